// Opening and listing directories that are to be watched.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_DIRECTORY_SCAN_H_
#define QUARRY_DAEMONS_TARNOTIFYD_DIRECTORY_SCAN_H_

#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <string>

#include "common/unique_fd.h"

namespace quarry::notify {

// Tells one directory from another that takes its place.
struct DirectoryId {
  dev_t device = 0;
  ino_t inode = 0;
  bool is_mount = false;  // something is mounted at the path
  // Of the mount by which it was reached; 0 where the kernel does not tell.
  std::uint64_t mount = 0;

  bool operator==(const DirectoryId&) const = default;
};

// Whether an error of opening says that there is no directory at the path.
bool IsGone(int error);

// Opens a directory, no matter how long its path is; its last component is no symbolic link.
// Without a descriptor errno says why.
UniqueFd OpenDirectory(const std::string& path);

// The same for a directory at or below `top`, by its full path: nothing below `top` is a symbolic
// link. With `to_read` it can be listed.
UniqueFd OpenBelow(const std::string& top, const std::string& path, bool to_read);

// False with errno set when it cannot be told.
bool Identify(int fd, DirectoryId* id);

// Calls with the name of each directory in the one that `fd`, which must not be used otherwise
// afterwards, is open on. Symbolic links are not followed. False with errno set when there may be
// more of them than could be read.
bool ForEachSubdirectory(UniqueFd fd, const std::function<void(const char* name)>& action);

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_DIRECTORY_SCAN_H_
