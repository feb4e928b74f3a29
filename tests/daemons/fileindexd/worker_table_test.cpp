#include "daemons/fileindexd/worker_table.h"

#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <deque>
#include <future>
#include <map>

#include "common/error.h"
#include "daemons/common/system_error.h"
#include "tests/daemons/fileindexd/share_fixture.h"
#include "tests/daemons/fileindexd/shared_parts.h"
#include "tests/support/files.h"

namespace quarry::fileindexd {
namespace {

// Every worker has the same disk and index.
class WorkerTableTest : public ShareFixture {
 protected:
  WorkerTableTest() { host_.SetFolders({Folder("/s")}); }

  std::unique_ptr<Worker> Make(const std::string& share) {
    ++made_[share];
    return MakeWorker(host_, index_, disk_, slots_);
  }

  std::string State(const std::string& share) {
    table_.Tend();
    for (const Json::Value& report : table_.Report()) {
      if (report["share"] == share) return report["state"].asString();
    }
    return "none";
  }

  bool Becomes(const std::string& share, const std::string& state) {
    return test::WaitUntil([&] { return State(share) == state; });
  }

  HostState host_{QueuePath()};
  std::map<std::string, int> made_;
  WorkerTable table_{[this](const std::string& share) { return Make(share); }};
};

// The reports of fakes all name the share "s".
TEST_F(WorkerTableTest, AShareWithFoldersGetsAWorker) {
  EXPECT_EQ("none", State("s"));
  table_.SetShares({"s"});
  EXPECT_TRUE(Becomes("s", "idle"));
  table_.SetShares({"s"});
  EXPECT_EQ(1, made_["s"]);
}

TEST_F(WorkerTableTest, AShareWithoutFoldersLosesItsWorker) {
  table_.SetShares({"s"});
  ASSERT_TRUE(Becomes("s", "idle"));
  table_.SetShares({});
  EXPECT_TRUE(Becomes("s", "none"));
  table_.SetShares({"s"});
  EXPECT_TRUE(Becomes("s", "idle"));
  EXPECT_EQ(2, made_["s"]);
}

TEST_F(WorkerTableTest, ADeletedWorkerStaysAwayUntilItIsAllowed) {
  table_.SetShares({"s"});
  ASSERT_TRUE(Becomes("s", "idle"));
  table_.Delete("s");
  EXPECT_TRUE(Becomes("s", "stopped"));
  table_.SetShares({"s"});
  EXPECT_EQ("stopped", State("s"));
  table_.Allow("s");
  EXPECT_TRUE(Becomes("s", "idle"));
  EXPECT_EQ(2, made_["s"]);
}

// A process that does nothing until it is killed.
pid_t StartIdler() {
  const pid_t pid = fork();
  if (pid != 0) return pid;
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  while (true) pause();
}

void Kill(pid_t pid) {
  ASSERT_EQ(kill(pid, SIGKILL), 0);
  ASSERT_EQ(waitpid(pid, nullptr, 0), pid);
}

TEST_F(WorkerTableTest, ADeletedWorkerComesBackAfterTheProcessThatWantedItAway) {
  const pid_t process = StartIdler();
  ASSERT_GT(process, 0);
  table_.SetShares({"s"});
  ASSERT_TRUE(Becomes("s", "idle"));
  table_.Delete("s", process);
  EXPECT_TRUE(Becomes("s", "stopped"));
  EXPECT_EQ("stopped", State("s"));
  Kill(process);
  EXPECT_TRUE(Becomes("s", "idle"));
  // One that has ended already wants nothing any more.
  table_.Delete("s", process);
  EXPECT_EQ("idle", State("s"));
  EXPECT_EQ(2, made_["s"]);
}

TEST_F(WorkerTableTest, AWorkerStaysWhereItsReturnCannotBeSeenTo) {
  table_.SetShares({"s"});
  ASSERT_TRUE(Becomes("s", "idle"));
  rlimit usual{};
  ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &usual), 0);
  // A sanitizer needs descriptors the first time that it looks at what a failure is told with.
  EXPECT_THROW(daemon::ThrowSystemError("A failure"), Error);
  const rlimit none{0, usual.rlim_max};
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &none), 0);
  EXPECT_THROW(table_.Delete("s", getpid()), Error);
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &usual), 0);
  EXPECT_EQ("idle", State("s"));
  EXPECT_EQ(1, made_["s"]);
}

