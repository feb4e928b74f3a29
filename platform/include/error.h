// The platform's last error of the calling thread.

#ifndef QUARRY_PLATFORM_INCLUDE_ERROR_H_
#define QUARRY_PLATFORM_INCLUDE_ERROR_H_

#include "common/export.h"

// Out of space: on the volume, and in the quota.
constexpr int kHLIBErrNoSpace = 0x2900;
constexpr int kHLIBErrQuota = 0x2400;

extern "C" {

// The number, and the source file and line that set it. 0, "" and 0 before any error. A success
// leaves them as they are. The file's name belongs to the platform.
QUARRY_EXPORT int HLIBCErrGet();
QUARRY_EXPORT const char* HLIBCErrorGetFile();
QUARRY_EXPORT int HLIBCErrorGetLine();

}  // extern "C"

#endif  // QUARRY_PLATFORM_INCLUDE_ERROR_H_
