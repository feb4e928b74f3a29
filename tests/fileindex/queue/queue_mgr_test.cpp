#include "fileindex/queue/queue_mgr.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>

#include <cerrno>
#include <cstdio>
#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "common/error.h"
#include "common/file_util.h"
#include "common/lock_file.h"
#include "common/unique_fd.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/queue/queue_lines.h"

namespace quarry::fileindex {
namespace {

using Strings = std::vector<std::string>;

class QueueMgrTest : public fake::FakePlatformTest {
 protected:
  ~QueueMgrTest() override { log_level = 7; }

  void WriteLive(const std::string& text) { test::WriteFile(live_, text); }
  void WriteTmp(const std::string& text) { test::WriteFile(tmp_, text); }

  // What one pass hands out; its result goes to `count`.
  Strings Process(bool use_tmp, std::int32_t* count = nullptr) {
    Strings texts;
    const std::int32_t result = QueueMgr(live_).ProcessOP(
        [&texts](std::shared_ptr<OP> op) { texts.push_back(Text(*op)); }, use_tmp);
    if (count != nullptr) *count = result;
    return texts;
  }

  static Error Refusal(const std::function<void()>& call) {
    try {
      call();
    } catch (const Error& error) {
      return error;
    }
    ADD_FAILURE() << "no error";
    return Error(0);
  }

  test::TempDir dir_;
  const std::string live_ = dir_ / "queue";
  const std::string tmp_ = dir_ / "queue.tmp";
};

// ---- The snapshot

TEST_F(QueueMgrTest, PathsThatNameNoQueueAreRefused) {
  for (const std::string path : {"", "/", "queue", "./queue", "/var/", "//"}) {
    const Error error = Refusal([&path] { QueueMgr manager(path); });
    EXPECT_EQ(error.code(), 120);
    EXPECT_EQ(error.reason(), "Not a queue path: " + path);
  }
  EXPECT_EQ(Refusal([] { QueueMgr manager(std::string("/a\0b", 4)); }).code(), 120);
  for (const char* call : {"rename", "unlink", "open"}) {
    fake::ResetSystemCalls();
    Refusal([] { QueueMgr manager("/"); });
    EXPECT_EQ(fake::SystemCallCount(call), 0);
  }
}

TEST_F(QueueMgrTest, LiveQueueBecomesTheSnapshot) {
  WriteLive("content");
  QueueMgr(live_).PrepareTmpQueue();
  EXPECT_EQ(test::ReadFile(tmp_), "content");
  EXPECT_FALSE(IsFileExist(live_));
}

TEST_F(QueueMgrTest, WithoutALiveQueueNothingIsDone) {
  QueueMgr(live_).PrepareTmpQueue();
  EXPECT_EQ(test::ListDir(dir_.path()), Strings{});
  WriteTmp("old");
  QueueMgr(live_).PrepareTmpQueue();
  EXPECT_EQ(test::ListDir(dir_.path()), Strings{"queue.tmp"});
}

TEST_F(QueueMgrTest, SnapshotThatIsThereStays) {
  WriteLive("new");
  WriteTmp("old");
  QueueMgr(live_).PrepareTmpQueue();
  EXPECT_EQ(test::ReadFile(live_), "new");
  EXPECT_EQ(test::ReadFile(tmp_), "old");
}

TEST_F(QueueMgrTest, QueueIsRenamedUnderItsLock) {
  WriteLive("content");
  bool locked = false;
  fake::OnSystemCall("rename", [this, &locked] {
    const UniqueFd fd(open(live_.c_str(), O_RDONLY | O_CLOEXEC));
    locked = flock(fd.get(), LOCK_EX | LOCK_NB) != 0 && errno == EWOULDBLOCK;
  });
  QueueMgr(live_).PrepareTmpQueue();
  EXPECT_TRUE(locked);
  const LockFile free(tmp_, true);
}

TEST_F(QueueMgrTest, LockThatCannotBeHadLeavesTheQueue) {
  WriteLive("content");
  const LockFile lock(live_, true);
  EXPECT_EQ(Refusal([this] { QueueMgr(live_).PrepareTmpQueue(); }).code(), 506);
  EXPECT_EQ(test::ReadFile(live_), "content");
}

TEST_F(QueueMgrTest, FailedRenameIsLogged) {
  WriteLive("content");
  errno = 0;
  fake::FailSystemCall("rename", 1, EXDEV);
  const Error error = Refusal([this] { QueueMgr(live_).PrepareTmpQueue(); });
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), "rename failed, reason=Invalid cross-device link");
  const Strings logs = fake::LogsWith("queue_mgr");
  ASSERT_EQ(logs.size(), 1u);
  EXPECT_EQ(fake::AnyLine(logs[0]),
            fake::AnyLine(fake::LogHead("queue_mgr", 1, "PrepareTmpQueue")) +
                "Failed [0 > rename(queue_path_.c_str(), queue_path_tmp_.c_str())], reason: rename "
                "failed, reason=Invalid cross-device link [err: Invalid cross-device link]");
  EXPECT_EQ(test::ReadFile(live_), "content");
}

