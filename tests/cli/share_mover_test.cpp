#include "cli/share_mover.h"

#include <gtest/gtest.h>

#include <filesystem>

#include "cli/problem.h"
#include "common/file_util.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::cli {
namespace {

class MoveDirectoryTest : public testing::Test {
 protected:
  MoveDirectoryTest() {
    plan_.from = plan_.to = "docs";
    plan_.old_path = dir_ / "old/docs";
    plan_.new_path = dir_ / "new/docs";
    test::MakeDirs(dir_ / "old");
    test::MakeDirs(dir_ / "new");
  }

  std::string ProblemOf(bool copied) const {
    try {
      MoveDirectory(plan_, copied);
    } catch (const Problem& problem) {
      return problem.what();
    }
    return {};
  }

  test::TempDir dir_;
  SharePlan plan_;
};

TEST_F(MoveDirectoryTest, Moves) {
  test::WriteFile(plan_.old_path + "/a", "text");
  EXPECT_EQ(ProblemOf(false), "");
  EXPECT_EQ(test::ReadFile(plan_.new_path + "/a"), "text");
  EXPECT_FALSE(IsDirExist(plan_.old_path, false));
}

TEST_F(MoveDirectoryTest, TakesWhatWasMovedAlready) {
  test::MakeDirs(plan_.new_path);
  EXPECT_EQ(ProblemOf(false), "");
  EXPECT_EQ(ProblemOf(true), "");
}

TEST_F(MoveDirectoryTest, TakesACopyOnlyWhenItIsOne) {
  test::WriteFile(plan_.old_path + "/a", "text");
  test::MakeDirs(plan_.new_path);
  EXPECT_NE(ProblemOf(false).find("is there already"), std::string::npos);
  EXPECT_EQ(ProblemOf(true), "");
  EXPECT_EQ(test::ReadFile(plan_.old_path + "/a"), "text");
}

TEST_F(MoveDirectoryTest, NamesWhatIsMissing) {
  EXPECT_NE(ProblemOf(false).find("no directory \"" + plan_.old_path), std::string::npos);
  test::MakeDirs(plan_.old_path);
  EXPECT_NE(ProblemOf(true).find("no directory \"" + plan_.new_path), std::string::npos);
  EXPECT_TRUE(IsDirExist(plan_.old_path, false));
}

TEST_F(MoveDirectoryTest, ALinkIsNoDirectory) {
  test::MakeDirs(dir_ / "elsewhere");
  std::filesystem::create_directory_symlink(dir_ / "elsewhere", plan_.new_path);
  test::MakeDirs(plan_.old_path);
  EXPECT_NE(ProblemOf(true).find("no directory"), std::string::npos);
}

TEST_F(MoveDirectoryTest, AFileInTheWayStays) {
  test::MakeDirs(plan_.old_path);
  test::WriteFile(plan_.new_path, "text");
  EXPECT_NE(ProblemOf(false).find("Not a directory"), std::string::npos);
  EXPECT_EQ(test::ReadFile(plan_.new_path), "text");
}

TEST_F(MoveDirectoryTest, SaysHowToReachAnotherFileSystem) {
  test::MakeDirs(plan_.old_path);
  plan_.new_path = "/proc/sys/docs";
  EXPECT_NE(ProblemOf(false).find("quarry share migrate docs /proc/sys/ --copied"),
            std::string::npos);
  EXPECT_TRUE(IsDirExist(plan_.old_path, false));
}

}  // namespace
}  // namespace quarry::cli
