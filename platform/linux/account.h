// Accounts of this machine.

#ifndef QUARRY_PLATFORM_LINUX_ACCOUNT_H_
#define QUARRY_PLATFORM_LINUX_ACCOUNT_H_

#include <sys/types.h>

#include <string>
#include <vector>

namespace quarry::platform {

struct Account {
  std::string name;
  uid_t uid = 0;
  gid_t gid = 0;
  std::vector<gid_t> groups;  // all groups, the primary one among them
};

// Looks an account up in the account database. False when there is none. The caller is found even
// where no account has its number, under that number as its name.
bool FindAccount(const std::string& name, Account* account);
bool FindAccountByUid(uid_t uid, Account* account);

// The id of a group of the account database. False when there is none.
bool FindGroup(const std::string& name, gid_t* gid);

// Whether this process was started with the right to become other users: its real, effective or
// saved user is root.
bool MaySwitchUser();

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_ACCOUNT_H_
