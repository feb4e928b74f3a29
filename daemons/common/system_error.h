// Reporting failed system calls of daemons.

#ifndef QUARRY_DAEMONS_COMMON_SYSTEM_ERROR_H_
#define QUARRY_DAEMONS_COMMON_SYSTEM_ERROR_H_

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <string>
#include <system_error>

#include "common/error.h"

namespace quarry::daemon {

// Throws Error 502: "what: text of errno".
[[noreturn]] inline void ThrowSystemError(const std::string& what) {
  throw Error(kErrorSystem, what + ": " + std::generic_category().message(errno));
}

// Creates the directories above `path` that are missing. Throws Error 502.
inline void MakeParentDirectories(const std::string& path) {
  const std::filesystem::path parent = std::filesystem::path(path).parent_path();
  std::error_code error;
  std::filesystem::create_directories(parent, error);
  if (error) {
    throw Error(kErrorSystem, "Cannot create " + parent.string() + ": " + error.message());
  }
}

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_SYSTEM_ERROR_H_
