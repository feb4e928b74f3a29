#include "daemons/fileindexd/task_lane.h"

#include <gtest/gtest.h>

#include <atomic>
#include <deque>
#include <future>
#include <map>
#include <random>

#include "common/error.h"
#include "tests/support/files.h"

namespace quarry::fileindexd {
namespace {

using test::WaitUntil;

TEST(PathsMeetTest, OnlyPlacesAtAboveAndBelowMeet) {
  EXPECT_TRUE(PathsMeet("/a/b", "/a/b"));
  EXPECT_TRUE(PathsMeet("/a", "/a/b"));
  EXPECT_TRUE(PathsMeet("/a/b/c", "/a"));
  EXPECT_FALSE(PathsMeet("/a/b", "/a/bc"));
  EXPECT_FALSE(PathsMeet("/a/bc", "/a/b"));
  EXPECT_FALSE(PathsMeet("/a/b", "/a/c"));
  EXPECT_TRUE(PathsMeet("", "/a"));
}

// A task that waits until the test lets it go.
class Held {
 public:
  std::function<void()> Task() {
    return [this] {
      begun_ = true;
      gate_.wait();
    };
  }
  bool WaitBegun() {
    return WaitUntil([this] { return begun_.load(); });
  }
  bool begun() const { return begun_; }
  void Go() { go_.set_value(); }

