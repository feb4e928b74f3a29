#include "daemons/tarnotifyd/inotify_events.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <cstring>

#include "common/unique_fd.h"

namespace quarry::notify {
namespace {

class InotifyEventsTest : public ::testing::Test {
 protected:
  InotifyEventsTest() {
    int ends[2];
    if (pipe2(ends, O_NONBLOCK | O_CLOEXEC) == 0) {
      read_.Reset(ends[0]);
      write_.Reset(ends[1]);
    }
  }

  // What the kernel would give.
  void Put(std::uint32_t mask, std::uint32_t cookie, const std::string& name) {
    inotify_event head{1, mask, cookie, static_cast<std::uint32_t>(name.size() + 3)};
    std::string bytes(reinterpret_cast<const char*>(&head), sizeof(head));
    bytes += name + std::string(3, '\0');
    ASSERT_EQ(write(write_.get(), bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
  }
  void Fill() { events_.Fill(read_.get(), now_); }
  std::string Next() {
    const auto event = events_.Next(now_);
    return event ? event->name : "nothing";
  }

  UniqueFd read_;
  UniqueFd write_;
  InotifyEvents events_;
  Clock::time_point now_ = Clock::now();
};

TEST_F(InotifyEventsTest, KeepsTheOrder) {
  Put(IN_CREATE, 0, "a");
  Put(IN_DELETE, 0, "b");
  Fill();
  EXPECT_EQ(events_.NextDue(), now_);
  EXPECT_EQ(Next(), "a");
  EXPECT_EQ(Next(), "b");
  EXPECT_EQ(Next(), "nothing");
  EXPECT_EQ(events_.NextDue(), std::nullopt);
}

TEST_F(InotifyEventsTest, FindsTheOtherHalfBehindOtherEvents) {
  Put(IN_MOVED_FROM, 5, "old");
  Put(IN_CREATE, 0, "between");
  Put(IN_MOVED_TO, 6, "another");
  Put(IN_MOVED_TO, 5, "new");
  Fill();
  EXPECT_EQ(Next(), "old");
  const auto arrival = events_.TakeArrival(5);
  ASSERT_TRUE(arrival);
  EXPECT_EQ(arrival->name, "new");
  EXPECT_FALSE(events_.TakeArrival(5));
  EXPECT_EQ(Next(), "between");
  EXPECT_EQ(Next(), "another");
  EXPECT_EQ(Next(), "nothing");
}

TEST_F(InotifyEventsTest, WaitsForTheOtherHalf) {
  Put(IN_MOVED_FROM, 5, "old");
  Fill();
  EXPECT_EQ(Next(), "nothing");
  EXPECT_EQ(events_.NextDue(), now_ + InotifyEvents::kPatience);
  Put(IN_MOVED_TO, 5, "new");
  Fill();
  EXPECT_EQ(Next(), "old");
  EXPECT_TRUE(events_.TakeArrival(5));
  EXPECT_EQ(events_.NextDue(), std::nullopt);
}

TEST_F(InotifyEventsTest, DoesNotWaitForEver) {
  Put(IN_MOVED_FROM, 5, "old");
  Put(IN_CREATE, 0, "next");
  Fill();
  EXPECT_EQ(Next(), "nothing");
  now_ += InotifyEvents::kPatience;
  EXPECT_EQ(Next(), "old");
  EXPECT_FALSE(events_.TakeArrival(5));
  EXPECT_EQ(Next(), "next");
}

TEST_F(InotifyEventsTest, ForgetsEverything) {
  Put(IN_MOVED_TO, 5, "new");
  Fill();
  events_.Clear();
  EXPECT_EQ(Next(), "nothing");
  EXPECT_FALSE(events_.TakeArrival(5));
}

}  // namespace
}  // namespace quarry::notify
