#include "platform/linux/durable_file.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "tests/platform/linux/child.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::platform {
namespace {

TEST(WriteFileDurablyTest, ReplacesTheWholeFileAndLeavesNothingBeside) {
  test::TempDir dir;
  EXPECT_TRUE(WriteFileDurably(dir / "f", "a long first text"));
  struct stat before {};
  ASSERT_EQ(stat((dir / "f").c_str(), &before), 0);
  EXPECT_TRUE(WriteFileDurably(dir / "f", std::string("sh\0rt", 5)));
  struct stat after {};
  ASSERT_EQ(stat((dir / "f").c_str(), &after), 0);
  EXPECT_EQ(test::ReadFile(dir / "f"), std::string("sh\0rt", 5));
  EXPECT_NE(before.st_ino, after.st_ino);
  EXPECT_EQ(test::FileMode(dir / "f"), 0644u);
  EXPECT_EQ(test::ListDir(dir.path()), std::vector<std::string>{"f"});
}

TEST(WriteFileDurablyTest, FailsCleanly) {
  test::TempDir dir;
  errno = 0;
  EXPECT_FALSE(WriteFileDurably(dir / "missing/f", "x"));
  EXPECT_EQ(errno, ENOENT);
  test::MakeDirs(dir / "d/inner");
  EXPECT_FALSE(WriteFileDurably(dir / "d", "x"));
  EXPECT_EQ(test::ListDir(dir.path()), std::vector<std::string>{"d"});
}

TEST(WriteFileDurablyTest, ADirectoryThatCannotBeSyncedIsLeftAlone) {
  test::TempDir dir;
  chmod(dir.path().c_str(), 0755);
  test::WriteFile(dir / "d/f", "old");
  EXPECT_EQ(test::RunInChild([&] {
              const std::string place = dir / "d";
              if (geteuid() == 0 && chown(place.c_str(), 65534, 65534) != 0) return 1;
              if (chmod(place.c_str(), 0300) != 0) return 2;
              if (geteuid() == 0 && (setegid(65534) != 0 || seteuid(65534) != 0)) return 3;
              return WriteFileDurably(place + "/f", "new") || errno != EACCES ? 4 : 0;
            }),
            0);
  chmod((dir / "d").c_str(), 0755);
  EXPECT_EQ(test::ReadFile(dir / "d/f"), "old");
  EXPECT_EQ(test::ListDir(dir / "d"), std::vector<std::string>{"f"});
}

TEST(ReadWholeFileTest, ReadsRegularFilesUpToTheLimit) {
  test::TempDir dir;
  std::string text;
  test::WriteFile(dir / "f", std::string(100000, 'x'));
  EXPECT_TRUE(ReadWholeFile(dir / "f", 100000, &text));
  EXPECT_EQ(text.size(), 100000u);
  EXPECT_FALSE(ReadWholeFile(dir / "f", 99999, &text));
  EXPECT_EQ(errno, EFBIG);
  EXPECT_FALSE(ReadWholeFile(dir / "none", 10, &text));
  EXPECT_EQ(errno, ENOENT);
  EXPECT_FALSE(ReadWholeFile(dir.path(), 10, &text));
  EXPECT_EQ(errno, EINVAL);
  ASSERT_EQ(mkfifo((dir / "fifo").c_str(), 0600), 0);
  EXPECT_FALSE(ReadWholeFile(dir / "fifo", 10, &text));
  EXPECT_EQ(errno, EINVAL);
}

TEST(MakeDirectoriesTest, MakesWhatIsMissing) {
  test::TempDir dir;
  EXPECT_TRUE(MakeDirectories(dir / "a/b/c", 0750));
  EXPECT_EQ(test::FileMode(dir / "a/b/c"), 0750u);
  EXPECT_EQ(test::FileMode(dir / "a/b"), 0755u);
  EXPECT_TRUE(MakeDirectories(dir / "a/b/c", 0700));
  EXPECT_EQ(test::FileMode(dir / "a/b/c"), 0750u);
  test::WriteFile(dir / "f", "");
  EXPECT_FALSE(MakeDirectories(dir / "f", 0755));
  EXPECT_EQ(errno, ENOTDIR);
  EXPECT_FALSE(MakeDirectories(dir / "f/x", 0755));
  EXPECT_EQ(errno, ENOTDIR);
}

TEST(ParentDirectoryTest, IsTheTextBeforeTheLastSlash) {
  EXPECT_EQ(ParentDirectory("/a/b"), "/a");
  EXPECT_EQ(ParentDirectory("/a"), "/");
  EXPECT_EQ(ParentDirectory("a"), ".");
}

}  // namespace
}  // namespace quarry::platform