 private:
  std::atomic<bool> begun_{false};
  std::promise<void> go_;
  std::shared_future<void> gate_ = go_.get_future().share();
};

class TaskLaneTest : public ::testing::Test {
 protected:
  Slots slots_{8};
};

TEST_F(TaskLaneTest, TasksOnDifferentPlacesRunSideBySide) {
  TaskLane lane(2, slots_);
  Held a;
  Held b;
  lane.Submit("/a", a.Task());
  lane.Submit("/b", b.Task());
  EXPECT_TRUE(a.WaitBegun());
  EXPECT_TRUE(b.WaitBegun());
  a.Go();
  b.Go();
  lane.Drain();
}

TEST_F(TaskLaneTest, TasksThatMeetDoNotOvertakeEachOther) {
  TaskLane lane(4, slots_);
  Held first;
  std::atomic<bool> second{false};
  lane.Submit("/a/b", first.Task());
  std::thread submitter([&] { lane.Submit("/a", [&] { second = true; }); });
  EXPECT_TRUE(first.WaitBegun());
  EXPECT_FALSE(second);
  first.Go();
  submitter.join();
  lane.Drain();
  EXPECT_TRUE(second);
}

TEST_F(TaskLaneTest, SettleWaitsOnlyForWhatMeets) {
  TaskLane lane(2, slots_);
  Held other;
  std::atomic<bool> done{false};
  lane.Submit("/other", other.Task());
  lane.Submit("/a/b", [&] { done = true; });
  lane.Settle("/a");
  EXPECT_TRUE(done);
  EXPECT_TRUE(other.WaitBegun());
  other.Go();
  lane.Drain();
}

TEST_F(TaskLaneTest, TakesOnlySoManyTasksAhead) {
  TaskLane lane(2, slots_);
  Held held[5];
  std::atomic<int> submitted{0};
  std::thread submitter([&] {
    for (int i = 0; i < 5; ++i) {
      lane.Submit("/" + std::to_string(i), held[i].Task());
      ++submitted;
    }
  });
  EXPECT_TRUE(WaitUntil([&] { return submitted == 4; }));
  EXPECT_TRUE(held[0].WaitBegun());
  EXPECT_TRUE(held[1].WaitBegun());
  EXPECT_EQ(4, submitted);
  EXPECT_FALSE(held[2].begun());
  for (Held& task : held) task.Go();
  submitter.join();
  lane.Drain();
}

TEST_F(TaskLaneTest, AFailureEndsTheLane) {
  TaskLane lane(1, slots_);
  Held first;
  std::atomic<bool> dropped{true};
  lane.Submit("/a", [&] {
    first.Task()();
    throw Error(913, "broken");
  });
  lane.Submit("/b", [&] { dropped = false; });
  EXPECT_TRUE(first.WaitBegun());
  first.Go();
  EXPECT_THROW(lane.Drain(), Error);
  EXPECT_THROW(lane.Settle("/c"), Error);
  EXPECT_THROW(lane.Submit("/c", [] {}), Error);
  lane.End();
  EXPECT_TRUE(dropped);
}

TEST_F(TaskLaneTest, EndWaitsForWhatHasBegun) {
  TaskLane lane(1, slots_);
  Held held;
  bool finished = false;
  lane.Submit("/a", [&] {
    held.Task()();
    finished = true;
  });
  EXPECT_TRUE(held.WaitBegun());
  std::thread ender([&] { lane.End(); });
  held.Go();
  ender.join();
  EXPECT_TRUE(finished);
}

TEST_F(TaskLaneTest, SlotsBoundSeveralLanesTogether) {
  Slots one(1, std::chrono::hours(1));
  TaskLane a(2, one);
  TaskLane b(2, one);
  std::atomic<int> running{0};
  std::atomic<int> most{0};
  const auto task = [&] {
    const int now = ++running;
    for (int seen = most; now > seen && !most.compare_exchange_weak(seen, now);) {
    }
    --running;
  };
  for (int i = 0; i < 200; ++i) {
    a.Submit("/" + std::to_string(i), task);
    b.Submit("/" + std::to_string(i), task);
  }
  a.Drain();
  b.Drain();
  EXPECT_EQ(1, most);
}

TEST(SlotsTest, NobodyWaitsForeverForASlot) {
  Slots slots(1, std::chrono::milliseconds(1));
  const auto first = slots.Acquire();
  const auto second = slots.Acquire();
  slots.Release(first);
  slots.Release(second);
  slots.Release(slots.Acquire());
}

TEST(SlotsTest, ASlotThatIsReleasedIsFreeAtOnce) {
  Slots slots(2, std::chrono::hours(1));
  const auto held = slots.Acquire();
  auto second = slots.Acquire();
  std::atomic<bool> got{false};
  std::thread waiter([&] {
    const SlotHolder slot(slots);
    got = true;
  });
  EXPECT_FALSE(got);
  slots.Release(second);
  waiter.join();
  EXPECT_TRUE(got);
  slots.Release(held);
}

// Tasks of one share that all wait for the engine cost the others one wait, not one for each task.
TEST(SlotsTest, WhoHoldsASlotForLongCountsNoLonger) {
  constexpr auto kPatience = std::chrono::milliseconds(200);
  Slots slots(1, kPatience);
  const auto stuck = slots.Acquire();
  const auto begin = Slots::Clock::now();
  for (int i = 0; i < 100; ++i) slots.Release(slots.Acquire());
  EXPECT_LT(Slots::Clock::now() - begin, 50 * kPatience);
  slots.Release(stuck);
}

// Random tasks: those that meet are done in order of submission, whatever the threads do.
TEST_F(TaskLaneTest, KeepsTheOrderOfRandomTasks) {
  std::mt19937 random(1);
  TaskLane lane(4, slots_);
  std::mutex mutex;
  std::map<std::string, int> last_at;  // the last task done at each place
  bool in_order = true;
  const auto submit = [&](int number, const std::string& path) {
    lane.Submit(path, [&, number, path] {
      const std::lock_guard<std::mutex> lock(mutex);
      for (const auto& [place, last] : last_at) {
        if (PathsMeet(place, path) && last > number) in_order = false;
      }
      last_at[path] = number;
    });
  };
  for (int i = 0; i < 3000; ++i) {
    std::string path;
    for (std::size_t depth = random() % 3 + 1; depth > 0; --depth) {
      path += "/" + std::to_string(random() % 3);
    }
    submit(i, path);
    if (random() % 50 == 0) lane.Settle(path);
  }
  lane.Drain();
  EXPECT_TRUE(in_order);
}

using Paths = std::vector<std::string>;
using Wishes = std::vector<Wish>;

Paths PathsOf(const Wishes& wishes) {
  Paths paths;
  for (const Wish& wish : wishes) paths.push_back(wish.path);
  return paths;
}

// Small tasks that are recorded as they are done, together or alone.
class SmallTasksTest : public TaskLaneTest {
 protected:
  // Records places done together, of which those that end in "!" cannot be, after the first of all
  // has waited to be let go.
  const TaskLane::Joint joint_ = [this](const Wishes& wishes) {
    const Paths paths = PathsOf(wishes);
    if (!first_done_.exchange(true)) first_.Task()();
    std::vector<bool> done;
    const std::lock_guard<std::mutex> lock(mutex_);
    together_.push_back(paths);
    for (const std::string& path : paths) done.push_back(path.back() != '!');
    return done;
  };
  std::function<void()> Alone(const std::string& path) {
    return [this, path] {
      const std::lock_guard<std::mutex> lock(mutex_);
      alone_.push_back(path);
    };
  }
  void Submit(TaskLane& lane, const std::string& path) {
    lane.SubmitSmall({path}, Alone(path), joint_);
  }

