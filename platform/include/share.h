// The share database: what shares there are, where they live and how they are set up.
//
// Functions that return int return 0 on success (or the value said) and a negative number on
// failure, with the platform's last error set (platform/include/error.h). None is safe for threads:
// callers hold one lock around them.

#ifndef QUARRY_PLATFORM_INCLUDE_SHARE_H_
#define QUARRY_PLATFORM_INCLUDE_SHARE_H_

#include <cstddef>

#include "common/export.h"
#include "platform/include/list.h"

// One share's record, owned by the platform: got from TARNShareGet, released with TARNShareFree.
struct TARNSHARE {
  const char* szName;  // the share's name
  const char* szPath;  // its full path: the volume's directory, "/" and the name
  int ftpPrivilege;    // the platform's FTP privilege value
};

// The values of TARNShareUserPrivGet.
enum TARNSharePrivilege { TARN_PRIV_NONE = 0, TARN_PRIV_READ_ONLY = 1, TARN_PRIV_READ_WRITE = 2 };

extern "C" {

// Looks a share up by its exact name and hands out a record that the caller releases. On failure
// *share is left null.
QUARRY_EXPORT int TARNShareGet(const char* name, TARNSHARE** share);

// Releases a record; null is allowed.
QUARRY_EXPORT void TARNShareFree(TARNSHARE* share);

// Finds the share that holds the absolute path `full_path` (the share's own root included), and
// writes its name and full path, NUL-terminated, into buffers of the sizes given in bytes. The path
// need not exist. Fails for a path outside every share and for a buffer that is too small.
QUARRY_EXPORT int TARNShareNamePathGet(const char* full_path, char* name, size_t name_size,
                                       char* path, size_t path_size);

// Calls `enum_func` with each share's name and `list`. The function returns 0 to go on, a negative
// number to stop; HLIBShareEnum then fails. HLIBCSzListPush of list.h is such a function.
typedef int (*HLIBShareEnumFunc)(const char* name, HLIBCSZLIST** list);
QUARRY_EXPORT int HLIBShareEnum(HLIBCSZLIST** list, HLIBShareEnumFunc enum_func);

// Each writes 1 or 0 to its second argument: whether unreadable files are hidden from users;
// whether the share's files are encrypted at present; whether it can only be read; whether it is
// one that can be encrypted, locked or not; whether its recycle bin is on.
QUARRY_EXPORT int HLIBShareHideUnreadableGet(const TARNSHARE* share, int* hidden);
QUARRY_EXPORT int HLIBShareIsEncryptedGet(const TARNSHARE* share, int* encrypted);
QUARRY_EXPORT int HLIBShareIsReadOnlyGet(const TARNSHARE* share, int* read_only);
QUARRY_EXPORT int HLIBShareIsEncryptionGet(const TARNSHARE* share, int* encryption);
QUARRY_EXPORT int HLIBShareRecycleStatusGet(const TARNSHARE* share, int* enabled);

// The privilege of the account `user` on the share, a TARNSharePrivilege, or negative.
QUARRY_EXPORT int TARNShareUserPrivGet(const TARNSHARE* share, const char* user);

}  // extern "C"

#endif  // QUARRY_PLATFORM_INCLUDE_SHARE_H_
