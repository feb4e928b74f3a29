#include "daemons/fileindexd/pass.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <random>
#include <thread>

#include "common/error.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "tests/daemons/fileindexd/share_fixture.h"
#include "tests/support/files.h"

namespace quarry::fileindexd {
namespace {

using fileindex::EVENT_ATTR;
using fileindex::EVENT_CREATE;
using fileindex::EVENT_DELETE;
using fileindex::EVENT_MODIFY;
using fileindex::EVENT_OVERFLOW;
using fileindex::EVENT_REINDEX;
using fileindex::EVENT_RENAME;
using ::testing::AnyOf;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::StartsWith;

class PassTest : public ShareFixture {
 protected:
  // The call of that number, counted from 1, fails.
  // From that call on: the engine is gone.
  void FailCall(std::size_t number, const Error& error) {
    auto calls = std::make_shared<std::atomic<std::size_t>>(0);
    index_.SetHook([=](const std::string&) {
      if (++*calls >= number) throw error;
    });
  }
};

TEST_F(PassTest, CommitsBeforeItDeletesTheSnapshot) {
  disk_.WriteFile("/v/s/a.txt");
  Queue(EVENT_CREATE, "/v/s/a.txt");
  bool snapshot_at_commit = false;
  index_.SetHook([&](const std::string& command) {
    if (command == "commit") snapshot_at_commit = HasSnapshot();
  });
  EXPECT_EQ(PassResult::kDone, Run());
  EXPECT_TRUE(snapshot_at_commit);
  EXPECT_FALSE(HasSnapshot());
  EXPECT_FALSE(HasQueue());
}

TEST_F(PassTest, LinesThatComeMeanwhileWaitForTheNextPass) {
  disk_.WriteFile("/v/s/a.txt");
  disk_.WriteFile("/v/s/b.txt");
  Queue(EVENT_CREATE, "/v/s/a.txt");
  index_.SetHook([&](const std::string& command) {
    if (command == "commit") Queue(EVENT_CREATE, "/v/s/b.txt");
  });
  EXPECT_EQ(PassResult::kDone, Run());
  EXPECT_TRUE(HasQueue());
  index_.SetHook(nullptr);
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/b.txt content"));
}

TEST_F(PassTest, AnEngineThatIsStartedAnewGetsTheWorkAgain) {
  disk_.WriteFile("/v/s/a.txt");
  Queue(EVENT_CREATE, "/v/s/a.txt");
  index_.SetHook([&](const std::string& command) {
    if (command == "commit") index_.Restart();
  });
  EXPECT_EQ(PassResult::kAgain, Run());
  EXPECT_TRUE(HasSnapshot());
  EXPECT_EQ(0U, index_.All().size());
  index_.SetHook(nullptr);
  EXPECT_EQ(PassResult::kDone, Run());
  EXPECT_FALSE(HasSnapshot());
  EXPECT_EQ(1U, index_.All().count("/v/s/a.txt"));
}

TEST_F(PassTest, AnEngineThatDoesNotAnswerIsNotedBeforeTheQueueIsTouched) {
  Queue(EVENT_CREATE, "/v/s/a.txt");
  FailCall(1, Error(kErrorEngineRequest, "Connect failed"));
  EXPECT_THROW(Run(), Error);
  EXPECT_TRUE(HasQueue());
  EXPECT_FALSE(HasSnapshot());
}

TEST_F(PassTest, AFailedCommitKeepsTheSnapshot) {
  disk_.WriteFile("/v/s/a.txt");
  Queue(EVENT_CREATE, "/v/s/a.txt");
  index_.SetHook([](const std::string& command) {
    if (command == "commit") throw Error(kErrorNoSpace, "Share (s) space not enough");
  });
  EXPECT_THROW(Run(), Error);
  EXPECT_TRUE(HasSnapshot());
}

TEST_F(PassTest, AMissingReaderIsNotTheFilesFault) {
  disk_.WriteFile("/v/s/a.txt");
  Queue(EVENT_CREATE, "/v/s/a.txt");
  index_.SetReaderRunning(false);
  try {
    Run();
    FAIL();
  } catch (const Error& error) {
    EXPECT_EQ(kErrorParseDocument, error.code());
    EXPECT_THAT(error.reason(), ::testing::HasSubstr("tarncontentextractd"));
  }
  EXPECT_TRUE(HasSnapshot());
  EXPECT_EQ(0U, progress_.FailedCount());
}

TEST_F(PassTest, AnExchangeThatBreaksOffForOneDocumentIsThatDocumentsFault) {
  disk_.WriteFile("/v/s/a.txt");
  disk_.WriteFile("/v/s/b.txt");
  index_.SetHook([](const std::string& command) {
    if (command == "upsert /v/s/a.txt content") throw Error(kErrorEngineRequest, "Recv failed");
  });
  EXPECT_EQ(PassResult::kDone, Run(true));
  EXPECT_EQ(1U, progress_.FailedCount());
  EXPECT_EQ("", index_.All()["/v/s/a.txt"].content_stamp);
  EXPECT_NE("", index_.All()["/v/s/b.txt"].content_stamp);
}

TEST_F(PassTest, ShareThatIsGoneLosesNothing) {
  disk_.WriteFile("/v/s/a.txt");
  disk_.WriteFile("/v/s/d/b.txt");
  Run(true);
  const FakeIndex::Documents before = index_.All();
  // The disk is unplugged after the pass has begun.
  index_.SetHook([this](const std::string& command) {
    if (command == "epoch") disk_.Remove("/v/s");
  });
  Queue(EVENT_OVERFLOW, "");
  EXPECT_THROW(Run(), Error);
  EXPECT_TRUE(HasSnapshot());
  EXPECT_EQ(before.size(), index_.All().size());
}

TEST_F(PassTest, GarbageInTheQueueStopsNothing) {
  disk_.WriteFile("/v/s/a.txt");
  test::WriteFile(QueuePath(), "\xff\xfe{]\n\n{\"event\":2}\nnull\n[1]\n");
  Queue(EVENT_CREATE, "/v/s/a.txt");
  EXPECT_EQ(PassResult::kDone, Run());
  EXPECT_EQ(1U, index_.All().count("/v/s/a.txt"));
  EXPECT_FALSE(HasSnapshot());
}

// What a lost line told of is found by comparing, which is done once.
TEST_F(PassTest, WhatGarbageInTheQueueMeantIsFound) {
  for (const std::string& torn :
       {std::string("garbage\n"), std::string(R"({"event":64,"path":"/v)"),
        std::string("{\"event\":64,\"path\":\"/v/s/\\u0000\"}\n")}) {
    disk_.Remove("/v/s");
    disk_.WriteFile("/v/s/told.txt");
    disk_.WriteFile("/v/s/d/untold.txt");
    Queue(EVENT_CREATE, "/v/s/told.txt");
    test::WriteFile(QueuePath(), test::ReadFile(QueuePath()) + torn);
    EXPECT_EQ(PassResult::kDone, Run());
    ExpectInLine();
    disk_.WriteFile("/v/s/told.txt");
    Queue(EVENT_MODIFY, "/v/s/told.txt");
    EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/told.txt content"));
  }
}

TEST_F(PassTest, GarbageIsKeptUntilWhatItMeantIsCommitted) {
  disk_.WriteFile("/v/s/untold.txt");
  test::WriteFile(QueuePath(), "garbage\n");
  FailCall(3, Error(kErrorNoSpace, "full"));
  EXPECT_THROW(Run(), Error);
  index_.SetHook(nullptr);
  index_.Restart();
  EXPECT_TRUE(HasSnapshot());
  Run();
  ExpectInLine();
  EXPECT_FALSE(HasSnapshot());
}

TEST_F(PassTest, StopLeavesTheSnapshot) {
  for (int i = 0; i < 500; ++i) {
    const std::string path = "/v/s/" + std::to_string(i) + ".txt";
    disk_.WriteFile(path);
    Queue(EVENT_CREATE, path);
  }
  index_.SetHook([this](const std::string& command) {
    if (command == "upsert /v/s/7.txt content") gate_.Stop();
  });
  EXPECT_THROW(Run(), Interrupted);
  EXPECT_TRUE(HasSnapshot());
  EXPECT_LT(index_.All().size(), 250U);
}

TEST_F(PassTest, PauseHoldsAWalkUpAndLetsItGoOn) {
  for (int i = 0; i < 2000; ++i) disk_.WriteFile("/v/s/" + std::to_string(i) + ".txt");
  index_.SetHook([this](const std::string& command) {
    if (command == "upsert /v/s/120.txt content") gate_.SetPaused(true);
  });
  std::atomic<bool> done{false};
  std::thread pass([&] {
    Run(true);
    done = true;
  });
  EXPECT_TRUE(test::WaitUntil([this] { return gate_.Paused(); }));
  // What was begun before the pause is still finished, and no more than that.
  EXPECT_TRUE(test::WaitUntil([this] { return progress_.DoneCount() > 20; }));
  index_.SetHook(nullptr);
  EXPECT_FALSE(done);
  EXPECT_LT(index_.All().size(), 1000U);
  gate_.SetPaused(false);
  EXPECT_TRUE(test::WaitUntil([&] { return done.load(); }));
  pass.join();
  ExpectInLine();
}

// Killing the daemon after any call, or any call failing, must not change the result.
TEST_F(PassTest, EveryCallMayFail) {
  const auto prepare = [this] {
    disk_.Remove("/v/s");
    disk_.AddDir("/v/s");
    for (const char* path : {"/v/s/a/1.txt", "/v/s/a/2.txt", "/v/s/b/c/3.txt", "/v/s/4.txt"}) {
      disk_.WriteFile(path);
    }
    Run(true);
    disk_.Rename("/v/s/a", "/v/s/z");
    disk_.Remove("/v/s/b");
    disk_.WriteFile("/v/s/z/2.txt");
    disk_.WriteFile("/v/s/new/5.txt");
    disk_.Touch("/v/s/4.txt");
    Queue(EVENT_RENAME, "/v/s/z", true, "/v/s/a");
    Queue(EVENT_MODIFY, "/v/s/z/2.txt");
    Queue(EVENT_DELETE, "/v/s/b", true);
    Queue(EVENT_CREATE, "/v/s/new", true);
    Queue(EVENT_ATTR, "/v/s/4.txt");
    Queue(EVENT_ATTR, "/v/s");
    index_.ForgetCommands();
  };
  prepare();
  ASSERT_EQ(PassResult::kDone, Run());
  ExpectInLine();
  const std::size_t calls = index_.CallCount();
  ASSERT_GT(calls, 20U);
  for (const bool restart : {false, true}) {
    for (std::size_t call = 1; call <= calls; ++call) {
      SCOPED_TRACE("call " + std::to_string(call));
      prepare();
      FailCall(call, Error(engine::kStorageFailed, "killed"));
      EXPECT_THROW(Run(), Error);
      EXPECT_TRUE(HasSnapshot() || HasQueue());
      index_.SetHook(nullptr);
      if (restart) index_.Restart();
      ASSERT_EQ(PassResult::kDone, Run());
      ExpectInLine();
      EXPECT_FALSE(HasSnapshot());
    }
  }
}

// Random changes, told in lines that are complete, late, or not there at all.
class RandomShare : public PassTest, public ::testing::WithParamInterface<unsigned> {
 protected:
  std::string Name() {
    static const char* const kNames[] = {"a", "b", "c.txt", "d.mp3", "e", "@eaDir", ".DS_Store"};
    return kNames[random_() % 7];
  }

