// Recycle bins of shares and of users' home folders.

#ifndef QUARRY_PLATFORM_INCLUDE_RECYCLE_H_
#define QUARRY_PLATFORM_INCLUDE_RECYCLE_H_

#include "common/export.h"

extern "C" {

// Whether `full_path` is, or lies in, the recycle bin of a share: 1, 0, or negative on failure.
QUARRY_EXPORT int TARNShareIsShareRecycle(const char* full_path);

// Whether `full_path` is, or lies in, the recycle bin of a user's home folder: 1, 0, or negative on
// failure. `kind` is the constant 11.
QUARRY_EXPORT int TARNRecycleUserHomePathIsExist(const char* full_path, int kind);

}  // extern "C"

#endif  // QUARRY_PLATFORM_INCLUDE_RECYCLE_H_
