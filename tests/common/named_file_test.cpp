#include "common/named_file.h"

#include <fcntl.h>
#include <gtest/gtest.h>

#include <cstdio>
#include <filesystem>
#include <string>

#include "common/unique_fd.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry {
namespace {

class NamedFileTest : public fake::FakePlatformTest {
 protected:
  NamedFileTest() { test::WriteFile(path_, ""); }

  static UniqueFd Opened(const std::string& path) {
    return UniqueFd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  }

  test::TempDir dir_;
  const std::string path_ = dir_ / "file";
};

TEST_F(NamedFileTest, FileHasItsNameAndThoseOfLinksToIt) {
  const UniqueFd file = Opened(path_);
  std::filesystem::create_symlink(path_, dir_ / "link");
  std::filesystem::create_hard_link(path_, dir_ / "second");
  EXPECT_TRUE(IsStillNamed(path_, file.get()));
  EXPECT_TRUE(IsStillNamed(dir_ / "link", file.get()));
  EXPECT_TRUE(IsStillNamed(dir_ / "second", file.get()));
}

TEST_F(NamedFileTest, NameIsLostByRemovalReplacementAndRenaming) {
  const UniqueFd file = Opened(path_);
  ASSERT_EQ(std::rename(path_.c_str(), (dir_ / "moved").c_str()), 0);
  EXPECT_FALSE(IsStillNamed(path_, file.get()));
  EXPECT_TRUE(IsStillNamed(dir_ / "moved", file.get()));
  test::WriteFile(path_, "");
  EXPECT_FALSE(IsStillNamed(path_, file.get()));
}

// Numbers of files are unique within one file system only.
TEST_F(NamedFileTest, FileOfAnotherFileSystemIsAnother) {
  const UniqueFd file = Opened(path_);
  EXPECT_FALSE(IsStillNamed("/proc/version", file.get()));
  EXPECT_FALSE(IsStillNamed(path_, Opened("/proc/version").get()));
}

TEST_F(NamedFileTest, WhatCannotBeAskedHasNoName) {
  EXPECT_FALSE(IsStillNamed(path_, -1));
  const UniqueFd file = Opened(path_);
  fake::FailSystemCall("fstat", 1, EIO);
  EXPECT_FALSE(IsStillNamed(path_, file.get()));
  EXPECT_TRUE(IsStillNamed(path_, file.get()));
}

}  // namespace
}  // namespace quarry
