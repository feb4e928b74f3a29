// Managing what is indexed: the operations behind the administrator's user interface.
//
// Success is a normal return, every failure a thrown Error. Paths are share paths, such as
// /share/dir, unless they are called full or absolute. Each operation loads its state anew and
// keeps none; all may block on lock files and on daemons. Any thread may call them, but the
// effective user of the process is switched while state is saved.

#ifndef QUARRY_FILEINDEX_INDEX_MGR_H_
#define QUARRY_FILEINDEX_INDEX_MGR_H_

#include <json/json.h>

#include <string>
#include <vector>

#include "common/export.h"

// The platform's enumeration of account kinds.
enum AUTH_TYPE : int;

namespace quarry {
namespace fileindex {

// Adds, or sets, the folders of an array of records as Folder(const Json::Value&) reads them. The
// shares' indexes and monitor configurations and the related services are brought in line, the list
// is saved, the index daemon is told, and what has become stale is queued for indexing.
//
// FolderAdd creates the index of a share that had no folder; FolderSet never does, and inserts a
// folder that is not there yet. In updater mode a path that cannot be indexed is accepted, and
// nothing is queued.
//
// Throw before anything is changed: Error 120 for a list or record of the wrong shape, 903 for a
// path that cannot be indexed, 901 for one that is a folder already (FolderAdd), 900 when the list
// would be too long, 1003 when the share's volume is full, 800 for an unknown share, 504 and 506
// for a list that cannot be loaded or locked. A later failure is thrown at once; what was done
// stays.
QUARRY_EXPORT void FolderAdd(const Json::Value& folder_list, bool updater_mode);
QUARRY_EXPORT void FolderSet(const Json::Value& folder_list, bool updater_mode);

// Sets `result` to the record of the folder at `path`. Throws Error 902 when there is none, and
// what loading the list throws.
QUARRY_EXPORT void FolderGet(Json::Value& result, const std::string& path);

// Sets `result` to {"folder": [...], "total": all folders, "offset": offset} with a page of the
// sorted list, see FolderMgr::List(); each element is Folder::GetDataWithAdditional(additional).
// When that throws, `result` holds what was there until then. Throws what loading the list throws,
// with `result` as it was.
QUARRY_EXPORT void FolderList(Json::Value& result, unsigned int offset, unsigned int limit,
                              const std::string& sort_by, const std::string& sort_direction,
                              const Json::Value& additional);

// Has everything at and below each path of an array indexed again, where its share has a folder;
// other paths are passed over. A share whose index must be rebuilt gets a new index and is indexed
// again as a whole. Takes no lock.
//
// Throws Error 120 for a list or element of the wrong shape, what loading list and status throws,
// and what a step throws; what was queued or done before stays.
QUARRY_EXPORT void FolderReindex(const Json::Value& path_list);

// Removes the folders at the paths of an array. A share that keeps folders gets a new monitor
// configuration and the places are queued to be looked at anew; of one that does not, the index,
// the queue and the status are removed. The services are stopped with the last folder.
//
// Throws before anything is changed: Error 120 for a list or element of the wrong shape, 902 for a
// path that is no folder or stands twice, 800 for an unknown share, 504 and 506 for a list that
// cannot be loaded or locked. A later failure is thrown at once; what was done stays.
QUARRY_EXPORT void FolderDelete(const Json::Value& path_list);

// What follows takes no lock: the callers see to it that one operation runs at a time. A failure is
// thrown at once and what was done before it stays. Besides what is said, all throw what loading
// and saving the list throws, and what the engine, the index daemon and AddCustomEvent report.

// A share that has got a new name: its folders, its index and its documents follow. To be called
// when the platform knows it by the new name. Throws Error 120 when a name is empty or the new
// one has a NUL byte, with nothing changed; 800, with the list saved, when the share is not known.
QUARRY_EXPORT void ShareRename(const std::string& share_from, const std::string& share_to);

// A share that has moved from one full path to another: its index and its documents follow. Without
// effect for a share that has no folder. Throws Error 120 for an empty argument.
QUARRY_EXPORT void ShareMigrate(const std::string& share_name, const std::string& path_from,
                                const std::string& path_to);

// Queues the share's recycle bin for indexing, if it has one. Throws Error 800 for an unknown
// share.
QUARRY_EXPORT void ShareCheckRecycle(const std::string& share_name);

// Stop and resume the indexing of a share: its worker, its monitor configuration, writes to its
// index. Without effect for a share that has no folder. Throw Error 120 for an empty name.
QUARRY_EXPORT void SharePause(const std::string& share_name);
QUARRY_EXPORT void ShareResume(const std::string& share_name);

// Drops a paused share for good, which lived at the full path `share_path`: its folders, its index,
// its queue and its status. The services are stopped with the last folder. Throws Error 120 for an
// empty argument, with nothing changed.
QUARRY_EXPORT void ShareClearPaused(const std::string& share_name, const std::string& share_path);

// The same for all shares that have a folder on the volume mounted at the absolute path
// `mount_point`, given without a "/" at its end: pause, resume, and forget. VolumeClearPaused
// forgets the folders that VolumePause paused for exactly this mount point, with their shares;
// index and queue are left. Throw Error 120 for an empty mount point, with nothing changed.
QUARRY_EXPORT void VolumePause(const std::string& mount_point);
QUARRY_EXPORT void VolumeResume(const std::string& mount_point);
QUARRY_EXPORT void VolumeClearPaused(const std::string& mount_point);

// Queue the recycle bins of home folders for indexing, when they are switched off (of accounts of
// all kinds) or on (of one kind). Where the platform cannot list them, that is logged only.
QUARRY_EXPORT void HomeDisable(AUTH_TYPE auth);
QUARRY_EXPORT void HomeEnable(AUTH_TYPE auth);

// An account that has got a new name, and its home folder with it: folders in /homes/`user_from`
// follow, and so do its documents. Throws Error 120 when a name is empty or the new one has a NUL
// byte, with nothing changed; 800, with the list saved, when there are no home folders.
QUARRY_EXPORT void UserRename(const std::string& user_from, const std::string& user_to);

// Refreshes the engine's term suggestions of the indexes named so, from all that they hold. Names
// that are no index of a share with folders are passed over. Throws what the engine reports; shares
// done before keep what they got.
QUARRY_EXPORT void UpdateTermSuggestion(const std::vector<std::string>& db_names);

// Starts the services that indexing needs if there is any folder, else stops them. A service that
// cannot be started or stopped is logged. Throws what loading the list throws.
QUARRY_EXPORT void PrepareServices();

}  // namespace fileindex
}  // namespace quarry

#endif  // QUARRY_FILEINDEX_INDEX_MGR_H_
