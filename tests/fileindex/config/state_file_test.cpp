#include "fileindex/config/state_file.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::fileindex {
namespace {

TEST(StateFileTest, OnlyAPlaceWithoutAnythingIsMissing) {
  const test::TempDir dir;
  EXPECT_FALSE(IsAnythingAt(dir / "none"));
  EXPECT_FALSE(IsAnythingAt(dir / "none/below"));

  test::WriteFile(dir / "file", "");
  EXPECT_TRUE(IsAnythingAt(dir / "file"));
  EXPECT_TRUE(IsAnythingAt(dir.path()));
  ASSERT_EQ(symlink("nowhere", (dir / "link").c_str()), 0);
  EXPECT_TRUE(IsAnythingAt(dir / "link"));
  ASSERT_EQ(mkfifo((dir / "fifo").c_str(), 0600), 0);
  EXPECT_TRUE(IsAnythingAt(dir / "fifo"));
}

TEST(StateFileTest, APlaceThatCannotBeAskedAboutIsNotMissing) {
  const test::TempDir dir;
  test::WriteFile(dir / "file", "");
  EXPECT_TRUE(IsAnythingAt(dir / "file/below"));
  EXPECT_TRUE(IsAnythingAt(dir / std::string(300, 'x')));
}

TEST(StateFileTest, ErrnoIsLeftAlone) {
  const test::TempDir dir;
  errno = 0;
  IsAnythingAt(dir / "none");
  EXPECT_EQ(errno, 0);
  errno = EBUSY;
  IsAnythingAt(dir.path());
  EXPECT_EQ(errno, EBUSY);
}

}  // namespace
}  // namespace quarry::fileindex
