// What happens to many shares at once: volumes that go and come back, home folders, accounts.

#include <json/json.h>

#include <memory>
#include <set>
#include <string>
#include <vector>

#include "comm/elastic_control.h"
#include "common/error.h"
#include "common/file_util.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/sdk/share.h"
#include "fileindex/config/folder.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_internal.h"
#include "fileindex/queue/event.h"
#include "fileindex/util/custom_event.h"
#include "fileindex/util/util.h"
#include "platform/include/list.h"
#include "platform/include/recycle.h"

namespace quarry::fileindex {
namespace {

using FolderPtr = std::shared_ptr<Folder>;

constexpr int kRecyclePathsAtFirst = 1024;
constexpr char kHomes[] = "/homes/";

void RequireMountPoint(const char* function, const std::string& mount_point) {
  if (mount_point.empty()) {
    Fail({"index_mgr.cpp", __LINE__, function}, "mount_point.empty()", kErrorBadParameter,
         "Missing mount point");
  }
}

// The slashes keep /volume1 from holding what is on /volume10.
bool IsOnVolume(const Folder& folder, const std::string& mount_point) {
  return StringStartWith(folder.GetFullPath() + "/", mount_point + "/");
}

// A list of the platform's, filled and released under the lock that it needs; the lock is free
// while the list is read.
class RecyclePaths {
 public:
  RecyclePaths() {
    const LockMutex lock(sdk::SDKMutex());
    list_ = HLIBCSzListAlloc(kRecyclePathsAtFirst);
  }
  ~RecyclePaths() {
    if (list_ == nullptr) return;
    const LockMutex lock(sdk::SDKMutex());
    HLIBCSzListFree(list_);
  }
  RecyclePaths(const RecyclePaths&) = delete;
  RecyclePaths& operator=(const RecyclePaths&) = delete;

  bool IsAllocated() const { return list_ != nullptr; }

  // `enumerate` takes the list, which may move, and returns 0 when it has filled it.
  template <typename Enumerate>
  bool Fill(Enumerate enumerate) {
    const LockMutex lock(sdk::SDKMutex());
    return enumerate(&list_) == 0;
  }

  void Reindex() const {
    const int count = HLIBCSzListCount(list_);
    for (int i = 0; i < count; ++i) {
      AddCustomEvent(EVENT_REINDEX, HLIBCSzListGet(list_, i), "", Json::Value());
    }
  }

 private:
  HLIBCSZLIST* list_ = nullptr;
};

// Home folders are no reason to fail what the platform is doing, so a list that is not to be had is
// only logged.
template <typename Enumerate>
void ReindexRecyclePaths(const char* function, const char* enumerator, AUTH_TYPE auth,
                         Enumerate enumerate) {
  const LogSite site{"index_mgr.cpp", __LINE__, function};
  RecyclePaths paths;
  if (!paths.IsAllocated()) {
    LogError(site, "HLIBCSzListAlloc failed");
  } else if (!paths.Fill(enumerate)) {
    LogError(site, std::string(enumerator) + " failed. auth: " + std::to_string(auth));
  } else {
    paths.Reindex();
  }
}

}  // namespace

void VolumePause(const std::string& mount_point) {
  RequireMountPoint(__func__, mount_point);
  const FolderMgr folder_mgr;
  std::set<std::string> shares;
  for (const FolderPtr& folder : folder_mgr.GetFolders()) {
    if (!IsOnVolume(*folder, mount_point)) continue;
    folder->SetPaused(true);
    folder->SetVolumeToBeClean(mount_point);
    shares.insert(folder->GetShare());
  }
  folder_mgr.Save();
  for (const std::string& share : shares) {
    DeleteWorker(share);
    DeleteTARNotifydCfg(share);
    elastic::ShareIndexPause(share);
  }
}

void VolumeResume(const std::string& mount_point) {
  RequireMountPoint(__func__, mount_point);
  const FolderMgr folder_mgr;
  std::set<std::string> shares;
  for (const FolderPtr& folder : folder_mgr.GetFolders()) {
    if (!IsOnVolume(*folder, mount_point)) continue;
    folder->SetPaused(false);
    shares.insert(folder->GetShare());
  }
  folder_mgr.Save();
  for (const std::string& share : shares) {
    elastic::ShareIndexResume(share);
    CreateWorker(share);
    UpsertTARNotifydCfg(share, folder_mgr);
  }
}

void VolumeClearPaused(const std::string& mount_point) {
  RequireMountPoint(__func__, mount_point);
  FolderMgr folder_mgr;
  StatusMgr status_mgr;
  std::set<std::string> shares;
  for (const FolderPtr& folder : folder_mgr.GetFolders()) {
    if (folder->IsPaused() && folder->GetVolumeToBeClean() == mount_point) {
      shares.insert(folder->GetShare());
    }
  }
  for (const std::string& share : shares) {
    LogLine(QUARRY_SITE("index_mgr"), "Remove share " + share + " from folder mgr");
    status_mgr.ClearShareStatus(share);
    folder_mgr.DeleteByShare(share);
  }
  folder_mgr.Save();
  if (folder_mgr.GetFolders().empty()) SetupRelatedServices(false);
}

void HomeDisable(AUTH_TYPE auth) {
  ReindexRecyclePaths(__func__, "TARNRecycleHomeEnumRecyclePath", auth,
                      [](HLIBCSZLIST** list) { return TARNRecycleHomeEnumRecyclePath(list); });
}

void HomeEnable(AUTH_TYPE auth) {
  ReindexRecyclePaths(
      __func__, "TARNRecycleHomeEnumRecyclePathForAuthType", auth,
      [auth](HLIBCSZLIST** list) { return TARNRecycleHomeEnumRecyclePathForAuthType(list, auth); });
}

void UserRename(const std::string& user_from, const std::string& user_to) {
  if (user_from.empty()) {
    Fail(QUARRY_SITE("index_mgr"), "user_from.empty()", kErrorBadParameter, "Missing user_from");
  }
  if (user_to.empty()) {
    Fail(QUARRY_SITE("index_mgr"), "user_to.empty()", kErrorBadParameter, "Missing user_to");
  }
  const std::string home_from = kHomes + user_from;
  const std::string home_to = kHomes + user_to;
  // A name with a NUL byte is refused here: once saved, it would fail every question about shares.
  GetShareNameByPath(home_to);
  const FolderMgr folder_mgr;
  for (const FolderPtr& folder : folder_mgr.GetFolders()) {
    const std::string path = folder->GetPath();
    if (!StringStartWith(path + "/", home_from + "/")) continue;
    folder->SetPath(home_to + path.substr(home_from.size()));
    LogLine(QUARRY_SITE("index_mgr"),
            "Update homes rule: [" + path + "] -> [" + folder->GetPath() + "]");
  }
  folder_mgr.Save();
  const std::string full_path = GetFullPath(home_to);
  AddCustomEvent(EVENT_RENAME, full_path, GetFullPath(home_from), Json::Value());
}

}  // namespace quarry::fileindex
