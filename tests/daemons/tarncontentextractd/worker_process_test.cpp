// One worker: that it is closed off, and how its end is told.

#include "daemons/tarncontentextractd/worker_process.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <thread>

#include "common/error.h"
#include "tests/daemons/tarncontentextractd/support/extract_support.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::extract {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

constexpr seconds kPatience{60};
// Where a file is to take too long: enough for all others on a machine that is busy.
constexpr seconds kTooLong{5};

class WorkerProcessTest : public ::testing::Test {
 protected:
  WorkerProcessTest() {
    test::WriteFile(dir_ / "file", "some words");
    file_ = OpenToRead(dir_ / "file");
  }

  WorkerOutcome Parse(WorkerProcess& worker, const std::string& what,
                      milliseconds timeout = kPatience) {
    const WorkerOutcome outcome = ParseAll(worker, {what}, timeout);
    fields_ = all_.empty() ? Fields() : all_[0];
    return outcome;
  }
  // As many requests for the same file.
  WorkerOutcome ParseAll(WorkerProcess& worker, const std::vector<std::string>& whats,
                         milliseconds timeout = kPatience) {
    std::vector<WorkerFile> files;
    for (const std::string& what : whats) files.push_back({file_.get(), what});
    std::vector<std::vector<Field>> all(2, {{"TARNMDStale", std::string()}});
    const WorkerOutcome outcome = worker.Parse(files, timeout, &all);
    all_.clear();
    for (const std::vector<Field>& each : all) all_.push_back(ToMap(each));
    return outcome;
  }

  // What a worker whose format tries `what` reports.
  std::string ResultOf(const std::string& what) {
    WorkerProcess worker(HostileWorker(), kPatience, -1);
    EXPECT_EQ(Parse(worker, what), WorkerOutcome::kDone) << what;
    return fields_["TARNMDTitle"];
  }

  // Why a worker is not taken into service.
  static std::string RefusalOf(const std::vector<std::string>& command, milliseconds timeout,
                               int stop_fd = -1) {
    try {
      const WorkerProcess worker(command, timeout, stop_fd);
    } catch (const Error& error) {
      EXPECT_EQ(error.code(), kErrorSystem);
      return error.reason();
    }
    return std::string();
  }

  test::TempDir dir_;
  UniqueFd file_;
  Fields fields_;
  std::vector<Fields> all_;
};

class Forbidden : public WorkerProcessTest, public ::testing::WithParamInterface<const char*> {};

TEST_P(Forbidden, IsRefused) {
  EXPECT_EQ(ResultOf(GetParam()), "refused: EPERM");
  EXPECT_EQ(test::ReadFile(dir_ / "file"), "some words");
}

INSTANTIATE_TEST_SUITE_P(Calls, Forbidden,
                         ::testing::Values("socket", "localsocket", "create", "read", "write",
                                           "truncate", "chmod", "exec", "fork", "kill", "trace",
                                           "root", "nice", "limit", "code", "remove", "move",
                                           "directory", "talk", "connect", "send", "stat", "list"),
                         [](const auto& call) { return std::string(call.param); });

TEST_F(WorkerProcessTest, HoldsTheStandardThreeItsChannelAndOneFile) {
  EXPECT_EQ(ResultOf("descriptors"), "0 1 2 3 4");
}

TEST_F(WorkerProcessTest, HoldsNoFileOfTheOneBefore) {
  WorkerProcess worker(HostileWorker(), kPatience, -1);
  for (int i = 0; i < 20; ++i) {
    ASSERT_EQ(Parse(worker, "descriptors"), WorkerOutcome::kDone);
    EXPECT_EQ(fields_["TARNMDTitle"], "0 1 2 3 4");
  }
  EXPECT_EQ(worker.FilesDone(), 20u);
}

TEST_F(WorkerProcessTest, HasNoRightsThatTheSystemKnowsOf) {
  WorkerProcess worker(HostileWorker(), kPatience, -1);
  const std::string uid = std::to_string(geteuid() == 0 ? 65534 : geteuid());
  EXPECT_EQ(ProcessStatus(worker.pid(), "Uid"), uid + "\t" + uid + "\t" + uid + "\t" + uid);
  if (geteuid() == 0) {
    EXPECT_EQ(ProcessStatus(worker.pid(), "Groups"), "");
  }
  for (const char* set : {"CapInh", "CapPrm", "CapEff", "CapAmb"}) {
    EXPECT_EQ(ProcessStatus(worker.pid(), set), "0000000000000000") << set;
  }
  EXPECT_EQ(ProcessStatus(worker.pid(), "NoNewPrivs"), "1");
  EXPECT_EQ(ProcessStatus(worker.pid(), "Seccomp"), "2");
}

TEST_F(WorkerProcessTest, LeadsAGroupOfItsOwnAndEndsWithItsObject) {
  pid_t pid = 0;
  {
    const WorkerProcess worker(HostileWorker(), kPatience, -1);
    pid = worker.pid();
    EXPECT_EQ(getpgid(pid), pid);
  }
  EXPECT_EQ(kill(pid, 0), -1);
  EXPECT_EQ(errno, ESRCH);
}

