// Paths, and naming files after them.

#ifndef QUARRY_PLATFORM_LINUX_PATH_NAME_H_
#define QUARRY_PLATFORM_LINUX_PATH_NAME_H_

#include <string>

namespace quarry::platform {

// Whether `path` is absolute and in its shortest form: no empty, "." or ".." component, no "/" at
// the end, and not "/" itself.
bool IsPlainAbsolutePath(const std::string& path);

// Whether `path` is `directory` or lies below it. Both are in their shortest form.
bool IsSameOrBelow(const std::string& path, const std::string& directory);

// The path without links, ".", ".." or a "/" at its end, or "", with errno set, when there is no
// such place.
std::string ResolvedPath(const std::string& path);

// One path component that stands for `path`, a plain absolute path: readable, at most 240 bytes,
// and different for different paths. "/volume1/photo" is "volume1+photo". Bytes with a meaning of
// their own are %XX; what would be too long ends in "~" and a hash of the whole path, where
// different paths are different as far as 128 bits can tell.
std::string NameForPath(const std::string& path);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_PATH_NAME_H_
