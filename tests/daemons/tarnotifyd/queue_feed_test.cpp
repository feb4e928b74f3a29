#include "daemons/tarnotifyd/queue_feed.h"

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>

#include "common/lock_file.h"
#include "daemons/tarnotifyd/queue_file.h"
#include "fileindex/queue/event.h"
#include "fileindex/queue/queue_mgr.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::notify {
namespace {

using namespace fileindex;
using std::chrono::milliseconds;

const std::string kOverflow = R"({"event":512,"is_dir":true,"path":"/v/s","path_old":""})"
                              "\n";

std::string CreateLine(const std::string& path) {
  return R"({"event":64,"is_dir":false,"path":")" + path + R"(","path_old":""})" + "\n";
}

// Lets files of this process grow to so many bytes only.
class FileSizeLimit {
 public:
  explicit FileSizeLimit(rlim_t bytes) {
    old_handler_ = std::signal(SIGXFSZ, SIG_IGN);
    getrlimit(RLIMIT_FSIZE, &old_);
    rlimit now = old_;
    now.rlim_cur = bytes;
    setrlimit(RLIMIT_FSIZE, &now);
  }
  ~FileSizeLimit() {
    setrlimit(RLIMIT_FSIZE, &old_);
    std::signal(SIGXFSZ, old_handler_);
  }
  FileSizeLimit(const FileSizeLimit&) = delete;
  FileSizeLimit& operator=(const FileSizeLimit&) = delete;

 private:
  rlimit old_{};
  sighandler_t old_handler_ = SIG_DFL;
};

class QueueFeedTest : public ::testing::Test {
 protected:
  void Create(const std::string& path) { feed_.Add({EVENT_CREATE, false, false, path, ""}, now_); }
  std::string QueueAfter(milliseconds time) {
    now_ += time;
    feed_.Step(now_);
    return std::filesystem::is_regular_file(queue_) ? test::ReadFile(queue_) : "none";
  }

