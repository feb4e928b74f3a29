#include "fileindex/index_mgr.h"

#include <cstdio>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "comm/communication.h"
#include "comm/elastic_control.h"
#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/paths.h"
#include "common/sdk/share.h"
#include "fileindex/config/folder.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/index_mgr_internal.h"
#include "fileindex/queue/event.h"
#include "fileindex/util/custom_event.h"
#include "fileindex/util/util.h"
#include "platform/include/error.h"
#include "platform/include/monitor.h"
#include "platform/include/service.h"

namespace quarry::fileindex {
namespace {

using TARN::TARNOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION;
using TARN::TARNOTIFYD::MonitorQueue;
using FolderPtr = std::shared_ptr<Folder>;

constexpr char kAppName[] = "fileindex";
constexpr char kMetadataDirectory[] = "@eaDir";
constexpr unsigned int kMonitorMask = 0xFFC6;
constexpr int kWait = 1;     // TRUE of the service interface
constexpr int kNoForce = 0;  // FALSE of the service interface

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

// Logs a failed step of SetupRelatedServices, which has no reason beside errno.
void LogServiceFailure(const char* condition) {
  LogError({"index_mgr.cpp", __LINE__, "SetupRelatedServices"},
           std::string("Failed [") + condition + "]");
}

// The same for a step of which the platform says more.
void LogSharingFailure(const char* call) {
  char error[16];
  std::snprintf(error, sizeof(error), "0x%04X", static_cast<unsigned int>(HLIBCErrGet()));
  LogError({"index_mgr.cpp", __LINE__, "SetupRelatedServices"},
           std::string(call) + " failed: err=[" + error + " " + HLIBCErrorGetFile() + ":" +
               std::to_string(HLIBCErrorGetLine()) + "]");
}

// The sharing service is restarted only for a change: that interrupts its users. Where the platform
// cannot tell what is set, it is left as it is.
void SetupSearchOfSharingService(bool enable) {
  const int enabled = TARNSMBIsEnableSpotlight();
  if (0 > enabled) LogServiceFailure("0 > TARNSMBIsEnableSpotlight()");
  if (0 > enabled || (enabled != 0) == enable) return;
  if (0 > TARNSMBSetSpotlight(enable ? 1 : 0)) {
    LogSharingFailure("TARNSMBSetSpotlight");
  } else if (0 > HLIBServiceRestart("samba")) {
    LogSharingFailure("HLIBServiceRestart");
  }
}

void StartServices() {
  if (0 > HLIBServiceStart("tarncontentextractd", kWait)) {
    LogServiceFailure("0 > HLIBServiceStart(\"tarncontentextractd\", TRUE)");
  }
  if (0 > HLIBServicectlStart("pkg-Quarry-fileindexd", HLIB_SERVICECTL_UPSTART)) {
    LogServiceFailure(
        "0 > HLIBServicectlStart(\"pkg-Quarry-fileindexd\", HLIB_SERVICECTL_UPSTART)");
  }
}

void StopServices() {
  if (0 > HLIBServiceStop("tarncontentextractd", kNoForce)) {
    LogServiceFailure("0 > HLIBServiceStop(\"tarncontentextractd\", FALSE)");
  }
  if (0 > HLIBServicectlStop("pkg-Quarry-fileindexd", HLIB_SERVICECTL_UPSTART)) {
    LogServiceFailure("0 > HLIBServicectlStop(\"pkg-Quarry-fileindexd\", HLIB_SERVICECTL_UPSTART)");
  }
}

Json::Value MonitorEntry(const Folder& folder) {
  Json::Value entry;
  entry["path"] = folder.GetFullPath();
  entry["mask"] = kMonitorMask;
  entry["ignore"] = Vec2JsonArr<std::string>({kMetadataDirectory});
  return entry;
}

}  // namespace

void SetupRelatedServices(bool enable) {
  SetupSearchOfSharingService(enable);
  if (enable) {
    StartServices();
  } else {
    StopServices();
  }
}

void NotifySettingChanged(const std::string& share_name, bool is_upsert) {
  Json::Value data;
  data["share_name"] = share_name;
  data["is_upsert"] = is_upsert;
  SendCommandToDaemon("notify_setting_changed", data);
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

void PrepareServices() {
  SetupRelatedServices(!FolderMgr().GetFolders().empty());
}

}  // namespace quarry::fileindex
