// Who waits for the lock of the folder list, and who does not.

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "common/lock_file.h"
#include "fileindex/index_mgr.h"
#include "platform/include/recycle.h"
#include "tests/fileindex/operation_fixture.h"

namespace quarry::fileindex {
namespace {

using Operations = std::vector<std::pair<std::string, std::function<void()>>>;

class FolderLockTest : public OperationTest {
 protected:
  FolderLockTest() {
    fake::AddShare("homes", volume_ + "/homes");
    fake::AddHomeRecycle(volume_ + "/homes/ann/#recycle", AUTH_TYPE_LOCAL);
    test::MakeDirs(volume_ + "/photo/#recycle");
    SaveList({Record("/photo/a"), Record("/music")});
  }

  // The code of the operation's failure, 0 when it does not fail.
  static int CodeOf(const std::function<void()>& operation) {
    try {
      operation();
    } catch (const Error& error) {
      return error.code();
    }
    return 0;
  }

  const LockFile lock_{kFolderLock, true};  // held by somebody else all the while
};

TEST_F(FolderLockTest, ThoseThatChangeFoldersWaitForIt) {
  const std::string before = StoredList();
  const Operations operations = {
      {"FolderAdd", [] { FolderAdd(Array({Record("/photo/b")}), false); }},
      {"FolderSet", [] { FolderSet(Array({Record("/photo/a", "d")}), false); }},
      {"FolderDelete", [] { FolderDelete(Array({"/music"})); }}};
  for (const auto& [name, operation] : operations) EXPECT_EQ(CodeOf(operation), 506) << name;
  EXPECT_EQ(StoredList(), before);
}

TEST_F(FolderLockTest, AllOthersAreDoneWithoutIt) {
  Begin();
  fake::OnRequest([](const Json::Value&) { return R"({"success":true,"data":[]})"; });
  Json::Value result;
  const Operations operations = {
      {"FolderList", [&] { FolderList(result, 0, 9, "path", "", Array({})); }},
      {"FolderGet", [&] { FolderGet(result, "/photo/a"); }},
      {"FolderReindex", [] { FolderReindex(Array({"/photo/a"})); }},
      {"ShareRename", [] { ShareRename("gone", "photo"); }},
      {"ShareMigrate", [&] { ShareMigrate("music", "/volume9/music", volume_ + "/music"); }},
      {"ShareCheckRecycle", [] { ShareCheckRecycle("photo"); }},
      {"SharePause", [] { SharePause("photo"); }},
      {"ShareResume", [] { ShareResume("photo"); }},
      {"VolumePause", [&] { VolumePause(volume_); }},
      {"VolumeResume", [&] { VolumeResume(volume_); }},
      {"HomeDisable", [] { HomeDisable(AUTH_TYPE_LOCAL); }},
      {"HomeEnable", [] { HomeEnable(AUTH_TYPE_LOCAL); }},
      {"UserRename", [] { UserRename("ann", "joan"); }},
      {"PrepareServices", [] { PrepareServices(); }},
      {"UpdateTermSuggestion", [] { UpdateTermSuggestion({"fileindex_photo"}); }},
      {"VolumeClearPaused", [&] { VolumeClearPaused(volume_); }},
      {"ShareClearPaused", [&] { ShareClearPaused("photo", volume_ + "/photo"); }}};
  for (const auto& [name, operation] : operations) EXPECT_EQ(CodeOf(operation), 0) << name;
  EXPECT_TRUE(fake::Sleeps().empty());
}

}  // namespace
}  // namespace quarry::fileindex
