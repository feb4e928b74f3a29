// Setting the platform's last error.

#ifndef QUARRY_PLATFORM_LINUX_LAST_ERROR_H_
#define QUARRY_PLATFORM_LINUX_LAST_ERROR_H_

namespace quarry::platform {

// Numbers of our own, beside those that platform/include/error.h fixes.
enum LastError {
  kErrBadParameter = 0x0D00,
  kErrNotFound = 0x1400,
  kErrNameTooLong = 0x0700,
  kErrSystem = 0x0200,
  kErrShareFile = 0x1300,
  kErrService = 0x2000,
  kErrPermission = 0x0900,
};

// Sets the calling thread's last error and returns -1. `file` must live for ever.
int SetLastError(int error, const char* file, int line);

// The same with the place of the call.
#define QUARRY_PLATFORM_FAIL(error) ::quarry::platform::SetLastError(error, __FILE_NAME__, __LINE__)

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_LAST_ERROR_H_
