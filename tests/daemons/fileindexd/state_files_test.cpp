#include "daemons/fileindexd/state_files.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "common/error.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace quarry::fileindexd {
namespace {

using fileindex::kFileIndexFoldersCfgPath;
using fileindex::kFileIndexStatusCfgPath;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

TEST(FileWatchTest, TellsEveryChange) {
  const test::TempDir dir;
  FileWatch watch(dir / "file");
  EXPECT_TRUE(watch.HasChanged());
  EXPECT_FALSE(watch.HasChanged());
  test::WriteFile(dir / "file", "one");
  EXPECT_TRUE(watch.HasChanged());
  EXPECT_FALSE(watch.HasChanged());
  test::WriteFile(dir / "new", "two");
  ASSERT_EQ(0, rename((dir / "new").c_str(), (dir / "file").c_str()));
  EXPECT_TRUE(watch.HasChanged());
  EXPECT_FALSE(watch.HasChanged());
  ASSERT_EQ(0, unlink((dir / "file").c_str()));
  EXPECT_TRUE(watch.HasChanged());
  EXPECT_FALSE(watch.HasChanged());
}

TEST(PauseStateTest, PausesWithoutEndOrUntilATime) {
  PauseState pause;
  EXPECT_FALSE(pause.IsPaused(1000));
  EXPECT_EQ(-1, pause.ResumeTime());
  pause.Set(0);
  EXPECT_TRUE(pause.IsPaused(1000));
  pause.Set(1001);
  EXPECT_TRUE(pause.IsPaused(1000));
  EXPECT_FALSE(pause.IsPaused(1001));
  EXPECT_FALSE(pause.IsPaused(1002));
  pause.Set(-7);
  EXPECT_FALSE(pause.IsPaused(1000));
  EXPECT_EQ(-7, pause.ResumeTime());
}

class StateFilesTest : public ::testing::Test {
 protected:
  void SetUp() override { test::ResetTestRoot(); }

  static std::string Record(const std::string& path) {
    return "{\"path\":\"" + path +
           "\",\"name\":\"n\",\"document\":true,\"audio\":true,\"video\":true,\"photo\":true}";
  }
};

TEST_F(StateFilesTest, NothingIsIndexedNorPausedWithoutFiles) {
  EXPECT_EQ(-1, LoadResumeTime());
  EXPECT_THAT(LoadIndexedShares(), IsEmpty());
}

TEST_F(StateFilesTest, ReadsThePauseEnd) {
  test::WriteFile(kFileIndexStatusCfgPath, "{\"resume_time\":12345678901}");
  EXPECT_EQ(12345678901, LoadResumeTime());
  test::WriteFile(kFileIndexStatusCfgPath, "{\"resume_time\":0}");
  EXPECT_EQ(0, LoadResumeTime());
}

TEST_F(StateFilesTest, NamesEachShareOnceAndPassesOverRecordsWithoutOne) {
  test::WriteFile(kFileIndexFoldersCfgPath, "[" + Record("/b/x") + "," + Record("no share") + "," +
                                                Record("/") + "," + Record("/a") + "," +
                                                Record("/b") + "]");
  EXPECT_THAT(LoadIndexedShares(), ElementsAre("a", "b"));
}

TEST_F(StateFilesTest, GarbageIsAnErrorAndNoEmptyList) {
  for (const char* text : {"{", "7", "{\"a\":1}", "[7]", ""}) {
    test::WriteFile(kFileIndexFoldersCfgPath, text);
    EXPECT_THROW(LoadIndexedShares(), Error) << text;
  }
  for (const char* text : {"{", "7", "[]", ""}) {
    test::WriteFile(kFileIndexStatusCfgPath, text);
    EXPECT_THROW(LoadResumeTime(), Error) << text;
  }
}

}  // namespace
}  // namespace quarry::fileindexd
