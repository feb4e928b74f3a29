#include "daemons/fileindexd/worker.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>

#include <thread>

#include "daemons/common/priority.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "fileindex/queue/queue_mgr.h"
#include "tests/daemons/common/io_class.h"
#include "tests/daemons/fileindexd/worker_fixture.h"
#include "tests/support/files.h"

namespace quarry::fileindexd {
namespace {

using fileindex::EVENT_CREATE;
using fileindex::EVENT_MODIFY;
using fileindex::EVENT_REINDEX;
using fileindex::EVENT_RENAME;
using fileindex::EVENT_UPDATE_CFG;
using std::chrono::milliseconds;
using ::testing::Contains;
using ::testing::HasSubstr;

using WorkerTest = WorkerFixture;

TEST_F(WorkerTest, BeginsByComparingTheWholeShare) {
  disk_.WriteFile("/v/s/d/a.txt");
  index_.Put({"/v/s/gone.txt", false, "", ""});
  EXPECT_EQ("waiting", State());
  EXPECT_EQ(milliseconds(0), worker_->Step());
  ExpectInLine();
  EXPECT_GT(worker_->Step(), milliseconds(0));
  EXPECT_EQ("idle", State());
  EXPECT_TRUE(IsAtRest());
}

TEST_F(WorkerTest, TakesTheQueueOnlyWhenItHasLines) {
  worker_->Step();
  test::WriteFile(QueuePath(), "");
  EXPECT_TRUE(IsAtRest());
  disk_.WriteFile("/v/s/a.txt");
  Queue(EVENT_CREATE, "/v/s/a.txt");
  EXPECT_THAT(CommandsOfStep(),
              ::testing::ElementsAre("upsert /v/s/a.txt content", "attributes /v/s"));
}

TEST_F(WorkerTest, FindsTheSnapshotOfAnEarlierLife) {
  worker_->Step();
  disk_.WriteFile("/v/s/a.txt");
  Queue(EVENT_CREATE, "/v/s/a.txt");
  ASSERT_EQ(0, rename(QueuePath().c_str(), (QueuePath() + ".tmp").c_str()));
  EXPECT_THAT(CommandsOfStep(), Contains("upsert /v/s/a.txt content"));
  EXPECT_FALSE(HasSnapshot());
}

TEST_F(WorkerTest, WaitsLongerAndLongerWhileTheEngineIsDown) {
  index_.SetHook([](const std::string&) { throw Error(kErrorEngineRequest, "not running"); });
  EXPECT_EQ(milliseconds(500), worker_->Step());
  EXPECT_EQ("retrying", State());
  EXPECT_THAT(LastError(), HasSubstr("not running"));
  EXPECT_EQ(milliseconds(1000), worker_->Step());
  EXPECT_EQ(milliseconds(2000), worker_->Step());
  for (int i = 0; i < 20; ++i) EXPECT_LE(worker_->Step(), milliseconds(60000));
  EXPECT_EQ(milliseconds(60000), worker_->Step());
  index_.SetHook(nullptr);
  EXPECT_EQ(milliseconds(0), worker_->Step());
  EXPECT_EQ("", LastError());
  ExpectInLine();
  index_.SetHook([](const std::string&) { throw Error(kErrorEngineRequest, "not running"); });
  worker_->CheckStatus();
  host_.MarkNeedsReindex();
  EXPECT_EQ(milliseconds(500), worker_->Step());
}

// What stops a pass and is not one document's fault.
class FailingWorkerTest : public WorkerTest, public ::testing::WithParamInterface<int> {};

TEST_P(FailingWorkerTest, LosesNothingAndTriesAgain) {
  worker_->Step();
  disk_.WriteFile("/v/s/a.txt");
  Queue(EVENT_CREATE, "/v/s/a.txt");
  index_.SetHook([](const std::string& command) {
    if (command == "upsert /v/s/a.txt content") throw Error(GetParam(), "cannot now");
  });
  for (int i = 0; i < 20; ++i) {
    EXPECT_GT(worker_->Step(), milliseconds(0));
    EXPECT_TRUE(HasSnapshot());
    EXPECT_EQ("retrying", State());
    EXPECT_TRUE(worker_->Report()["set_aside"].empty());
    EXPECT_THAT(LastError(), HasSubstr("cannot now (code " + std::to_string(GetParam()) + ")"));
  }
  index_.SetHook(nullptr);
  worker_->Step();
  EXPECT_EQ(1U, index_.All().count("/v/s/a.txt"));
  EXPECT_FALSE(HasSnapshot());
}

INSTANTIATE_TEST_SUITE_P(Codes, FailingWorkerTest,
                         ::testing::Values(static_cast<int>(kErrorNoSpace),
                                           static_cast<int>(kErrorSystem), 1400, 1401,
                                           engine::kPausedIndex, engine::kDiskFull,
                                           engine::kMovingIndex));

TEST_F(WorkerTest, WaitsForTheReader) {
  disk_.WriteFile("/v/s/a.txt");
  index_.SetReaderRunning(false);
  worker_->Step();
  EXPECT_THAT(LastError(), HasSubstr("tarncontentextractd"));
  index_.SetReaderRunning(true);
  worker_->Step();
  EXPECT_EQ("", LastError());
  ExpectInLine();
}

TEST_F(WorkerTest, DoesTheWorkAgainForAnEngineThatWasStartedAnew) {
  worker_->Step();
  disk_.WriteFile("/v/s/a.txt");
  Queue(EVENT_CREATE, "/v/s/a.txt");
  index_.SetHook([this](const std::string& command) {
    if (command == "commit") index_.Restart();
  });
  EXPECT_EQ(milliseconds(0), worker_->Step());
  EXPECT_TRUE(HasSnapshot());
  index_.SetHook(nullptr);
  worker_->Step();
  EXPECT_EQ(1U, index_.All().count("/v/s/a.txt"));
  EXPECT_FALSE(HasSnapshot());
}

TEST_F(WorkerTest, ComparesAgainWhenTheFirstComparisonWasCutShort) {
  disk_.WriteFile("/v/s/a.txt");
  index_.SetHook([](const std::string& command) {
    if (command == "commit") throw Error(engine::kDiskFull, "full");
  });
  worker_->Step();
  index_.SetHook(nullptr);
  index_.Restart();
  EXPECT_TRUE(index_.All().empty());
  worker_->Step();
  ExpectInLine();
}

// The index.

TEST_F(WorkerTest, MakesALostIndexAnewButNotAtOnce) {
  disk_.WriteFile("/v/s/a.txt");
  worker_->Step();
  index_.DeleteIndex();
  Queue(EVENT_MODIFY, "/v/s/a.txt");
  index_.ForgetCommands();
  worker_->Step();
  worker_->Step();
  EXPECT_THAT(index_.Commands(), ::testing::Not(Contains("create")));
  worker_->Step();
  EXPECT_THAT(index_.Commands(), Contains("create"));
  worker_->Step();
  ExpectInLine();
  EXPECT_EQ("", LastError());
}

TEST_F(WorkerTest, AnIndexThatWasOnlyRenamedIsNotMadeAnew) {
  disk_.WriteFile("/v/s/a.txt");
  worker_->Step();
  index_.ForgetCommands();
  for (int i = 0; i < 5; ++i) {
    Queue(EVENT_MODIFY, "/v/s/a.txt");
    int calls = 0;
    index_.SetHook([calls](const std::string&) mutable {
      if (++calls == 2) throw Error(engine::kUnknownIndex, "no such index");
    });
    worker_->Step();
    index_.SetHook(nullptr);
    worker_->Step();
  }
  EXPECT_THAT(index_.Commands(), ::testing::Not(Contains("create")));
}

TEST_F(WorkerTest, DoesNotBringBackTheIndexOfAShareWithoutFolders) {
  disk_.WriteFile("/v/s/a.txt");
  worker_->Step();
  index_.DeleteIndex();
  Queue(EVENT_MODIFY, "/v/s/a.txt");
  index_.ForgetCommands();
  index_.SetHook([this](const std::string& command) {
    if (command == "epoch") host_.SetFolders({});
  });
  for (int i = 0; i < 5; ++i) worker_->Step();
  EXPECT_THAT(index_.Commands(), ::testing::Not(Contains("create")));
}

// The share.

TEST_F(WorkerTest, AShareThatCannotBeLoadedIsTriedAgain) {
  host_.FailLoad(Error(kErrorShareNotFound, "no share"));
  EXPECT_EQ(milliseconds(500), worker_->Step());
  EXPECT_THAT(LastError(), HasSubstr("no share"));
  host_.FailLoad(std::nullopt);
  worker_->Step();
  EXPECT_EQ("", LastError());
  ExpectInLine();
}

TEST_F(WorkerTest, ATroubleThatIsOverIsForgottenWithoutWork) {
  worker_->Step();
  host_.FailLoad(Error(kErrorLoadFile, "Cannot load json"));
  worker_->Reload();
  worker_->Step();
  EXPECT_EQ("retrying", State());
  host_.FailLoad(std::nullopt);
  worker_->Step();
  EXPECT_EQ("idle", State());
  EXPECT_EQ("", LastError());
}

TEST_F(WorkerTest, AMissingDirectoryLosesNoDocument) {
  disk_.WriteFile("/v/s/a.txt");
  worker_->Step();
  const std::size_t before = index_.All().size();
  disk_.Remove("/v/s");
  worker_->Step();
  EXPECT_EQ("retrying", State());
  EXPECT_THAT(LastError(), HasSubstr("/v/s is not there"));
  EXPECT_EQ(before, index_.All().size());
  disk_.WriteFile("/v/s/b.txt");
  worker_->Step();
  EXPECT_EQ("", LastError());
  ExpectInLine();
}

TEST_F(WorkerTest, ADiskThatIsMountedLaterIsCompared) {
  worker_->Step();
  EXPECT_TRUE(IsAtRest());
  disk_.Remove("/v/s");
  disk_.AddMount("/v/s");
  disk_.WriteFile("/v/s/a.txt");
  worker_->Step();
  EXPECT_EQ(1U, index_.All().count("/v/s/a.txt"));
  EXPECT_TRUE(IsAtRest());
}

TEST_F(WorkerTest, ADiskThatIsUnmountedLosesNoDocument) {
  disk_.Remove("/v/s");
  disk_.AddMount("/v/s");
  disk_.WriteFile("/v/s/a.txt");
  worker_->Step();
  ASSERT_EQ(1U, index_.All().count("/v/s/a.txt"));
  disk_.Remove("/v/s");
  disk_.AddDir("/v/s");
  worker_->Step();
  EXPECT_EQ("retrying", State());
  EXPECT_EQ(1U, index_.All().count("/v/s/a.txt"));
}

TEST_F(WorkerTest, AShareThatHasMovedIsComparedAtItsNewPlace) {
  disk_.WriteFile("/v/s/a.txt");
  worker_->Step();
  disk_.Rename("/v", "/w");
  host_.SetRoot("/w/s");
  FolderRule folder = Folder("/s");
  folder.full_path = "/w/s";
  host_.SetFolders({folder});
  worker_->Reload();
  worker_->Step();
  EXPECT_EQ(1U, index_.All().count("/w/s/a.txt"));
  EXPECT_EQ(0U, index_.All().count("/v/s/a.txt"));
}

// Folders and pauses.

TEST_F(WorkerTest, RestsWhilePausedAndGoesOn) {
  disk_.WriteFile("/v/s/a.txt");
  worker_->SetPaused(true);
  EXPECT_TRUE(IsAtRest());
  EXPECT_EQ("paused", State());
  worker_->SetPaused(false);
  worker_->Step();
  ExpectInLine();
}

TEST_F(WorkerTest, RestsWhileAllFoldersArePaused) {
  host_.SetFolders({PausedFolder("/s")});
  disk_.WriteFile("/v/s/a.txt");
  Queue(EVENT_CREATE, "/v/s/a.txt");
  EXPECT_TRUE(IsAtRest());
  EXPECT_EQ("paused", State());
  EXPECT_TRUE(HasQueue());
}

TEST_F(WorkerTest, AFolderThatIsNoLongerPausedIsCompared) {
  host_.SetFolders({Folder("/s"), PausedFolder("/s/p")});
  disk_.WriteFile("/v/s/p/a.txt");
  worker_->Step();
  EXPECT_EQ(0U, index_.All().count("/v/s/p/a.txt"));
  host_.SetFolders({Folder("/s"), Folder("/s/p")});
  worker_->Reload();
  worker_->Step();
  EXPECT_EQ(1U, index_.All().count("/v/s/p/a.txt"));
}

TEST_F(WorkerTest, AFolderThatIsNoLongerPausedDuringAPassIsCompared) {
  host_.SetFolders({Folder("/s"), PausedFolder("/s/p")});
  disk_.WriteFile("/v/s/p/a.txt");
  index_.SetHook([this](const std::string& command) {
    if (command != "commit") return;
    host_.SetFolders({Folder("/s"), Folder("/s/p")});
    worker_->Reload();
  });
  worker_->Step();
  index_.SetHook(nullptr);
  while (worker_->Step() == milliseconds(0)) {
  }
  EXPECT_EQ(1U, index_.All().count("/v/s/p/a.txt"));
}

// The walk itself loads the list that has changed.
TEST_F(WorkerTest, AFolderThatIsNoLongerPausedBehindTheWalkIsCompared) {
  host_.SetFolders({Folder("/s"), PausedFolder("/s/a")});
  disk_.WriteFile("/v/s/a/1.txt");
  disk_.WriteFile("/v/s/b/2.txt");
  index_.Put({"/v/s/b", true, "", ""});
  index_.SetHook([this](const std::string& command) {
    if (command != "children /v/s/b") return;
    host_.SetFolders({Folder("/s"), Folder("/s/a")});
    worker_->Reload();
  });
  worker_->Step();
  index_.SetHook(nullptr);
  while (worker_->Step() == milliseconds(0)) {
  }
  EXPECT_EQ(1U, index_.All().count("/v/s/a/1.txt"));
}

// What lies behind the walk of a reindex was judged by the old folders: the event that comes with a
// change of folders is queued though a reindex above it is being worked on.
class ReindexTest : public WorkerTest {
 protected:
  ReindexTest() {
    host_.SetFolders({DocumentFolder("/s")});
    disk_.WriteFile("/v/s/a/1.mp3");
    disk_.WriteFile("/v/s/b/2.mp3");
    worker_->Step();
    Queue(EVENT_REINDEX, "/v/s", true);
  }

