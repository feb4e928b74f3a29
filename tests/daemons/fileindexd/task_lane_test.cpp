#include "daemons/fileindexd/task_lane.h"

#include <gtest/gtest.h>

#include <atomic>
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

}  // namespace
}  // namespace quarry::fileindexd
