#include "daemons/common/status_file.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <optional>

#include "common/json.h"
#include "daemons/common/single_instance.h"
#include "tests/support/files.h"
#include "tests/support/root.h"

namespace quarry::daemon {
namespace {

class StatusFileTest : public ::testing::Test {
 protected:
  StatusFileTest() {
    test::ResetTestRoot();
    instance_.emplace("quarryd");
    status_["directories"] = 7;
  }

  static std::string Said() { return toString(ReadStatusFile("quarryd")); }
  static std::string OnlyPid() { return "{\"pid\":" + std::to_string(getpid()) + "}"; }
  static std::string Whole() {
    return "{\"directories\":7,\"pid\":" + std::to_string(getpid()) + "}";
  }

  const std::string path_ = test::TestRoot() + "/var/run/quarryd.status";
  std::optional<SingleInstance> instance_;
  Json::Value status_;
};

TEST_F(StatusFileTest, IsWhatWasSaidLast) {
  StatusFile file("quarryd");
  EXPECT_EQ(Said(), OnlyPid());
  file.Write(status_);
  EXPECT_EQ(Said(), Whole());
  EXPECT_EQ(test::ReadFile(path_), Whole() + "\n");
  status_["directories"] = 8;
  file.Write(status_);
  EXPECT_EQ(ReadStatusFile("quarryd")["directories"], 8);
  EXPECT_FALSE(std::filesystem::exists(path_ + ".new"));
}

TEST_F(StatusFileTest, GoesWithTheProcess) {
  {
    StatusFile file("quarryd");
    file.Write(status_);
  }
  EXPECT_FALSE(std::filesystem::exists(path_));
  EXPECT_EQ(Said(), OnlyPid());
  instance_.reset();
  EXPECT_TRUE(ReadStatusFile("quarryd").isNull());
}

// The file stays, but nobody holds the pid file.
TEST_F(StatusFileTest, AKilledProcessSaysNothing) {
  instance_.reset();
  const pid_t child = fork();
  if (child == 0) {
    const SingleInstance instance("quarryd");
    StatusFile file("quarryd");
    file.Write(status_);
    raise(SIGKILL);
  }
  int end = 0;
  ASSERT_EQ(waitpid(child, &end, 0), child);
  ASSERT_TRUE(std::filesystem::exists(path_));
  EXPECT_TRUE(ReadStatusFile("quarryd").isNull());
  // Nor does another one that has just started, whatever its number.
  instance_.emplace("quarryd");
  EXPECT_EQ(Said(), OnlyPid());
  test::WriteFile(path_, Whole());
  StatusFile file("quarryd");
  EXPECT_EQ(Said(), OnlyPid());
}

TEST_F(StatusFileTest, WhatIsNoStatusIsNone) {
  for (const char* text : {"", "{\"pid\":", "[1]", "{}", "{\"pid\":\"x\"}"}) {
    test::WriteFile(path_, text);
    EXPECT_EQ(Said(), OnlyPid()) << text;
  }
}

TEST_F(StatusFileTest, IsWrittenOnceItCanBe) {
  StatusFile file("quarryd");
  std::filesystem::create_directory(path_ + ".new");
  file.Write(status_);
  EXPECT_EQ(Said(), OnlyPid());
  std::filesystem::remove(path_ + ".new");
  file.Write(status_);
  EXPECT_EQ(Said(), Whole());
  // What it says already is not true any more when it cannot be written.
  std::filesystem::create_directory(path_ + ".new");
  status_["directories"] = 8;
  file.Write(status_);
  EXPECT_EQ(Said(), OnlyPid());
}

}  // namespace
}  // namespace quarry::daemon
