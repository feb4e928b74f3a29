#include "daemons/tarnotifyd/directory_handle.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <vector>

#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::notify {
namespace {

using Answer = DirectoryLookup::Answer;

class DirectoryHandleTest : public testing::Test {
 protected:
  static std::string HandleOf(const std::string& path) {
    const UniqueFd fd(open(path.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
    const std::optional<DirectoryIdentity> identity = IdentifyDirectory(fd.get());
    return identity ? identity->handle : std::string();
  }

  // Whether handles can be opened here. If not, that is what the lookup says of every one.
  bool Start() {
    directories_.AddEntrance(top_.path());
    const std::string handle = HandleOf(top_.path());
    const Answer answer = directories_.Find(handle, &place_);
    if (answer == Answer::kFound) return true;
    EXPECT_EQ(answer, handle.empty() ? Answer::kGone : Answer::kFailed);
    return false;
  }

  static dev_t DeviceOf(const std::string& path) {
    struct stat status {};
    EXPECT_EQ(stat(path.c_str(), &status), 0);
    return status.st_dev;
  }

  test::TempDir top_;
  MountedDirectories directories_{DeviceOf(top_.path())};
  DirectoryPlace place_;
};

TEST_F(DirectoryHandleTest, ParentAndName) {
  test::MakeDirs(top_ / "a/b");
  if (!Start()) return;
  ASSERT_EQ(directories_.Find(HandleOf(top_ / "a/b"), &place_), Answer::kFound);
  EXPECT_EQ(place_.name, "b");
  EXPECT_EQ(place_.parent, HandleOf(top_ / "a"));
  ASSERT_EQ(directories_.Find(place_.parent, &place_), Answer::kFound);
  EXPECT_EQ(place_.name, "a");
  EXPECT_EQ(place_.parent, HandleOf(top_.path()));
}

TEST_F(DirectoryHandleTest, ThePresentPlaceIsTold) {
  test::MakeDirs(top_ / "a/b");
  if (!Start()) return;
  const std::string handle = HandleOf(top_ / "a/b");
  std::rename((top_ / "a/b").c_str(), (top_ / "c (deleted)").c_str());
  ASSERT_EQ(directories_.Find(handle, &place_), Answer::kFound);
  EXPECT_EQ(place_.name, "c (deleted)");
  EXPECT_EQ(place_.parent, HandleOf(top_.path()));
}

TEST_F(DirectoryHandleTest, DeletedIsGoneAlsoWhileSomebodyIsInIt) {
  test::MakeDirs(top_ / "a");
  test::MakeDirs(top_ / "b");
  if (!Start()) return;
  const std::vector<std::string> handles = {HandleOf(top_ / "a"), HandleOf(top_ / "b")};
  const UniqueFd inside(open((top_ / "b").c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  rmdir((top_ / "a").c_str());
  rmdir((top_ / "b").c_str());
  for (const std::string& handle : handles) {
    EXPECT_EQ(directories_.Find(handle, &place_), Answer::kGone);
  }
}

TEST_F(DirectoryHandleTest, WhatIsNoHandleIsGone) {
  if (!Start()) return;
  EXPECT_EQ(directories_.Find("", &place_), Answer::kGone);
  EXPECT_EQ(directories_.Find("abc", &place_), Answer::kGone);
  EXPECT_EQ(directories_.Find(std::string(1000, 'x'), &place_), Answer::kGone);
}

TEST_F(DirectoryHandleTest, EntranceOfAnotherFileSystemIsNotUsed) {
  if (!Start()) return;
  const std::string handle = HandleOf(top_.path());
  MountedDirectories other(DeviceOf(top_.path()) + 1);
  other.AddEntrance(top_.path());
  EXPECT_EQ(other.Find(handle, &place_), Answer::kFailed);
  directories_.RemoveEntrance(top_.path());
  EXPECT_EQ(directories_.Find(handle, &place_), Answer::kFailed);
  EXPECT_EQ(directories_.FindFile(handle, &place_), Answer::kFailed);
}

// Without descriptors nothing is found, but nothing is gone either.
TEST_F(DirectoryHandleTest, WhatCannotBeOpenedIsNotGone) {
  if (!Start()) return;
  const std::string handle = HandleOf(top_.path());
  directories_.Release();
  rlimit limit{};
  ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &limit), 0);
  const rlimit none{0, limit.rlim_max};
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &none), 0);
  const Answer answer = directories_.Find(handle, &place_);
  const Answer of_file = directories_.FindFile(handle, &place_);
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &limit), 0);
  EXPECT_EQ(answer, Answer::kFailed);
  EXPECT_EQ(of_file, Answer::kFailed);
  EXPECT_EQ(directories_.Find(handle, &place_), Answer::kFound);
}

TEST_F(DirectoryHandleTest, PlaceOfAFile) {
  test::WriteFile(top_ / "a/f", "");
  if (!Start()) return;
  const std::string handle = HandleOf(top_ / "a/f");
  ASSERT_EQ(directories_.FindFile(handle, &place_), Answer::kFound);
  EXPECT_EQ(place_.name, "f");
  EXPECT_EQ(place_.parent, HandleOf(top_ / "a"));
  unlink((top_ / "a/f").c_str());
  EXPECT_EQ(directories_.FindFile(handle, &place_), Answer::kGone);
}

TEST_F(DirectoryHandleTest, NoHandleWhereTheFileSystemHasNone) {
  EXPECT_EQ(HandleOf("/proc/sys"), "");
}

}  // namespace
}  // namespace quarry::notify
