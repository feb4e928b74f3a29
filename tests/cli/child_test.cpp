#include "cli/supervisor/child.h"

#include <gtest/gtest.h>

#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>

#include "cli/problem.h"
#include "tests/support/temp_dir.h"

namespace quarry::cli {
namespace {

constexpr int kPatience = 60'000;

Child Shell(const std::string& script) {
  return Child("/bin/sh", {"-c", script});
}

TEST(ChildTest, TellsHowAProgramEnded) {
  Child child = Shell("exit 3");
  ASSERT_TRUE(child.WaitEnded(kPatience));
  EXPECT_EQ(child.Ended(), "exit code 3");
  EXPECT_TRUE(child.WaitEnded(0));
}

TEST(ChildTest, TellsTheSignalThatKilledAProgram) {
  Child child = Shell("exec sleep 1000");
  child.Signal(SIGKILL);
  ASSERT_TRUE(child.WaitEnded(kPatience));
  EXPECT_EQ(child.Ended(), "signal 9");
}

TEST(ChildTest, WaitsNoLongerThanItIsAskedTo) {
  Child child = Shell("exec sleep 1000");
  const auto began = std::chrono::steady_clock::now();
  EXPECT_FALSE(child.WaitEnded(20));
  EXPECT_GE(std::chrono::steady_clock::now() - began, std::chrono::milliseconds(19));
  EXPECT_FALSE(child.WaitEnded(0));
  EXPECT_FALSE(child.Ended());
}

TEST(ChildTest, WaitsOnWhenASignalInterrupts) {
  struct sigaction heard {};
  struct sigaction before {};
  heard.sa_handler = [](int) {};
  ASSERT_EQ(sigaction(SIGALRM, &heard, &before), 0);
  Child child = Shell("kill -ALRM $PPID; sleep 0.05");
  EXPECT_TRUE(child.WaitEnded(kPatience));
  sigaction(SIGALRM, &before, nullptr);
}

TEST(ChildTest, KillsAProgramThatItStillOwns) {
  pid_t pid = 0;
  {
    const Child child = Shell("exec sleep 1000");
    pid = child.Pid();
    EXPECT_EQ(kill(pid, 0), 0);
  }
  EXPECT_EQ(kill(pid, 0), -1);
}

TEST(ChildTest, NamesAProgramThatCannotBeStarted) {
  test::TempDir dir;
  try {
    const Child child(dir.path() + "/none", {});
    FAIL() << "started";
  } catch (const Problem& problem) {
    EXPECT_EQ(problem.what(), "Cannot start " + dir.path() + "/none: No such file or directory");
  }
}

TEST(ChildTest, WritesWhereItIsTold) {
  test::TempDir dir;
  const std::string output = dir.path() + "/output";
  Child child("/bin/sh", {"-c", "echo out; echo err >&2"}, output);
  ASSERT_TRUE(child.WaitEnded(kPatience));
  std::ifstream file(output);
  EXPECT_EQ(std::string(std::istreambuf_iterator<char>(file), {}), "out\nerr\n");
}

}  // namespace
}  // namespace quarry::cli
