#include "common/sdk/credentials.h"

#include <grp.h>
#include <unistd.h>

#include <cerrno>

#include "common/lock_file.h"
#include "common/log.h"
#include "common/sdk/share.h"
#include "platform/include/error.h"
#include "platform/include/user.h"

namespace quarry::sdk {
namespace {

std::vector<gid_t> CurrentGroups() {
  const int count = getgroups(0, nullptr);
  std::vector<gid_t> groups(static_cast<size_t>(count < 0 ? 0 : count));
  const int filled = getgroups(static_cast<int>(groups.size()), groups.data());
  groups.resize(static_cast<size_t>(filled < 0 ? 0 : filled));
  return groups;
}

bool Become(const std::string& user) {
  LockMutex lock(SDKMutex());
  return ResetCredentialsByName(user);
}

// Looks up the name of the account `uid`; false with the platform's last error in `error`.
bool NameOf(uid_t uid, std::string& name, int& error) {
  LockMutex lock(SDKMutex());
  TARNUSER* user_info = nullptr;
  if (TARNUserGetByUID(uid, &user_info) < 0 || user_info == nullptr) {
    error = HLIBCErrGet();
    return false;
  }
  name = user_info->szName;
  TARNUserFree(user_info);
  return true;
}

bool IsAdministrator(const std::string& user) {
  LockMutex lock(SDKMutex());
  return HLIBGroupIsAdminGroupMem(user.c_str(), 0) == 1;
}

}  // namespace

SDKCredentials::SDKCredentials() : euid_(geteuid()), egid_(getegid()), groups_(CurrentGroups()) {
  int error = 0;
  if (!NameOf(euid_, username_, error)) {
    Fail(QUARRY_SITE("credentials"), "0 > TARNUserGetByUID(euid_, &user_info) || !user_info",
         kErrorCredentials, "TARNUserGetByUID failed, err=" + std::to_string(error));
  }
}

SDKCredentials::SDKCredentials(const std::string& user)
    : euid_(geteuid()), egid_(getegid()), groups_(CurrentGroups()), username_(user) {
  try {
    AsUser(user);
  } catch (...) {
    // No destructor follows, and the switch may have been made by half.
    RestoreIds();
    throw;
  }
}

SDKCredentials::~SDKCredentials() {
  if (AreIdsRestored()) return;
  const int saved_errno = errno;
  if (Become(username_)) {
    errno = saved_errno;
  } else {
    LogFailure(QUARRY_SITE_AT("credentials", 39), "!ResetCredentialsByName(username_)", "");
  }
  if (!RestoreIds()) LogFailure(QUARRY_SITE("credentials"), "!RestoreIds()", "");
}

void SDKCredentials::AsUser(const std::string& user) {
  // The platform would become the account named before a NUL byte.
  bool done = user.find('\0') == std::string::npos;
  if (done) {
    const std::string target_username = IsAdministrator(user) ? "root" : user;
    done = Become(target_username);
  }
  if (!done) {
    Fail(QUARRY_SITE("credentials"), "!ResetCredentialsByName(target_username)", kErrorCredentials);
  }
}

bool SDKCredentials::AreIdsRestored() const {
  return geteuid() == euid_ && getegid() == egid_;
}

bool SDKCredentials::RestoreIds() {
  if (AreIdsRestored()) return true;
  const int saved_errno = errno;
  // Groups can be changed by root only, so root is the way from one account to another. Where that
  // is not to be had, each id is still set as far as it goes.
  const bool is_root = geteuid() == 0 || seteuid(0) == 0;
  const bool groups_restored = !is_root || setgroups(groups_.size(), groups_.data()) == 0;
  const bool group_restored = setegid(egid_) == 0;
  const bool user_restored = seteuid(euid_) == 0;
  if (!groups_restored || !group_restored || !user_restored) return false;
  errno = saved_errno;
  return true;
}

}  // namespace quarry::sdk
