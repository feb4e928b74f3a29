// The steps that the index management operations are made of. Not part of the library's interface.

#ifndef QUARRY_FILEINDEX_INDEX_MGR_INTERNAL_H_
#define QUARRY_FILEINDEX_INDEX_MGR_INTERNAL_H_

#include <json/json.h>

#include <string>

#include "fileindex/config/folder_mgr.h"

namespace quarry {
namespace fileindex {

// FolderAdd (`create`) and FolderSet.
void FolderUpsert(const Json::Value& folder_list, bool create, bool updater_mode);

// Tells the index daemon that the share's folders have changed: inserted or replaced, or removed.
// Throws what SendCommandToDaemon throws.
void NotifySettingChanged(const std::string& share_name, bool is_upsert);

// Registers with the change monitor the folders that `folder_mgr` has in the share, none perhaps,
// in place of those registered before. Throws Error 502 when the monitor refuses, 800 when there is
// no such share.
void UpsertTARNotifydCfg(const std::string& share_name, const FolderMgr& folder_mgr);

// Withdraws what is registered with the change monitor for the share. Throws as UpsertTARNotifydCfg
// does.
void DeleteTARNotifydCfg(const std::string& share_name);

// Removes the queue, its snapshot and the index directory of the share that lives, or lived, at the
// full path `share_path`, and forgets its status. The share need not exist. Throws Error 502 when
// the platform does not say where they are, 120 when it names a place that must not be removed, and
// what StatusMgr throws; what was removed before stays removed.
void CleanShareIndexData(const std::string& share_name, const std::string& share_path);

// Tells the index daemon to start, or to stop, working on the share. Throw what SendCommandToDaemon
// throws.
void CreateWorker(const std::string& share_name);
void DeleteWorker(const std::string& share_name);

// Switches the three services that indexing needs on or off. Each failure is logged, and the next
// step is done all the same. Throws nothing.
void SetupRelatedServices(bool enable);

}  // namespace fileindex
}  // namespace quarry

#endif  // QUARRY_FILEINDEX_INDEX_MGR_INTERNAL_H_