  Held first_;
  std::atomic<bool> first_done_{false};
  std::mutex mutex_;
  std::vector<std::vector<std::string>> together_;
  std::vector<std::string> alone_;
};

TEST_F(SmallTasksTest, WhatWaitsIsDoneTogetherAndNothingWaitsForOthers) {
  TaskLane lane(1, slots_, nullptr, 3);
  Submit(lane, "/1");
  ASSERT_TRUE(first_.WaitBegun());
  for (const char* path : {"/2", "/3", "/4", "/5"}) Submit(lane, path);
  first_.Go();
  lane.Drain();
  EXPECT_EQ(together_, (std::vector<Paths>{{"/1"}, {"/2", "/3", "/4"}, {"/5"}}));
  EXPECT_TRUE(alone_.empty());
}

TEST_F(SmallTasksTest, OnlyTasksOfOneKindAreDoneTogether) {
  TaskLane lane(1, slots_, nullptr, 10);
  const TaskLane::Joint other = joint_;
  Submit(lane, "/1");
  ASSERT_TRUE(first_.WaitBegun());
  Submit(lane, "/2");
  lane.SubmitSmall({"/3"}, Alone("/3"), other);
  Submit(lane, "/4");
  lane.Submit("/5", Alone("/5"));
  Submit(lane, "/6");
  first_.Go();
  lane.Drain();
  EXPECT_EQ(together_, (std::vector<Paths>{{"/1"}, {"/2", "/4", "/6"}, {"/3"}}));
  EXPECT_EQ(alone_, Paths{"/5"});
}

TEST_F(SmallTasksTest, MayLieAboveAndBelowEachOtherButNotOnTheSamePlace) {
  TaskLane lane(2, slots_, nullptr, 10);
  Submit(lane, "/a");
  ASSERT_TRUE(first_.WaitBegun());
  Submit(lane, "/a/b");
  lane.SettleBelow("/a");
  EXPECT_EQ(together_, std::vector<Paths>{{"/a/b"}});
  std::atomic<bool> submitted{false};
  std::thread submitter([&] {
    Submit(lane, "/a");
    submitted = true;
  });
  EXPECT_FALSE(submitted);
  first_.Go();
  submitter.join();
  lane.Drain();
  EXPECT_EQ(together_, (std::vector<Paths>{{"/a/b"}, {"/a"}, {"/a"}}));
}

TEST_F(SmallTasksTest, WhatCannotBeDoneTogetherIsDoneAloneAfterwards) {
  TaskLane lane(1, slots_, nullptr, 10);
  Submit(lane, "/1");
  ASSERT_TRUE(first_.WaitBegun());
  for (const char* path : {"/a!", "/b", "/a!/c", "/d!"}) Submit(lane, path);
  first_.Go();
  lane.Drain();
  EXPECT_EQ(together_, (std::vector<Paths>{{"/1"}, {"/a!", "/b", "/a!/c", "/d!"}}));
  EXPECT_EQ(alone_, (Paths{"/a!", "/d!"}));
}

TEST_F(SmallTasksTest, WhatIsDoneAloneWaitsForWhatItMeets) {
  TaskLane lane(2, slots_, nullptr, 1000);
  Held below;
  std::atomic<bool> above{false};
  const TaskLane::Joint slow = [&](const Wishes& wishes) {
    below.Task()();
    return std::vector<bool>(wishes.size(), true);
  };
  const TaskLane::Joint never = [](const Wishes& wishes) {
    return std::vector<bool>(wishes.size(), false);
  };
  lane.SubmitSmall(
      {"/a/b"}, [] {}, slow);
  ASSERT_TRUE(below.WaitBegun());
  lane.SubmitSmall(
      {"/a"}, [&] { above = true; }, never);
  lane.SubmitSmall(
      {"/c"}, [] {}, never);
  lane.Settle("/c");
  EXPECT_FALSE(above);
  below.Go();
  lane.Drain();
  EXPECT_TRUE(above);
}

TEST_F(SmallTasksTest, TakesSoManyMoreOfThemAhead) {
  TaskLane lane(1, slots_, nullptr, 3);
  std::atomic<int> submitted{0};
  std::thread submitter([&] {
    for (int i = 0; i < 9; ++i) {
      Submit(lane, "/" + std::to_string(i));
      ++submitted;
    }
  });
  EXPECT_TRUE(first_.WaitBegun());
  EXPECT_TRUE(WaitUntil([&] { return submitted == 6; }));
  EXPECT_EQ(6, submitted);
  first_.Go();
  submitter.join();
  lane.Drain();
}

TEST_F(SmallTasksTest, WithNoOthersEachIsDoneAlone) {
  TaskLane lane(2, slots_, nullptr, 1);
  for (int i = 0; i < 20; ++i) Submit(lane, "/" + std::to_string(i));
  lane.Drain();
  EXPECT_TRUE(together_.empty());
  EXPECT_EQ(alone_.size(), 20U);
}

TEST_F(TaskLaneTest, BeginsNothingWhileTheGateIsClosed) {
  Gate gate;
  gate.SetPaused(true);
  TaskLane lane(2, slots_, &gate);
  std::atomic<int> done{0};
  lane.Submit("/a", [&] { ++done; });
  lane.Submit("/b", [&] { ++done; });
  EXPECT_EQ(0, done);
  gate.SetPaused(false);
  lane.Drain();
  EXPECT_EQ(2, done);
  gate.Stop();
  lane.Submit("/c", [&] { ++done; });
  EXPECT_THROW(lane.Drain(), Interrupted);
  EXPECT_EQ(2, done);
}

TEST_F(SmallTasksTest, AFailureOfSeveralEndsTheLane) {
  TaskLane lane(1, slots_);
  const TaskLane::Joint broken = [](const Wishes&) -> std::vector<bool> {
    throw Error(913, "broken");
  };
  lane.SubmitSmall(
      {"/a"}, [] {}, broken);
  EXPECT_THROW(lane.Drain(), Error);
}

// As KeepsTheOrderOfRandomTasks, with small tasks among them that cannot be done together now and
// then.
TEST_F(SmallTasksTest, KeepsTheOrderOfRandomTasks) {
  std::mt19937 random(7);
  std::mt19937 luck(8);
  std::mutex mutex;
  std::map<std::string, std::deque<int>> submitted;     // small ones
  std::map<std::pair<std::string, bool>, int> last_at;  // by place and whether it was a small one
  bool in_order = true;
  int count = 0;
  const auto record = [&](int number, const std::string& path, bool small) {
    ++count;
    for (const auto& [place, last] : last_at) {
      const bool meet = small && place.second ? place.first == path : PathsMeet(place.first, path);
      if (meet && last > number) in_order = false;
    }
    last_at[{path, small}] = number;
  };
  const TaskLane::Joint joint = [&](const Wishes& wishes) {
    const std::lock_guard<std::mutex> lock(mutex);
    std::vector<bool> done;
    for (const std::string& path : PathsOf(wishes)) {
      done.push_back(luck() % 4 != 0);
      if (done.back()) record(submitted[path].front(), path, true);
      submitted[path].pop_front();
    }
    return done;
  };
  TaskLane lane(4, slots_, nullptr, 5);
  for (int i = 0; i < 3000; ++i) {
    std::string path;
    for (std::size_t depth = random() % 3 + 1; depth > 0; --depth) {
      path += "/" + std::to_string(random() % 4);
    }
    const bool small = random() % 3 != 0;
    const auto task = [&, i, path, small] {
      const std::lock_guard<std::mutex> lock(mutex);
      record(i, path, small);
    };
    if (small) {
      {
        const std::lock_guard<std::mutex> lock(mutex);
        submitted[path].push_back(i);
      }
      lane.SubmitSmall({path}, task, joint);
    } else {
      lane.Submit(path, task);
    }
    if (random() % 50 == 0) lane.SettleBelow(path);
  }
  lane.Drain();
  EXPECT_TRUE(in_order);
  EXPECT_EQ(3000, count);
}

}  // namespace
}  // namespace quarry::fileindexd