  std::string Path() {
    std::string path = kRoot;
    for (std::size_t depth = random_() % 4 + 1; depth > 0; --depth) path += "/" + Name();
    return path;
  }

  // Whether all above the place can hold entries.
  bool CanHold(const std::string& path) {
    for (std::string above = path.substr(0, path.rfind('/')); above != kRoot;
         above = above.substr(0, above.rfind('/'))) {
      const PlaceKind kind = disk_.Peek(above).kind;
      if (kind != PlaceKind::kAbsent && kind != PlaceKind::kDirectory) return false;
    }
    return true;
  }

  void Tell(unsigned int event, const std::string& path, bool is_dir, const std::string& old = "") {
    if (random_() % 20 != 0) {
      Queue(event, path, is_dir, old);
    } else {
      Queue(EVENT_OVERFLOW, "");
    }
  }

  void Change() {
    const std::string path = Path();
    const bool is_dir = disk_.Peek(path).kind == PlaceKind::kDirectory;
    switch (random_() % 8) {
      case 0:
      case 1:
      case 2:
        if (is_dir || !CanHold(path)) return;
        return Write(path);
      case 3:
        if (!disk_.Has(path)) return;
        disk_.Touch(path);
        return Tell(EVENT_ATTR, path, is_dir);
      case 4:
        if (!disk_.Has(path)) return;
        disk_.Remove(path);
        return Tell(EVENT_DELETE, path, is_dir);
      case 5:
        if (disk_.Has(path) || !CanHold(path)) return;
        TellNewDirs(path);
        disk_.AddOther(path);
        return Tell(EVENT_CREATE, path, false);
      default:
        return Move(path, Path());
    }
  }

