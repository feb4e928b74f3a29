// What the two state files have in common.

#ifndef QUARRY_FILEINDEX_CONFIG_STATE_FILE_H_
#define QUARRY_FILEINDEX_CONFIG_STATE_FILE_H_

#include <string>

namespace quarry::fileindex {

// Whether there is anything at `path`, of whatever kind; true also when that cannot be told. Only a
// state file of which this is false is an empty state: anything else that were taken for one would
// be overwritten by the next save. Leaves errno alone.
bool IsAnythingAt(const std::string& path);

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_CONFIG_STATE_FILE_H_
