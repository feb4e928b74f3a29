// What a snapshot is while it is being worked off, and which one a manager removes when others have
// made and removed some in between.

#include <gtest/gtest.h>

#include <cerrno>
#include <memory>
#include <string>

#include "common/error.h"
#include "fileindex/queue/queue_mgr.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::fileindex {
namespace {

class SnapshotTest : public fake::FakePlatformTest {
 protected:
  void WriteLive(const std::string& path) const {
    test::WriteFile(live_, R"({"event":2,"path":")" + path + "\"}\n");
  }
  std::string Process(QueueMgr& manager) const {
    std::string paths;
    manager.ProcessOP([&](std::shared_ptr<OP> op) { paths += op->node->GetPath(); }, true);
    return paths;
  }
  void ExpectKept(QueueMgr& manager) const {
    errno = 0;
    EXPECT_EQ(manager.DeleteTmp(), -1);
    EXPECT_EQ(errno, ENOENT);
    EXPECT_EQ(test::ReadFile(tmp_).substr(0, 9), R"({"event":)");
  }

  test::TempDir dir_;
  const std::string live_ = dir_.path() + "/queue";
  const std::string tmp_ = live_ + ".tmp";
};

TEST_F(SnapshotTest, OneMadeAfterNoneWasFoundStays) {
  QueueMgr idle(live_);
  EXPECT_EQ(Process(idle), "");
  WriteLive("/a");
  QueueMgr(live_).PrepareTmpQueue();
  ExpectKept(idle);
  EXPECT_EQ(Process(idle), "/a");
  EXPECT_EQ(idle.DeleteTmp(), 0);
}

TEST_F(SnapshotTest, OneInThePlaceOfTheProcessedOneStays) {
  WriteLive("/a");
  QueueMgr first(live_);
  QueueMgr second(live_);
  EXPECT_EQ(Process(first), "/a");
  EXPECT_EQ(Process(second), "/a");
  EXPECT_EQ(first.DeleteTmp(), 0);
  WriteLive("/b");
  QueueMgr third(live_);
  EXPECT_EQ(Process(third), "/b");
  ExpectKept(second);
  ExpectKept(second);
  EXPECT_EQ(third.DeleteTmp(), 0);
}

TEST_F(SnapshotTest, OneThatFollowsTheRemovedOneStays) {
  WriteLive("/a");
  QueueMgr manager(live_);
  EXPECT_EQ(Process(manager), "/a");
  EXPECT_EQ(manager.DeleteTmp(), 0);
  WriteLive("/b");
  EXPECT_EQ(Process(manager), "/a");
  ExpectKept(manager);
  QueueMgr next(live_);
  EXPECT_EQ(Process(next), "/b");
  EXPECT_EQ(next.DeleteTmp(), 0);
}

TEST_F(SnapshotTest, OneThatIsGoneIsReported) {
  WriteLive("/a");
  QueueMgr manager(live_);
  EXPECT_EQ(Process(manager), "/a");
  EXPECT_EQ(QueueMgr(live_).DeleteTmp(), 0);
  EXPECT_EQ(manager.DeleteTmp(), -1);
  EXPECT_EQ(errno, ENOENT);
}

TEST_F(SnapshotTest, ItIsTheSameHoweverOftenItIsRead) {
  WriteLive("/a");
  QueueMgr manager(live_);
  EXPECT_EQ(Process(manager), "/a");
  EXPECT_EQ(Process(manager), "/a");
  EXPECT_EQ(manager.DeleteTmp(), 0);
  EXPECT_EQ(manager.DeleteTmp(), -1);
  EXPECT_EQ(errno, ENOENT);
}

TEST_F(SnapshotTest, RemovalWaitsThroughASignal) {
  WriteLive("/a");
  QueueMgr manager(live_);
  EXPECT_EQ(Process(manager), "/a");
  fake::FailSystemCall("flock", 1, EINTR);
  EXPECT_EQ(manager.DeleteTmp(), 0);
}

