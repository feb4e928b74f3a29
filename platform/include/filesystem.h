// What a place in the file system is, who may use it, and how much room it has.
//
// Paths are NUL-terminated bytes. A negative result sets the platform's last error
// (platform/include/error.h). All may be called from any thread, and block as long as the file
// system does.

#ifndef QUARRY_PLATFORM_INCLUDE_FILESYSTEM_H_
#define QUARRY_PLATFORM_INCLUDE_FILESYSTEM_H_

#include "common/export.h"

// The one file-system type that is never indexed whatever else it is.
constexpr int kTARNFSTypeRefused = 12;

// How TARNFileCopy copies. Zero-filled but for the flags that are wanted.
struct TARNCOPYARGS {
  int preserve;      // 1: keep owner, mode, times, access lists and other attributes
  int move;          // 1: remove the source once it is copied
  int reserved[14];  // the platform's own
};

extern "C" {

// The platform's number for the type of the file system that holds `path`, or negative when it
// cannot be told. `flags` is 0.
QUARRY_EXPORT int TARNGetFSType(const char* path, int flags);

// Whether a type is one of network mounts, or of mounted disc and disk images: 1 or 0.
QUARRY_EXPORT int TARNFSIsRemoteFS(int type);
QUARRY_EXPORT int TARNFSIsImageFS(int type);

// Whether `path` is a mount point other than the root of a share: 1, 0, or negative when it cannot
// be told.
QUARRY_EXPORT int TARNFSDirIsMntPoint(const char* path);

// Writes to *in_snapshot whether `path` lies in a snapshot of a share. 0, or negative on failure.
QUARRY_EXPORT int HLIBFhsPathInSnapshot(const char* path, int* in_snapshot);

// Whether `name`, one path component, is a hidden metadata directory of the platform: 1 or 0.
QUARRY_EXPORT int TARNEAIsHiddenDir(const char* name);

// The permission bits of the process's effective user on `path` (1 execute, 2 write, 4 read), or
// negative.
QUARRY_EXPORT int TARNACLPermGet(const char* path);

// Whether the user `uid` can still write `bytes` bytes to the volume that holds `path`: nonzero if
// so, else 0 with the reason as the platform's last error.
QUARRY_EXPORT int TARNQuotaIsEnough(const char* path, unsigned int uid, unsigned long long bytes);

// Copies a file or a directory with all that is in it. `args` stays the caller's. 0, or negative
// with errno set; what was copied before a failure may be left behind, the source is whole.
QUARRY_EXPORT int TARNFileCopy(const char* from, const char* to, TARNCOPYARGS* args);

// Compares two UTF-8 texts without regard to case: negative, 0 or positive. Bytes that are not
// UTF-8 compare as they are.
QUARRY_EXPORT int HLIBCUnicodeUTF8StrCaseCmp(const char* a, const char* b);

}  // extern "C"

#endif  // QUARRY_PLATFORM_INCLUDE_FILESYSTEM_H_
