// What belongs to a share beside its folders, and what happens to it with the share: its index, its
// queue, its monitor configuration and its worker in the index daemon.

#include <array>
#include <memory>
#include <string>

#include "comm/communication.h"
#include "comm/elastic_control.h"
#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
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
#include "platform/include/index_path.h"
#include "platform/include/monitor.h"
#include "platform/include/service.h"

namespace quarry::fileindex {
namespace {

using TARN::TARNOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION;
using TARN::TARNOTIFYD::MonitorQueue;
using FolderPtr = std::shared_ptr<Folder>;

constexpr char kAppName[] = "fileindex";
constexpr char kMetadataDirectory[] = "@eaDir";
constexpr char kRecycleBin[] = "/#recycle";
constexpr char kShareName[] = "share_name";
constexpr unsigned int kMonitorMask = 0xFFC6;

Json::Value MonitorEntry(const Folder& folder) {
  Json::Value entry;
  entry["path"] = folder.GetFullPath();
  entry["mask"] = kMonitorMask;
  entry["ignore"] = Vec2JsonArr<std::string>({kMetadataDirectory});
  return entry;
}

// Has the platform compose one of the paths that belong to a share. False when it cannot.
bool Compose(int (*compose)(const char*, char*, size_t), const std::string& share_path,
             std::string& path) {
  // The platform would compose the path of another share, the one named before a NUL byte.
  if (share_path.find('\0') != std::string::npos) return false;
  std::array<char, 4096> buffer{};
  const LockMutex lock(sdk::SDKMutex());
  if (compose(share_path.c_str(), buffer.data(), buffer.size()) < 0) return false;
  path = buffer.data();
  return true;
}

// What is removed is what the platform says, so that is looked at once more: a slip there must not
// remove the working directory or the whole disk.
void RequireRemovable(const std::string& path) {
  if (path.empty() || path.front() != '/' || path.find_first_not_of('/') == std::string::npos) {
    throw Error(kErrorBadParameter, "Not a path to remove: " + path);
  }
}

void RemoveTree(const std::string& path) {
  HLIBCExec("/bin/rm", "-rf", path.c_str(), static_cast<char*>(nullptr));
}

void SetPaused(const FolderMgr& folder_mgr, const std::string& share_name, bool paused) {
  for (const FolderPtr& folder : folder_mgr.GetFolders()) {
    if (folder->GetShare() == share_name) folder->SetPaused(paused);
  }
}

}  // namespace

void NotifySettingChanged(const std::string& share_name, bool is_upsert) {
  Json::Value data;
  data[kShareName] = share_name;
  data["is_upsert"] = is_upsert;
  SendCommandToDaemon("notify_setting_changed", data);
}

void CreateWorker(const std::string& share_name) {
  Json::Value data;
  data[kShareName] = share_name;
  SendCommandToDaemon("worker_create", data);
}

void DeleteWorker(const std::string& share_name) {
  Json::Value data;
  data[kShareName] = share_name;
  SendCommandToDaemon("worker_delete", data);
}

void UpsertTARNotifydCfg(const std::string& share_name, const FolderMgr& folder_mgr) {
  const sdk::SDKShare share(share_name);
  Json::Value config(Json::arrayValue);
  for (const FolderPtr& folder : folder_mgr.GetFolders()) {
    if (folder->GetShare() == share_name) config.append(MonitorEntry(*folder));
  }
  Json::Value data;
  data["queue"] = share.GetQueuePath();
  data["config"] = config;
  const MonitorQueue monitor_queue(data);
  if (!MonitorQueue::Upsert(monitor_queue, kAppName, MONITOR_QUEUE_TYPE_APPLICATION)) {
    Fail(QUARRY_SITE("index_mgr"),
         "!MonitorQueue::Upsert(monitor_queue, kAppName, MONITOR_QUEUE_TYPE_APPLICATION)",
         kErrorSystem, "MonitorQueue::Upsert failed, share=" + share_name);
  }
}

void DeleteTARNotifydCfg(const std::string& share_name) {
  const sdk::SDKShare share(share_name);
  if (!MonitorQueue::Delete(share.GetQueuePath(), kAppName, MONITOR_QUEUE_TYPE_APPLICATION)) {
    Fail(QUARRY_SITE("index_mgr"),
         "!MonitorQueue::Delete(share.GetQueuePath(), kAppName, MONITOR_QUEUE_TYPE_APPLICATION)",
         kErrorSystem, "MonitorQueue::Delete failed, share=" + share_name);
  }
}

void CleanShareIndexData(const std::string& share_name, const std::string& share_path) {
  std::string path;
  if (!Compose(&FILEIDXQueuePathCompose, share_path, path)) {
    Fail(QUARRY_SITE("index_mgr"),
         "0 > FILEIDXQueuePathCompose(share_path.c_str(), path, sizeof(path))", kErrorSystem,
         "FILEIDXQueuePathCompose failed, share_path=" + share_path);
  }
  RequireRemovable(path);
  RemoveTree(path);
  RemoveTree(path + ".tmp");
  if (!Compose(&FILEIDXDBPathCompose, share_path, path)) {
    Fail(QUARRY_SITE("index_mgr"),
         "0 > FILEIDXDBPathCompose(share_path.c_str(), path, sizeof(path))", kErrorSystem,
         "FILEIDXDBPathCompose failed, share_path=" + share_path);
  }
  RequireRemovable(path);
  RemoveTree(path);
  StatusMgr().ClearShareStatus(share_name);
}

void ShareRename(const std::string& share_from, const std::string& share_to) {
  const FolderMgr folder_mgr;
  if (share_from.empty()) {
    Fail(QUARRY_SITE("index_mgr"), "share_from.empty()", kErrorBadParameter, "Missing share_from");
  }
  if (share_to.empty()) {
    Fail(QUARRY_SITE("index_mgr"), "share_to.empty()", kErrorBadParameter, "Missing share_to");
  }
  // A name with a NUL byte is refused here: once saved, it would fail every question about shares.
  GetShareNameByPath(std::string(1, '/') + share_to);
  for (const FolderPtr& folder : folder_mgr.GetFolders()) {
    if (folder->GetShare() == share_from) folder->SetShare(share_to);
  }
  folder_mgr.Save();

  const sdk::SDKShare share(share_to);
  elastic::ShareIndexRename(share_from, share_to, share.GetDBPath());
  const std::string path = share.GetPath();
  // Only the last component is the share's: the volume may have a directory of the same name.
  const std::string path_old =
      Dirname(path) + ReplacePathShare(std::string(1, '/') + Basename(path), share_from, share_to);
  AddCustomEvent(EVENT_RENAME, path, path_old, Json::Value());
}

void ShareMigrate(const std::string& share_name, const std::string& path_from,
                  const std::string& path_to) {
  const FolderMgr folder_mgr;
  if (share_name.empty()) {
    Fail(QUARRY_SITE("index_mgr"), "share_name.empty()", kErrorBadParameter, "Missing share_name");
  }
  if (path_from.empty()) {
    Fail(QUARRY_SITE("index_mgr"), "path_from.empty()", kErrorBadParameter, "Missing path_from");
  }
  if (path_to.empty()) {
    Fail(QUARRY_SITE("index_mgr"), "path_to.empty()", kErrorBadParameter, "Missing path_to");
  }
  if (!folder_mgr.IsShareIndexed(share_name)) return;
  elastic::ShareIndexMigrate(share_name, sdk::SDKShare(share_name).GetDBPath());
  AddCustomEvent(EVENT_RENAME, path_to, path_from, Json::Value());
}

void ShareCheckRecycle(const std::string& share_name) {
  const std::string recycle_path = sdk::SDKShare(share_name).GetPath() + kRecycleBin;
  if (!IsDirExist(recycle_path, false)) return;
  AddCustomEvent(EVENT_REINDEX, recycle_path, "", Json::Value());
}

void SharePause(const std::string& share_name) {
  if (share_name.empty()) {
    Fail(QUARRY_SITE("index_mgr"), "share_name.empty()", kErrorBadParameter, "Missing share name");
  }
  const FolderMgr folder_mgr;
  if (!folder_mgr.IsShareIndexed(share_name)) return;
  // Neither here nor in ShareResume may a worker be left without an index.
  DeleteWorker(share_name);
  DeleteTARNotifydCfg(share_name);
  elastic::ShareIndexPause(share_name);
  SetPaused(folder_mgr, share_name, true);
  folder_mgr.Save();
}

void ShareResume(const std::string& share_name) {
  if (share_name.empty()) {
    Fail(QUARRY_SITE("index_mgr"), "share_name.empty()", kErrorBadParameter, "Missing share name");
  }
  const FolderMgr folder_mgr;
  if (!folder_mgr.IsShareIndexed(share_name)) return;
  elastic::ShareIndexResume(share_name);
  UpsertTARNotifydCfg(share_name, folder_mgr);
  CreateWorker(share_name);
  SetPaused(folder_mgr, share_name, false);
  folder_mgr.Save();
}

void ShareClearPaused(const std::string& share_name, const std::string& share_path) {
  if (share_name.empty()) {
    Fail(QUARRY_SITE("index_mgr"), "share_name.empty()", kErrorBadParameter, "Missing share name");
  }
  if (share_path.empty()) {
    Fail(QUARRY_SITE("index_mgr"), "share_path.empty()", kErrorBadParameter, "Missing share path");
  }
  FolderMgr folder_mgr;
  CleanShareIndexData(share_name, share_path);
  elastic::ShareIndexDelete(share_name);
  folder_mgr.DeleteByShare(share_name);
  folder_mgr.Save();
  if (folder_mgr.GetFolders().empty()) SetupRelatedServices(false);
}

}  // namespace quarry::fileindex