TEST_F(SnapshotTest, OneThatCannotBeHeldStays) {
  WriteLive("/a");
  QueueMgr manager(live_);
  EXPECT_EQ(Process(manager), "/a");
  fake::FailSystemCall("flock", 1, ENOLCK);
  EXPECT_EQ(manager.DeleteTmp(), -1);
  EXPECT_EQ(errno, ENOLCK);
  EXPECT_EQ(manager.DeleteTmp(), 0);
}

TEST_F(SnapshotTest, OneThatCannotBeRemovedMayBeTriedAgain) {
  WriteLive("/a");
  QueueMgr manager(live_);
  EXPECT_EQ(Process(manager), "/a");
  fake::FailSystemCall("unlink", 1, EACCES);
  EXPECT_EQ(manager.DeleteTmp(), -1);
  EXPECT_EQ(errno, EACCES);
  EXPECT_EQ(manager.DeleteTmp(), 0);
}

// A reader may see a line that is being appended without its end, and the end a moment later.
TEST_F(SnapshotTest, LineThatIsEndedWhileTheQueueIsReadIsOneLine) {
  WriteLive("/a");
  const std::string whole = test::ReadFile(live_);
  test::WriteFile(live_, whole.substr(0, whole.size() - 1));
  int reads = 0;
  fake::OnSystemCall("read", [&] {
    if (++reads == 3) test::WriteFile(live_, whole);
  });
  EXPECT_FALSE(QueueMgr(live_).IsReindexWaitingFor("/a"));
  fake::OnSystemCall("read", nullptr);
}

// ---- Whether a reindex is still waiting

class ReindexInWorkTest : public SnapshotTest {
 protected:
  ReindexInWorkTest() {
    test::WriteFile(live_, R"({"event":65536,"path":"/s"})"
                           "\n");
  }
  bool IsWaiting() const { return QueueMgr(live_).IsReindexWaitingFor("/s/a"); }
};

TEST_F(ReindexInWorkTest, ItWaitsUntilItIsHandedOut) {
  EXPECT_TRUE(IsWaiting());
  QueueMgr manager(live_);
  manager.PrepareTmpQueue();
  EXPECT_TRUE(IsWaiting());
  manager.GetOPTreeTmp();
  EXPECT_TRUE(IsWaiting());
  bool in_work = true;
  manager.ProcessOP([&](std::shared_ptr<OP>) { in_work = !IsWaiting(); }, true);
  EXPECT_TRUE(in_work);
  EXPECT_FALSE(IsWaiting());
  EXPECT_TRUE(QueueMgr(live_).IsFullPathHasReindex("/s"));
  EXPECT_EQ(manager.DeleteTmp(), 0);
  EXPECT_FALSE(IsWaiting());
}

TEST_F(ReindexInWorkTest, ItWaitsAgainWhenThePassWasBrokenOff) {
  { EXPECT_EQ(Process(*std::make_unique<QueueMgr>(live_)), "/s"); }
  EXPECT_TRUE(IsWaiting());
}

TEST_F(ReindexInWorkTest, AnotherOneWaitsInTheLiveQueue) {
  QueueMgr manager(live_);
  EXPECT_EQ(Process(manager), "/s");
  EXPECT_FALSE(IsWaiting());
  test::WriteFile(live_, R"({"event":65536,"path":"/s/a"})");
  EXPECT_TRUE(IsWaiting());
}

TEST_F(ReindexInWorkTest, OneThatIsOnlyLookedAtWaits) {
  QueueMgr manager(live_);
  manager.ProcessOP([this](std::shared_ptr<OP>) { EXPECT_TRUE(IsWaiting()); }, false);
  EXPECT_TRUE(IsWaiting());
}

TEST_F(ReindexInWorkTest, AMalformedLineIsAnErrorThen) {
  test::WriteFile(live_, "rubbish\n" + test::ReadFile(live_));
  QueueMgr manager(live_);
  EXPECT_EQ(Process(manager), "/s");
  try {
    IsWaiting();
    ADD_FAILURE() << "nothing thrown";
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), 906);
  }
}

}  // namespace
}  // namespace quarry::fileindex