TEST_F(WorkerProcessTest, IsRefusedWhenItsSandboxDidNotClose) {
  EXPECT_EQ(RefusalOf(HostileWorker("open"), kPatience),
            "Its sandbox did not close: a network socket was possible");
}

TEST_F(WorkerProcessTest, IsRefusedWhenItDoesNotSayThatItIsReady) {
  EXPECT_EQ(RefusalOf(HostileWorker("dies"), kPatience),
            "Worker not started: it ended with code 7");
  EXPECT_EQ(RefusalOf(HostileWorker("talks"), kPatience), "Its sandbox did not close: nonsense");
  EXPECT_EQ(RefusalOf(HostileWorker("silent"), milliseconds(50)),
            "Worker not started: it does not get ready");
  EXPECT_EQ(RefusalOf({dir_ / "nothing"}, kPatience),
            "Cannot start " + (dir_ / "nothing") + ": No such file or directory");
}

TEST_F(WorkerProcessTest, StopsWaitingForAWorkerWhenTheDaemonStops) {
  const UniqueFd stop(eventfd(1, EFD_CLOEXEC));
  EXPECT_EQ(RefusalOf(HostileWorker("silent"), kPatience, stop.get()),
            "Worker not started: the daemon stops");
}

struct Death {
  const char* what;
  const char* ending;
};

class Deaths : public WorkerProcessTest, public ::testing::WithParamInterface<Death> {};

TEST_P(Deaths, AreToldApart) {
  WorkerProcess worker(HostileWorker(), kPatience, -1);
  EXPECT_EQ(Parse(worker, GetParam().what), WorkerOutcome::kDied);
  EXPECT_EQ(fields_, Fields());
  EXPECT_EQ(worker.FilesDone(), 0u);
  EXPECT_EQ(worker.End(), GetParam().ending);
  EXPECT_EQ(worker.End(), GetParam().ending) << "it is told again";
}

INSTANTIATE_TEST_SUITE_P(Ways, Deaths,
                         ::testing::Values(Death{"crash", "was ended by signal 11"},
                                           Death{"abort", "was ended by signal 6"},
                                           Death{"leave", "ended with code 0"},
                                           Death{"memory", "ended with code 4"},
                                           Death{"garbage", "was ended by signal 9"},
                                           Death{"other", "was ended by signal 9"},
                                           Death{"endless", "was ended by signal 9"}),
                         [](const auto& death) { return std::string(death.param.what); });

TEST_F(WorkerProcessTest, IsGivenUpWhenItsTimeIsOver) {
  for (const char* what : {"stall", "spin"}) {
    WorkerProcess worker(HostileWorker(), kPatience, -1);
    EXPECT_EQ(Parse(worker, what, milliseconds(50)), WorkerOutcome::kTimedOut) << what;
    EXPECT_EQ(worker.End(), "was ended by signal 9");
  }
}

TEST_F(WorkerProcessTest, IsGivenUpWhenTheDaemonStops) {
  const UniqueFd stop(eventfd(0, EFD_CLOEXEC));
  WorkerProcess worker(HostileWorker(), kPatience, stop.get());
  std::thread stopper([&] { eventfd_write(stop.get(), 1); });
  EXPECT_EQ(Parse(worker, "stall"), WorkerOutcome::kStopped);
  stopper.join();
}

TEST_F(WorkerProcessTest, AnAnswerThatWasNotAskedForIsNotTakenForTheNextFile) {
  WorkerProcess worker(HostileWorker(), kPatience, -1);
  ASSERT_EQ(Parse(worker, "ahead"), WorkerOutcome::kDone);
  EXPECT_EQ(Parse(worker, "good"), WorkerOutcome::kDied);
}

TEST_F(WorkerProcessTest, TakesManyFilesAtATime) {
  WorkerProcess worker(HostileWorker(), kPatience, -1);
  for (std::size_t count : {1u, 2u, 30u}) {
    ASSERT_EQ(ParseAll(worker, std::vector<std::string>(count, "descriptors")),
              WorkerOutcome::kDone);
    ASSERT_EQ(all_.size(), count);
    for (Fields& each : all_) EXPECT_EQ(each["TARNMDTitle"], "0 1 2 3 4");
  }
  EXPECT_EQ(worker.FilesDone(), 33u);
}

TEST_F(WorkerProcessTest, TakesNoMoreAtATimeThanThereIsRoomFor) {
  WorkerProcess worker(HostileWorker(), kPatience, -1);
  std::size_t done = 0;
  for (int round = 0; round < 3; ++round) {
    ASSERT_EQ(ParseAll(worker, std::vector<std::string>(5000, "good")), WorkerOutcome::kDone);
    EXPECT_GE(all_.size(), 8u);
    EXPECT_LT(all_.size(), 5000u);
    for (Fields& each : all_) EXPECT_EQ(each["TARNMDTextContent"], "some words");
    done += all_.size();
  }
  EXPECT_EQ(worker.FilesDone(), done);
}

