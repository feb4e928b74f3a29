// Many processes that add events to one queue while others make snapshots and work them off.

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sched.h>
#include <sys/file.h>

#include <array>
#include <atomic>
#include <chrono>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
#include "common/paths.h"
#include "common/unique_fd.h"
#include "fileindex/config/status_mgr.h"
#include "fileindex/queue/event.h"
#include "fileindex/queue/queue_mgr.h"
#include "fileindex/util/custom_event.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/concurrency/processes.h"
#include "tests/support/files.h"

namespace quarry::fileindex {
namespace {

constexpr int kWriters = 5;
constexpr int kConsumers = 3;
constexpr size_t kMostLines = 100000;

// What is known of one line.
struct Line {
  std::atomic<int> begun;      // attempts to write it
  std::atomic<bool> written;   // its writer was told so
  std::atomic<int> processed;  // times
};

struct Board {
  test::Complaints complaints;
  std::array<std::array<Line, kMostLines>, kWriters> lines;
  std::array<std::atomic<size_t>, kWriters> next{};
  std::atomic<bool> stop{false};
  std::atomic<int> refused{0};  // for an unfinished line before theirs
  std::atomic<int> passes{0};
  std::atomic<int> consumers{0};  // started
  // What each writer has last changed, and what was last found when its place was looked at.
  std::array<std::atomic<size_t>, kWriters> changed{};
  std::array<std::atomic<size_t>, kWriters> found{};
};

// How the processes of one run behave.
struct Habits {
  bool writers_die = false;
  bool consumers_die = false;
  bool consumers_take_turns = true;
};

class QueueTest : public fake::FakePlatformTest {
 protected:
  QueueTest() {
    fake::AddShare("photo", "/volume1/photo");
    queue_ = fake::QueuePath("/volume1/photo");
    test::WriteFile(turn_, "");
  }

  size_t LinesEach() const { return static_cast<size_t>(400 * test::Effort()); }

  // Returns how many writers were killed.
  int Run(const Habits& habits) {
    test::Crew crew(board_->complaints);
    std::vector<size_t> consumers;
    std::vector<size_t> writers;
    for (size_t i = 0; i < kWriters; ++i) {
      writers.push_back(
          crew.Start([this, i, habits](std::mt19937& random) { Write(i, random, habits); }));
    }
    for (int i = 0; i < kConsumers; ++i) {
      consumers.push_back(
          crew.Start([this, habits](std::mt19937& random) { Consume(habits, random); }));
    }
    consumers.push_back(crew.Start([this](std::mt19937&) { Snapshot(); }));
    crew.Finish(writers);
    board_->stop = true;
    crew.Finish(consumers);
    // What is left: a snapshot, then the queue.
    for (int i = 0; i < 2; ++i) Pass();
    return crew.Killed(writers);
  }

  // ---- Writers

  void Write(size_t writer, std::mt19937& random, const Habits& habits) {
    if (habits.writers_die) test::DieAtCall(test::Draw(random, 1, 60));
    std::atomic<size_t>& next = board_->next[writer];
    // Long enough for every consumer to meet its end.
    const int starts = habits.consumers_die ? 2 * kConsumers : 0;
    while ((next < LinesEach() || board_->consumers < starts) && !board_->complaints.Any()) {
      Line& line = board_->lines[writer].at(next);
      // A line that was begun by one who was killed may have been written or not.
      if (line.begun == 0) WriteLine(writer, next, line, random, habits.writers_die);
      ++next;
      test::ForgetRecords();
    }
  }

  void WriteLine(size_t writer, size_t number, Line& line, std::mt19937& random, bool mortal) {
    ++line.begun;
    const std::string name = std::to_string(writer) + "-" + std::to_string(number);
    while (!board_->complaints.Any()) {
      // One who dies with its line half written leaves just that.
      if (mortal && number % 3 == 0) {
        fake::CutWrite(1, static_cast<size_t>(test::Draw(random, 1, 100)));
      }
      try {
        AddEvent(name, number);
        line.written = true;
        return;
      } catch (const Error& error) {
        if (error.code() == 906) {
          ++board_->refused;
          ExpectMarked();
        } else if (error.code() != 506) {
          throw;
        }
      }
    }
  }

  // Who could not write, for another's unfinished line, has left word.
  void ExpectMarked() {
    const bool marked = StatusMgr().GetShareStatus("photo") == 1;
    // The status is locked too.
    if (marked || !fake::LogsWith("SetShareStatus failed, code=506").empty()) return;
    board_->complaints.Add("an event is lost and the share not marked");
  }

  static void AddEvent(const std::string& name, size_t number) {
    const std::string path = "/volume1/photo/" + name;
    switch (number % 3) {
      case 0:
        return AddCustomEvent(EVENT_UPDATE_CFG, path, "", Json::Value(Json::objectValue));
      case 1:
        return AddCustomEvent(EVENT_RENAME, path, "/volume1/photo/old-" + name, Json::Value());
      default:
        return AddCustomEvent(EVENT_REINDEX, path, "", Json::Value());
    }
  }

  // ---- Consumers

  void Consume(const Habits& habits, std::mt19937& random) {
    ++board_->consumers;
    if (habits.consumers_die) test::DieAtCall(test::Draw(random, 1, 30));
    while (!board_->stop && !board_->complaints.Any()) {
      const UniqueFd turn(open(turn_.c_str(), O_RDONLY | O_CLOEXEC));
      if (habits.consumers_take_turns) flock(turn.get(), LOCK_EX);
      try {
        Pass();
      } catch (const Error& error) {
        // Without turns another may have removed the snapshot just before it was opened.
        if (habits.consumers_take_turns || error.code() != 502) throw;
      }
      test::ForgetRecords();
    }
  }

