// The lock of a queue: what is decided under it, and that nobody shares it.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>

#include <string>

#include "common/file_util.h"
#include "common/unique_fd.h"
#include "fileindex/queue/queue_mgr.h"
#include "fileindex/util/custom_event.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"

namespace quarry::fileindex {
namespace {

class QueueLockTest : public fake::FakePlatformTest {
 protected:
  QueueLockTest() {
    fake::AddShare("photo", "/volume1/photo");
    live_ = fake::QueuePath("/volume1/photo");
    tmp_ = live_ + ".tmp";
  }

  // Whether the queue's lock is held so that it cannot even be shared.
  bool IsLocked() const {
    const UniqueFd fd(open(live_.c_str(), O_RDONLY | O_CLOEXEC));
    return fd.valid() && flock(fd.get(), LOCK_SH | LOCK_NB) != 0;
  }

  std::string live_;
  std::string tmp_;
};

TEST_F(QueueLockTest, ASnapshotThatComesWhileTheLockIsTakenStays) {
  test::WriteFile(live_, "new");
  fake::OnSystemCall("flock", [this] {
    if (!IsFileExist(tmp_)) test::WriteFile(tmp_, "old");
  });
  QueueMgr(live_).PrepareTmpQueue();
  EXPECT_EQ(test::ReadFile(tmp_), "old");
  EXPECT_EQ(test::ReadFile(live_), "new");
}

TEST_F(QueueLockTest, ASnapshotIsMadeUnderALockThatNobodyShares) {
  test::WriteFile(live_, "new");
  bool locked = false;
  fake::OnSystemCall("rename", [&] { locked = IsLocked(); });
  QueueMgr(live_).PrepareTmpQueue();
  EXPECT_TRUE(locked);
}

TEST_F(QueueLockTest, AnEventIsWrittenUnderALockThatNobodyShares) {
  bool locked = false;
  fake::OnSystemCall("write", [&] { locked = IsLocked(); });
  AddCustomEvent(0x20000, "/volume1/photo/a", "", Json::Value());
  EXPECT_TRUE(locked);
  EXPECT_NE(test::ReadFile(live_), "");
}

}  // namespace
}  // namespace quarry::fileindex
