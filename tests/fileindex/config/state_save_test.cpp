// How the two state files are written: as root to the end, and under the lock to the end.

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <unistd.h>

#include <functional>
#include <string>
#include <vector>

#include "common/lock_file.h"
#include "common/paths.h"
#include "common/unique_fd.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/index_daemon.h"

namespace quarry::fileindex {
namespace {

using ::testing::Each;

constexpr uid_t kCaller = 1234;

class StateSaveTest : public fake::FakePlatformTest {
 protected:
  // The effective users that change the files while `save` runs, one for each change.
  static std::vector<uid_t> WritersDuring(const std::function<void()>& save) {
    std::vector<uid_t> writers;
    for (const char* call : {"open", "rename", "chmod"}) {
      fake::OnSystemCall(call, [&writers] { writers.push_back(geteuid()); });
    }
    save();
    for (const char* call : {"open", "rename", "chmod"}) fake::OnSystemCall(call, nullptr);
    return writers;
  }

  // Whether nobody else could take the status lock, not even to share it, while files were changed.
  static bool IsLockedDuring(const std::function<void()>& change) {
    const std::string path = RootedPath("/tmp/quarry_cfg_fi_status.lock");
    std::vector<bool> locked;
    for (const char* call : {"rename", "chmod"}) {
      fake::OnSystemCall(call, [&locked, &path] {
        const UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
        locked.push_back(fd.valid() && flock(fd.get(), LOCK_SH | LOCK_NB) != 0);
      });
    }
    change();
    for (const char* call : {"rename", "chmod"}) fake::OnSystemCall(call, nullptr);
    return locked == std::vector<bool>(2, true);
  }
};

TEST_F(StateSaveTest, TheListIsWrittenAndItsModeSetAsRoot) {
  const FolderMgr folders;
  fake::SetEffectiveIds(kCaller, kCaller);
  const std::vector<uid_t> writers = WritersDuring([&] { folders.Save(); });
  EXPECT_GE(writers.size(), 3U);
  EXPECT_THAT(writers, Each(0U));
  EXPECT_EQ(geteuid(), kCaller);
}

TEST_F(StateSaveTest, TheStatusIsWrittenAndItsModeSetAsRoot) {
  const StatusMgr status;
  fake::SetEffectiveIds(kCaller, kCaller);
  const std::vector<uid_t> writers = WritersDuring([&] { status.Save(); });
  EXPECT_GE(writers.size(), 3U);
  EXPECT_THAT(writers, Each(0U));
  EXPECT_EQ(geteuid(), kCaller);
}

TEST_F(StateSaveTest, EachChangeOfTheStatusIsSavedUnderTheLock) {
  const test::IndexDaemon daemon;
  const std::vector<std::function<void(StatusMgr&)>> changes = {
      [](StatusMgr& status) { status.Pause(1); }, [](StatusMgr& status) { status.Resume(); },
      [](StatusMgr& status) { status.SetShareStatus("a", 1); },
      [](StatusMgr& status) { status.UnsetShareStatus("a", 1); },
      [](StatusMgr& status) { status.ClearShareStatus("a"); }};
  for (size_t i = 0; i < changes.size(); ++i) {
    StatusMgr status;
    EXPECT_TRUE(IsLockedDuring([&] { changes[i](status); })) << i;
  }
}

TEST_F(StateSaveTest, NeitherQuestionsNorSavesTakeTheLock) {
  const LockFile lock(RootedPath("/tmp/quarry_cfg_fi_status.lock"), true);
  StatusMgr status;
  EXPECT_EQ(status.GetPauseInfo(), -1);
  EXPECT_EQ(status.GetShareStatus("a"), 0);
  status.Save();
  EXPECT_TRUE(fake::Sleeps().empty());
}

}  // namespace
}  // namespace quarry::fileindex
