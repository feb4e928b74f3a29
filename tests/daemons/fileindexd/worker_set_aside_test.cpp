// What a worker does about work that fails again and again.

#include <gtest/gtest.h>

#include "common/error.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "tests/daemons/fileindexd/worker_fixture.h"

namespace quarry::fileindexd {
namespace {

using fileindex::EVENT_ATTR;
using fileindex::EVENT_CREATE;
using fileindex::EVENT_DELETE;
using fileindex::EVENT_MODIFY;
using fileindex::EVENT_REINDEX;
using fileindex::EVENT_RENAME;
using std::chrono::milliseconds;

class PoisonTest : public WorkerFixture {
 protected:
  PoisonTest() {
    worker_->Step();
    for (const char* name : {"a", "b", "c"}) {
      const std::string path = std::string("/v/s/") + name + ".txt";
      disk_.WriteFile(path);
      Queue(EVENT_CREATE, path);
    }
    Queue(EVENT_ATTR, "/v/s", true);
    Poison("upsert /v/s/b.txt content", Error(engine::kInternalFailure, "cannot"));
  }

  void Poison(const std::string& command, const Error& error) {
    index_.SetHook([=](const std::string& asked) {
      if (asked == command) throw error;
    });
  }

  Json::Value SetAside() const { return worker_->Report()["set_aside"]; }

  // Steps until something is set aside. Returns how many that took.
  int StepsUntilSetAside() {
    int steps = 0;
    while (SetAside().empty() && steps < 20) {
      EXPECT_GT(worker_->Step(), milliseconds(0));
      ++steps;
    }
    return steps;
  }

