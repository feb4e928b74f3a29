#include "fileindex/config/state_file.h"

#include <sys/stat.h>

#include <cerrno>

namespace quarry::fileindex {

bool IsAnythingAt(const std::string& path) {
  const int saved_errno = errno;
  struct stat info;
  const bool missing = lstat(path.c_str(), &info) != 0 && errno == ENOENT;
  errno = saved_errno;
  return !missing;
}

}  // namespace quarry::fileindex