  test::TempDir scratch_;
  const std::string queue_ = scratch_ / "queue";
  bool is_wanted_ = true;
  QueueFeed feed_{queue_, [this] { return is_wanted_; }};
  Clock::time_point now_ = Clock::now();
};

TEST_F(QueueFeedTest, WritesTogetherWhatComesTogether) {
  EXPECT_EQ(feed_.Due(), std::nullopt);
  Create("/v/s/a");
  EXPECT_EQ(feed_.Due(), now_ + QueueFeed::kGather);
  EXPECT_EQ(QueueAfter(milliseconds(10)), "none");
  Create("/v/s/b");
  EXPECT_EQ(QueueAfter(milliseconds(30)), CreateLine("/v/s/a") + CreateLine("/v/s/b"));
  EXPECT_EQ(test::FileMode(queue_), 0644U);
}

TEST_F(QueueFeedTest, LinesAreEventsWithEveryByteOfAPath) {
  const std::string path = "/v/\xff\xfe \"q\"\n\\";
  feed_.Add({EVENT_RENAME, true, false, path, "/v/\xc3"}, now_);
  std::string text = QueueAfter(QueueFeed::kGather);
  ASSERT_EQ(text.back(), '\n');
  text.pop_back();
  const Event event(text);
  EXPECT_EQ(event.op, EVENT_RENAME);
  EXPECT_TRUE(event.is_dir);
  EXPECT_EQ(event.path, path);
  EXPECT_EQ(event.path_old, "/v/\xc3");
}

TEST_F(QueueFeedTest, EndsATornLineFirst) {
  test::WriteFile(queue_, "{\"event\":2,");
  Create("/a");
  EXPECT_EQ(QueueAfter(QueueFeed::kGather), "{\"event\":2,\n" + CreateLine("/a"));
}

TEST_F(QueueFeedTest, NothingLandsInASnapshot) {
  Create("/a");
  QueueAfter(QueueFeed::kGather);
  QueueMgr(queue_).PrepareTmpQueue();
  Create("/b");
  EXPECT_EQ(QueueAfter(QueueFeed::kGather), CreateLine("/b"));
  EXPECT_EQ(test::ReadFile(queue_ + ".tmp"), CreateLine("/a"));
}

TEST_F(QueueFeedTest, AQueueThatWasGivenUpIsNotMadeAnew) {
  is_wanted_ = false;
  Create("/a");
  EXPECT_EQ(QueueAfter(QueueFeed::kGather), "none");
  EXPECT_EQ(feed_.Due(), now_ - QueueFeed::kGather + ChangeFold::kPause);
}

TEST_F(QueueFeedTest, WhatWaitsInAQueueIsNeverGivenUp) {
  Create("/a");
  QueueAfter(QueueFeed::kGather);
  is_wanted_ = false;
  Create("/b");
  EXPECT_EQ(QueueAfter(QueueFeed::kGather), CreateLine("/a") + CreateLine("/b"));
}

TEST_F(QueueFeedTest, WaitsForTheLockWithoutBlocking) {
  Create("/a");
  {
    const LockFile lock(queue_, true);
    EXPECT_EQ(QueueAfter(QueueFeed::kGather), "");
    EXPECT_GT(feed_.Due(), now_);
    Create("/b");
  }
  EXPECT_EQ(QueueAfter(milliseconds(100)), CreateLine("/a") + CreateLine("/b"));
  EXPECT_FALSE(feed_.Due() && *feed_.Due() < now_);
}

TEST_F(QueueFeedTest, TooMuchThatWaitsForTheLockIsAnOverflow) {
  {
    const LockFile lock(queue_, true);
    for (std::size_t i = 0; i <= QueueFeed::kMaxWaiting; ++i) {
      Create("/v/" + std::to_string(i));
      if (i % 5000 == 0) QueueAfter(milliseconds(100));
    }
  }
  const std::string text = QueueAfter(milliseconds(100));
  EXPECT_EQ(text.substr(0, 12), "{\"event\":512");
  EXPECT_EQ(text.find('\n'), text.size() - 1);
}

TEST_F(QueueFeedTest, DoubtTakesThePlaceOfWhatIsNotWritten) {
  Create("/v/s/a");
  feed_.Doubt("/v/s");
  Create("/v/s/b");
  EXPECT_EQ(QueueAfter(milliseconds(0)), kOverflow);
  EXPECT_EQ(feed_.Due(), std::nullopt);
}

TEST_F(QueueFeedTest, AQueueThatEndsInAnOverflowGetsNoMore) {
  feed_.Doubt("/v/s");
  EXPECT_EQ(QueueAfter(milliseconds(0)), kOverflow);
  feed_.Doubt("/v/s");
  Create("/v/s/a");
  EXPECT_EQ(QueueAfter(QueueFeed::kGather), kOverflow);
  Create("/v/s/b");
  EXPECT_EQ(QueueAfter(QueueFeed::kGather), kOverflow);
  QueueMgr(queue_).PrepareTmpQueue();
  Create("/v/s/c");
  EXPECT_EQ(QueueAfter(QueueFeed::kGather), CreateLine("/v/s/c"));
}

TEST_F(QueueFeedTest, AnOverflowThatIsFollowedOrTornIsNone) {
  const std::string line = R"({"event":65536,"path":"/v/s"})"
                           "\n";
  test::WriteFile(queue_, kOverflow + line);
  feed_.Doubt("/v/s");
  EXPECT_EQ(QueueAfter(milliseconds(0)), kOverflow + line + kOverflow);
  const std::string torn = kOverflow.substr(0, kOverflow.size() - 1);
  test::WriteFile(queue_, torn);
  feed_.Doubt("/v/s");
  EXPECT_EQ(QueueAfter(milliseconds(0)), torn + "\n" + kOverflow);
}

TEST_F(QueueFeedTest, GarbageAtTheEndIsNoOverflow) {
  for (const std::string& text :
       {std::string("garbage\n"), std::string("[512]\n"), std::string("{\"event\":512}\n"),
        std::string("\n"), std::string(100'000, 'x') + "\n", std::string("{\"event\":2}") + "\n"}) {
    test::WriteFile(queue_, text);
    feed_.Doubt("/v/s");
    EXPECT_EQ(QueueAfter(milliseconds(0)), text + kOverflow);
  }
}

TEST_F(QueueFeedTest, AShortWriteIsCutBackAndBecomesAnOverflow) {
  test::WriteFile(queue_, CreateLine("/old"));
  Create("/v/s");
  {
    const FileSizeLimit limit(CreateLine("/old").size() + 20);
    EXPECT_EQ(QueueAfter(QueueFeed::kGather), CreateLine("/old"));
    Create("/v/s/lost");
    EXPECT_EQ(QueueAfter(std::chrono::seconds(1)), CreateLine("/old"));
  }
  ASSERT_TRUE(feed_.Due());
  EXPECT_GT(*feed_.Due(), now_);
  EXPECT_EQ(QueueAfter(std::chrono::seconds(30)), CreateLine("/old") + kOverflow);
  Create("/v/s/more");
  EXPECT_EQ(QueueAfter(QueueFeed::kGather), CreateLine("/old") + kOverflow);
}

TEST_F(QueueFeedTest, AQueueThatCannotBeOpenedIsTriedAgain) {
  std::filesystem::create_directory(queue_);
  Create("/v/s");
  EXPECT_EQ(QueueAfter(QueueFeed::kGather), "none");
  EXPECT_EQ(QueueAfter(std::chrono::seconds(30)), "none");
  std::filesystem::remove(queue_);
  EXPECT_EQ(QueueAfter(std::chrono::seconds(30)), kOverflow);
}

TEST_F(QueueFeedTest, AFullDiskIsTriedAgain) {
  std::filesystem::create_symlink("/dev/full", queue_);
  Create("/v/s");
  EXPECT_EQ(QueueAfter(QueueFeed::kGather), "none");
  std::filesystem::remove(queue_);
  EXPECT_EQ(QueueAfter(std::chrono::seconds(30)), kOverflow);
}

TEST_F(QueueFeedTest, TheEndWritesWhatIsHeldBack) {
  const auto modify = [&] { feed_.Add({EVENT_MODIFY, false, true, "/a", ""}, now_); };
  modify();
  const std::string once = QueueAfter(QueueFeed::kGather);
  modify();
  EXPECT_EQ(QueueAfter(milliseconds(100)), once);
  feed_.Finish(now_);
  EXPECT_EQ(test::ReadFile(queue_), once + once);
}

}  // namespace
}  // namespace quarry::notify
