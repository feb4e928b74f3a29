#include "platform/linux/systemd.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cstdlib>

#include "platform/include/error.h"
#include "platform/linux/last_error.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::platform {
namespace {

// A PATH on which systemctl writes down how it is called, a line each, and exits with `status`.
class SystemdTest : public ::testing::Test {
 protected:
  SystemdTest() : path_(std::getenv("PATH")) { Install(0); }
  ~SystemdTest() override { setenv("PATH", path_.c_str(), 1); }

  void Install(int status) {
    const std::string program = dir_ / "bin/systemctl";
    test::WriteFile(program, "#!/bin/sh\necho \"$@\" >> '" + Log() + "'\nexit " +
                                 std::to_string(status) + "\n");
    chmod(program.c_str(), 0755);
    test::WriteFile(Log(), "");
    setenv("PATH", (dir_ / "bin").c_str(), 1);
  }
  std::string Log() const { return dir_ / "log"; }
  std::string Calls() const { return test::ReadFile(Log()); }

  test::TempDir dir_;
  const std::string path_;
};

TEST_F(SystemdTest, StartsNowAndWithTheMachine) {
  EXPECT_EQ(StartUnit("fileindexd", true), 0);
  EXPECT_EQ(StartUnit("fileindexd", false), 0);
  EXPECT_EQ(Calls(),
            "--quiet --now enable fileindexd.service\n"
            "--quiet --no-block --now enable fileindexd.service\n");
}

TEST_F(SystemdTest, StopsForGood) {
  EXPECT_EQ(StopUnit("fileindexd", false), 0);
  EXPECT_EQ(StopUnit("fileindexd", true), 0);
  EXPECT_EQ(Calls(),
            "--quiet --now disable fileindexd.service\n"
            "--quiet --signal=SIGKILL kill fileindexd.service\n"
            "--quiet --now disable fileindexd.service\n");
}

TEST_F(SystemdTest, Restarts) {
  EXPECT_EQ(RestartUnit("fileindexd"), 0);
  EXPECT_EQ(RestartUnitIfRunning("smbd"), 0);
  EXPECT_EQ(Calls(),
            "--quiet restart fileindexd.service\n"
            "--quiet try-restart smbd.service\n");
}

TEST_F(SystemdTest, FailsWhenTheCommandFails) {
  for (const int status : {1, 5}) {
    Install(status);
    SetLastError(0, "", 0);
    EXPECT_LT(StartUnit("fileindexd", true), 0);
    EXPECT_EQ(HLIBCErrGet(), kErrService);
    EXPECT_LT(StartUnit("fileindexd", false), 0);
    EXPECT_LT(StopUnit("fileindexd", true), 0);
    EXPECT_LT(RestartUnit("fileindexd"), 0);
  }
  Install(1);
  EXPECT_LT(RestartUnitIfRunning("smbd"), 0);
}

TEST_F(SystemdTest, WithoutFileSharingThereIsNothingToRestart) {
  Install(5);
  EXPECT_EQ(RestartUnitIfRunning("smbd"), 0);
}

TEST_F(SystemdTest, FailsWithoutTheCommand) {
  setenv("PATH", (dir_ / "nowhere").c_str(), 1);
  EXPECT_LT(StartUnit("fileindexd", true), 0);
  EXPECT_LT(StopUnit("fileindexd", true), 0);
  EXPECT_LT(RestartUnit("fileindexd"), 0);
  EXPECT_LT(RestartUnitIfRunning("smbd"), 0);
  EXPECT_EQ(HLIBCErrGet(), kErrService);
}

}  // namespace
}  // namespace quarry::platform
