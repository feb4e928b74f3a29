#include "platform/linux/account.h"

#include <grp.h>
#include <pwd.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>

#include "platform/linux/keep_errno.h"

namespace quarry::platform {
namespace {

constexpr std::size_t kFirstBuffer = 4096;
constexpr std::size_t kLastBuffer = std::size_t{4} << 20;
constexpr int kMaxGroups = 65536;

// Asks `lookup(record, buffer, size, &result)` with buffers that grow until the entry fits.
template <typename Record, typename Lookup>
bool LookUp(Record* record, std::vector<char>* buffer, const Lookup& lookup) {
  const KeepErrno keep;
  for (std::size_t size = kFirstBuffer; size <= kLastBuffer; size *= 4) {
    buffer->resize(size);
    Record* result = nullptr;
    int error;
    do {
      error = lookup(record, buffer->data(), size, &result);
    } while (error == EINTR);
    if (error == 0) return result != nullptr;
    if (error != ERANGE) return false;
  }
  return false;
}

std::vector<gid_t> GroupsOf(const char* name, gid_t primary) {
  std::vector<gid_t> groups(64);
  while (true) {
    int count = static_cast<int>(groups.size());
    if (getgrouplist(name, primary, groups.data(), &count) >= 0) {
      groups.resize(static_cast<std::size_t>(count));
      return groups;
    }
    if (count <= static_cast<int>(groups.size()) || count > kMaxGroups) return {primary};
    groups.resize(static_cast<std::size_t>(count));
  }
}

// The caller where no account has its number, as in a container. Its name is the number.
Account NamelessCaller() {
  Account account;
  account.name = std::to_string(geteuid());
  account.uid = geteuid();
  account.gid = getegid();
  account.groups = {account.gid};
  return account;
}

void Fill(const passwd& entry, Account* account) {
  account->name = entry.pw_name;
  account->uid = entry.pw_uid;
  account->gid = entry.pw_gid;
  account->groups = GroupsOf(entry.pw_name, entry.pw_gid);
}

}  // namespace

bool FindAccount(const std::string& name, Account* account) {
  if (name.empty() || name.find('\0') != std::string::npos) return false;
  passwd entry{};
  std::vector<char> buffer;
  const bool found = LookUp(&entry, &buffer, [&](passwd* e, char* b, std::size_t n, passwd** r) {
    return getpwnam_r(name.c_str(), e, b, n, r);
  });
  if (found) Fill(entry, account);
  return found || (name == std::to_string(geteuid()) && FindAccountByUid(geteuid(), account) &&
                   account->name == name);
}

bool FindAccountByUid(uid_t uid, Account* account) {
  passwd entry{};
  std::vector<char> buffer;
  const bool found = LookUp(&entry, &buffer, [&](passwd* e, char* b, std::size_t n, passwd** r) {
    return getpwuid_r(uid, e, b, n, r);
  });
  if (found) {
    Fill(entry, account);
  } else if (uid == geteuid()) {
    *account = NamelessCaller();
  }
  return found || uid == geteuid();
}

bool FindGroup(const std::string& name, gid_t* gid) {
  group entry{};
  std::vector<char> buffer;
  const bool found = LookUp(&entry, &buffer, [&](group* e, char* b, std::size_t n, group** r) {
    return getgrnam_r(name.c_str(), e, b, n, r);
  });
  if (found) *gid = entry.gr_gid;
  return found;
}

bool MaySwitchUser() {
  uid_t real = 0;
  uid_t effective = 0;
  uid_t saved = 0;
  if (getresuid(&real, &effective, &saved) != 0) return false;
  return real == 0 || effective == 0 || saved == 0;
}

}  // namespace quarry::platform
