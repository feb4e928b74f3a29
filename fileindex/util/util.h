// Rules about paths: from share paths to full paths and back, and which places may be indexed.
//
// A share path is "/" + share name + the path inside the share: /share/dir/file. A full path is the
// share's volume directory followed by the share path: /volume1/share/dir/file. Paths are byte
// strings in UTF-8; a path with a NUL byte names nothing and is refused. No function keeps state;
// all may be called from any thread.

#ifndef QUARRY_FILEINDEX_UTIL_UTIL_H_
#define QUARRY_FILEINDEX_UTIL_UTIL_H_

#include <string>

#include "common/export.h"
#include "common/file_util.h"

namespace quarry::fileindex {

using quarry::Basename;
using quarry::Dirname;
using quarry::StringStartWith;

// The first component of a share path, empty for "/". Throws Error 120, with the path as reason,
// when the path does not begin with "/". The out parameter is untouched then.
QUARRY_EXPORT void GetShareNameByPath(std::string& share_name, const std::string& share_path);
QUARRY_EXPORT std::string GetShareNameByPath(const std::string& share_path);

// The full path of a share path. Nothing is normalised. Throws as GetShareNameByPath does, and
// Error 800 when there is no such share. The out parameter is untouched then.
QUARRY_EXPORT void GetFullPath(std::string& full_path, const std::string& share_path);
QUARRY_EXPORT std::string GetFullPath(const std::string& share_path);

// The share that holds `full_path`: its name, and its own full path (not a share path). The path
// need not exist. Throws Error 502 when no share holds it; the out parameters are untouched then.
QUARRY_EXPORT void GetShareNamePathByFullPath(std::string& share_name, std::string& share_path,
                                              const std::string& full_path);

// Whether the path lies in the recycle bin of a share or of a user's home. Throws Error 502 when no
// share holds it.
QUARRY_EXPORT bool IsFullPathInRecycleBin(const std::string& full_path);

// Whether the place may hold an indexed folder: it exists on a local file system in a share that
// may be indexed, is written canonically, and is neither a snapshot, a recycle bin nor the mount
// point of something foreign. Never says why not. Throws Error 502 when no share holds a path that
// has passed the tests of its file system, or the platform cannot tell a property of the share, and
// Error 800 when the share has vanished meanwhile.
QUARRY_EXPORT bool CanFullPathBeIndexed(const std::string& full_path);
// The same of a share path. Throws also as GetFullPath does.
QUARRY_EXPORT bool CanPathBeIndexed(const std::string& share_path);

// `path`, a share path or a full path, with its first component `old_share` exchanged for
// `new_share`. Throws Error 120 when it has no such component.
QUARRY_EXPORT std::string ReplacePathShare(const std::string& path, const std::string& new_share,
                                           const std::string& old_share);

// Whether a file of this name, one path component, is never indexed.
QUARRY_EXPORT bool IsSystemPreservedFileName(const std::string& name);

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_UTIL_UTIL_H_
