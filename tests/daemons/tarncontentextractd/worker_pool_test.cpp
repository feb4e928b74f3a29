#include "daemons/tarncontentextractd/worker_pool.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <set>
#include <thread>

#include "tests/daemons/tarncontentextractd/support/extract_support.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::extract {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

class WorkerPoolTest : public ::testing::Test {
 protected:
  WorkerPoolTest() {
    options_.command = HostileWorker();
    options_.start_timeout = seconds(60);
    options_.file_timeout = seconds(60);
    options_.pause = std::chrono::hours(1);
    test::WriteFile(dir_ / "file", "some words");
  }

  PoolOutcome Parse(WorkerPool& pool, const std::string& what) {
    const UniqueFd file = OpenToRead(dir_ / "file");
    std::vector<Field> fields{{"TARNMDStale", std::string()}};
    const PoolOutcome outcome = pool.Parse(file.get(), what, "a name", &fields);
    fields_ = ToMap(fields);
    return outcome;
  }
  std::string PidOf(WorkerPool& pool) {
    EXPECT_EQ(Parse(pool, "pid"), PoolOutcome::kDone);
    return fields_["TARNMDTitle"];
  }

  test::TempDir dir_;
  WorkerPoolOptions options_;
  Fields fields_;
};

TEST_F(WorkerPoolTest, StartsWorkersWhenTheyAreNeededAndKeepsThem) {
  options_.workers = 4;
  WorkerPool pool(options_);
  EXPECT_EQ(pool.WorkerCount(), 0u);
  const std::string first = PidOf(pool);
  EXPECT_EQ(PidOf(pool), first);
  EXPECT_EQ(pool.WorkerCount(), 1u);
}

TEST_F(WorkerPoolTest, AFileThatKillsAFreshWorkerIsBad) {
  WorkerPool pool(options_);
  for (const char* what : {"crash", "abort", "leave", "memory", "garbage", "endless"}) {
    EXPECT_EQ(Parse(pool, what), PoolOutcome::kBadFile) << what;
    EXPECT_EQ(fields_, Fields()) << what;
    EXPECT_EQ(pool.WorkerCount(), 0u) << what;
  }
  EXPECT_EQ(Parse(pool, "good"), PoolOutcome::kDone);
}

TEST_F(WorkerPoolTest, AFileThatKillsAUsedWorkerIsTriedWithAFreshOne) {
  WorkerPool pool(options_);
  const std::string first = PidOf(pool);
  EXPECT_EQ(Parse(pool, "usedcrash"), PoolOutcome::kDone);
  EXPECT_EQ(fields_["TARNMDTextContent"], "some words");
  EXPECT_NE(PidOf(pool), first);
  EXPECT_EQ(Parse(pool, "crash"), PoolOutcome::kBadFile);
}

TEST_F(WorkerPoolTest, AFileThatFollowsALateAnswerGetsItsOwn) {
  WorkerPool pool(options_);
  EXPECT_EQ(Parse(pool, "ahead"), PoolOutcome::kDone);
  EXPECT_EQ(Parse(pool, "good"), PoolOutcome::kDone);
  EXPECT_EQ(fields_["TARNMDTextContent"], "some words");
}

TEST_F(WorkerPoolTest, AFileThatStallsIsBadAtOnce) {
  WorkerPool pool(options_);
  const std::string first = PidOf(pool);
  options_.file_timeout = milliseconds(50);
  WorkerPool hasty(options_);
  EXPECT_EQ(Parse(hasty, "stall"), PoolOutcome::kBadFile);
  EXPECT_EQ(Parse(hasty, "spin"), PoolOutcome::kBadFile);
  EXPECT_EQ(hasty.WorkerCount(), 0u);
  EXPECT_EQ(PidOf(pool), first);
}

TEST_F(WorkerPoolTest, ReplacesAWorkerThatHasDoneEnough) {
  options_.files_per_worker = 2;
  WorkerPool pool(options_);
  std::set<std::string> pids;
  for (int i = 0; i < 6; ++i) pids.insert(PidOf(pool));
  EXPECT_EQ(pids.size(), 3u);
  EXPECT_EQ(pool.WorkerCount(), 1u);
}

