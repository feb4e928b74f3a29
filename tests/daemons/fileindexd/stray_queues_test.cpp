#include "daemons/fileindexd/stray_queues.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <optional>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/sdk/share.h"
#include "daemons/fileindexd/index_daemon.h"
#include "fileindex/config/folder_mgr.h"
#include "platform/linux/share_move.h"
#include "tests/daemons/fileindexd/share_fixture.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace quarry::fileindexd {
namespace {

class StrayQueuesTest : public ::testing::Test {
 protected:
  void SetUp() override {
    test::ResetTestRoot();
    for (const char* name : {"indexed", "stray"}) {
      test::MakeDirs(volume_ / name);
      RegisterShare(volume_ / name);
      test::WriteFile(QueueOf(name), "{}\n");
      test::WriteFile(QueueOf(name) + ".tmp", "{}\n");
    }
    Json::Value list(Json::arrayValue);
    list.append(
        fileindex::Folder("/indexed/a", "a", true, true, true, true, false, true).GetData());
    ASSERT_TRUE(toFile(list, fileindex::kFileIndexFoldersCfgPath));
  }

  static std::string QueueOf(const std::string& share) {
    return sdk::SDKShare(share).GetQueuePath();
  }
  static bool HasQueue(const std::string& share) {
    const std::string queue = QueueOf(share);
    EXPECT_EQ(IsFileExist(queue), IsFileExist(queue + ".tmp"));
    return IsFileExist(queue);
  }

  test::TempDir volume_;
};

TEST_F(StrayQueuesTest, OnlyThoseOfSharesWithoutFoldersGo) {
  RemoveStrayQueues();
  EXPECT_FALSE(HasQueue("stray"));
  EXPECT_TRUE(HasQueue("indexed"));
  RemoveStrayQueues();
  EXPECT_TRUE(HasQueue("indexed"));
}

TEST_F(StrayQueuesTest, AQueueThatIsBeingWrittenWaits) {
  std::optional<LockFile> writer(std::in_place, QueueOf("stray"), true);
  RemoveStrayQueues();
  EXPECT_TRUE(HasQueue("stray"));
  writer.reset();
  RemoveStrayQueues();
  EXPECT_FALSE(HasQueue("stray"));
}

TEST_F(StrayQueuesTest, AShareOnItsWayKeepsItsQueue) {
  std::filesystem::rename(volume_ / "stray", volume_ / "moved");
  platform::MoveShare("stray", volume_ / "moved");
  RemoveStrayQueues();
  platform::ShowMovingShares(true);
  EXPECT_TRUE(IsFileExist(QueueOf("moved")));
  platform::ShowMovingShares(false);
}

TEST_F(StrayQueuesTest, ALinkInTheQueuesPlaceIsNotFollowed) {
  ASSERT_TRUE(Unlink(QueueOf("stray")));
  std::filesystem::create_symlink(volume_ / "elsewhere", QueueOf("stray"));
  RemoveStrayQueues();
  EXPECT_TRUE(std::filesystem::is_symlink(QueueOf("stray")));
}

TEST_F(StrayQueuesTest, ADamagedFolderListRemovesNothing) {
  test::WriteFile(fileindex::kFileIndexFoldersCfgPath, "{");
  EXPECT_THROW(RemoveStrayQueues(), Error);
  EXPECT_TRUE(HasQueue("stray"));
}

TEST_F(StrayQueuesTest, TheDaemonSweepsWhenItStarts) {
  IndexDaemon daemon(1);
  daemon.Step(0);
  EXPECT_FALSE(HasQueue("stray"));
  EXPECT_TRUE(daemon.Stop(std::chrono::seconds(20)));
}

}  // namespace
}  // namespace quarry::fileindexd