TEST_F(QueueMgrTest, DirectoryInPlaceOfTheSnapshotIsAFailedRename) {
  WriteLive("content");
  test::MakeDirs(tmp_);
  EXPECT_EQ(Refusal([this] { QueueMgr(live_).PrepareTmpQueue(); }).reason(),
            "rename failed, reason=Is a directory");
}

TEST_F(QueueMgrTest, SnapshotIsDeleted) {
  WriteLive("new");
  WriteTmp("old");
  EXPECT_EQ(QueueMgr(live_).DeleteTmp(), 0);
  EXPECT_EQ(test::ListDir(dir_.path()), Strings{"queue"});
  EXPECT_EQ(QueueMgr(live_).DeleteTmp(), -1);
  EXPECT_EQ(errno, ENOENT);
}

TEST_F(QueueMgrTest, SnapshotThatCannotBeDeletedIsReported) {
  WriteTmp("old");
  fake::FailSystemCall("unlink", 1, EACCES);
  EXPECT_EQ(QueueMgr(live_).DeleteTmp(), -1);
  EXPECT_EQ(errno, EACCES);
  EXPECT_EQ(test::ReadFile(tmp_), "old");
}

// ---- Processing

TEST_F(QueueMgrTest, NothingToProcess) {
  std::int32_t count = -1;
  EXPECT_EQ(Process(true, &count), Strings{});
  EXPECT_EQ(count, 0);
  EXPECT_EQ(Process(false, &count), Strings{});
  EXPECT_EQ(count, 0);
  EXPECT_TRUE(fake::Logs().empty());
}

TEST_F(QueueMgrTest, SnapshotIsProcessedAndKept) {
  WriteLive(Line(EVENT_MODIFY, "/s/d/a") + Line(EVENT_REINDEX, "/s/d"));
  std::int32_t count = 0;
  EXPECT_EQ(Process(true, &count), Strings{"reindex /s/d"});
  EXPECT_EQ(count, 2);
  EXPECT_EQ(test::ListDir(dir_.path()), Strings{"queue.tmp"});
  EXPECT_EQ(Process(true), Strings{"reindex /s/d"});
}

TEST_F(QueueMgrTest, LeftoverSnapshotIsProcessedAlone) {
  WriteTmp(Line(EVENT_MODIFY, "/old"));
  WriteLive(Line(EVENT_MODIFY, "/new"));
  EXPECT_EQ(Process(true), Strings{"index /old"});
  EXPECT_EQ(test::ReadFile(live_), Line(EVENT_MODIFY, "/new"));
  QueueMgr(live_).DeleteTmp();
  EXPECT_EQ(Process(true), Strings{"index /new"});
}

TEST_F(QueueMgrTest, LiveQueueIsProcessedInPlace) {
  WriteTmp(Line(EVENT_MODIFY, "/old"));
  WriteLive(Line(EVENT_MODIFY, "/new"));
  EXPECT_EQ(Process(false), Strings{"index /new"});
  EXPECT_EQ(test::ListDir(dir_.path()), (Strings{"queue", "queue.tmp"}));
}

TEST_F(QueueMgrTest, OverflowIsOneFullReindex) {
  WriteLive(Line(EVENT_MODIFY, "/a") + Line(EVENT_OVERFLOW, ""));
  std::int32_t count = 0;
  EXPECT_EQ(Process(true, &count), Strings{"full "});
  EXPECT_EQ(count, 1);
}

