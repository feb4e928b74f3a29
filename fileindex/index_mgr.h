// Managing what is indexed: the operations behind the administrator's user interface.
//
// Success is a normal return, every failure a thrown Error. All paths are share paths, such as
// /share/dir. Each operation loads its state anew and keeps none; all may block on lock files and
// on daemons. Any thread may call them, but the effective user of the process is switched while
// state is saved.

#ifndef QUARRY_FILEINDEX_INDEX_MGR_H_
#define QUARRY_FILEINDEX_INDEX_MGR_H_

#include <json/json.h>

#include <string>

#include "common/export.h"

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

// Starts the services that indexing needs if there is any folder, else stops them. A service that
// cannot be started or stopped is logged. Throws what loading the list throws.
QUARRY_EXPORT void PrepareServices();

}  // namespace fileindex
}  // namespace quarry

#endif  // QUARRY_FILEINDEX_INDEX_MGR_H_
