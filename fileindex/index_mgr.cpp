#include "fileindex/index_mgr.h"

#include <memory>
#include <set>
#include <string>
#include <vector>

#include "comm/elastic_control.h"
#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/paths.h"
#include "common/sdk/share.h"
#include "fileindex/config/folder.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "fileindex/index_mgr_internal.h"
#include "fileindex/queue/event.h"
#include "fileindex/util/custom_event.h"
#include "fileindex/util/util.h"

namespace quarry::fileindex {
namespace {

using FolderPtr = std::shared_ptr<Folder>;

const std::string kFolderLockPath = RootedPath("/tmp/quarry_cfg_folder.lock");

// What an upsert of folders has changed so far.
struct FolderChanges {
  std::vector<FolderPtr> stale;  // in order of the request; their kinds are those to look at anew
  std::set<std::string> shares;
};

// The kinds that inserting `folder` makes stale: all for a folder that is added, else those that
// the change record names.
FolderPtr StaleCfg(const Folder& folder, const FolderPtr& diff, bool create) {
  if (!create) return diff;
  return std::make_shared<Folder>(folder.GetPath(), folder.GetName(), true, true, true, true, false,
                                  false);
}

// One element of FolderUpsert's list; its failures are logged as FolderUpsert's.
void UpsertOne(FolderMgr& folder_mgr, FolderChanges& changes, const Json::Value& element,
               bool create, bool updater_mode) {
  const LogSite site{"index_mgr.cpp", __LINE__, "FolderUpsert"};
  const FolderPtr folder_new = std::make_shared<Folder>(element);
  const std::string& path = folder_new->GetPath();
  if (!CanPathBeIndexed(path) && !updater_mode) {
    Fail(site, "!CanPathBeIndexed(folder_new->GetPath()) && !updater_mode", kErrorPathNotIndexable,
         "Path cannot index: " + path);
  }
  if (create && folder_mgr.HasFolder(path)) {
    Fail(site, "create && folder_mgr.HasFolder(folder_new->GetPath())", kErrorFolderExists,
         "Duplicated ID: " + path);
  }
  FolderPtr diff;
  folder_mgr.Upsert(diff, folder_new);
  changes.stale.push_back(StaleCfg(*folder_new, diff, create));

  const std::string share_name = folder_new->GetShare();
  const sdk::SDKShare share(share_name);
  if (!share.IsSpaceEnough()) {
    Fail(site, "!share.IsSpaceEnough()", kErrorNoSpace,
         "Share (" + share_name + ") space not enough");
  }
  changes.shares.insert(share_name);
}

void RequireArray(const char* function, const Json::Value& path_list) {
  if (!path_list.isArray()) {
    Fail({"index_mgr.cpp", __LINE__, function}, "!path_list.isArray()", kErrorBadParameter,
         toString(path_list));
  }
}

std::string PathOf(const char* function, const Json::Value& it) {
  if (!it.isString()) {
    Fail({"index_mgr.cpp", __LINE__, function}, "!it.isString()", kErrorBadParameter, toString(it));
  }
  return it.asString();
}

// A new, empty index, to be filled from the disk.
void RebuildShareIndex(const std::string& share_name) {
  const sdk::SDKShare share(share_name);
  elastic::ShareIndexDelete(share_name);
  elastic::ShareIndexCreate(share_name);
  AddCustomEvent(EVENT_REINDEX, share.GetPath(), "", Json::Value());
}

// Takes the machinery of a share down that has no folder any more.
void RemoveShareIndex(const std::string& share_name) {
  const sdk::SDKShare share(share_name);
  elastic::ShareIndexDelete(share_name);
  DeleteTARNotifydCfg(share_name);
  CleanShareIndexData(share_name, share.GetPath());
}

}  // namespace

void FolderUpsert(const Json::Value& folder_list, bool create, bool updater_mode) {
  const LockFile lock(kFolderLockPath, true);
  FolderMgr folder_mgr;
  const FolderMgr folder_mgr_before;
  if (!folder_list.isArray()) {
    Fail(QUARRY_SITE("index_mgr"), "!folder_list.isArray()", kErrorBadParameter,
         toString(folder_list));
  }
  FolderChanges changes;
  for (const Json::Value& element : folder_list) {
    UpsertOne(folder_mgr, changes, element, create, updater_mode);
  }

  // From here on the world outside changes, and a failure leaves behind what was done before it.
  SetupRelatedServices(true);
  for (const std::string& share : changes.shares) {
    if (create && !folder_mgr_before.IsShareIndexed(share)) elastic::ShareIndexCreate(share);
    UpsertTARNotifydCfg(share, folder_mgr);
  }
  folder_mgr.Save();
  for (const std::string& share : changes.shares) NotifySettingChanged(share, true);
  if (updater_mode) return;
  for (const FolderPtr& folder : changes.stale) {
    AddCustomEvent(EVENT_UPDATE_CFG, folder->GetFullPath(), "", folder->GetIndexCfg());
  }
}

void FolderAdd(const Json::Value& folder_list, bool updater_mode) {
  FolderUpsert(folder_list, true, updater_mode);
}

void FolderSet(const Json::Value& folder_list, bool updater_mode) {
  FolderUpsert(folder_list, false, updater_mode);
}

void FolderReindex(const Json::Value& path_list) {
  StatusMgr status_mgr;
  const FolderMgr folder_mgr;
  RequireArray(__func__, path_list);
  std::set<std::string> rebuild;
  std::set<std::string> touched;
  for (const Json::Value& it : path_list) {
    const std::string path = PathOf(__func__, it);
    const std::string share = GetShareNameByPath(path);
    if (!folder_mgr.IsShareIndexed(share)) continue;
    if ((status_mgr.GetShareStatus(share) & kShareNeedRebuild) != 0) {
      rebuild.insert(share);
    } else {
      AddCustomEvent(EVENT_REINDEX, GetFullPath(path), "", Json::Value());
    }
    touched.insert(share);
  }
  for (const std::string& share : rebuild) RebuildShareIndex(share);
  for (const std::string& share : touched) {
    if ((status_mgr.GetShareStatus(share) & kShareNeedReindex) != 0) {
      status_mgr.UnsetShareStatus(share, kShareNeedReindex | kShareNeedRebuild);
    }
  }
}

void FolderDelete(const Json::Value& path_list) {
  const LockFile lock(kFolderLockPath, true);
  FolderMgr folder_mgr;
  RequireArray(__func__, path_list);
  std::vector<FolderPtr> removed;
  std::set<std::string> shares;
  for (const Json::Value& it : path_list) {
    const std::string path = PathOf(__func__, it);
    FolderPtr folder;
    // An enclosing folder would answer for a path that is no folder itself.
    folder_mgr.Get(folder, path);
    folder_mgr.Delete(folder, path);
    removed.push_back(folder);
    shares.insert(GetShareNameByPath(path));
  }

  // From here on the world outside changes, and a failure leaves behind what was done before it.
  for (const std::string& share : shares) {
    if (folder_mgr.IsShareIndexed(share)) {
      UpsertTARNotifydCfg(share, folder_mgr);
    } else {
      RemoveShareIndex(share);
    }
  }
  folder_mgr.Save();
  for (const std::string& share : shares) NotifySettingChanged(share, false);
  for (const FolderPtr& folder : removed) {
    if (!folder_mgr.IsShareIndexed(folder->GetShare())) continue;
    AddCustomEvent(EVENT_UPDATE_CFG, folder->GetFullPath(), "", folder->GetIndexCfg());
  }
  if (folder_mgr.GetFolders().empty()) SetupRelatedServices(false);
}

void FolderGet(Json::Value& result, const std::string& path) {
  const FolderMgr folder_mgr;
  FolderPtr folder;
  folder_mgr.Get(folder, path);
  result = folder->GetData();
}

void FolderList(Json::Value& result, unsigned int offset, unsigned int limit,
                const std::string& sort_by, const std::string& sort_direction,
                const Json::Value& additional) {
  const FolderMgr folder_mgr;
  std::vector<FolderPtr> folders;
  unsigned int total = 0;
  folder_mgr.List(folders, total, offset, limit, sort_by, sort_direction);

  result = Json::Value(Json::objectValue);
  Json::Value& list = result["folder"] = Json::Value(Json::arrayValue);
  result["total"] = total;
  result["offset"] = offset;
  for (const FolderPtr& folder : folders) list.append(folder->GetDataWithAdditional(additional));
}

}  // namespace quarry::fileindex
