// Telling an open file from another that may have taken its name.

#ifndef QUARRY_COMMON_NAMED_FILE_H_
#define QUARRY_COMMON_NAMED_FILE_H_

#include <sys/stat.h>

#include <string>

namespace quarry {

// Whether `path`, links followed, leads to the very file that `fd` has open. False when either
// cannot be asked; errno may change.
inline bool IsStillNamed(const std::string& path, int fd) {
  struct stat opened {};
  struct stat named {};
  return fstat(fd, &opened) == 0 && stat(path.c_str(), &named) == 0 &&
         opened.st_dev == named.st_dev && opened.st_ino == named.st_ino;
}

}  // namespace quarry

#endif  // QUARRY_COMMON_NAMED_FILE_H_