  void TellNewDirs(const std::string& path) {
    std::string top;
    for (std::string above = path.substr(0, path.rfind('/')); !disk_.Has(above);
         above = above.substr(0, above.rfind('/'))) {
      top = above;
    }
    if (!top.empty()) Tell(EVENT_CREATE, top, true);
  }

  void Write(const std::string& path) {
    const bool is_new = !disk_.Has(path);
    if (is_new) TellNewDirs(path);
    disk_.WriteFile(path);
    Tell(is_new ? EVENT_CREATE : EVENT_MODIFY, path, false);
  }

  void Move(const std::string& from, const std::string& to) {
    if (!disk_.Has(from) || PathsMeet(from, to) || !CanHold(to)) return;
    if (!disk_.Has(to.substr(0, to.rfind('/')))) return;
    if (disk_.Peek(to).kind == PlaceKind::kDirectory) return;
    const bool is_dir = disk_.Peek(from).kind == PlaceKind::kDirectory;
    disk_.Rename(from, to);
    Tell(EVENT_RENAME, to, is_dir, from);
  }

  void RandomFolders() {
    std::vector<FolderRule> folders;
    if (random_() % 3 != 0) folders.push_back(Folder("/s"));
    for (std::size_t i = random_() % 4; i > 0; --i) {
      const std::string path = Path().substr(2);
      folders.push_back(random_() % 2 == 0 ? Folder(path) : DocumentFolder(path));
    }
    SetFolders(folders);
  }

