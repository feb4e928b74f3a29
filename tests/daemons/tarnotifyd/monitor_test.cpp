#include "daemons/tarnotifyd/monitor.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <functional>
#include <stdexcept>

#include "common/json.h"
#include "fileindex/queue/event.h"
#include "platform/include/monitor.h"
#include "tests/daemons/tarnotifyd/support/fake_source.h"
#include "tests/support/files.h"
#include "tests/support/root.h"

namespace quarry::notify {
namespace {

using namespace fileindex;
using TARN::TARNOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION;
using TARN::TARNOTIFYD::MonitorQueue;
using test::FakeSource;
using ::testing::ElementsAre;
using Names = std::vector<std::string>;

class MonitorTest : public ::testing::Test {
 protected:
  MonitorTest() { test::ResetTestRoot(); }

  static Json::Value Place(const std::string& path, unsigned mask = 0xFFC6) {
    Json::Value place;
    place["path"] = path;
    place["mask"] = mask;
    place["ignore"].append("@eaDir");
    return place;
  }
  static void Register(const std::string& queue, const std::vector<Json::Value>& places,
                       const std::string& application = "fileindex") {
    Json::Value config;
    config["queue"] = QueuePath(queue);
    config["config"] = Json::Value(Json::arrayValue);
    for (const Json::Value& place : places) config["config"].append(place);
    ASSERT_TRUE(
        MonitorQueue::Upsert(MonitorQueue(config), application, MONITOR_QUEUE_TYPE_APPLICATION));
  }
  static std::string QueuePath(const std::string& queue) {
    return test::TestRoot() + "/var/lib/quarry/queue/" + queue;
  }

  void Step() {
    now_ += std::chrono::seconds(1);
    monitor_.Step(0);
    now_ += QueueFeed::kGather;
    monitor_.Step(0);
  }
  void Tell(const std::function<void(ChangeSink&)>& tell) {
    source_->Tell(tell);
    Step();
  }
  void TellChange(std::uint32_t kind, bool is_dir, const std::string& path,
                  const std::string& path_old = "") {
    Tell([&](ChangeSink& sink) { sink.OnChange({kind, is_dir, false, path, path_old}); });
  }

  // The events in the queue, which is emptied.
  static Names Take(const std::string& queue) {
    Names events;
    std::string text;
    try {
      text = test::ReadFile(QueuePath(queue));
    } catch (const std::runtime_error&) {
      return events;
    }
    for (std::size_t at = 0; at < text.size();) {
      const std::size_t end = text.find('\n', at);
      const Event event(text.substr(at, end - at));
      events.push_back(std::to_string(event.op) + (event.is_dir ? " dir " : " ") + event.path +
                       (event.path_old.empty() ? "" : " from " + event.path_old));
      at = end + 1;
    }
    test::WriteFile(QueuePath(queue), "");
    return events;
  }
  // Registered, and past its first overflow.
  void Follow(const std::string& queue, const std::vector<Json::Value>& places) {
    Register(queue, places);
    Step();
    Take(queue);
  }

