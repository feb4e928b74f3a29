#include "daemons/common/single_instance.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <memory>

#include "common/error.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace quarry::daemon {
namespace {

using test::TempDir;

TEST(SingleInstanceTest, WritesItsPidUnderTheRoot) {
  test::ResetTestRoot();
  EXPECT_EQ(PidFilePath("quarryd"), test::TestRoot() + "/var/run/quarryd.pid");
  SingleInstance instance("quarryd");
  EXPECT_EQ(test::ReadFile(PidFilePath("quarryd")), std::to_string(getpid()) + "\n");
  EXPECT_EQ(test::FileMode(PidFilePath("quarryd")) & 0600u, 0600u);
  EXPECT_EQ(RunningPid(PidFilePath("quarryd")), getpid());
}

TEST(SingleInstanceTest, RefusesASecondOneAndNamesTheFirst) {
  TempDir dir;
  const std::string path = dir / "run/d.pid";
  auto first = std::make_unique<SingleInstance>("quarryd", path);
  try {
    SingleInstance second("quarryd", path);
    FAIL() << "two instances run";
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), kErrorLock);
    EXPECT_EQ(error.reason(), "quarryd is already running as process " + std::to_string(getpid()) +
                                  " (" + path + " is locked).");
  }
  EXPECT_EQ(test::ReadFile(path), std::to_string(getpid()) + "\n");
  first.reset();
  EXPECT_EQ(RunningPid(path), 0);
  EXPECT_EQ(test::ReadFile(path), "");
  SingleInstance third("quarryd", path);
}

TEST(SingleInstanceTest, TakesOverFromAProcessThatWasKilled) {
  TempDir dir;
  const std::string path = dir / "d.pid";
  int ready[2];
  ASSERT_EQ(pipe(ready), 0);
  const pid_t child = fork();
  if (child == 0) {
    SingleInstance instance("quarryd", path);
    if (write(ready[1], "x", 1) != 1) _exit(1);
    while (true) pause();
  }
  char byte;
  ASSERT_EQ(read(ready[0], &byte, 1), 1);
  close(ready[0]);
  close(ready[1]);
  EXPECT_EQ(RunningPid(path), child);
  EXPECT_THROW(SingleInstance("quarryd", path), Error);
  kill(child, SIGKILL);
  waitpid(child, nullptr, 0);
  EXPECT_EQ(RunningPid(path), 0);
  SingleInstance instance("quarryd", path);
  EXPECT_EQ(test::ReadFile(path), std::to_string(getpid()) + "\n");
}

TEST(SingleInstanceTest, LooksAtPidFilesOfAnyContent) {
  TempDir dir;
  EXPECT_EQ(RunningPid(dir / "missing"), 0);
  EXPECT_EQ(RunningPid(dir.path()), 0);
  for (const char* text : {"", "-5\n", "99999999999999999999\n", "garbage"}) {
    test::WriteFile(dir / "d.pid", text);
    EXPECT_EQ(RunningPid(dir / "d.pid"), 0);
    SingleInstance instance("quarryd", dir / "d.pid");
    EXPECT_EQ(RunningPid(dir / "d.pid"), getpid());
    test::WriteFile(dir / "d.pid", text);
    EXPECT_EQ(RunningPid(dir / "d.pid"), 0);
    EXPECT_THROW(SingleInstance("quarryd", dir / "d.pid"), Error);
  }
}

TEST(SingleInstanceTest, ReportsAPlaceThatCannotBeUsed) {
  TempDir dir;
  test::WriteFile(dir / "file", "");
  EXPECT_THROW(SingleInstance("quarryd", dir / "file/d.pid"), Error);
  test::MakeDirs(dir / "d.pid");
  try {
    SingleInstance instance("quarryd", dir / "d.pid");
    FAIL() << "a directory was locked";
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), kErrorSystem);
    EXPECT_EQ(error.reason(), "Cannot open " + (dir / "d.pid") + ": Is a directory");
  }
  ASSERT_EQ(symlink("elsewhere", (dir / "link").c_str()), 0);
  EXPECT_THROW(SingleInstance("quarryd", dir / "link"), Error);
}

}  // namespace
}  // namespace quarry::daemon
