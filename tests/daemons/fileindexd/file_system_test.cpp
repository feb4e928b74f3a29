#include "daemons/fileindexd/file_system.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <fstream>

#include "common/file_util.h"
#include "common/unique_fd.h"
#include "daemons/fileindexd/stamps.h"
#include "daemons/tarncontentextractd/stamp.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::fileindexd {
namespace {

using ::testing::IsEmpty;
using ::testing::UnorderedElementsAre;

class FileSystemTest : public ::testing::Test {
 protected:
  PlaceKind Look(const std::string& name) { return files_.Look(dir_.path(), dir_ / name).kind; }
  PlaceKind Peek(const std::string& name) { return files_.Peek(dir_ / name).kind; }

  test::TempDir dir_;
  PosixFileSystem files_;
};

TEST_F(FileSystemTest, TellsKindsApart) {
  test::WriteFile(dir_ / "d/file", "text");
  ASSERT_EQ(0, symlink("d", (dir_ / "link").c_str()));
  ASSERT_EQ(0, mkfifo((dir_ / "pipe").c_str(), 0600));
  for (const bool look : {true, false}) {
    const auto kind = [&](const std::string& name) { return look ? Look(name) : Peek(name); };
    EXPECT_EQ(PlaceKind::kFile, kind("d/file"));
    EXPECT_EQ(PlaceKind::kDirectory, kind("d"));
    EXPECT_EQ(PlaceKind::kOther, kind("link"));
    EXPECT_EQ(PlaceKind::kOther, kind("pipe"));
    EXPECT_EQ(PlaceKind::kAbsent, kind("none"));
    EXPECT_EQ(PlaceKind::kAbsent, kind("none/below"));
    EXPECT_EQ(PlaceKind::kAbsent, kind("d/file/below"));
  }
  EXPECT_EQ(PlaceKind::kDirectory, files_.Look(dir_.path(), dir_.path()).kind);
}

TEST_F(FileSystemTest, LookFollowsNoLinkOnTheWay) {
  test::WriteFile(dir_ / "d/e/file", "text");
  ASSERT_EQ(0, symlink("d", (dir_ / "link").c_str()));
  EXPECT_EQ(PlaceKind::kFile, Look("d/e/file"));
  EXPECT_EQ(PlaceKind::kAbsent, Look("link/e"));
  EXPECT_EQ(PlaceKind::kAbsent, Look("link/e/file"));
}

TEST_F(FileSystemTest, LookReachesPathsThatNoCallTakes) {
  const std::string name(200, 'n');
  UniqueFd dir(open(dir_.path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  std::string path = dir_.path();
  while (path.size() < 2 * PATH_MAX) {
    ASSERT_EQ(0, mkdirat(dir.get(), name.c_str(), 0700));
    dir.Reset(openat(dir.get(), name.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    path += "/" + name;
  }
  EXPECT_EQ(PlaceKind::kDirectory, files_.Look(dir_.path(), path).kind);
  EXPECT_EQ(PlaceKind::kAbsent, files_.Look(dir_.path(), path + "/none").kind);
}

TEST_F(FileSystemTest, StampsAreThoseOfTheExtractor) {
  test::WriteFile(dir_ / "file", "text");
  struct stat status {};
  ASSERT_EQ(0, lstat((dir_ / "file").c_str(), &status));
  for (const Place& place : {files_.Look(dir_.path(), dir_ / "file"), files_.Peek(dir_ / "file")}) {
    EXPECT_EQ(extract::AttributeStamp(status), place.attribute_stamp);
    EXPECT_EQ(extract::ContentStamp(status), place.content_stamp);
  }
  const Place place = files_.Peek(dir_.path());
  EXPECT_NE("", place.attribute_stamp);
  EXPECT_EQ("", place.content_stamp);
}

TEST_F(FileSystemTest, StampsTellChangesApart) {
  test::WriteFile(dir_ / "file", "text");
  const Place before = files_.Peek(dir_ / "file");
  EXPECT_TRUE(SameAttributes(before.attribute_stamp, files_.Peek(dir_ / "file").attribute_stamp));
  ASSERT_TRUE(test::WaitUntil([&] {
    chmod((dir_ / "file").c_str(), 0600);
    return files_.Peek(dir_ / "file").attribute_stamp != before.attribute_stamp;
  }));
  EXPECT_EQ(before.content_stamp, files_.Peek(dir_ / "file").content_stamp);
  ASSERT_EQ(0, rename((dir_ / "file").c_str(), (dir_ / "other").c_str()));
  EXPECT_TRUE(SameInode(before.attribute_stamp, files_.Peek(dir_ / "other").attribute_stamp));
  test::WriteFile(dir_ / "other", "longer text");
  EXPECT_NE(before.content_stamp, files_.Peek(dir_ / "other").content_stamp);
}

TEST_F(FileSystemTest, ListsAllNames) {
  std::vector<std::string> names = {"left over"};
  EXPECT_EQ(PlaceKind::kDirectory, files_.List(dir_.path(), names));
  EXPECT_THAT(names, IsEmpty());
  test::WriteFile(dir_ / "\xff\xfe", "");
  test::WriteFile(dir_ / "d/below", "");
  ASSERT_EQ(0, symlink("none", (dir_ / "link").c_str()));
  EXPECT_EQ(PlaceKind::kDirectory, files_.List(dir_.path(), names));
  EXPECT_THAT(names, UnorderedElementsAre("\xff\xfe", "d", "link"));
}

TEST_F(FileSystemTest, SaysWhyItCannotList) {
  std::vector<std::string> names;
  test::WriteFile(dir_ / "file", "");
  ASSERT_EQ(0, symlink(".", (dir_ / "link").c_str()));
  EXPECT_EQ(PlaceKind::kAbsent, files_.List(dir_ / "none", names));
  EXPECT_EQ(PlaceKind::kAbsent, files_.List(dir_ / "file", names));
  EXPECT_NE(PlaceKind::kDirectory, files_.List(dir_ / "link", names));
  EXPECT_THAT(names, IsEmpty());
}

TEST_F(FileSystemTest, WhatMayNotBeReadIsUnknown) {
  if (geteuid() == 0) {
    // Nothing is forbidden to root, but no file system takes such a name.
    EXPECT_EQ(PlaceKind::kUnknown, Peek(std::string(300, 'x')));
    return;
  }
  test::WriteFile(dir_ / "d/file", "");
  ASSERT_EQ(0, chmod((dir_ / "d").c_str(), 0));
  std::vector<std::string> names;
  EXPECT_EQ(PlaceKind::kUnknown, files_.List(dir_ / "d", names));
  EXPECT_EQ(PlaceKind::kUnknown, Look("d/file"));
  EXPECT_EQ(PlaceKind::kUnknown, Peek("d/file"));
}

TEST_F(FileSystemTest, OtherFileSystemsAreForeign) {
  EXPECT_EQ(PlaceKind::kForeign, files_.Peek("/proc").kind);
  EXPECT_EQ(PlaceKind::kDirectory, files_.Look("/proc", "/proc").kind);
  EXPECT_TRUE(files_.Identify("/proc").mount_root);
  // The machine's other mounts, as far as a directory above can be the base.
  std::ifstream mounts("/proc/self/mounts");
  for (std::string device, place, rest; mounts >> device >> place && getline(mounts, rest);) {
    if (Dirname(place).empty() || !files_.Identify(place).mount_root) continue;
    EXPECT_EQ(PlaceKind::kForeign, files_.Look(Dirname(place), place).kind) << place;
    EXPECT_EQ(PlaceKind::kForeign, files_.Look(Dirname(place), place + "/below").kind) << place;
  }
}

TEST_F(FileSystemTest, IdentifiesADirectory) {
  test::MakeDirs(dir_ / "d");
  const Identity identity = files_.Identify(dir_ / "d");
  EXPECT_TRUE(identity.exists);
  EXPECT_FALSE(identity.mount_root);
  EXPECT_EQ(identity, files_.Identify(dir_ / "d"));
  test::MakeDirs(dir_ / "e");
  EXPECT_FALSE(identity == files_.Identify(dir_ / "e"));
  EXPECT_FALSE(files_.Identify(dir_ / "none").exists);
  test::WriteFile(dir_ / "file", "");
  EXPECT_FALSE(files_.Identify(dir_ / "file").exists);
  ASSERT_EQ(0, symlink("d", (dir_ / "link").c_str()));
  EXPECT_FALSE(files_.Identify(dir_ / "link").exists);
}

}  // namespace
}  // namespace quarry::fileindexd
