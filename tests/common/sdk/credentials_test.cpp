#include "common/sdk/credentials.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "common/error.h"
#include "tests/common/sdk/lock_held.h"
#include "tests/fake_platform/fixture.h"

namespace quarry::sdk {
namespace {

using Strings = std::vector<std::string>;
using Ids = std::pair<uid_t, gid_t>;

Ids Now() {
  return {geteuid(), getegid()};
}

// Starts as "alice", who is no administrator.
class CredentialsTest : public fake::FakePlatformTest {
 protected:
  CredentialsTest() {
    fake::AddUser({"alice", 1001, 101, false});
    fake::AddUser({"bob", 1002, 102, false});
    fake::AddUser({"carol", 1003, 103, true});
    fake::SetEffectiveIds(1001, 101);
    fake::OnCall([](const std::string& function) { EXPECT_FALSE(IsSDKMutexFree()) << function; });
  }
  ~CredentialsTest() override { fake::OnCall(nullptr); }

  const Ids alice_{1001, 101};
  const Ids bob_{1002, 102};
  const Ids root_{0, 0};
};

TEST_F(CredentialsTest, UserIsBecomeAndLeft) {
  {
    SDKCredentials credentials;
    EXPECT_EQ(Now(), alice_);
    credentials.AsUser("bob");
    EXPECT_EQ(Now(), bob_);
  }
  EXPECT_EQ(Now(), alice_);
  EXPECT_EQ(
      fake::Calls(),
      Strings({"TARNUserGetByUID(1001)", "TARNUserFree(alice)", "HLIBGroupIsAdminGroupMem(bob, 0)",
               "ResetCredentialsByName(bob, true)", "ResetCredentialsByName(alice, true)"}));
  EXPECT_TRUE(fake::Logs().empty());
}

TEST_F(CredentialsTest, NothingIsDoneWhereNothingChanged) {
  { SDKCredentials credentials; }
  EXPECT_TRUE(fake::CallsOf("ResetCredentialsByName").empty());
  EXPECT_EQ(fake::SystemCallCount("seteuid"), 0);
}

TEST_F(CredentialsTest, AdministratorIsServedAsRoot) {
  SDKCredentials credentials;
  credentials.AsUser("carol");
  EXPECT_EQ(Now(), root_);
  EXPECT_EQ(fake::CallsOf("ResetCredentialsByName"),
            Strings({"ResetCredentialsByName(root, true)"}));
}

TEST_F(CredentialsTest, MembershipThatIsNotOneIsNone) {
  for (const int answer : {-1, 0, 2}) {
    fake::ClearCalls();
    fake::FailCall("HLIBGroupIsAdminGroupMem", 1, {answer});
    SDKCredentials credentials;
    credentials.AsUser("bob");
    EXPECT_EQ(fake::CallsOf("ResetCredentialsByName"),
              Strings({"ResetCredentialsByName(bob, true)"}));
  }
}

TEST_F(CredentialsTest, LastOfSeveralUsersIsLeftForTheFirst) {
  {
    SDKCredentials credentials;
    credentials.AsUser("bob");
    credentials.AsUser("carol");
    EXPECT_EQ(Now(), root_);
  }
  EXPECT_EQ(Now(), alice_);
}

TEST_F(CredentialsTest, UnknownCurrentUserIsAnError) {
  fake::SetPlatformError(5120);
  fake::FailCall("TARNUserGetByUID", 1, {-1, ESRCH});
  EXPECT_EQ(FailureOf([] { SDKCredentials credentials; }), "503 TARNUserGetByUID failed, err=5120");
  ASSERT_EQ(fake::Logs().size(), 1u);
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("credentials", 1, "SDKCredentials")) +
                "Failed [0 > TARNUserGetByUID(euid_, &user_info) || !user_info], reason: "
                "TARNUserGetByUID failed, err=5120 [err: No such process]");
}

TEST_F(CredentialsTest, MissingRecordOfTheCurrentUserIsAnError) {
  fake::FailCall("TARNUserGetByUID", 1, {0});
  EXPECT_EQ(FailureOf([] { SDKCredentials credentials; }), "503 TARNUserGetByUID failed, err=0");
}

TEST_F(CredentialsTest, FailedSwitchIsAnErrorAndTheNextMaySucceed) {
  SDKCredentials credentials;
  fake::FailCall("ResetCredentialsByName", 1, {0, EPERM});
  EXPECT_EQ(FailureOf([&] { credentials.AsUser("bob"); }), "503 ");
  ASSERT_EQ(fake::Logs().size(), 1u);
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("credentials", 1, "AsUser")) +
                "Failed [!ResetCredentialsByName(target_username)], reason:  "
                "[err: Operation not permitted]");
  credentials.AsUser("bob");
  EXPECT_EQ(Now(), bob_);
}

TEST_F(CredentialsTest, UserWithNulByteIsRefused) {
  SDKCredentials credentials;
  EXPECT_EQ(FailureOf([&] { credentials.AsUser(std::string("bob\0x", 5)); }), "503 ");
  EXPECT_EQ(Now(), alice_);
  EXPECT_TRUE(fake::CallsOf("ResetCredentialsByName").empty());
}

// ---- The constructor with a user

TEST_F(CredentialsTest, ConstructorBecomesTheUser) {
  const SDKCredentials credentials("bob");
  EXPECT_EQ(Now(), bob_);
  EXPECT_EQ(fake::Calls(),
            Strings({"HLIBGroupIsAdminGroupMem(bob, 0)", "ResetCredentialsByName(bob, true)"}));
}

