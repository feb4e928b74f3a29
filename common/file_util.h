// Simple questions about paths, and the few changes to files that the library makes. Paths are byte
// strings; no file answers to one with a NUL byte. Unless said otherwise a function reports failure
// by its result alone, logs nothing and throws nothing. All may be called from any thread, and
// block as long as the file system does.

#ifndef QUARRY_COMMON_FILE_UTIL_H_
#define QUARRY_COMMON_FILE_UTIL_H_

#include <dirent.h>

#include <string>

#include "common/export.h"

struct TARNCOPYARGS;

namespace quarry {

// Whether `path` itself is a regular file. A symbolic link is not, wherever it leads.
QUARRY_EXPORT bool IsFileExist(const std::string& path);

// Whether `path` is a directory or, with `follow`, a symbolic link that leads to one. The text of a
// relative link is taken from the working directory. Chains of more than 40 links are false.
QUARRY_EXPORT bool IsDirExist(const std::string& path, bool follow);

// Whether the directory entry is known to be a directory. An entry of unknown type is not treated
// as one, whatever `path`, its full path, is.
QUARRY_EXPORT bool IsDirentDir(const dirent& entry, const std::string& path);

// Whether the caller has any of the platform's permission bits `perm` on `path`.
QUARRY_EXPORT bool CheckACLPerm(const std::string& path, int perm);

// Whether the platform says that `path` is a mount point; false when it cannot tell.
QUARRY_EXPORT bool IsMountPoint(const std::string& path);

// Whether `text` begins with `prefix`; always for an empty prefix.
QUARRY_EXPORT bool StringStartWith(const std::string& text, const std::string& prefix);

// The text after the last "/", the whole path when there is none.
QUARRY_EXPORT std::string Basename(const std::string& path);

// The text before the last "/", the whole path when there is none.
QUARRY_EXPORT std::string Dirname(const std::string& path);

// The text after the last "." of the last component, empty when there is none; with `lower` the
// letters A to Z are lower-cased.
QUARRY_EXPORT std::string GetFileExtension(const std::string& path, bool lower);

// The path without links, "." and "..", or "" when it cannot be resolved.
QUARRY_EXPORT std::string RealPath(const std::string& path);

// Removes a file or a link, no directory. True also when there was none; false with errno set.
QUARRY_EXPORT bool Unlink(const std::string& path);

// Copies the file or directory `from` to `to` as the platform does (TARNFileCopy), with its options
// record, which stays the caller's. True when all was copied, else false with errno set.
QUARRY_EXPORT bool MVFileImpl(const std::string& from, const std::string& to, TARNCOPYARGS* args);
// The same with owner, mode and times kept; MVFile then removes the source.
QUARRY_EXPORT bool MVFile(const std::string& from, const std::string& to);
QUARRY_EXPORT bool CPFile(const std::string& from, const std::string& to);

// Gives `path` to the package's account and its group; a symbolic link is followed, the mode kept.
// False, with errno set, when the owner cannot be changed. Throws Error 801 when there is no such
// account. Waits for the platform lock.
QUARRY_EXPORT bool ChownQuarry(const std::string& path);

}  // namespace quarry

#endif  // QUARRY_COMMON_FILE_UTIL_H_