  std::mt19937 random_{GetParam()};
};

// Comparing directories' own attributes is for the walk alone: a change in a directory is told by a
// line about the entry.
TEST_P(RandomShare, IsInLineAfterEachFullPass) {
  threads_ = 4;
  if (GetParam() % 2 == 0) index_.MakeDoubtful(GetParam());
  for (int round = 0; round < 30; ++round) {
    if (round % 5 == 0) RandomFolders();
    for (std::size_t i = random_() % 40; i > 0; --i) Change();
    ASSERT_EQ(PassResult::kDone, Run(true));
    ExpectInLine();
    if (HasFailure()) return;
    index_.ForgetCommands();
    ASSERT_EQ(PassResult::kDone, Run(true));
    // Removing what may be there is all that is left to do.
    EXPECT_THAT(index_.Commands(), Each(AnyOf(StartsWith("delete"), "commit")));
  }
}

TEST_P(RandomShare, HoldsTheRightPlacesAfterPassesOverTheQueue) {
  threads_ = 4;
  if (GetParam() % 2 == 0) index_.MakeDoubtful(GetParam());
  RandomFolders();
  Queue(EVENT_REINDEX, kRoot);
  for (int round = 0; round < 30; ++round) {
    // Some lines are only read when the disk has moved on.
    const std::size_t first = random_() % 20;
    for (std::size_t i = 0; i < first; ++i) Change();
    if (random_() % 4 == 0) {
      auto left = std::make_shared<std::atomic<int>>(static_cast<int>(random_() % 30));
      index_.SetHook([left](const std::string&) {
        if (--*left == 0) throw Error(engine::kStorageFailed, "killed");
      });
      for (std::size_t i = random_() % 10; i > 0; --i) Change();
      try {
        Run();
      } catch (const Error&) {
        if (random_() % 2 == 0) index_.Restart();
      }
      index_.SetHook(nullptr);
      for (std::size_t i = random_() % 10; i > 0; --i) Change();
    }
    while (HasQueue() || HasSnapshot()) ASSERT_EQ(PassResult::kDone, Run());
    const FakeIndex::Documents expected = Expected();
    const FakeIndex::Documents actual = index_.All();
    for (const auto& [path, document] : expected) {
      ASSERT_EQ(1U, actual.count(path)) << path << " is missing in round " << round;
      EXPECT_EQ(document.is_dir, actual.at(path).is_dir) << path;
      EXPECT_EQ(document.content_stamp, actual.at(path).content_stamp) << path;
    }
    ASSERT_EQ(expected.size(), actual.size()) << "round " << round;
  }
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomShare, ::testing::Range(1U, 41U));

}  // namespace
}  // namespace quarry::fileindexd