TEST_F(CredentialsTest, ReturnIsByTheNameOfTheConstructorAndThenToTheRecordedIds) {
  { const SDKCredentials credentials("root"); }
  EXPECT_EQ(fake::CallsOf("ResetCredentialsByName"),
            Strings({"ResetCredentialsByName(root, true)", "ResetCredentialsByName(root, true)"}));
  EXPECT_EQ(Now(), alice_);
  EXPECT_EQ(fake::SystemCallCount("setgroups"), 1);
  EXPECT_TRUE(fake::Logs().empty());
}

TEST_F(CredentialsTest, RootReturnsToRoot) {
  fake::SetEffectiveIds(0, 0);
  {
    const SDKCredentials credentials("bob");
    EXPECT_EQ(Now(), bob_);
  }
  EXPECT_EQ(Now(), root_);
}

TEST_F(CredentialsTest, GroupAloneIsRestoredToo) {
  fake::SetEffectiveIds(1001, 7);
  {
    SDKCredentials credentials;
    credentials.AsUser("alice");
    EXPECT_EQ(Now(), alice_);
  }
  EXPECT_EQ(Now(), Ids(1001, 7));
}

TEST_F(CredentialsTest, FailedConstructorLeavesNoPrivilegeBehind) {
  // The platform gets half-way and fails.
  fake::OnCall([](const std::string& function) {
    if (function == "ResetCredentialsByName") fake::SetEffectiveIds(0, 101);
  });
  fake::FailCall("ResetCredentialsByName");
  EXPECT_EQ(FailureOf([] { SDKCredentials credentials("root"); }), "503 ");
  EXPECT_EQ(Now(), alice_);
}

TEST_F(CredentialsTest, FailedReturnIsLoggedAndTheIdsRestored) {
  auto credentials = std::make_unique<SDKCredentials>();
  credentials->AsUser("carol");
  fake::FailCall("ResetCredentialsByName", 1, {0, EPERM});
  const std::string head = fake::LogHead("credentials", 39, "~SDKCredentials");
  credentials.reset();
  EXPECT_EQ(fake::Logs(), Strings({head + "Failed [!ResetCredentialsByName(username_)], reason:  "
                                          "[err: Operation not permitted]"}));
  EXPECT_EQ(Now(), alice_);
}

TEST_F(CredentialsTest, IdsThatCannotBeRestoredAreLogged) {
  auto credentials = std::make_unique<SDKCredentials>("root");
  fake::FailEverySystemCall("seteuid", EPERM);
  credentials.reset();
  ASSERT_EQ(fake::Logs().size(), 1u);
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("credentials", 1, "~SDKCredentials")) +
                "Failed [!RestoreIds()], reason:  [err: Operation not permitted]");
}

TEST_F(CredentialsTest, GroupsThatCannotBeSetAreLoggedAndDoNotStopTheReturn) {
  auto credentials = std::make_unique<SDKCredentials>("root");
  fake::FailEverySystemCall("setgroups", EPERM);
  credentials.reset();
  EXPECT_EQ(Now(), alice_);
  ASSERT_EQ(fake::Logs().size(), 1u);
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("credentials", 1, "~SDKCredentials")) +
                "Failed [!RestoreIds()], reason:  [err: Operation not permitted]");
}

TEST_F(CredentialsTest, GroupThatCannotBeSetDoesNotStopTheReturn) {
  auto credentials = std::make_unique<SDKCredentials>("root");
  fake::FailEverySystemCall("setegid", EPERM);
  credentials.reset();
  EXPECT_EQ(Now(), Ids(1001, 0));
  EXPECT_EQ(
      fake::LogsWith("Failed [!RestoreIds()], reason:  [err: Operation not permitted]").size(), 1u);
}

TEST_F(CredentialsTest, IdsAreRestoredAsFarAsTheyGoWithoutTheWayThroughRoot) {
  // The platform became another account and gave the way back up.
  auto credentials = std::make_unique<SDKCredentials>("bob");
  fake::FailCall("ResetCredentialsByName", 1, {0, EPERM});
  fake::FailSystemCall("seteuid", 1, EPERM);
  credentials.reset();
  EXPECT_EQ(Now(), alice_);
  EXPECT_EQ(fake::SystemCallCount("setgroups"), 0);
  EXPECT_EQ(fake::Logs().size(), 1u);
}

TEST_F(CredentialsTest, ReturnLeavesErrnoAlone) {
  auto credentials = std::make_unique<SDKCredentials>("root");
  errno = ENOSPC;
  credentials.reset();
  EXPECT_EQ(errno, ENOSPC);
  EXPECT_TRUE(fake::Logs().empty());
}

TEST_F(CredentialsTest, FailedReturnIsLoggedByTheErrnoThatStandsAndClearsIt) {
  for (const bool is_set : {true, false}) {
    auto credentials = std::make_unique<SDKCredentials>("bob");
    fake::ClearLogs();
    fake::FailCall("ResetCredentialsByName", 1, {0});
    const std::string head = fake::LogHead("credentials", 39, "~SDKCredentials");
    errno = is_set ? ENOSPC : 0;
    credentials.reset();
    EXPECT_EQ(errno, 0);
    EXPECT_EQ(fake::Logs(),
              Strings({head + "Failed [!ResetCredentialsByName(username_)], reason: " +
                       (is_set ? " [err: No space left on device]" : "")}));
    EXPECT_EQ(Now(), alice_);
  }
}

TEST_F(CredentialsTest, ScopesNest) {
  {
    const SDKCredentials outer("bob");
    {
      const SDKCredentials inner("root");
      EXPECT_EQ(Now(), root_);
    }
    EXPECT_EQ(Now(), bob_);
  }
  EXPECT_EQ(Now(), alice_);
}

}  // namespace
}  // namespace quarry::sdk