  void StepUntilAtRest() {
    for (int i = 0; i < 10 && State() != "idle"; ++i) worker_->Step();
    EXPECT_EQ("idle", State());
  }
};

TEST_F(PoisonTest, IsSetAsideAfterAFewPassesAndTheRestGoesOn) {
  EXPECT_EQ(5, StepsUntilSetAside());
  EXPECT_TRUE(HasSnapshot());
  StepUntilAtRest();
  EXPECT_FALSE(HasSnapshot());
  EXPECT_EQ(1U, index_.All().count("/v/s/a.txt"));
  EXPECT_EQ(0U, index_.All().count("/v/s/b.txt"));
  EXPECT_EQ(1U, index_.All().count("/v/s/c.txt"));
  EXPECT_EQ("/v/s/b.txt", SetAside()[0]["path"].asString());
  EXPECT_EQ("cannot (code 1413)", SetAside()[0]["error"].asString());
  EXPECT_EQ(1U, SetAside().size());
  EXPECT_EQ("", LastError());
  EXPECT_TRUE(host_.NeedsReindex());
}

TEST_F(PoisonTest, ItsMarkStaysAndIsNoWorkForever) {
  StepsUntilSetAside();
  StepUntilAtRest();
  worker_->CheckStatus();
  EXPECT_FALSE(IsAtRest());
  EXPECT_TRUE(IsAtRest());
  EXPECT_TRUE(host_.NeedsReindex());
  EXPECT_EQ(1U, SetAside().size());
}

TEST_F(PoisonTest, AMarkThatCannotBeSetIsTriedAgain) {
  host_.FailMark(Error(kErrorLock, "locked"));
  StepsUntilSetAside();
  EXPECT_GT(worker_->Step(), milliseconds(0));
  EXPECT_FALSE(host_.NeedsReindex());
  host_.FailMark(std::nullopt);
  StepUntilAtRest();
  EXPECT_TRUE(host_.NeedsReindex());
}

TEST_F(PoisonTest, WhoTakesTheMarkAwayHasEverythingTriedAgain) {
  StepsUntilSetAside();
  StepUntilAtRest();
  index_.SetHook(nullptr);
  host_.Clear();
  worker_->CheckStatus();
  worker_->Step();
  StepUntilAtRest();
  ExpectInLine();
  EXPECT_TRUE(SetAside().empty());
  EXPECT_FALSE(host_.NeedsReindex());
}

TEST_F(PoisonTest, IsForgottenWhenItsFileHasGone) {
  StepsUntilSetAside();
  StepUntilAtRest();
  disk_.Remove("/v/s/b.txt");
  Queue(EVENT_DELETE, "/v/s/b.txt");
  worker_->Step();
  EXPECT_TRUE(SetAside().empty());
  StepUntilAtRest();
  EXPECT_FALSE(host_.NeedsReindex());
  ExpectInLine();
}

TEST_F(PoisonTest, IsRemovedAndForgottenWithTheDirectoryAboveIt) {
  index_.SetHook(nullptr);
  StepUntilAtRest();
  disk_.WriteFile("/v/s/d/x.txt");
  Queue(EVENT_CREATE, "/v/s/d", true);
  worker_->Step();
  disk_.WriteFile("/v/s/d/x.txt");
  Queue(EVENT_MODIFY, "/v/s/d/x.txt");
  Poison("upsert /v/s/d/x.txt content", Error(engine::kInternalFailure, "cannot"));
  StepsUntilSetAside();
  StepUntilAtRest();
  ASSERT_EQ(1U, index_.All().count("/v/s/d/x.txt"));
  disk_.Remove("/v/s/d");
  Queue(EVENT_DELETE, "/v/s/d", true);
  worker_->Step();
  EXPECT_TRUE(SetAside().empty());
  StepUntilAtRest();
  EXPECT_FALSE(host_.NeedsReindex());
  ExpectInLine();
}

TEST_F(PoisonTest, ARemovalThatFailsIsSetAsideToo) {
  index_.SetHook(nullptr);
  StepUntilAtRest();
  disk_.Remove("/v/s/b.txt");
  disk_.WriteFile("/v/s/d.txt");
  Queue(EVENT_DELETE, "/v/s/b.txt");
  Queue(EVENT_CREATE, "/v/s/d.txt");
  Poison("delete /v/s/b.txt", Error(engine::kInternalFailure, "cannot"));
  StepsUntilSetAside();
  StepUntilAtRest();
  EXPECT_EQ("/v/s/b.txt (removal)", SetAside()[0]["path"].asString());
  EXPECT_EQ(1U, index_.All().count("/v/s/d.txt"));
}

TEST_F(PoisonTest, WhatFailsThenIsSetAsideAtOnce) {
  StepsUntilSetAside();
  StepUntilAtRest();
  host_.Clear();
  worker_->CheckStatus();
  EXPECT_EQ(milliseconds(500), worker_->Step());
  EXPECT_EQ(1U, SetAside().size());
  StepUntilAtRest();
  EXPECT_TRUE(host_.NeedsReindex());
}

TEST_F(PoisonTest, ADocumentThatKillsTheEngineIsFound) {
  bool dead = false;
  index_.SetHook([&](const std::string& command) {
    if (command == "upsert /v/s/b.txt content") dead = true;
    if (dead) throw Error(kErrorEngineRequest, "Recv failed");
  });
  for (int i = 0; i < 5; ++i) {
    worker_->Step();
    EXPECT_GT(worker_->Step(), milliseconds(0)) << "the engine is still down";
    dead = false;
    index_.Restart();
  }
  StepUntilAtRest();
  EXPECT_EQ("/v/s/b.txt", SetAside()[0]["path"].asString());
  EXPECT_EQ(1U, index_.All().count("/v/s/c.txt"));
}

TEST_F(PoisonTest, ADocumentThatKillsTheReaderIsFound) {
  index_.SetHook([&](const std::string& command) {
    if (command == "upsert /v/s/b.txt content") index_.SetReaderRunning(false);
  });
  for (int i = 0; i < 5; ++i) {
    worker_->Step();
    index_.SetReaderRunning(true);
  }
  StepUntilAtRest();
  EXPECT_EQ("/v/s/b.txt", SetAside()[0]["path"].asString());
  EXPECT_EQ(1U, index_.All().count("/v/s/c.txt"));
}

TEST_F(PoisonTest, NothingIsSetAsideForAReaderThatDoesNotRun) {
  index_.SetHook(nullptr);
  index_.SetReaderRunning(false);
  for (int i = 0; i < 20; ++i) worker_->Step();
  EXPECT_TRUE(SetAside().empty());
  index_.SetReaderRunning(true);
  StepUntilAtRest();
  ExpectInLine();
}

TEST_F(PoisonTest, AMoveThatFailsIsReplacedByComparing) {
  index_.SetHook(nullptr);
  StepUntilAtRest();
  disk_.Rename("/v/s/a.txt", "/v/s/z.txt");
  Queue(EVENT_RENAME, "/v/s/z.txt", false, "/v/s/a.txt");
  Queue(EVENT_ATTR, "/v/s", true);
  Poison("rename /v/s/a.txt /v/s/z.txt", Error(kErrorEngineQuery, "cannot"));
  StepsUntilSetAside();
  StepUntilAtRest();
  EXPECT_EQ("/v/s/a.txt -> /v/s/z.txt", SetAside()[0]["path"].asString());
  ExpectInLine();
}

TEST_F(PoisonTest, ADirectoryThatCannotBeComparedIsLeftOut) {
  index_.SetHook(nullptr);
  StepUntilAtRest();
  disk_.WriteFile("/v/s/d/x.txt");
  disk_.WriteFile("/v/s/e/y.txt");
  Queue(EVENT_REINDEX, "/v/s", true);
  Poison("children /v/s/d", Error(engine::kStorageFailed, "cannot"));
  StepsUntilSetAside();
  StepUntilAtRest();
  EXPECT_EQ("/v/s/d/", SetAside()[0]["path"].asString());
  EXPECT_EQ(1U, index_.All().count("/v/s/d"));
  EXPECT_EQ(0U, index_.All().count("/v/s/d/x.txt"));
  EXPECT_EQ(1U, index_.All().count("/v/s/e/y.txt"));
}

}  // namespace
}  // namespace quarry::fileindexd
