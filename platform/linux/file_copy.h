// Copying and removing trees.

#ifndef QUARRY_PLATFORM_LINUX_FILE_COPY_H_
#define QUARRY_PLATFORM_LINUX_FILE_COPY_H_

#include <string>

namespace quarry::platform {

// Copies `from` with all that is in it to `to`, which must not exist. Links are copied as links.
// With `preserve` mode, times, and as far as they can be owner, access lists and other extended
// attributes are kept. Returns false, with errno set, on failure; part of the copy may be there.
bool CopyTree(const std::string& from, const std::string& to, bool preserve);

// Removes `path` with all that is in it, following no link. False, with errno set, on failure.
bool RemoveTree(const std::string& path);

// Copies to another file system and removes the source once the copy is on disk. False, with errno
// set and the source whole, on failure.
bool MoveByCopy(const std::string& from, const std::string& to, bool preserve);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_FILE_COPY_H_
