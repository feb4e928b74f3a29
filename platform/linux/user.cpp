#include "platform/include/user.h"

#include <grp.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <new>
#include <string>
#include <vector>

#include "common/paths.h"
#include "platform/linux/account.h"
#include "platform/linux/last_error.h"

namespace quarry::platform {
namespace {

// The package's own account, and the name that account tools of Linux allow.
constexpr char kServiceAccount[] = "Quarry";
constexpr char kServiceAccountHere[] = "quarry";

// Whoever is in one of these administers the machine.
constexpr const char* kAdminGroups[] = {"sudo", "wheel", "admin"};

struct OwnedUser : TARNUSER {
  explicit OwnedUser(const Account& account) : TARNUSER{}, name(account.name) {
    szName = name.c_str();
    uid = account.uid;
    gid = account.gid;
  }
  std::string name;
};

int HandOut(const Account& account, TARNUSER** user) {
  *user = new (std::nothrow) OwnedUser(account);
  return *user == nullptr ? QUARRY_PLATFORM_FAIL(kErrSystem) : 0;
}

// A private or unprivileged system has no account of its own and belongs to its caller.
bool IsOwnSystem() {
  return !Root().empty() || !MaySwitchUser();
}

bool FindServiceAccount(Account* account) {
  const bool found = MaySwitchUser() && (FindAccount(kServiceAccount, account) ||
                                         FindAccount(kServiceAccountHere, account));
  return found || (IsOwnSystem() && FindAccountByUid(geteuid(), account));
}

// The ids that a switch changes, to return to when it fails half way.
class CurrentIds {
 public:
  CurrentIds() : uid_(geteuid()), gid_(getegid()) {
    const int count = getgroups(0, nullptr);
    if (count > 0) groups_.resize(static_cast<std::size_t>(count));
    if (count > 0 && getgroups(count, groups_.data()) != count) groups_.clear();
  }

  uid_t uid() const { return uid_; }
  gid_t gid() const { return gid_; }

  void Restore() const {
    const int saved = errno;
    if (seteuid(0) != 0 || setgroups(groups_.size(), groups_.data()) != 0 || setegid(gid_) != 0 ||
        seteuid(uid_) != 0) {
      QUARRY_PLATFORM_FAIL(kErrPermission);
    }
    errno = saved;
  }

 private:
  uid_t uid_;
  gid_t gid_;
  std::vector<gid_t> groups_;
};

// Needs an effective user of root. Groups first: afterwards there is no right to change them.
bool Become(const Account& account, bool keep_privilege) {
  constexpr uid_t kSameUid = static_cast<uid_t>(-1);
  constexpr gid_t kSameGid = static_cast<gid_t>(-1);
  const uid_t other_uid = keep_privilege ? kSameUid : account.uid;
  const gid_t other_gid = keep_privilege ? kSameGid : account.gid;
  return setgroups(account.groups.size(), account.groups.data()) == 0 &&
         setresgid(other_gid, account.gid, other_gid) == 0 &&
         setresuid(other_uid, account.uid, keep_privilege ? 0 : account.uid) == 0;
}

}  // namespace

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" {

int TARNUserGet(const char* name, TARNUSER** user) {
  if (user == nullptr) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  *user = nullptr;
  if (name == nullptr) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  Account account;
  const bool found = std::string(name) == kServiceAccount ? FindServiceAccount(&account)
                                                          : FindAccount(name, &account);
  return found ? HandOut(account, user) : QUARRY_PLATFORM_FAIL(kErrNotFound);
}

int TARNUserGetByUID(unsigned int uid, TARNUSER** user) {
  if (user == nullptr) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  *user = nullptr;
  Account account;
  return FindAccountByUid(uid, &account) ? HandOut(account, user)
                                         : QUARRY_PLATFORM_FAIL(kErrNotFound);
}

void TARNUserFree(TARNUSER* user) {
  delete static_cast<OwnedUser*>(user);
}

int HLIBGroupIsAdminGroupMem(const char* name, int) {
  Account account;
  if (name == nullptr || !FindAccount(name, &account)) return QUARRY_PLATFORM_FAIL(kErrNotFound);
  if (account.uid == 0) return 1;
  for (const char* group : kAdminGroups) {
    gid_t gid = 0;
    if (FindGroup(group, &gid) &&
        std::find(account.groups.begin(), account.groups.end(), gid) != account.groups.end()) {
      return 1;
    }
  }
  return 0;
}

}  // extern "C"

bool ResetCredentialsByName(const std::string& name, bool keep_privilege) {
  using namespace quarry::platform;
  if (!MaySwitchUser()) return true;
  Account account;
  if (!FindAccount(name, &account)) {
    QUARRY_PLATFORM_FAIL(kErrNotFound);
    return false;
  }
  const CurrentIds before;
  if (keep_privilege && account.uid == before.uid() && account.gid == before.gid()) return true;
  if (before.uid() != 0 && seteuid(0) != 0) {
    QUARRY_PLATFORM_FAIL(kErrPermission);
    return false;
  }
  if (Become(account, keep_privilege)) return true;
  before.Restore();
  QUARRY_PLATFORM_FAIL(kErrPermission);
  return false;
}