TEST_F(WorkerTableTest, TheLastWhoDeletesAWorkerSaysForHowLong) {
  const pid_t first = StartIdler();
  const pid_t second = StartIdler();
  table_.SetShares({"s"});
  table_.Delete("s", first);
  table_.Delete("s", second);
  Kill(first);
  EXPECT_TRUE(Becomes("s", "stopped"));
  table_.Delete("s");
  Kill(second);
  EXPECT_EQ("stopped", State("s"));
  table_.Allow("s");
  EXPECT_TRUE(Becomes("s", "idle"));
}

TEST_F(WorkerTableTest, ADeletedWorkerIsForgottenWithTheSharesFolders) {
  table_.SetShares({"s"});
  table_.Delete("s");
  table_.SetShares({});
  EXPECT_TRUE(Becomes("s", "none"));
  table_.SetShares({"s"});
  EXPECT_TRUE(Becomes("s", "idle"));
}

TEST_F(WorkerTableTest, DeletingAndAllowingWhatIsNotThereIsHarmless) {
  table_.Delete("none");
  table_.Allow("none");
  table_.SetShares({"none"});
  EXPECT_EQ(1, made_["none"]);
}

// Two workers of one share would get in each other's way.
TEST_F(WorkerTableTest, ANewWorkerWaitsForTheEndOfTheFormerOne) {
  std::promise<void> go;
  std::shared_future<void> gate = go.get_future().share();
  index_.SetHook([gate](const std::string&) { gate.wait(); });
  table_.SetShares({"s"});
  ASSERT_TRUE(test::WaitUntil([this] { return index_.CallCount() > 0; }));
  table_.Delete("s");
  EXPECT_EQ("stopping", State("s"));
  table_.Allow("s");
  EXPECT_EQ("stopping", State("s"));
  EXPECT_EQ(1, made_["s"]);
  EXPECT_FALSE(table_.StopAll(std::chrono::milliseconds(20)));
  go.set_value();
  index_.SetHook(nullptr);
  EXPECT_TRUE(Becomes("s", "none"));
  table_.SetShares({"s"});
  EXPECT_TRUE(Becomes("s", "idle"));
}

TEST_F(WorkerTableTest, APauseHoldsAllWorkersAndThoseToCome) {
  table_.SetPaused(true);
  table_.SetShares({"s"});
  EXPECT_EQ("paused", State("s"));
  table_.SetPaused(false);
  EXPECT_TRUE(Becomes("s", "idle"));
  table_.SetPaused(true);
  EXPECT_EQ("paused", State("s"));
}

TEST_F(WorkerTableTest, TellsWorkersWhatMayHaveChanged) {
  table_.SetShares({"s"});
  ASSERT_TRUE(Becomes("s", "idle"));
  const int loads = host_.Loads();
  table_.Reload();
  EXPECT_TRUE(test::WaitUntil([&] { return host_.Loads() > loads; }));
  host_.MarkNeedsReindex();
  table_.CheckStatus();
  EXPECT_TRUE(test::WaitUntil([this] { return !host_.NeedsReindex(); }));
}

TEST_F(WorkerTableTest, OneSharesTroubleIsItsOwn) {
  HostState broken(QueuePath() + "2");
  broken.FailLoad(Error(kErrorShareNotFound, "no share"));
  WorkerTable table([&](const std::string& share) {
    return MakeWorker(share == "broken" ? broken : host_, index_, disk_, slots_);
  });
  disk_.WriteFile("/v/s/a.txt");
  table.SetShares({"broken", "s"});
  EXPECT_TRUE(test::WaitUntil([&] {
    std::set<std::string> states;
    for (const Json::Value& report : table.Report()) states.insert(report["state"].asString());
    return states == std::set<std::string>{"idle", "retrying"};
  }));
  EXPECT_EQ(1U, index_.All().count("/v/s/a.txt"));
}

TEST_F(WorkerTableTest, StopAllEndsAllWorkers) {
  table_.SetShares({"s", "t", "u"});
  EXPECT_TRUE(table_.StopAll(std::chrono::seconds(20)));
  EXPECT_EQ(0U, table_.Report().size());
}

}  // namespace
}  // namespace quarry::fileindexd
