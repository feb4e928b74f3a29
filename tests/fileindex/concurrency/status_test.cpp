// Many processes that change the status while others read it.

#include <gmock/gmock.h>

#include <array>
#include <atomic>
#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/paths.h"
#include "fileindex/config/status_mgr.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/concurrency/processes.h"
#include "tests/support/files.h"

namespace quarry::fileindex {
namespace {

using ::testing::Contains;
using ::testing::Each;
using ::testing::Not;
using ::testing::StartsWith;

constexpr int kWriters = 6;
constexpr int kShares = 5;
constexpr size_t kMostEntries = 50000;
constexpr std::time_t kNow = 1700000000;

// All that the status file says: the end of the pause, then the bits of each share.
using Status = std::array<long long, kShares + 1>;

std::string ShareName(int share) {
  return "s" + std::to_string(share);
}

Status StatusOf(const StatusMgr& status_mgr) {
  Status status{status_mgr.GetPauseInfo()};
  for (int i = 0; i < kShares; ++i) {
    status[static_cast<size_t>(i) + 1] = status_mgr.GetShareStatus(ShareName(i));
  }
  return status;
}

std::string Text(const Status& status) {
  std::string text;
  for (const long long value : status) text += std::to_string(value) + " ";
  return text;
}

struct Change {
  enum Kind { kSet, kUnset, kClear, kPause, kResume } kind;
  int share;
  int number;  // bits, or hours

  static Change Any(std::mt19937& random) {
    return {static_cast<Kind>(test::Draw(random, kSet, kResume)),
            test::Draw(random, 0, kShares - 1), test::Draw(random, 0, 15)};
  }

  void Make(StatusMgr& status_mgr) const {
    switch (kind) {
      case kSet:
        return status_mgr.SetShareStatus(ShareName(share), number);
      case kUnset:
        return status_mgr.UnsetShareStatus(ShareName(share), number);
      case kClear:
        return status_mgr.ClearShareStatus(ShareName(share));
      case kPause:
        return status_mgr.Pause(number);
      case kResume:
        return status_mgr.Resume();
    }
  }

  // What the file says once the change is made to a copy that said `status`.
  Status After(Status status) const {
    long long& bits = status[static_cast<size_t>(share) + 1];
    if (kind == kSet) bits |= number;
    if (kind == kUnset) bits &= ~number;
    if (kind == kClear) bits = 0;
    if (kind == kPause) status[0] = number == 0 ? 0 : kNow + number * 3600;
    if (kind == kResume) status[0] = -1;
    return status;
  }
};

// One change that some process is about to make to its copy, noted before it is made.
struct Entry {
  Status before;
  Status after;
  std::atomic<bool> noted;
};

struct Board {
  test::Complaints complaints;
  std::array<Entry, kMostEntries> entries;
  std::atomic<size_t> entry_count{0};
  // The last entry that was saved; changed by whoever holds the status lock.
  std::atomic<int> last_saved{-1};
  std::array<std::atomic<int>, kWriters> steps{};
  std::atomic<bool> daemon_ready{false};
  std::atomic<bool> stop{false};
  std::atomic<int> loads{0};
  std::atomic<int> commands{0};
};

const Status kFresh{-1, 0, 0, 0, 0, 0};

class StatusTest : public fake::FakePlatformTest {
 protected:
  StatusTest() { fake::SetTime(kNow); }

  int Run(bool mortal) {
    test::Crew crew(board_->complaints);
    const size_t daemon = crew.Start([this, mortal](std::mt19937&) { Serve(mortal); });
    test::WaitUntil([this] { return board_->daemon_ready.load(); });
    const size_t reader = crew.Start([this](std::mt19937&) { Read(); });
    std::vector<size_t> writers;
    for (int i = 0; i < kWriters; ++i) {
      writers.push_back(
          crew.Start([this, i, mortal](std::mt19937& random) { Write(i, random, mortal); }));
    }
    crew.Finish(writers);
    board_->stop = true;
    crew.Finish({reader, daemon});
    return crew.Killed(writers);
  }

  void Write(int writer, std::mt19937& random, bool mortal) {
    if (mortal) test::DieAtCall(test::Draw(random, 1, 40));
    std::atomic<int>& steps = board_->steps.at(static_cast<size_t>(writer));
    while (steps < 25 * test::Effort() && !board_->complaints.Any()) {
      StatusMgr status_mgr;
      // Some keep their copy for longer, so that it grows old.
      for (int i = test::Draw(random, 0, 2); i >= 0; --i) {
        const Change change = Change::Any(random);
        const int entry = Note(StatusOf(status_mgr), change);
        if (!mortal) ExpectToSave(entry);
        test::DoLocked([&] { change.Make(status_mgr); });
        ++steps;
      }
      test::ForgetRecords();
    }
  }