TEST_F(WorkerProcessTest, LongAnswersFollowEachOther) {
  const std::string words(std::size_t{5} << 20, 'w');
  test::WriteFile(dir_ / "long", words);
  file_ = OpenToRead(dir_ / "long");
  WorkerProcess worker(HostileWorker(), kPatience, -1);
  ASSERT_EQ(ParseAll(worker, {"good", "pid", "good", "good"}), WorkerOutcome::kDone);
  ASSERT_EQ(all_.size(), 4u);
  for (const std::size_t i : {0u, 2u, 3u}) EXPECT_TRUE(all_[i]["TARNMDTextContent"] == words);
  EXPECT_EQ(all_[1]["TARNMDTitle"], std::to_string(worker.pid()));
  EXPECT_EQ(Parse(worker, "pid"), WorkerOutcome::kDone);
}

TEST_F(WorkerProcessTest, AnswersTogetherAreBounded) {
  WorkerProcess worker(HostileWorker(), kPatience, -1);
  EXPECT_EQ(ParseAll(worker, std::vector<std::string>(8, "much")), WorkerOutcome::kDied);
  EXPECT_EQ(all_.size(), 2u);
}

TEST_F(WorkerProcessTest, ASlowFileIsBegunWithNothingHeldBack) {
  const std::string words(std::size_t{1} << 20, 'w');
  test::WriteFile(dir_ / "long", words);
  const UniqueFd slow = OpenToRead(dir_ / "long");
  WorkerProcess worker(HostileWorker(), kPatience, -1);
  std::vector<std::vector<Field>> answers;
  EXPECT_EQ(worker.Parse({{file_.get(), "good"}, {file_.get(), "good"}, {slow.get(), "stall"}},
                         kTooLong, &answers),
            WorkerOutcome::kTimedOut);
  EXPECT_EQ(answers.size(), 2u);
}

TEST_F(WorkerProcessTest, AnAnswerThatTookTimeIsNotHeldBack) {
  WorkerProcess worker(HostileWorker(), kPatience, -1);
  EXPECT_EQ(ParseAll(worker, {"slow", "stall"}, kTooLong), WorkerOutcome::kTimedOut);
  EXPECT_EQ(all_.size(), 1u);
}

struct MiddleEnd {
  const char* what;
  WorkerOutcome outcome;
  std::size_t answers;
};

class InTheMiddle : public WorkerProcessTest, public ::testing::WithParamInterface<MiddleEnd> {};

// Answers that the worker holds back when it dies are lost.
TEST_P(InTheMiddle, WhatWasAnsweredBeforeIsKept) {
  WorkerProcess worker(HostileWorker(), kPatience, -1);
  const bool is_stalled = GetParam().outcome == WorkerOutcome::kTimedOut;
  EXPECT_EQ(ParseAll(worker, {"good", "pid", GetParam().what, "good", "good"},
                     is_stalled ? kTooLong : kPatience),
            GetParam().outcome);
  ASSERT_LE(all_.size(), GetParam().answers);
  if (!all_.empty()) {
    EXPECT_EQ(all_[0]["TARNMDTextContent"], "some words");
  }
  if (all_.size() > 1) {
    EXPECT_EQ(all_[1]["TARNMDTitle"], std::to_string(worker.pid()));
  }
}

INSTANTIATE_TEST_SUITE_P(Ways, InTheMiddle,
                         ::testing::Values(MiddleEnd{"crash", WorkerOutcome::kDied, 2},
                                           MiddleEnd{"leave", WorkerOutcome::kDied, 2},
                                           MiddleEnd{"garbage", WorkerOutcome::kDied, 2},
                                           MiddleEnd{"endless", WorkerOutcome::kDied, 2},
                                           MiddleEnd{"other", WorkerOutcome::kDied, 2},
                                           // The first of its answers is its own.
                                           MiddleEnd{"ahead", WorkerOutcome::kDied, 3},
                                           MiddleEnd{"stall", WorkerOutcome::kTimedOut, 2}),
                         [](const auto& way) { return std::string(way.param.what); });

TEST_F(WorkerProcessTest, AFormatThatGivesUpKeepsWhatItFound) {
  WorkerProcess worker(HostileWorker(), kPatience, -1);
  EXPECT_EQ(Parse(worker, "throw"), WorkerOutcome::kDone);
  EXPECT_EQ(fields_, (Fields{{"TARNMDTextContent", "what was found before"}}));
  EXPECT_EQ(Parse(worker, "good"), WorkerOutcome::kDone);
  EXPECT_EQ(fields_["TARNMDTextContent"], "some words");
}

TEST_F(WorkerProcessTest, TheDaemonsOwnWorkerReads) {
  WorkerProcess worker(RealWorker(), kPatience, -1);
  EXPECT_EQ(Parse(worker, "txt"), WorkerOutcome::kDone);
  EXPECT_EQ(fields_, (Fields{{"TARNMDTextContent", "some words"}}));
}

}  // namespace
}  // namespace quarry::extract