  void Pass() {
    QueueMgr queue(queue_);
    const auto take = [this](const std::shared_ptr<OP>& op) { Count(op->node->GetPath()); };
    test::DoLocked([&] { queue.ProcessOP(take, true); });
    queue.DeleteTmp();
    ++board_->passes;
  }

  // "/volume1/photo/2-17" is line 17 of writer 2.
  void Count(const std::string& path) {
    const std::string name = Basename(path);
    const size_t dash = name.find('-');
    const size_t writer = std::stoul(name.substr(0, dash));
    Line& line = board_->lines.at(writer).at(std::stoul(name.substr(dash + 1)));
    ++line.processed;
    if (line.begun == 0) board_->complaints.Add("processed before it was written: " + name);
  }

  // Makes snapshots for others to find.
  void Snapshot() {
    while (!board_->stop && !board_->complaints.Any()) {
      test::DoLocked([this] { QueueMgr(queue_).PrepareTmpQueue(); });
      test::ForgetRecords();
    }
  }

  // ---- Places that are looked at

  // Changes its place and says so, again and again, and each time waits for it to be looked at.
  void ChangePlace(size_t writer, std::mt19937& random) {
    const std::string place = "/volume1/photo/" + std::to_string(writer);
    for (size_t i = 1; i <= LinesEach() / 4 && !board_->complaints.Any(); ++i) {
      board_->changed[writer] = i;
      if (test::Draw(random, 0, 1) == 0) {
        test::DoLocked([&] { AddCustomEvent(EVENT_REINDEX, place, "", Json::Value()); });
      } else {
        const Json::Value kinds(Json::objectValue);
        test::DoLocked([&] { AddCustomEvent(EVENT_UPDATE_CFG, place + "/below", "", kinds); });
      }
      AwaitLook(writer, i);
      test::ForgetRecords();
    }
  }

  void AwaitLook(size_t writer, size_t change) {
    const auto end = std::chrono::steady_clock::now() + std::chrono::minutes(1);
    while (board_->found[writer] < change && !board_->complaints.Any()) {
      if (std::chrono::steady_clock::now() > end) {
        board_->complaints.Add("a change was never looked at: " + std::to_string(change));
      }
      sched_yield();
    }
  }

  void LookAtPlaces() {
    while (!board_->stop && !board_->complaints.Any()) {
      QueueMgr queue(queue_);
      const auto look = [this](const std::shared_ptr<OP>& op) {
        const std::string place = op->node->GetPath().substr(std::strlen("/volume1/photo/"));
        const size_t writer = std::stoul(place);
        board_->found.at(writer) = board_->changed.at(writer).load();
      };
      test::DoLocked([&] { queue.ProcessOP(look, true); });
      // Whoever waited for that look may go on before the snapshot is removed.
      for (int i = 0; i < 20; ++i) sched_yield();
      queue.DeleteTmp();
      test::ForgetRecords();
    }
  }

  // ---- The outcome

  // Calls `check` for every line.
  template <typename Check>
  void ForEachLine(Check check) {
    EXPECT_EQ(board_->complaints.Text(), "");
    EXPECT_GT(board_->passes, 0);
    EXPECT_FALSE(IsFileExist(queue_ + ".tmp"));
    for (size_t writer = 0; writer < kWriters; ++writer) {
      EXPECT_GE(board_->next[writer], LinesEach());
      for (size_t i = 0; i < board_->next[writer]; ++i) {
        SCOPED_TRACE(std::to_string(writer) + "-" + std::to_string(i));
        check(board_->lines[writer][i]);
      }
    }
  }

  const std::string turn_ = RootedPath("/tmp/turn");
  std::string queue_;
  test::Shared<Board> board_;
};

TEST_F(QueueTest, EveryLineIsProcessedExactlyOnce) {
  Run({});
  ForEachLine([](const Line& line) {
    EXPECT_TRUE(line.written);
    EXPECT_EQ(line.processed, 1);
  });
  EXPECT_EQ(board_->refused, 0);
}

TEST_F(QueueTest, SoIsEveryWrittenLineWhenWritersAreKilledAtAnyMoment) {
  EXPECT_GE(Run({.writers_die = true}), kWriters);
  ForEachLine([](const Line& line) {
    EXPECT_LE(line.processed, 1);
    EXPECT_TRUE(line.processed == 1 || !line.written);
  });
}

TEST_F(QueueTest, NoneIsLostWhenConsumersAreKilledOrMeet) {
  Run({.consumers_die = true, .consumers_take_turns = false});
  EXPECT_GE(board_->consumers, 2 * kConsumers);
  ForEachLine([](const Line& line) {
    EXPECT_TRUE(line.written);
    EXPECT_GE(line.processed, 1);
  });
}

TEST_F(QueueTest, NoChangeIsCoveredByAReindexThatCameBeforeIt) {
  test::Crew crew(board_->complaints);
  const size_t consumer = crew.Start([this](std::mt19937&) { LookAtPlaces(); });
  std::vector<size_t> writers;
  for (size_t i = 0; i < kWriters; ++i) {
    writers.push_back(crew.Start([this, i](std::mt19937& random) { ChangePlace(i, random); }));
  }
  crew.Finish(writers);
  board_->stop = true;
  crew.Finish({consumer});
  EXPECT_EQ(board_->complaints.Text(), "");
  for (const auto& found : board_->found) EXPECT_EQ(found, LinesEach() / 4);
}

}  // namespace
}  // namespace quarry::fileindex
