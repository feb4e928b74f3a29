#include "cli/problem.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include "cli/state_check.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "tests/support/files.h"
#include "tests/support/root.h"

namespace quarry::cli {
namespace {

TEST(ExplainTest, SaysWhatToDoForEveryCode) {
  for (const int code : std::initializer_list<int>{kErrorBadParameter,
                                                   kErrorShareEnum,
                                                   kErrorSystem,
                                                   kErrorCredentials,
                                                   kErrorLoadFile,
                                                   kErrorSaveFile,
                                                   kErrorLock,
                                                   kErrorShareNotFound,
                                                   kErrorServiceAccount,
                                                   kErrorTooManyFolders,
                                                   kErrorFolderExists,
                                                   kErrorFolderNotFound,
                                                   kErrorPathNotIndexable,
                                                   kErrorMalformedEvent,
                                                   kErrorEngineRequest,
                                                   kErrorParseDocument,
                                                   kErrorEngineQuery,
                                                   kErrorNoSpace,
                                                   kErrorEngineBusy,
                                                   kErrorEngineBusyMemory,
                                                   engine::kDamagedIndex,
                                                   engine::kMovingIndex}) {
    const std::string text = Explain(Error(static_cast<ErrorCode>(code), ""));
    EXPECT_EQ(text.find("The request failed"), std::string::npos) << code;
    EXPECT_NE(text.find(" (code " + std::to_string(code) + ")"), std::string::npos) << text;
  }
}

TEST(ExplainTest, AddsTheReason) {
  EXPECT_EQ(Explain(Error(kErrorFolderNotFound, "/Music/live")),
            "No such folder is indexed; \"quarry folder list\" names those there are: /Music/live "
            "(code 902)");
}

TEST(ExplainTest, TellsALockThatMayNotBeUsedFromOneThatIsHeld) {
  EXPECT_EQ(Explain(Error(kErrorLock, "Exceed max retry, path=/l")),
            "Another process holds the lock; try again when it is done: Exceed max retry, path=/l "
            "(code 506)");
  EXPECT_EQ(Explain(Error(kErrorLock, "open failed, path=/l, reason=Permission denied")),
            "A lock file cannot be used; run as the user who started the system, or as root: "
            "open failed, path=/l, reason=Permission denied (code 506)");
}

class StateTest : public testing::Test {
 protected:
  void SetUp() override { test::ResetTestRoot(); }

  const std::string shares_ = test::TestRoot() + "/etc/quarry/shares.json";
  const std::string folders_ = test::TestRoot() + "/var/packages/Quarry/etc/fileindex.folders";
  const std::string status_ = test::TestRoot() + "/var/packages/Quarry/etc/fileindex.status";
};

constexpr char kFolder[] =
    R"([{"path":"/Music","name":"Music","document":true,"audio":true,"video":true,"photo":true}])";

TEST_F(StateTest, EmptyStateIsReadable) {
  EXPECT_EQ(UnreadableState(), "");
  EXPECT_TRUE(VanishedShares().empty());
  EXPECT_EQ(Explain(Error(kErrorBadParameter, "Missing path")),
            "The request was not understood; check its arguments: Missing path (code 120)");
}

TEST_F(StateTest, ADamagedListOfSharesIsNamedWhateverTheLibraryMissed) {
  test::WriteFile(shares_, "{\"shares\":[");
  const std::string cause = "The list of shares (" + shares_ +
                            ") is damaged; mend it with \"quarry doctor\": The share file " +
                            shares_ + " is no JSON document";
  EXPECT_EQ(UnreadableState(), cause);
  for (const ErrorCode code :
       {kErrorBadParameter, kErrorShareEnum, kErrorSystem, kErrorLoadFile, kErrorShareNotFound}) {
    EXPECT_EQ(Explain(Error(code, "x")), cause + " (code " + std::to_string(code) + ")");
  }
  EXPECT_EQ(Explain(Error(kErrorFolderNotFound)),
            "No such folder is indexed; \"quarry folder list\" names those there are (code 902)");
}

TEST_F(StateTest, ADamagedListOfFoldersIsNamed) {
  test::WriteFile(folders_, "[3]");
  EXPECT_EQ(UnreadableState(), "The list of folders (" + folders_ +
                                   ") is damaged; mend it with \"quarry doctor\": Not an object, "
                                   "data=3");
}

TEST_F(StateTest, ADamagedStatusIsNamed) {
  test::WriteFile(status_, "[3]");
  EXPECT_EQ(UnreadableState(), "The status (" + status_ +
                                   ") is damaged; mend it with \"quarry doctor\": Not an object, "
                                   "data=[3]");
}

TEST_F(StateTest, AFileThatMayNotBeReadIsNotDamaged) {
  test::WriteFile(folders_, kFolder);
  ASSERT_EQ(chmod(test::TestRoot().c_str(), 0755), 0);
  ASSERT_EQ(chmod(folders_.c_str(), 0), 0);
  const int child = fork();
  if (child == 0) {
    if (getuid() == 0 && setuid(65534) != 0) _exit(2);
    _exit(UnreadableState() == "You may not read " + folders_ +
                                   "; run as the user who started the system, or as root"
              ? 0
              : 1);
  }
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
}

TEST_F(StateTest, SharesThatHaveVanishedAreNamed) {
  test::WriteFile(folders_, kFolder);
  EXPECT_EQ(VanishedShares(), std::vector<std::string>{"Music"});
  EXPECT_EQ(
      Explain(Error(kErrorShareNotFound)),
      "The share \"Music\", of which folders are indexed, is not known any more; add it again "
      "(quarry share add DIRECTORY), or drop it from the index (quarry share clear NAME "
      "/FULL/PATH) (code 800)");
  EXPECT_EQ(HowToRegain({"a", "b"}),
            "The shares \"a\", \"b\", of which folders are indexed, are not known any more; add "
            "them again (quarry share add DIRECTORY), or drop them from the index (quarry share "
            "clear NAME /FULL/PATH)");
}

TEST_F(StateTest, AShareOnItsWayHasNotVanished) {
  test::WriteFile(folders_, kFolder);
  test::WriteFile(shares_, R"({"shares":[{"name":"Sound","path":"/srv/Sound",)"
                           R"("moved_from":"/srv/Music"}]})");
  EXPECT_TRUE(VanishedShares().empty());
}

TEST(ExplainTest, LeavesTheEnginesOwnCodesToItsReason) {
  EXPECT_EQ(Explain(Error(1409, "The quote at character 1 is not closed.")),
            "The quote at character 1 is not closed. (code 1409)");
  EXPECT_EQ(Explain(Error(1409)), "The request failed (code 1409)");
}

}  // namespace
}  // namespace quarry::cli