TEST_F(QueueMgrTest, LinesThatWereSkippedAreCounted) {
  QueueMgr queue(live_);
  EXPECT_EQ(0U, queue.SkippedLines());
  WriteLive("rubbish\n" + Line(EVENT_MODIFY, "/s/a") + "\n{\"event\":2");
  EXPECT_EQ(1, queue.ProcessOP([](const std::shared_ptr<OP>&) {}, true));
  EXPECT_EQ(3U, queue.SkippedLines());
}

TEST_F(QueueMgrTest, FailureWhileProcessingKeepsTheSnapshot) {
  WriteLive(Line(EVENT_MODIFY, "/a"));
  EXPECT_EQ(Refusal([this] {
              QueueMgr(live_).ProcessOP([](std::shared_ptr<OP>) { throw Error(913); }, true);
            }).code(),
            913);
  EXPECT_EQ(test::ReadFile(tmp_), Line(EVENT_MODIFY, "/a"));
}

TEST_F(QueueMgrTest, TreesAreBuiltOnceAndKept) {
  WriteLive(Line(EVENT_MODIFY, "/a"));
  WriteTmp(Line(EVENT_MODIFY, "/b"));
  QueueMgr manager(live_);
  const auto tree = manager.GetOPTree();
  const auto tree_tmp = manager.GetOPTreeTmp();
  EXPECT_EQ(Texts(tree->ops), Strings{"index /a"});
  EXPECT_EQ(Texts(tree_tmp->ops), Strings{"index /b"});
  WriteLive(Line(EVENT_MODIFY, "/a") + Line(EVENT_MODIFY, "/c"));
  test::WriteFile(tmp_, "");
  EXPECT_EQ(manager.GetOPTree(), tree);
  EXPECT_EQ(manager.GetOPTreeTmp(), tree_tmp);
  EXPECT_EQ(tree->ops.size(), 1u);
}

TEST_F(QueueMgrTest, WhatWasProcessedOnceIsProcessedAgainAsItWas) {
  for (const bool use_tmp : {false, true}) {
    WriteLive(Line(EVENT_MODIFY, "/a"));
    QueueMgr manager(live_);
    const auto count = [](std::shared_ptr<OP>) {};
    EXPECT_EQ(manager.ProcessOP(count, use_tmp), 1);
    test::WriteFile(use_tmp ? tmp_ : live_, Line(EVENT_MODIFY, "/a") + Line(EVENT_MODIFY, "/b"));
    EXPECT_EQ(manager.ProcessOP(count, use_tmp), 1);
  }
}

// What came to its name meanwhile was never read.
TEST_F(QueueMgrTest, OnlyTheSnapshotThatWasReadIsDeletedAtASecondAttempt) {
  WriteLive(Line(EVENT_MODIFY, "/a"));
  QueueMgr manager(live_);
  manager.ProcessOP([](std::shared_ptr<OP>) {}, true);
  fake::FailSystemCall("unlink", 1, EACCES);
  EXPECT_EQ(manager.DeleteTmp(), -1);
  WriteLive("new");
  ASSERT_EQ(rename(live_.c_str(), tmp_.c_str()), 0);
  EXPECT_EQ(manager.DeleteTmp(), -1);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_EQ(test::ReadFile(tmp_), "new");
}

TEST_F(QueueMgrTest, TreeOfAMissingQueue) {
  QueueMgr manager(live_);
  EXPECT_EQ(Refusal([&manager] { manager.GetOPTree(); }).code(), 502);
  EXPECT_EQ(Refusal([&manager] { manager.GetOPTreeTmp(); }).code(), 502);
  WriteLive("");
  EXPECT_TRUE(manager.GetOPTree()->ops.empty());
}

// ---- Questions

class QuestionTest : public QueueMgrTest {
 protected:
  bool Processing(const std::string& path) { return QueueMgr(live_).IsFullPathProcessing(path); }
  bool HasReindex(const std::string& path) { return QueueMgr(live_).IsFullPathHasReindex(path); }
  bool WaitingFor(const std::string& path) { return QueueMgr(live_).IsReindexWaitingFor(path); }
};

