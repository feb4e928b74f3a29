// Many processes that add, set and delete folders while others read the list.

#include <gmock/gmock.h>

#include <array>
#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "common/paths.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/queue/queue_mgr.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/concurrency/processes.h"
#include "tests/support/files.h"

namespace quarry::fileindex {
namespace {

using ::testing::Each;
using ::testing::Not;
using ::testing::StartsWith;

constexpr int kWriters = 8;
constexpr int kFoldersEach = 3;
constexpr int kFolders = kWriters * kFoldersEach;

// How a folder stands in the list: not at all, or with which of the four kinds.
using Standing = std::uint32_t;
constexpr Standing kAbsent = 0;
constexpr Standing kPresent = 16;

// What its only writer knows of a folder. While it is being changed either standing may be in the
// file; else just the one.
struct Known {
  std::uint32_t changes = 0;
  bool busy = false;
  Standing from = kAbsent;
  Standing to = kAbsent;

  static Known Unpack(std::uint64_t word) {
    return {static_cast<std::uint32_t>(word >> 32), (word & 1) != 0,
            static_cast<Standing>(word >> 8) & 0xFF, static_cast<Standing>(word >> 16) & 0xFF};
  }
  std::uint64_t Pack() const {
    return static_cast<std::uint64_t>(changes) << 32 | to << 16 | from << 8 | (busy ? 1 : 0);
  }
  bool Allows(Standing standing) const { return standing == to || (busy && standing == from); }
};

struct Board {
  test::Complaints complaints;
  std::array<std::atomic<std::uint64_t>, kFolders> known{};
  std::array<std::atomic<int>, kWriters> steps{};
  std::atomic<bool> daemon_ready{false};
  std::atomic<bool> stop{false};
  std::atomic<int> loads{0};
};

std::string PathOf(int folder) {
  // The second share has few folders, so that it leaves the index and comes back to it.
  const std::string share = folder / kFoldersEach < kWriters - 1 ? "/photo/" : "/music/";
  return share + std::to_string(folder);
}

Json::Value RecordOf(int folder, Standing standing) {
  const auto has = [standing](Standing kind) { return (standing & kind) != 0; };
  return Folder(PathOf(folder), "n", has(1), has(2), has(4), has(8), false, false).GetData();
}

std::array<Standing, kFolders> StandingsIn(const FolderMgr& folder_mgr) {
  std::array<Standing, kFolders> standings{};
  for (const auto& folder : folder_mgr.GetFolders()) {
    Standing& standing = standings.at(std::stoul(folder->GetPath().substr(7)));
    if (standing != kAbsent) throw std::runtime_error("twice in the list: " + folder->GetPath());
    standing = kPresent | (folder->IsDocument() ? 1U : 0U) | (folder->IsAudio() ? 2U : 0U) |
               (folder->IsVideo() ? 4U : 0U) | (folder->IsPhoto() ? 8U : 0U);
  }
  return standings;
}

class FolderListTest : public fake::FakePlatformTest {
 protected:
  FolderListTest() {
    for (const char* share : {"music", "photo"}) {
      fake::AddShare(share, test::TestRoot() + "/v/" + share);
    }
    for (int i = 0; i < kFolders; ++i) test::MakeDirs(test::TestRoot() + "/v" + PathOf(i));
    test::WriteFile(RootedPath("/var/run/tarnelasticd.sock"), "");
  }

  // Returns how many writers were killed.
  int Run(bool mortal) {
    test::Crew crew(board_->complaints);
    const size_t daemon = crew.Start(
        [this](std::mt19937&) { test::ServeAsDaemon(board_->stop, board_->daemon_ready); });
    test::WaitUntil([this] { return board_->daemon_ready.load(); });
    const std::vector<size_t> readers = {crew.Start([this](std::mt19937&) { Read(true); }),
                                         crew.Start([this](std::mt19937&) { Read(false); })};
    std::vector<size_t> writers;
    for (int i = 0; i < kWriters; ++i) {
      writers.push_back(
          crew.Start([this, i, mortal](std::mt19937& random) { Write(i, random, mortal); }));
    }
    crew.Finish(writers);
    board_->stop = true;
    crew.Finish({readers[0], readers[1], daemon});
    return crew.Killed(writers);
  }