  int Note(const Status& before, const Change& change) {
    const size_t index = board_->entry_count++;
    Entry& entry = board_->entries.at(index);
    entry.before = before;
    entry.after = change.After(before);
    entry.noted = true;
    return static_cast<int>(index);
  }

  // Nobody else may have saved between the last one who had the lock and this process, which has it
  // when it is about to replace the file.
  void ExpectToSave(int entry) {
    fake::OnSystemCall("rename", [this, entry] {
      const int last = board_->last_saved;
      const Status status = StatusOf(StatusMgr());
      const Status& expected =
          last < 0 ? kFresh : board_->entries.at(static_cast<size_t>(last)).after;
      if (status != expected) Complain("saved by two at once", status);
      board_->last_saved = entry;
    });
  }

  void Read() {
    while (!board_->stop && !board_->complaints.Any()) {
      const Status status = StatusOf(StatusMgr());
      if (!IsExplained(status)) Complain("nobody's copy with one change", status);
      ++board_->loads;
      test::ForgetRecords();
    }
  }

  // Whether the file may say this: at first, or after some noted change.
  bool IsExplained(const Status& status) {
    TakeNotes();
    return explained_.count(status) != 0;
  }

  void TakeNotes() {
    const size_t count = board_->entry_count;
    for (; taken_ < count && board_->entries[taken_].noted; ++taken_) {
      explained_.insert(board_->entries[taken_].after);
    }
    // A process that was killed leaves an entry that is never noted.
    for (size_t i = taken_; i < count; ++i) {
      if (board_->entries[i].noted) explained_.insert(board_->entries[i].after);
    }
  }

  // The daemon is told while the status is still locked, so the file says the same.
  void Serve(bool mortal) {
    test::ServeAsDaemon(board_->stop, board_->daemon_ready,
                        [this, mortal](const Json::Value& told) {
                          ++board_->commands;
                          const Status status = StatusOf(StatusMgr());
                          const bool pauses = told["type"] == "pause";
                          const long long end = pauses ? told["data"]["resume_time"].asInt64() : -1;
                          // One who was killed has told, but holds the lock no more.
                          if (!mortal && status[0] != end)
                            Complain("told otherwise: " + std::to_string(end), status);
                        });
  }

  void Complain(const std::string& what, const Status& status) {
    board_->complaints.Add(what + ": " + Text(status));
  }

  void ExpectAllExplained() {
    EXPECT_EQ(board_->complaints.Text(), "");
    EXPECT_GT(board_->loads, 0);
    EXPECT_GT(board_->commands, 0);
    EXPECT_TRUE(IsExplained(StatusOf(StatusMgr())));
    // What was loaded is what somebody had saved, or the outcome of the same copy's last change.
    for (size_t i = 0; i < board_->entry_count; ++i) {
      const Entry& entry = board_->entries[i];
      EXPECT_TRUE(!entry.noted || IsExplained(entry.before)) << Text(entry.before);
    }
    EXPECT_EQ(test::FileMode(kFileIndexStatusCfgPath), 0644u);
  }

  test::Shared<Board> board_;
  std::set<Status> explained_{kFresh};
  size_t taken_ = 0;
};

TEST_F(StatusTest, TheFileIsAlwaysSomebodysCopyWithOneChange) {
  EXPECT_EQ(Run(false), 0);
  ExpectAllExplained();
  ASSERT_GE(board_->last_saved, 0);
  EXPECT_EQ(StatusOf(StatusMgr()),
            board_->entries.at(static_cast<size_t>(board_->last_saved)).after);
  EXPECT_THAT(test::ListDir(RootedPath("/var/packages/Quarry/etc")), Each(Not(StartsWith("."))));
}

TEST_F(StatusTest, AlsoWhenWritersAreKilledAtAnyMoment) {
  EXPECT_GE(Run(true), kWriters);
  ExpectAllExplained();
}

// Who loads under a lock of the callers' own writes back no older copy.
TEST_F(StatusTest, NoChangeIsLostBetweenCallersWhoTakeTurns) {
  constexpr int kBits = 30;
  test::Crew crew(board_->complaints);
  std::vector<size_t> writers;
  for (int i = 0; i < kShares; ++i) {
    writers.push_back(crew.Start([i](std::mt19937&) {
      for (int bit = 0; bit < kBits; ++bit) {
        test::DoLocked([&] {
          const LockFile turn(RootedPath("/tmp/turn.lock"), true);
          StatusMgr().SetShareStatus(ShareName(i), 1 << bit);
        });
      }
    }));
  }
  crew.Finish(writers);
  EXPECT_EQ(board_->complaints.Text(), "");
  constexpr long long kAll = (1LL << kBits) - 1;
  EXPECT_EQ(StatusOf(StatusMgr()), (Status{-1, kAll, kAll, kAll, kAll, kAll}));
}

}  // namespace
}  // namespace quarry::fileindex
