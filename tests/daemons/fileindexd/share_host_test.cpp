#include "daemons/fileindexd/share_host.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>

#include "common/error.h"
#include "common/lock_file.h"
#include "common/paths.h"
#include "common/unique_fd.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "platform/linux/share_registry.h"
#include "tests/daemons/fileindexd/share_fixture.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace quarry::fileindexd {
namespace {

using fileindex::Folder;
using fileindex::FolderMgr;
using fileindex::StatusMgr;

class ShareHostTest : public ::testing::Test {
 protected:
  void SetUp() override {
    test::ResetTestRoot();
    test::MakeDirs(volume_ / "s");
    RegisterShare(volume_ / "s");
  }

  void SaveFolders(const std::vector<Folder>& folders) {
    std::string text;
    for (const Folder& folder : folders) text += (text.empty() ? "" : ",") + Text(folder);
    test::WriteFile(fileindex::kFileIndexFoldersCfgPath, "[" + text + "]");
  }

  static std::string Text(const Folder& folder) { return folder.GetData().toStyledString(); }

  test::TempDir volume_;
  std::unique_ptr<ShareHost> host_ = MakeShareHost("s");
};

TEST_F(ShareHostTest, LoadsTheSharesOwnFoldersAndNoOthers) {
  SaveFolders({Folder("/s/a", "a", true, false, true, false, false, true),
               Folder("/vanished/b", "b", true, true, true, true, false, false),
               Folder("no share", "c", true, true, true, true, false, false),
               Folder("/s", "s", false, true, false, true, false, false)});
  const ShareLayout layout = host_->Load();
  EXPECT_EQ(volume_ / "s", layout.root);
  EXPECT_EQ(0U, layout.queue_path.find(RootedPath("/var/lib/quarry/queue/")));
  const FolderRules expected({{"/s/a", volume_ / "s/a", true, false, true, false, true},
                              {"/s", volume_ / "s", false, true, false, true, false}});
  EXPECT_EQ(expected, *layout.rules);
}

TEST_F(ShareHostTest, AShareThatHasVanishedIsAnError) {
  ASSERT_TRUE(platform::RemoveShare("s"));
  EXPECT_THROW(host_->Load(), Error);
  EXPECT_THROW(host_->CreateIndexIfWanted([] { ADD_FAILURE(); }), Error);
}

TEST_F(ShareHostTest, AListThatIsGarbageIsAnError) {
  test::WriteFile(fileindex::kFileIndexFoldersCfgPath, "{");
  EXPECT_THROW(host_->Load(), Error);
}

TEST_F(ShareHostTest, ReadsAndClearsTheMark) {
  EXPECT_FALSE(host_->NeedsReindex());
  host_->MarkNeedsReindex();
  EXPECT_EQ(fileindex::kShareNeedReindex, fileindex::StatusMgr().GetShareStatus("s"));
  StatusMgr().SetShareStatus("s", fileindex::kShareNeedReindex | 4);
  EXPECT_TRUE(host_->NeedsReindex());
  host_->ClearNeedsReindex();
  EXPECT_FALSE(host_->NeedsReindex());
  EXPECT_EQ(4, StatusMgr().GetShareStatus("s"));
}

TEST_F(ShareHostTest, LeavesAShareAloneThatMustBeRebuilt) {
  StatusMgr().SetShareStatus("s", fileindex::kShareNeedReindex | fileindex::kShareNeedRebuild);
  EXPECT_FALSE(host_->NeedsReindex());
}

TEST_F(ShareHostTest, KnowsRecycleBins) {
  test::MakeDirs(volume_ / "s/#recycle/d");
  EXPECT_TRUE(host_->IsInRecycleBin(volume_ / "s/#recycle"));
  EXPECT_TRUE(host_->IsInRecycleBin(volume_ / "s/#recycle/d"));
  EXPECT_FALSE(host_->IsInRecycleBin(volume_ / "s/recycle"));
}

TEST_F(ShareHostTest, MakesAnIndexOnlyForAShareWithFolders) {
  bool created = false;
  const auto create = [&] { created = true; };
  EXPECT_FALSE(host_->CreateIndexIfWanted(create));
  EXPECT_FALSE(created);
  SaveFolders({Folder("/s", "s", true, true, true, true, false, false)});
  EXPECT_TRUE(host_->CreateIndexIfWanted(create));
  EXPECT_TRUE(created);
}

TEST_F(ShareHostTest, KeepsTheFolderListFromChangingWhileItMakesAnIndex) {
  SaveFolders({Folder("/s", "s", true, true, true, true, false, false)});
  bool locked = false;
  host_->CreateIndexIfWanted([&] {
    const UniqueFd fd(open(RootedPath("/tmp/quarry_cfg_folder.lock").c_str(), O_RDWR | O_CLOEXEC));
    locked = fd.valid() && flock(fd.get(), LOCK_EX | LOCK_NB) != 0;
  });
  EXPECT_TRUE(locked);
  EXPECT_NO_THROW(LockFile(RootedPath("/tmp/quarry_cfg_folder.lock"), true));
}

}  // namespace
}  // namespace quarry::fileindexd