TEST_F(WorkerPoolTest, RefusesWorkersWhoseSandboxDidNotClose) {
  options_.command = HostileWorker("open");
  WorkerPool pool(options_);
  EXPECT_EQ(Parse(pool, "good"), PoolOutcome::kBroken);
  EXPECT_EQ(fields_, Fields());
  EXPECT_EQ(pool.WorkerCount(), 0u);
}

TEST_F(WorkerPoolTest, TriesAFewTimesAndThenPauses) {
  // Each start leaves one more byte behind.
  test::WriteFile(dir_ / "worker", "#!/bin/sh\nprintf x >> \"$1\"\nexit 1\n");
  ASSERT_EQ(chmod((dir_ / "worker").c_str(), 0755), 0);
  options_.command = {dir_ / "worker", dir_ / "starts"};
  WorkerPool pool(options_);
  EXPECT_EQ(Parse(pool, "good"), PoolOutcome::kBroken);
  EXPECT_EQ(test::ReadFile(dir_ / "starts"), "xxx");
  EXPECT_EQ(Parse(pool, "good"), PoolOutcome::kBroken);
  EXPECT_EQ(test::ReadFile(dir_ / "starts"), "xxx");
}

TEST_F(WorkerPoolTest, GoesOnAsSoonAsWorkersCanBeStarted) {
  options_.command = {dir_ / "worker", ""};
  options_.pause = milliseconds(1);
  WorkerPool pool(options_);
  EXPECT_EQ(Parse(pool, "good"), PoolOutcome::kBroken);
  ASSERT_EQ(symlink(QUARRY_HOSTILE_WORKER, (dir_ / "worker").c_str()), 0);
  EXPECT_TRUE(test::WaitUntil([&] { return Parse(pool, "good") == PoolOutcome::kDone; }));
}

TEST_F(WorkerPoolTest, StopEndsWhoWorksAndWhoWaits) {
  WorkerPool pool(options_);
  std::atomic<int> stopped{0};
  std::vector<std::thread> threads;
  for (int i = 0; i < 3; ++i) {
    threads.emplace_back([&] {
      const UniqueFd file = OpenToRead(dir_ / "file");
      std::vector<Field> fields;
      if (pool.Parse(file.get(), "stall", "", &fields) == PoolOutcome::kStopped) ++stopped;
    });
  }
  EXPECT_TRUE(test::WaitUntil([&] { return pool.WorkerCount() == 1; }));
  pool.Stop();
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(stopped, 3);
  EXPECT_EQ(Parse(pool, "good"), PoolOutcome::kStopped);
}

TEST_F(WorkerPoolTest, StopEndsWhoStartsAWorker) {
  options_.command = HostileWorker("silent");
  WorkerPool pool(options_);
  std::thread parser([&] { EXPECT_EQ(Parse(pool, "good"), PoolOutcome::kStopped); });
  pool.Stop();
  parser.join();
}

// Many at once, bad ones among them: each gets what is its own.
TEST_F(WorkerPoolTest, BadFilesTakeNoOthersDown) {
  options_.workers = 3;
  options_.files_per_worker = 5;
  WorkerPool pool(options_);
  std::vector<std::thread> threads;
  for (int t = 0; t < 8; ++t) {
    threads.emplace_back([&, t] {
      const std::string path = dir_ / std::to_string(t);
      test::WriteFile(path, "words of " + std::to_string(t));
      for (int i = 0; i < 12; ++i) {
        const UniqueFd file = OpenToRead(path);
        std::vector<Field> fields;
        const bool bad = (t + i) % 5 == 0;
        const PoolOutcome outcome = pool.Parse(file.get(), bad ? "crash" : "good", path, &fields);
        EXPECT_EQ(outcome, bad ? PoolOutcome::kBadFile : PoolOutcome::kDone);
        EXPECT_EQ(ToMap(fields)["TARNMDTextContent"], bad ? "" : "words of " + std::to_string(t));
        EXPECT_LE(pool.WorkerCount(), 3u);
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
}

}  // namespace
}  // namespace quarry::extract