TEST_F(QuestionTest, NothingIsWaitingWithoutFiles) {
  EXPECT_FALSE(Processing("/s"));
  EXPECT_FALSE(HasReindex("/s"));
  EXPECT_FALSE(WaitingFor("/s"));
  WriteLive("");
  WriteTmp("");
  EXPECT_FALSE(Processing("/s"));
}

TEST_F(QuestionTest, EventAtThePathOrBelowIt) {
  WriteLive(Line(EVENT_MODIFY, "/s/a/b/c"));
  for (const std::string path : {"/s", "/s/a", "/s/a/b", "/s/a/b/c", ""}) {
    EXPECT_TRUE(Processing(path)) << path;
  }
  for (const std::string path : {"/s/a/b/c/d", "/s/b", "/t", "/s/a/b/", "s"}) {
    EXPECT_FALSE(Processing(path)) << path;
  }
}

TEST_F(QuestionTest, NameThatBeginsTheSameIsAnother) {
  WriteLive(Line(EVENT_MODIFY, "/s/ab"));
  EXPECT_FALSE(Processing("/s/a"));
}

TEST_F(QuestionTest, RenameAwayFromThePathCounts) {
  WriteLive(RenameLine("/s/a/x", "/t/y"));
  EXPECT_TRUE(Processing("/s/a"));
  EXPECT_TRUE(Processing("/t"));
  EXPECT_FALSE(Processing("/s/a/x/z"));
  EXPECT_FALSE(Processing("/u"));
  // An old path means nothing in other events, and an empty one is nowhere.
  WriteLive(Line(EVENT_MODIFY, "/t/y", "/s/a/x"));
  EXPECT_FALSE(Processing("/s/a"));
  WriteLive(Line(EVENT_RENAME, "t"));
  EXPECT_FALSE(Processing(""));
}

TEST_F(QuestionTest, BothFilesAreAsked) {
  WriteTmp(Line(EVENT_REINDEX, "/s/old"));
  WriteLive(Line(EVENT_REINDEX, "/s/new"));
  for (const std::string path : {"/s/old", "/s/new"}) {
    EXPECT_TRUE(Processing(path));
    EXPECT_TRUE(HasReindex(path));
    EXPECT_TRUE(WaitingFor(path));
  }
  EXPECT_FALSE(Processing("/s/other"));
  EXPECT_FALSE(HasReindex("/s/other"));
  EXPECT_FALSE(WaitingFor("/s/other"));
}

TEST_F(QuestionTest, ReindexAtThePathOrBelowIt) {
  WriteLive(Line(EVENT_REINDEX, "/s/a/b"));
  EXPECT_TRUE(HasReindex("/s/a"));
  EXPECT_TRUE(HasReindex("/s/a/b"));
  EXPECT_FALSE(HasReindex("/s/a/b/c"));
  EXPECT_FALSE(HasReindex("/s/a/bb"));
  EXPECT_FALSE(HasReindex("/s/aa"));
}

TEST_F(QuestionTest, ReindexAtThePathOrAboveIt) {
  WriteLive(Line(EVENT_REINDEX, "/s/a/b"));
  EXPECT_TRUE(WaitingFor("/s/a/b"));
  EXPECT_TRUE(WaitingFor("/s/a/b/c"));
  EXPECT_TRUE(WaitingFor("/s/a/b/c/d"));
  EXPECT_FALSE(WaitingFor("/s/a"));
  EXPECT_FALSE(WaitingFor("/s/a/bb"));
  EXPECT_FALSE(WaitingFor("/s/a/b c"));
}

TEST_F(QuestionTest, ReindexTogetherWithOtherBitsIsNone) {
  for (const std::uint32_t bit : {0x1u, 0x2u, 0x40u, 0x100u, 0x20000u}) {
    WriteLive(Line(EVENT_REINDEX | bit, "/s/a"));
    EXPECT_FALSE(HasReindex("/s/a"));
    EXPECT_FALSE(WaitingFor("/s/a"));
  }
  WriteLive(DirLine(EVENT_CREATE, "/s/a"));
  EXPECT_FALSE(HasReindex("/s/a"));
}

TEST_F(QuestionTest, LastLineNeedNotBeEnded) {
  std::string line = Line(EVENT_REINDEX, "/s/a");
  line.pop_back();
  WriteLive(Line(EVENT_MODIFY, "/t") + line);
  EXPECT_TRUE(HasReindex("/s/a"));
}