  FakeSource* source_ = new FakeSource;
  Clock::time_point now_ = Clock::now();
  Monitor monitor_{std::unique_ptr<ChangeSource>(source_), [this] { return now_; }};
};

TEST_F(MonitorTest, ANewRegistrationIsWatchedAndDoubtful) {
  Step();
  Register("a", {Place("/v/a/x"), Place("/v/a/y")});
  Step();
  EXPECT_THAT(source_->directories_, ElementsAre("/v/a/x", "/v/a/y"));
  EXPECT_THAT(source_->ignore_, ElementsAre("@eaDir"));
  EXPECT_THAT(Take("a"), ElementsAre("512 dir /v/a/x"));
  Register("b", {Place("/v/b")});
  Step();
  EXPECT_THAT(Take("a"), ElementsAre());
  EXPECT_THAT(Take("b"), ElementsAre("512 dir /v/b"));
}

TEST_F(MonitorTest, ARegistrationIsNoticedWithoutATurnOfTheClock) {
  Register("a", {Place("/v/a")});
  Step();
  Register("b", {Place("/v/b")});
  monitor_.Step(0);
  EXPECT_EQ(source_->directories_.size(), 2U);
}

TEST_F(MonitorTest, WhatIsWithdrawnIsNotWatched) {
  Follow("a", {Place("/v/a")});
  ASSERT_TRUE(MonitorQueue::Delete(QueuePath("a"), "fileindex", MONITOR_QUEUE_TYPE_APPLICATION));
  Step();
  EXPECT_THAT(source_->directories_, ElementsAre());
  TellChange(EVENT_CREATE, false, "/v/a/f");
  EXPECT_THAT(Take("a"), ElementsAre());
}

// As when the share has got another name, and its queue with it.
TEST_F(MonitorTest, WhatIsWithdrawnBeforeItsLinesAreWrittenLeavesNoQueue) {
  Follow("a", {Place("/v/a")});
  std::filesystem::remove(QueuePath("a"));
  source_->Tell([&](ChangeSink& sink) {
    sink.OnChange({EVENT_CREATE, false, false, "/v/a/b", ""});
    ASSERT_TRUE(MonitorQueue::Delete(QueuePath("a"), "fileindex", MONITOR_QUEUE_TYPE_APPLICATION));
  });
  monitor_.Step(0);
  monitor_.Finish();
  EXPECT_FALSE(std::filesystem::exists(QueuePath("a")));
}

TEST_F(MonitorTest, ADamagedRegistrationIsPassedOver) {
  Follow("a", {Place("/v/a")});
  const std::string directory = test::TestRoot() + "/var/lib/quarry/monitor/";
  test::WriteFile(directory + "fileindex-x.json", "{\"queue\":");
  test::WriteFile(directory + "fileindex-y.json", R"({"application":"a","queue":"x","config":[]})");
  test::WriteFile(directory + "other.txt", "no registration");
  Register("b", {Place("/v/b")});
  Step();
  EXPECT_THAT(source_->directories_, ElementsAre("/v/a", "/v/b"));
  TellChange(EVENT_CREATE, false, "/v/a/f");
  EXPECT_THAT(Take("a"), ElementsAre("64 /v/a/f"));
}

TEST_F(MonitorTest, EachKindIsALineOfItsOwn) {
  Follow("a", {Place("/v/a")});
  Tell([](ChangeSink& sink) {
    sink.OnChange({EVENT_CREATE, true, false, "/v/a/d", ""});
    sink.OnChange({EVENT_MODIFY, false, false, "/v/a/m", ""});
    sink.OnChange({EVENT_ATTR, false, false, "/v/a/t", ""});
    sink.OnChange({EVENT_RENAME, true, false, "/v/a/e", "/v/a/d"});
    sink.OnChange({EVENT_DELETE, false, false, "/v/a/x", ""});
    sink.OnChange({EVENT_CREATE, false, false, "/v/elsewhere", ""});
  });
  EXPECT_THAT(Take("a"), ElementsAre("64 dir /v/a/d", "2 /v/a/m", "4 /v/a/t",
                                     "256 dir /v/a/e from /v/a/d", "128 /v/a/x"));
}

TEST_F(MonitorTest, MasksAndIgnoredNamesAreHonoured) {
  Follow("a", {Place("/v/a", EVENT_CREATE | EVENT_DELETE)});
  TellChange(EVENT_MODIFY, false, "/v/a/f");
  TellChange(EVENT_CREATE, false, "/v/a/x/@eaDir/f");
  EXPECT_THAT(Take("a"), ElementsAre());
  // Who does not want renames is told of both ends.
  TellChange(EVENT_RENAME, false, "/v/a/g", "/v/a/f");
  EXPECT_THAT(Take("a"), ElementsAre("128 /v/a/f", "64 /v/a/g"));
}

TEST_F(MonitorTest, OverlappingPlacesOfAQueueAreOneLine) {
  Follow("a", {Place("/v/a"), Place("/v/a/b")});
  Register("a", {Place("/v/a/b")}, "other");
  Follow("b", {Place("/v/a/b")});
  Take("a");
  TellChange(EVENT_CREATE, false, "/v/a/b/f");
  EXPECT_THAT(Take("a"), ElementsAre("64 /v/a/b/f"));
  EXPECT_THAT(Take("b"), ElementsAre("64 /v/a/b/f"));
}

TEST_F(MonitorTest, ARenameBetweenQueuesIsTwoHalves) {
  Follow("a", {Place("/v/a")});
  Follow("b", {Place("/v/b")});
  TellChange(EVENT_RENAME, true, "/v/b/d", "/v/a/d");
  EXPECT_THAT(Take("a"), ElementsAre("128 dir /v/a/d"));
  EXPECT_THAT(Take("b"), ElementsAre("64 dir /v/b/d"));
  TellChange(EVENT_RENAME, false, "/v/a/@eaDir/f", "/v/a/f");
  EXPECT_THAT(Take("a"), ElementsAre("128 /v/a/f"));
  TellChange(EVENT_RENAME, false, "/v/a/f", "/v/out/f");
  EXPECT_THAT(Take("a"), ElementsAre("64 /v/a/f"));
}

TEST_F(MonitorTest, DoubtConcernsThoseWhoWatchThere) {
  Follow("a", {Place("/v/a")});
  Follow("b", {Place("/v/b/deep")});
  Tell([](ChangeSink& sink) { sink.OnDoubt("/v/a/below"); });
  EXPECT_THAT(Take("a"), ElementsAre("512 dir /v/a"));
  EXPECT_THAT(Take("b"), ElementsAre());
  Tell([](ChangeSink& sink) { sink.OnDoubt("/v/b"); });
  EXPECT_THAT(Take("a"), ElementsAre());
  EXPECT_THAT(Take("b"), ElementsAre("512 dir /v/b/deep"));
  Tell([](ChangeSink& sink) { sink.OnDoubt("/"); });
  EXPECT_EQ(Take("a").size(), 1U);
  EXPECT_EQ(Take("b").size(), 1U);
}

TEST_F(MonitorTest, ADirectoryAboveAPlaceTakesItAlong) {
  Follow("b", {Place("/v/b/deep")});
  TellChange(EVENT_RENAME, true, "/v/c", "/v/b");
  EXPECT_THAT(Take("b"), ElementsAre("512 dir /v/b/deep"));
  TellChange(EVENT_CREATE, true, "/v/b");
  EXPECT_THAT(Take("b"), ElementsAre("512 dir /v/b/deep"));
}

TEST_F(MonitorTest, APlaceThatSomebodyElseHasWatchedIsDoubtfulForTheNewQueue) {
  Follow("a", {Place("/v/a")});
  Register("b", {Place("/v/a")});
  Step();
  EXPECT_THAT(Take("a"), ElementsAre());
  EXPECT_THAT(Take("b"), ElementsAre("512 dir /v/a"));
  // A wider mask, too: what it adds was not told before.
  Register("b", {Place("/v/a", 0xFFFF)});
  Step();
  EXPECT_THAT(Take("b"), ElementsAre("512 dir /v/a"));
}

TEST_F(MonitorTest, ASourceThatFailsPutsEverythingInDoubt) {
  Follow("a", {Place("/v/a")});
  Tell([](ChangeSink&) { throw std::runtime_error("out of luck"); });
  EXPECT_THAT(Take("a"), ElementsAre("512 dir /v/a"));
  TellChange(EVENT_CREATE, false, "/v/a/f");
  EXPECT_THAT(Take("a"), ElementsAre("64 /v/a/f"));
}

TEST_F(MonitorTest, TheSourceLooksAgainEverySecond) {
  Step();
  const int before = source_->refreshed_;
  monitor_.Step(0);
  EXPECT_EQ(source_->refreshed_, before);
  now_ += std::chrono::milliseconds(1000);
  monitor_.Step(0);
  EXPECT_EQ(source_->refreshed_, before + 1);
}

TEST_F(MonitorTest, ReadsAtOnceAndThenLetsChangesGather) {
  Step();
  now_ += std::chrono::milliseconds(100);
  int reads = 0;
  const auto count = [&](ChangeSink&) { ++reads; };
  source_->Tell(count);
  monitor_.Step(0);
  EXPECT_EQ(reads, 1);
  source_->Tell(count);
  now_ += Monitor::kBetweenReads - std::chrono::milliseconds(1);
  monitor_.Step(0);
  EXPECT_EQ(reads, 1);
  // Nothing wakes it up then but the time that has passed.
  now_ += std::chrono::milliseconds(1);
  monitor_.Step(-1);
  EXPECT_EQ(reads, 2);
}

TEST_F(MonitorTest, SaysHowItDoesEverySecond) {
  std::vector<std::string> reports;
  monitor_.ReportTo([&](const Json::Value& report) { reports.push_back(toString(report)); });
  Register("a", {Place("/v/a"), Place("/v/b")});
  source_->unwatched_["/v/b"] = "too many";
  Step();
  const auto report = [](const char* overflows, const std::string& problem) {
    return R"({"directories":2,"file_systems":0,"queues":[{"overflows":)" + std::string(overflows) +
           R"(,"places":2,"problem":")" + problem + R"(","queue":")" + QueuePath("a") +
           R"("}],"source":"fake","unwatched":[{"path":"/v/b","reason":"too many"}]})";
  };
  EXPECT_THAT(reports, ElementsAre(report("1", "")));
  std::filesystem::remove(QueuePath("a"));
  std::filesystem::create_directory(QueuePath("a"));
  TellChange(EVENT_CREATE, false, "/v/a/f");
  Step();
  EXPECT_EQ(reports.back(), report("1", "Is a directory"));
  std::filesystem::remove(QueuePath("a"));
  Step();
  Step();
  EXPECT_EQ(reports.back(), report("2", ""));
}

TEST_F(MonitorTest, TheEndWritesWhatIsLeft) {
  Follow("a", {Place("/v/a")});
  source_->Tell([](ChangeSink& sink) {
    sink.OnChange({EVENT_CREATE, false, false, "/v/a/f", ""});
  });
  monitor_.Step(0);
  EXPECT_THAT(Take("a"), ElementsAre());
  monitor_.Finish();
  EXPECT_THAT(Take("a"), ElementsAre("64 /v/a/f"));
}

}  // namespace
}  // namespace quarry::notify
