// Recycle bins of shares and of users' home folders.

#ifndef QUARRY_PLATFORM_INCLUDE_RECYCLE_H_
#define QUARRY_PLATFORM_INCLUDE_RECYCLE_H_

#include "common/export.h"
#include "platform/include/list.h"

// Where an account is kept.
enum AUTH_TYPE : int { AUTH_TYPE_LOCAL = 0, AUTH_TYPE_DOMAIN = 1, AUTH_TYPE_LDAP = 2 };

extern "C" {

// Whether `full_path` is, or lies in, the recycle bin of a share: 1, 0, or negative on failure. 0
// where the share's recycle bin is switched off (HLIBShareRecycleStatusGet), whatever is left of
// it.
QUARRY_EXPORT int TARNShareIsShareRecycle(const char* full_path);

// Whether `full_path` is, or lies in, the recycle bin of a user's home folder: 1, 0, or negative on
// failure. 0 where the recycle bin of the share that holds the home folders is switched off. `kind`
// is the constant 11.
QUARRY_EXPORT int TARNRecycleUserHomePathIsExist(const char* full_path, int kind);

// Append the full paths of the recycle bins that home folders have, in ascending byte order: those
// of all accounts, or those of one kind. The list may move. 0, also when there are none, or another
// number on failure, with errno set.
QUARRY_EXPORT int TARNRecycleHomeEnumRecyclePath(HLIBCSZLIST** list);
QUARRY_EXPORT int TARNRecycleHomeEnumRecyclePathForAuthType(HLIBCSZLIST** list, AUTH_TYPE auth);

}  // extern "C"

#endif  // QUARRY_PLATFORM_INCLUDE_RECYCLE_H_
