#include "daemons/tarncontentextractd/worker_pool.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <map>
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
    const std::vector<PoolResult> results = ParseAll(pool, {what});
    fields_ = ToMap(results.at(0).fields);
    return results.at(0).outcome;
  }
  // As many requests for the same file.
  std::vector<PoolResult> ParseAll(WorkerPool& pool, const std::vector<std::string>& whats) {
    const UniqueFd file = OpenToRead(dir_ / "file");
    std::vector<PoolFile> files;
    for (const std::string& what : whats) files.push_back({file.get(), what, "a name"});
    return pool.Parse(files);
  }
  // What became of each file: "done", "bad", "broken" or "stopped".
  static std::vector<std::string> Names(const std::vector<PoolResult>& results) {
    std::vector<std::string> names;
    for (const PoolResult& result : results) {
      static constexpr const char* kNames[] = {"done", "bad", "broken", "stopped"};
      names.emplace_back(kNames[static_cast<int>(result.outcome)]);
      EXPECT_TRUE(result.outcome == PoolOutcome::kDone || result.fields.empty());
    }
    return names;
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
      if (ParseAll(pool, {"stall"}).at(0).outcome == PoolOutcome::kStopped) ++stopped;
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

using Texts = std::vector<std::string>;

TEST_F(WorkerPoolTest, AFileThatKillsCostsOnlyItselfWhateverCameBefore) {
  for (const char* what : {"crash", "leave", "garbage", "other", "endless"}) {
    WorkerPool pool(options_);
    EXPECT_EQ(Names(ParseAll(pool, {"good", what, "pid", what, what, "good", "good"})),
              (Texts{"done", "bad", "done", "bad", "bad", "done", "done"}))
        << what;
    EXPECT_EQ(Names(ParseAll(pool, {what})), (Texts{"bad"})) << what;
  }
}

TEST_F(WorkerPoolTest, AFileThatKillsUsedWorkersOnlyIsDoneAmongOthers) {
  WorkerPool pool(options_);
  const std::vector<PoolResult> results =
      ParseAll(pool, {"good", "usedcrash", "good", "usedcrash", "usedcrash"});
  EXPECT_EQ(Names(results), (Texts(5, "done")));
  for (const PoolResult& each : results) {
    EXPECT_EQ(ToMap(each.fields)["TARNMDTextContent"], "some words");
  }
}

TEST_F(WorkerPoolTest, FilesBehindALateAnswerGetTheirOwn) {
  WorkerPool pool(options_);
  const std::vector<PoolResult> results = ParseAll(pool, {"good", "ahead", "good", "pid"});
  EXPECT_EQ(Names(results), (Texts(4, "done")));
  EXPECT_EQ(ToMap(results[1].fields)["TARNMDTitle"], "early");
  EXPECT_EQ(ToMap(results[2].fields)["TARNMDTextContent"], "some words");
  EXPECT_EQ(ToMap(results[2].fields).count("TARNMDTitle"), 1u);
  EXPECT_EQ(ToMap(results[3].fields)["TARNMDTitle"], PidOf(pool));
}

TEST_F(WorkerPoolTest, FilesBehindOneThatStallsAreGivenBack) {
  options_.file_timeout = seconds(5);
  WorkerPool pool(options_);
  EXPECT_EQ(Names(ParseAll(pool, {"good", "stall", "good", "good"})), (Texts{"done", "bad"}));
  EXPECT_EQ(Names(ParseAll(pool, {"good", "good"})), (Texts{"done", "done"}));
}

TEST_F(WorkerPoolTest, ReplacesAWorkerBetweenFilesThatCameTogether) {
  options_.files_per_worker = 3;
  WorkerPool pool(options_);
  std::map<std::string, int> files_of;
  for (const PoolResult& each : ParseAll(pool, Texts(10, "pid"))) {
    ++files_of[ToMap(each.fields)["TARNMDTitle"]];
  }
  EXPECT_EQ(files_of.size(), 4u);
  for (const auto& [pid, files] : files_of) EXPECT_LE(files, 3) << pid;
}

TEST_F(WorkerPoolTest, MoreFilesThanAWorkerTakesAtATimeAreAllDone) {
  WorkerPool pool(options_);
  EXPECT_EQ(Names(ParseAll(pool, Texts(2000, "good"))), Texts(2000, "done"));
}

TEST_F(WorkerPoolTest, NoMoreIsReadOnceThereIsMuch) {
  WorkerPool pool(options_);
  EXPECT_EQ(Names(ParseAll(pool, Texts(8, "much"))), Texts(2, "done"));
  EXPECT_EQ(Names(ParseAll(pool, {"much"})), Texts(1, "done"));
  EXPECT_EQ(Names(ParseAll(pool, {"good", "much", "crash", "good"})),
            (Texts{"done", "done", "bad", "done"}));
  // The file behind a dead one is blamed for nothing that it has not done.
  EXPECT_EQ(Names(ParseAll(pool, {"much", "crash", "much", "crash"})),
            (Texts{"done", "bad", "done"}));
}

TEST_F(WorkerPoolTest, WithoutWorkersAllFilesAreToldSo) {
  options_.command = HostileWorker("open");
  WorkerPool pool(options_);
  EXPECT_EQ(Names(ParseAll(pool, {"good", "good"})), (Texts{"broken", "broken"}));
}

TEST_F(WorkerPoolTest, StopEndsFilesThatCameTogether) {
  WorkerPool pool(options_);
  std::thread parser([&] {
    const Texts names = Names(ParseAll(pool, {"good", "stall", "good"}));
    EXPECT_TRUE(names == (Texts{"done", "stopped", "stopped"}) || names == Texts(3, "stopped"));
  });
  EXPECT_TRUE(test::WaitUntil([&] { return pool.WorkerCount() == 1; }));
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
      for (int i = 0; i < 8; ++i) {
        const UniqueFd file = OpenToRead(path);
        std::vector<PoolFile> files;
        for (int k = 0; k <= i; ++k) {
          files.push_back({file.get(), (t + i + k) % 5 == 0 ? "crash" : "good", path});
        }
        const std::vector<PoolResult> results = pool.Parse(files);
        ASSERT_EQ(results.size(), files.size());
        for (std::size_t k = 0; k < files.size(); ++k) {
          const bool bad = files[k].extension == "crash";
          EXPECT_EQ(results[k].outcome, bad ? PoolOutcome::kBadFile : PoolOutcome::kDone);
          EXPECT_EQ(ToMap(results[k].fields)["TARNMDTextContent"],
                    bad ? "" : "words of " + std::to_string(t));
        }
        EXPECT_LE(pool.WorkerCount(), 3u);
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
}

}  // namespace
}  // namespace quarry::extract