  // Works the reindex off, and has all kinds wanted from the first command `when` on.
  void ChangeFoldersAt(const std::string& when) {
    bool changed = false;
    index_.SetHook([&](const std::string& command) {
      if (changed || command != when) return;
      changed = true;
      host_.SetFolders({Folder("/s")});
      EXPECT_FALSE(fileindex::QueueMgr(QueuePath()).IsReindexWaitingFor("/v/s"));
      Queue(EVENT_UPDATE_CFG, "/v/s", true);
      worker_->Reload();
    });
    while (worker_->Step() == milliseconds(0)) {
    }
    index_.SetHook(nullptr);
    EXPECT_TRUE(changed);
  }
};

TEST_F(ReindexTest, FoldersThatChangeBehindTheWalkAreCompared) {
  ChangeFoldersAt("children /v/s/a");
  ExpectInLine();
}

TEST_F(ReindexTest, FoldersThatChangeAfterTheWalkAreCompared) {
  ChangeFoldersAt("commit");
  ExpectInLine();
}

TEST_F(WorkerTest, FoldersThatChangeWhileNothingIsDoneAreLeftToTheirEvent) {
  worker_->Step();
  EXPECT_TRUE(IsAtRest());
  host_.SetFolders({DocumentFolder("/s")});
  worker_->Reload();
  EXPECT_TRUE(IsAtRest());
}

TEST_F(WorkerTest, LoadsTheFoldersForAPassAndWhenTheyMayHaveChanged) {
  worker_->Step();
  const int loads = host_.Loads();
  for (int i = 0; i < 5; ++i) worker_->Step();
  EXPECT_EQ(loads, host_.Loads());
  worker_->Reload();
  for (int i = 0; i < 5; ++i) worker_->Step();
  EXPECT_EQ(loads + 1, host_.Loads());
}

// The folder list is saved before its event is queued, and nobody tells of it in between.
TEST_F(WorkerTest, JudgesByTheFoldersThatItsEventsTellOf) {
  host_.SetFolders({Folder("/s/first")});
  disk_.WriteFile("/v/s/first/a.txt");
  worker_->Step();
  disk_.Rename("/v/s/first", "/v/s/second");
  Queue(EVENT_RENAME, "/v/s/second", true, "/v/s/first");
  index_.SetHook([this](const std::string& command) {
    if (command == "epoch") host_.SetFolders({Folder("/s/second")});
  });
  EXPECT_THAT(CommandsOfStep(), Contains("rename /v/s/first /v/s/second"));
  EXPECT_EQ(1U, index_.All().count("/v/s/second/a.txt"));
}

// The mark in the status file.

TEST_F(WorkerTest, AMarkedShareIsComparedAndTheMarkIsTakenAway) {
  worker_->Step();
  disk_.WriteFile("/v/s/untold.txt");
  host_.MarkNeedsReindex();
  EXPECT_TRUE(IsAtRest());
  worker_->CheckStatus();
  worker_->Step();
  EXPECT_FALSE(host_.NeedsReindex());
  ExpectInLine();
}

TEST_F(WorkerTest, AMarkThatCannotBeTakenAwayIsTriedAgain) {
  worker_->Step();
  disk_.WriteFile("/v/s/untold.txt");
  host_.MarkNeedsReindex();
  host_.FailClear(Error(kErrorLock, "locked"));
  worker_->CheckStatus();
  worker_->Step();
  EXPECT_EQ("retrying", State());
  EXPECT_TRUE(host_.NeedsReindex());
  host_.FailClear(std::nullopt);
  worker_->Step();
  EXPECT_FALSE(host_.NeedsReindex());
  ExpectInLine();
}

// Its end.

TEST_F(WorkerTest, RunsUntilItIsStopped) {
  disk_.WriteFile("/v/s/a.txt");
  std::thread thread([this] { worker_->Run(); });
  EXPECT_TRUE(test::WaitUntil([this] { return index_.All().size() == 2; }));
  disk_.WriteFile("/v/s/b.txt");
  Queue(EVENT_CREATE, "/v/s/b.txt");
  EXPECT_TRUE(test::WaitUntil([this] { return index_.All().count("/v/s/b.txt") == 1; }));
  worker_->Stop();
  thread.join();
  EXPECT_EQ(milliseconds(0), worker_->Step());
}

// The nice value and the I/O class of the thread that makes a document in a worker's run.
std::pair<int, long> PriorityOfWork(Worker& worker, FakeIndex& index) {
  std::pair<int, long> priority{-100, -1};
  index.SetHook([&](const std::string& command) {
    if (command != "upsert /v/s") return;
    priority = {getpriority(PRIO_PROCESS, 0), test::IoClass()};
    worker.Stop();
  });
  std::thread([&] { worker.Run(); }).join();
  index.SetHook(nullptr);
  return priority;
}

TEST_F(WorkerTest, WorksInTheBackground) {
  const auto priority = PriorityOfWork(*worker_, index_);
  EXPECT_GE(priority.first, daemon::kBackgroundNice);
  EXPECT_EQ(test::kIdleIoClass, priority.second);
}

TEST_F(WorkerTest, WorksAtFullSpeedOnRequest) {
  worker_ = MakeWorker(host_, index_, disk_, slots_, true);
  const auto priority = PriorityOfWork(*worker_, index_);
  EXPECT_EQ(getpriority(PRIO_PROCESS, 0), priority.first);
  EXPECT_NE(test::kIdleIoClass, priority.second);
}

// Each pass takes what was queued when it began: one file's events cannot keep others waiting.
TEST_F(WorkerTest, AFileThatChangesAllTheTimeKeepsNoOtherWaiting) {
  worker_->Step();
  disk_.WriteFile("/v/s/hot.log");
  Queue(EVENT_MODIFY, "/v/s/hot.log");
  index_.SetHook([this](const std::string& command) {
    if (command != "upsert /v/s/hot.log content") return;
    disk_.WriteFile("/v/s/hot.log");
    for (int i = 0; i < 10; ++i) Queue(EVENT_MODIFY, "/v/s/hot.log");
  });
  for (int i = 0; i < 5; ++i) {
    const std::string path = "/v/s/" + std::to_string(i) + ".txt";
    disk_.WriteFile(path);
    Queue(EVENT_CREATE, path);
    EXPECT_THAT(CommandsOfStep(),
                ::testing::ElementsAre("upsert /v/s/hot.log content", "upsert " + path + " content",
                                       "attributes /v/s"));
  }
}

TEST_F(WorkerTest, AStopInTheMiddleLeavesTheSnapshotAndIsNoFailure) {
  worker_->Step();
  for (int i = 0; i < 500; ++i) {
    const std::string path = "/v/s/" + std::to_string(i) + ".txt";
    disk_.WriteFile(path);
    Queue(EVENT_CREATE, path);
  }
  index_.SetHook([this](const std::string& command) {
    if (command == "upsert /v/s/9.txt content") worker_->Stop();
  });
  worker_->Step();
  EXPECT_TRUE(HasSnapshot());
  EXPECT_EQ("", LastError());
}

TEST_F(WorkerTest, AReloadEndsTheWaitAfterAFailure) {
  host_.FailLoad(Error(kErrorShareNotFound, "no share"));
  std::thread thread([this] { worker_->Run(); });
  EXPECT_TRUE(test::WaitUntil([this] { return State() == "retrying"; }));
  host_.FailLoad(std::nullopt);
  disk_.WriteFile("/v/s/a.txt");
  worker_->Reload();
  EXPECT_TRUE(test::WaitUntil([this] { return index_.All().size() == 2; }));
  worker_->Stop();
  thread.join();
}

}  // namespace
}  // namespace quarry::fileindexd