TEST_F(QuestionTest, MalformedLineBeforeTheAnswerIsAnError) {
  WriteLive("rubbish\n" + Line(EVENT_REINDEX, "/s/a"));
  for (const auto& ask : std::vector<std::function<void()>>{[this] { Processing("/s/a"); },
                                                            [this] { HasReindex("/s/a"); },
                                                            [this] { WaitingFor("/s/a"); }}) {
    const Error error = Refusal(ask);
    EXPECT_EQ(error.code(), 906);
    EXPECT_EQ(error.reason(), "Malformed event_raw: rubbish");
  }
  WriteLive("{}\n");
  EXPECT_EQ(Refusal([this] { Processing("/s/a"); }).code(), 120);
}

TEST_F(QuestionTest, ATornLastLineIsNoReindex) {
  const std::string torn = "{\"event\":65536,\"pa";
  WriteLive(Line(EVENT_MODIFY, "/s/a") + torn);
  WriteTmp(Line(EVENT_REINDEX, "/s/b") + torn);
  EXPECT_FALSE(WaitingFor("/s/a"));
  EXPECT_TRUE(WaitingFor("/s/b"));
  EXPECT_EQ(Refusal([this] { HasReindex("/s/b"); }).code(), 906);
  EXPECT_EQ(Refusal([this] { Processing("/s/b"); }).code(), 906);
  WriteLive(torn + "\n");
  EXPECT_EQ(Refusal([this] { WaitingFor("/s/b"); }).code(), 906);
}

TEST_F(QuestionTest, MalformedLineBehindTheAnswerIsNotSeen) {
  WriteLive(Line(EVENT_REINDEX, "/s/a") + "rubbish\n");
  WriteTmp("rubbish\n");
  EXPECT_TRUE(Processing("/s/a"));
  EXPECT_TRUE(HasReindex("/s/a"));
  EXPECT_TRUE(WaitingFor("/s/a"));
}

TEST_F(QuestionTest, QueueThatCannotBeOpenedIsAnError) {
  WriteLive(Line(EVENT_REINDEX, "/s/a"));
  errno = 0;
  fake::FailSystemCall("open", 1, EMFILE);
  const Error error = Refusal([this] { Processing("/s/a"); });
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), "Failed to open queue, reason=Too many open files");
  ASSERT_EQ(fake::Logs().size(), 1u);
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("queue_mgr", 1, "FindQueue")) +
                "Failed [!input_stream], reason: Failed to open queue, reason=Too many open files "
                "[err: Too many open files]");
}

TEST_F(QuestionTest, QueueThatCannotBeReadToItsEndIsAnError) {
  std::string lines;
  while (lines.size() < 200'000) lines += Line(EVENT_MODIFY, "/s/b");
  WriteLive(lines + Line(EVENT_REINDEX, "/s/a"));
  EXPECT_TRUE(HasReindex("/s/a"));
  fake::FailSystemCall("read", 2, EIO);
  const Error error = Refusal([this] { HasReindex("/s/a"); });
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), "Failed to open queue, reason=Input/output error");
}

// Another process renames the live queue between the two looks.
TEST_F(QuestionTest, QueueThatIsRenamedMeanwhileIsAskedAsTheSnapshot) {
  WriteLive(Line(EVENT_REINDEX, "/s/a"));
  bool renamed = false;
  fake::OnSystemCall("open", [this, &renamed] {
    if (!std::exchange(renamed, true)) rename(live_.c_str(), tmp_.c_str());
  });
  errno = EBADF;
  EXPECT_TRUE(HasReindex("/s/a"));
  EXPECT_TRUE(renamed);
  // Else a line that is logged next would end in what is no failure.
  EXPECT_EQ(EBADF, errno);
}

TEST_F(QuestionTest, QuestionsLeaveTheFilesAlone) {
  WriteLive(Line(EVENT_REINDEX, "/s/a"));
  Processing("/x");
  HasReindex("/x");
  WaitingFor("/x");
  EXPECT_EQ(test::ListDir(dir_.path()), Strings{"queue"});
  EXPECT_EQ(test::ReadFile(live_), Line(EVENT_REINDEX, "/s/a"));
}

}  // namespace
}  // namespace quarry::fileindex
