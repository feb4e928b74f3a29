// Who may use a place, and which names the system keeps for itself.

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <iterator>

#include "platform/include/filesystem.h"
#include "platform/linux/keep_errno.h"
#include "platform/linux/last_error.h"

namespace quarry::platform {
namespace {

constexpr int kPermissionBits[] = {X_OK, W_OK, R_OK};  // 1, 2 and 4, as the platform's own

// The directories in which systems keep data about files: the appliance's, what a repair of a file
// system has found, and the snapshots that common tools and file systems keep in place.
constexpr const char* kHiddenDirectories[] = {"@eaDir", "lost+found", ".snapshots", ".zfs"};

}  // namespace

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" {

int TARNEAIsHiddenDir(const char* name) {
  if (name == nullptr) return 0;
  return std::any_of(std::begin(kHiddenDirectories), std::end(kHiddenDirectories),
                     [&](const char* hidden) { return std::strcmp(hidden, name) == 0; })
             ? 1
             : 0;
}

int TARNACLPermGet(const char* path) {
  if (path == nullptr || faccessat(AT_FDCWD, path, F_OK, AT_EACCESS) != 0) {
    return QUARRY_PLATFORM_FAIL(kErrNotFound);
  }
  const KeepErrno keep;
  int bits = 0;
  for (const int bit : kPermissionBits) {
    if (faccessat(AT_FDCWD, path, bit, AT_EACCESS) == 0) bits |= bit;
  }
  return bits;
}

}  // extern "C"
