#include "daemons/tarnelasticd/side_work.h"

#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <future>
#include <memory>
#include <new>
#include <stdexcept>
#include <thread>
#include <vector>

namespace quarry::engine {
namespace {

TEST(SideWorkTest, IsDoneOnceAndInOrder) {
  SideWork work;
  std::vector<int> done;
  const auto first = work.Add(1, [&done] { done.push_back(1); });
  work.Add(1, [&done] { done.push_back(2); });
  EXPECT_FALSE(work.IsDone(*first));
  work.RunAll();
  EXPECT_TRUE(work.IsDone(*first));
  work.RunAll();
  work.Finish(first);
  EXPECT_EQ(done, (std::vector<int>{1, 2}));
}

TEST(SideWorkTest, WhoHelpsIsDoneSomeTime) {
  SideWork work;
  int done = 0;
  const std::function<void()> endless = [&] {
    ++done;
    work.Add(1, endless);
  };
  work.Add(1, endless);
  work.RunAll();
  EXPECT_EQ(done, 1);
  work.RunAll();
  EXPECT_EQ(done, 2);
}

TEST(SideWorkTest, WhoNeedsItDoesWhatNobodyHasBegun) {
  SideWork work;
  int others = 0;
  int done = 0;
  work.Add(1, [&others] { ++others; });
  const auto task = work.Add(1, [&done] { ++done; });
  work.Finish(task);
  EXPECT_EQ(done, 1);
  EXPECT_EQ(others, 0);
  work.RunAll();
  EXPECT_EQ(done, 1);
  EXPECT_EQ(others, 1);
}

TEST(SideWorkTest, WhoNeedsItWaitsForWhoHasBegun) {
  SideWork work;
  std::promise<void> begun;
  std::promise<void> may_end;
  int done = 0;
  const auto task = work.Add(1, [&] {
    begun.set_value();
    may_end.get_future().wait();
    ++done;
  });
  std::thread helper([&work] { work.RunAll(); });
  begun.get_future().wait();
  EXPECT_FALSE(work.IsDone(*task));
  std::thread opener([&may_end] { may_end.set_value(); });
  work.Finish(task);
  EXPECT_EQ(done, 1);
  opener.join();
  helper.join();
}

TEST(SideWorkTest, FailuresComeToWhoNeedsIt) {
  SideWork work;
  const auto thrown = work.Add(1, [] { throw std::runtime_error("failed"); });
  const auto memory = work.Add(1, [] { throw std::bad_alloc(); });
  const auto own = work.Add(1, [] { throw std::bad_alloc(); });
  int done = 0;
  work.Finish(work.Add(1, [&done] { ++done; }));
  EXPECT_THROW(work.Finish(own), std::bad_alloc);
  work.RunAll();
  EXPECT_TRUE(work.IsDone(*thrown));
  EXPECT_THROW(work.Finish(thrown), std::runtime_error);
  EXPECT_THROW(work.Finish(memory), std::bad_alloc);
  EXPECT_EQ(done, 1);
}

TEST(SideWorkTest, WhatIsDroppedIsNotBegun) {
  SideWork work;
  int done = 0;
  const auto task = work.Add(1, [&done] { ++done; });
  const auto before = work.Add(1, [&done] { ++done; });
  work.Finish(before);
  work.Drop(task);
  work.Drop(before);
  work.RunAll();
  EXPECT_EQ(done, 1);
}

TEST(SideWorkTest, WhatIsLargeIsDoneWithoutAnybody) {
  SideWork work;
  for (int round = 0; round < 20; ++round) {
    std::promise<std::thread::id> doer;
    const auto task =
        work.Add(SideWork::kLarge, [&doer] { doer.set_value(std::this_thread::get_id()); });
    EXPECT_NE(doer.get_future().get(), std::this_thread::get_id());
    work.Finish(task);
  }
}

TEST(SideWorkTest, WhoNeedsWhatIsLargeDoesItWhereTheThreadIsBusy) {
  SideWork work;
  std::promise<void> begun;
  std::promise<void> may_end;
  const auto busy = work.Add(SideWork::kLarge, [&] {
    begun.set_value();
    may_end.get_future().wait();
  });
  begun.get_future().wait();
  std::thread::id doer;
  const auto task = work.Add(SideWork::kLarge, [&doer] { doer = std::this_thread::get_id(); });
  work.RunAll();
  EXPECT_FALSE(work.IsDone(*task));
  work.Finish(task);
  EXPECT_EQ(doer, std::this_thread::get_id());
  may_end.set_value();
  work.Finish(busy);
}

TEST(SideWorkTest, EndsWhenWhatHasBegunIsDone) {
  std::promise<void> begun;
  std::promise<void> may_end;
  std::atomic<int> done{0};
  std::thread opener;
  {
    SideWork work;
    work.Add(SideWork::kLarge, [&] {
      begun.set_value();
      may_end.get_future().wait();
      ++done;
    });
    begun.get_future().wait();
    work.Add(1, [&done] { done += 100; });
    opener = std::thread([&may_end] { may_end.set_value(); });
  }
  EXPECT_EQ(done, 1);
  opener.join();
}

TEST(SideWorkTest, FailuresOfWhatIsLargeComeToWhoNeedsIt) {
  SideWork work;
  const auto task = work.Add(SideWork::kLarge, [] { throw std::bad_alloc(); });
  EXPECT_THROW(work.Finish(task), std::bad_alloc);
}

TEST(SideWorkTest, OwnsNothingOfWhatIsDone) {
  SideWork work;
  const auto owned = std::make_shared<int>(0);
  const auto done = work.Add(1, [owned] { ++*owned; });
  work.Finish(done);
  EXPECT_EQ(owned.use_count(), 1);
  const auto failed = work.Add(1, [owned] { throw std::bad_alloc(); });
  EXPECT_THROW(work.Finish(failed), std::bad_alloc);
  EXPECT_EQ(owned.use_count(), 1);
  for (int round = 0; round < 100; ++round) {
    std::promise<void> begun;
    const auto task = work.Add(SideWork::kLarge, [owned, &begun] {
      ++*owned;
      begun.set_value();
    });
    begun.get_future().wait();
    work.Finish(task);
    EXPECT_EQ(owned.use_count(), 1);
  }
  EXPECT_EQ(*owned, 101);
}

TEST(SideWorkTest, ManyShareIt) {
  SideWork work;
  std::atomic<int> done{0};
  std::atomic<bool> is_over{false};
  std::vector<std::thread> helpers;
  for (int i = 0; i < 3; ++i) {
    helpers.emplace_back([&] {
      while (!is_over) work.RunAll();
    });
  }
  std::vector<std::shared_ptr<SideWork::Task>> tasks;
  for (int i = 0; i < 1000; ++i)
    tasks.push_back(work.Add(i % 9 == 0 ? SideWork::kLarge : 1, [&done] { ++done; }));
  for (const auto& task : tasks) work.Finish(task);
  EXPECT_EQ(done, 1000);
  is_over = true;
  for (std::thread& helper : helpers) helper.join();
}

}  // namespace
}  // namespace quarry::engine
