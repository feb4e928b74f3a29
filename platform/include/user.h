// Accounts, and becoming one of them.
//
// Functions that return int return 0 on success (or the value said) and a negative number on
// failure, with the platform's last error set (platform/include/error.h). None is safe for threads:
// callers hold one lock around them.

#ifndef QUARRY_PLATFORM_INCLUDE_USER_H_
#define QUARRY_PLATFORM_INCLUDE_USER_H_

#include <string>

#include "common/export.h"

// One account's record, owned by the platform, released with TARNUserFree.
struct TARNUSER {
  const char* szName;
  unsigned int uid;
  unsigned int gid;  // the primary group
};

extern "C" {

// Looks an account up by name or by user id. On failure *user is left null.
QUARRY_EXPORT int TARNUserGet(const char* name, TARNUSER** user);
QUARRY_EXPORT int TARNUserGetByUID(unsigned int uid, TARNUSER** user);

// Releases a record; null is allowed.
QUARRY_EXPORT void TARNUserFree(TARNUSER* user);

// Whether the account is a member of the administrators' group: 1, 0, or negative. `flags` is 0.
QUARRY_EXPORT int HLIBGroupIsAdminGroupMem(const char* name, int flags);

}  // extern "C"

// Makes the account the effective user of the whole process, with its groups. Returns whether it
// did; the platform's last error is set when not. With `keep_privilege` the process may switch
// again afterwards. A process that was started without the right to switch is every account it is
// asked to become, and succeeds without effect.
QUARRY_EXPORT bool ResetCredentialsByName(const std::string& name, bool keep_privilege = true);

#endif  // QUARRY_PLATFORM_INCLUDE_USER_H_
