#include "platform/include/share.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>
#include <string>

#include "platform/linux/account.h"
#include "platform/linux/last_error.h"
#include "platform/linux/path_name.h"
#include "platform/linux/share_store.h"

namespace quarry::platform {
namespace {

// A record as it is handed out, with what it points to.
struct OwnedShare : TARNSHARE {
  explicit OwnedShare(const ShareRecord& share) : TARNSHARE{}, record(share) {
    szName = record.name.c_str();
    szPath = record.path.c_str();
    ftpPrivilege = record.read_only ? TARN_PRIV_READ_ONLY : TARN_PRIV_READ_WRITE;
  }
  ShareRecord record;
};

int GetFlag(const TARNSHARE* share, bool ShareRecord::*flag, int* value) {
  if (share == nullptr || value == nullptr) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  *value = static_cast<const OwnedShare*>(share)->record.*flag ? 1 : 0;
  return 0;
}

// What the mode of the share's directory gives the account. Access lists are not looked at.
TARNSharePrivilege PrivilegeOf(const Account& account, const struct stat& info) {
  constexpr unsigned kRead = 4;
  constexpr unsigned kWrite = 2;
  if (account.uid == 0) return TARN_PRIV_READ_WRITE;
  const bool in_group =
      std::find(account.groups.begin(), account.groups.end(), info.st_gid) != account.groups.end();
  const unsigned shift = info.st_uid == account.uid ? 6 : in_group ? 3 : 0;
  const unsigned bits = info.st_mode >> shift;
  if ((bits & kRead) == 0) return TARN_PRIV_NONE;
  return (bits & kWrite) != 0 ? TARN_PRIV_READ_WRITE : TARN_PRIV_READ_ONLY;
}

bool Fits(const std::string& text, const char* buffer, size_t size) {
  return buffer != nullptr && text.size() < size;
}

}  // namespace

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" {

int TARNShareGet(const char* name, TARNSHARE** share) {
  if (share == nullptr) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  *share = nullptr;
  if (name == nullptr) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  const ShareList shares = TryLoadShares();
  if (shares == nullptr) return -1;
  const auto found = std::find_if(shares->begin(), shares->end(),
                                  [&](const ShareRecord& record) { return record.name == name; });
  if (found == shares->end() || !IsShown(*found)) return QUARRY_PLATFORM_FAIL(kErrNotFound);
  *share = new (std::nothrow) OwnedShare(*found);
  return *share == nullptr ? QUARRY_PLATFORM_FAIL(kErrSystem) : 0;
}

void TARNShareFree(TARNSHARE* share) {
  delete static_cast<OwnedShare*>(share);
}

int TARNShareNamePathGet(const char* full_path, char* name, size_t name_size, char* path,
                         size_t path_size) {
  if (full_path == nullptr || *full_path != '/') return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  const ShareList shares = TryLoadShares();
  if (shares == nullptr) return -1;
  const ShareRecord* share = ShareHolding(*shares, full_path);
  if (share == nullptr || !IsShown(*share)) return QUARRY_PLATFORM_FAIL(kErrNotFound);
  if (!Fits(share->name, name, name_size) || !Fits(share->path, path, path_size)) {
    return QUARRY_PLATFORM_FAIL(kErrNameTooLong);
  }
  std::memcpy(name, share->name.c_str(), share->name.size() + 1);
  std::memcpy(path, share->path.c_str(), share->path.size() + 1);
  return 0;
}

int HLIBShareEnum(HLIBCSZLIST** list, HLIBShareEnumFunc enum_func) {
  if (list == nullptr || enum_func == nullptr) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  const ShareList shares = TryLoadShares();
  if (shares == nullptr) return -1;
  for (const ShareRecord& share : *shares) {
    if (enum_func(share.name.c_str(), list) < 0) return QUARRY_PLATFORM_FAIL(kErrSystem);
  }
  return 0;
}

int HLIBShareHideUnreadableGet(const TARNSHARE* share, int* hidden) {
  return GetFlag(share, &ShareRecord::hide_unreadable, hidden);
}

int HLIBShareIsEncryptedGet(const TARNSHARE* share, int* encrypted) {
  return GetFlag(share, &ShareRecord::encrypted, encrypted);
}

int HLIBShareIsReadOnlyGet(const TARNSHARE* share, int* read_only) {
  return GetFlag(share, &ShareRecord::read_only, read_only);
}

int HLIBShareIsEncryptionGet(const TARNSHARE* share, int* encryption) {
  return GetFlag(share, &ShareRecord::encryption, encryption);
}

int HLIBShareRecycleStatusGet(const TARNSHARE* share, int* enabled) {
  return GetFlag(share, &ShareRecord::recycle_bin, enabled);
}

int TARNShareUserPrivGet(const TARNSHARE* share, const char* user) {
  if (share == nullptr || user == nullptr) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  Account account;
  if (!FindAccount(user, &account)) return QUARRY_PLATFORM_FAIL(kErrNotFound);
  struct stat info {};
  if (stat(share->szPath, &info) != 0) return QUARRY_PLATFORM_FAIL(kErrSystem);
  const TARNSharePrivilege privilege = PrivilegeOf(account, info);
  const bool read_only = static_cast<const OwnedShare*>(share)->record.read_only;
  return read_only ? std::min(privilege, TARN_PRIV_READ_ONLY) : privilege;
}

}  // extern "C"
