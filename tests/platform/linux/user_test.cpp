#include "platform/include/user.h"

#include <grp.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <string>
#include <vector>

#include "platform/include/error.h"
#include "platform/linux/account.h"
#include "platform/linux/last_error.h"
#include "tests/platform/linux/child.h"

namespace quarry::platform {
namespace {

using test::RunInChild;

// An ordinary account that every Linux has.
constexpr char kOther[] = "daemon";

Account OtherAccount() {
  Account account;
  EXPECT_TRUE(FindAccount(kOther, &account));
  return account;
}

std::vector<gid_t> CurrentGroups() {
  std::vector<gid_t> groups(static_cast<std::size_t>(getgroups(0, nullptr)));
  groups.resize(
      static_cast<std::size_t>(getgroups(static_cast<int>(groups.size()), groups.data())));
  std::sort(groups.begin(), groups.end());
  return groups;
}

// Makes this process one that cannot switch, if it is not already.
bool DropRoot() {
  if (geteuid() != 0) return true;
  const Account account = OtherAccount();
  return setgroups(0, nullptr) == 0 && setresgid(account.gid, account.gid, account.gid) == 0 &&
         setresuid(account.uid, account.uid, account.uid) == 0;
}

TEST(UserTest, LooksAccountsUpByNameAndByNumber) {
  TARNUSER* user = nullptr;
  ASSERT_EQ(TARNUserGet("root", &user), 0);
  EXPECT_STREQ(user->szName, "root");
  EXPECT_EQ(user->uid, 0u);
  EXPECT_EQ(user->gid, 0u);
  TARNUserFree(user);
  ASSERT_EQ(TARNUserGetByUID(OtherAccount().uid, &user), 0);
  EXPECT_STREQ(user->szName, kOther);
  EXPECT_EQ(user->gid, OtherAccount().gid);
  TARNUserFree(user);
}

TEST(UserTest, FailsForAccountsThatAreNot) {
  for (const char* name : {"", "no such account", "no:such"}) {
    auto* user = reinterpret_cast<TARNUSER*>(1);
    EXPECT_LT(TARNUserGet(name, &user), 0);
    EXPECT_EQ(user, nullptr);
    EXPECT_EQ(HLIBCErrGet(), kErrNotFound);
    EXPECT_LT(HLIBGroupIsAdminGroupMem(name, 0), 0);
  }
  TARNUSER* user = nullptr;
  EXPECT_LT(TARNUserGetByUID(3999999999u, &user), 0);
  EXPECT_LT(TARNUserGet(nullptr, &user), 0);
  EXPECT_LT(TARNUserGet("root", nullptr), 0);
  EXPECT_LT(TARNUserGetByUID(0, nullptr), 0);
  EXPECT_LT(HLIBGroupIsAdminGroupMem(nullptr, 0), 0);
  TARNUserFree(nullptr);
}

TEST(UserTest, APrivateSystemsAccountIsItsCaller) {
  Account own;
  const bool has_account = FindAccount("Quarry", &own) || FindAccount("quarry", &own);
  TARNUSER* user = nullptr;
  ASSERT_EQ(TARNUserGet("Quarry", &user), 0);
  EXPECT_EQ(user->uid, geteuid() == 0 && has_account ? own.uid : geteuid());
  TARNUserFree(user);
  EXPECT_EQ(RunInChild([] {
              TARNUSER* mine = nullptr;
              return DropRoot() && TARNUserGet("Quarry", &mine) == 0 && mine->uid == geteuid() ? 0
                                                                                               : 1;
            }),
            0);
}

TEST(UserTest, TheCallerIsAlwaysAnAccount) {
  TARNUSER* user = nullptr;
  ASSERT_EQ(TARNUserGetByUID(geteuid(), &user), 0);
  EXPECT_EQ(user->uid, geteuid());
  const std::string name = user->szName;
  TARNUserFree(user);
  ASSERT_EQ(TARNUserGet(name.c_str(), &user), 0);
  EXPECT_EQ(user->uid, geteuid());
  TARNUserFree(user);
}

// Containers run programs under numbers that no account has.
TEST(UserTest, ACallerWithoutAnAccountIsItsNumber) {
  EXPECT_EQ(RunInChild([] {
              if (geteuid() != 0) return 0;
              constexpr uid_t kUid = 1234567;
              TARNUSER* user = nullptr;
              if (TARNUserGetByUID(kUid, &user) == 0 || TARNUserGet("1234567", &user) == 0) {
                return 1;
              }
              if (setresuid(kUid, kUid, kUid) != 0) return 2;
              if (TARNUserGetByUID(kUid, &user) != 0) return 3;
              if (std::string(user->szName) != "1234567" || user->uid != kUid) return 4;
              TARNUserFree(user);
              if (TARNUserGet("1234567", &user) != 0 || user->gid != getegid()) return 5;
              TARNUserFree(user);
              if (TARNUserGet("7654321", &user) == 0) return 6;
              return HLIBGroupIsAdminGroupMem("1234567", 0) == 0 ? 0 : 7;
            }),
            0);
}

TEST(UserTest, TheNumberOfAnAccountIsNoName) {
  TARNUSER* user = nullptr;
  EXPECT_LT(TARNUserGet("0", &user), 0);
  EXPECT_EQ(user, nullptr);
}

TEST(AdminGroupTest, RootAdministersAndServiceAccountsDoNot) {
  EXPECT_EQ(HLIBGroupIsAdminGroupMem("root", 0), 1);
  EXPECT_EQ(HLIBGroupIsAdminGroupMem(kOther, 0), 0);
}

TEST(AdminGroupTest, MembersOfTheAdministratorsGroupsDo) {
  for (const char* name : {"sudo", "wheel", "admin"}) {
    const group* entry = getgrnam(name);
    for (char** member = entry == nullptr ? nullptr : entry->gr_mem; member && *member; ++member) {
      EXPECT_EQ(HLIBGroupIsAdminGroupMem(*member, 0), 1) << *member;
    }
    gid_t gid = 0;
    EXPECT_EQ(FindGroup(name, &gid), getgrnam(name) != nullptr);
  }
}

TEST(CredentialsTest, AnUnprivilegedProcessIsEveryAccount) {
  EXPECT_EQ(RunInChild([] {
              if (!DropRoot()) return 1;
              const uid_t uid = geteuid();
              for (const char* name : {"root", kOther, "no such account", ""}) {
                if (!ResetCredentialsByName(name, true)) return 2;
                if (!ResetCredentialsByName(name, false)) return 3;
              }
              return geteuid() == uid && !MaySwitchUser() ? 0 : 4;
            }),
            0);
}

TEST(CredentialsTest, RootBecomesAnotherUserAndReturns) {
  const Account other = OtherAccount();
  EXPECT_EQ(RunInChild([&] {
              if (geteuid() != 0) return 0;
              if (!ResetCredentialsByName(kOther, true)) return 1;
              if (geteuid() != other.uid || getegid() != other.gid) return 2;
              std::vector<gid_t> wanted = other.groups;
              std::sort(wanted.begin(), wanted.end());
              if (CurrentGroups() != wanted) return 3;
              if (!MaySwitchUser()) return 4;
              if (!ResetCredentialsByName("nobody", true)) return 5;
              if (geteuid() == other.uid) return 6;
              if (!ResetCredentialsByName("root", true)) return 7;
              return geteuid() == 0 && getegid() == 0 ? 0 : 8;
            }),
            0);
}

TEST(CredentialsTest, WithoutKeepingThePrivilegeThereIsNoWayBack) {
  EXPECT_EQ(RunInChild([] {
              if (geteuid() != 0) return 0;
              if (!ResetCredentialsByName(kOther, false)) return 1;
              if (MaySwitchUser()) return 2;
              return seteuid(0) != 0 && errno == EPERM ? 0 : 3;
            }),
            0);
}

TEST(CredentialsTest, AnUnknownAccountChangesNothing) {
  EXPECT_EQ(RunInChild([] {
              if (geteuid() != 0) return 0;
              if (ResetCredentialsByName("no such account", true)) return 1;
              if (geteuid() != 0 || getegid() != 0) return 2;
              if (!ResetCredentialsByName(kOther, true)) return 3;
              const uid_t uid = geteuid();
              if (ResetCredentialsByName("no such account", true)) return 4;
              return geteuid() == uid ? 0 : 5;
            }),
            0);
}

}  // namespace
}  // namespace quarry::platform