  void Write(int writer, std::mt19937& random, bool mortal) {
    const int first = writer * kFoldersEach;
    for (int i = first; i < first + kFoldersEach; ++i) Settle(i);
    if (mortal) test::DieAtCall(test::Draw(random, 1, 60));
    std::atomic<int>& steps = board_->steps.at(static_cast<size_t>(writer));
    while (steps < 12 * test::Effort() && !board_->complaints.Any()) {
      Change(first + test::Draw(random, 0, kFoldersEach - 1), random);
      ++steps;
      test::ForgetRecords();
    }
  }

  void Change(int folder, std::mt19937& random) {
    std::atomic<std::uint64_t>& word = board_->known.at(static_cast<size_t>(folder));
    Known known = Known::Unpack(word);
    known.from = known.to;
    const bool removes = known.from != kAbsent && test::Draw(random, 0, 1) == 0;
    known.to = removes ? kAbsent : kPresent | static_cast<Standing>(test::Draw(random, 0, 15));
    known.busy = true;
    ++known.changes;
    word = known.Pack();
    try {
      Do(folder, known);
      known.busy = false;
      word = known.Pack();
    } catch (const Error& error) {
      // A lock that could not be had in time: the one of the list, or that of a later step.
      if (error.code() != 506) throw;
      Settle(folder);
    }
  }

  static void Do(int folder, const Known& known) {
    Json::Value list(Json::arrayValue);
    list.append(known.to == kAbsent ? Json::Value(PathOf(folder)) : RecordOf(folder, known.to));
    if (known.to == kAbsent) return FolderDelete(list);
    known.from == kAbsent ? FolderAdd(list, false) : FolderSet(list, false);
  }

  // Finds out what became of a change that was broken off.
  void Settle(int folder) {
    std::atomic<std::uint64_t>& word = board_->known.at(static_cast<size_t>(folder));
    Known known = Known::Unpack(word);
    if (!known.busy) return;
    const Standing standing = StandingsIn(FolderMgr()).at(static_cast<size_t>(folder));
    if (!known.Allows(standing)) Complain(folder, known, standing);
    known.to = standing;
    known.busy = false;
    ++known.changes;
    word = known.Pack();
  }

  // One of the readers also takes the events, which would become ever more.
  void Read(bool takes_events) {
    while (!board_->stop && !board_->complaints.Any()) {
      ReadOnce();
      if (takes_events && ++board_->loads % 16 == 0) {
        QueueMgr queue(fake::QueuePath(test::TestRoot() + "/v/photo"));
        test::DoLocked([&] { queue.ProcessOP([](std::shared_ptr<OP>) {}, true); });
        queue.DeleteTmp();
      }
      test::ForgetRecords();
    }
  }

  void ReadOnce() {
    std::array<std::uint64_t, kFolders> before{};
    for (size_t i = 0; i < kFolders; ++i) before[i] = board_->known[i];
    const std::array<Standing, kFolders> standings = StandingsIn(FolderMgr());
    for (size_t i = 0; i < kFolders; ++i) {
      const Known known = Known::Unpack(before[i]);
      if (board_->known[i] == before[i] && !known.Allows(standings[i])) {
        Complain(static_cast<int>(i), known, standings[i]);
      }
    }
  }

  void Complain(int folder, const Known& known, Standing standing) {
    board_->complaints.Add(PathOf(folder) + " stands in the list as " + std::to_string(standing) +
                           ", last changed from " + std::to_string(known.from) + " to " +
                           std::to_string(known.to));
  }

  void ExpectAllKept() {
    EXPECT_EQ(board_->complaints.Text(), "");
    EXPECT_GT(board_->loads, 0);
    const std::array<Standing, kFolders> standings = StandingsIn(FolderMgr());
    for (size_t i = 0; i < kFolders; ++i) {
      const Known known = Known::Unpack(board_->known[i]);
      EXPECT_FALSE(known.busy);
      EXPECT_EQ(standings[i], known.to) << PathOf(static_cast<int>(i));
    }
    EXPECT_EQ(test::FileMode(kFileIndexFoldersCfgPath), 0644u);
  }

  test::Shared<Board> board_;
};

TEST_F(FolderListTest, NoRecordIsLostAndTheListIsWholeAtEveryInstant) {
  EXPECT_EQ(Run(false), 0);
  ExpectAllKept();
  EXPECT_THAT(test::ListDir(RootedPath("/var/packages/Quarry/etc")), Each(Not(StartsWith("."))));
}

TEST_F(FolderListTest, NorWhenWritersAreKilledAtAnyMoment) {
  EXPECT_GE(Run(true), kWriters);
  ExpectAllKept();
}

}  // namespace
}  // namespace quarry::fileindex
