#include "daemons/fileindexd/progress.h"

#include <gtest/gtest.h>

#include <string>

#include "tests/daemons/fileindexd/share_fixture.h"

namespace quarry::fileindexd {
namespace {

using Point = Rate::Clock::time_point;
using std::chrono::milliseconds;
using std::chrono::seconds;

TEST(RateTest, CountsTheLastTenSeconds) {
  Rate rate;
  const Point start{};
  EXPECT_EQ(0.0, rate.PerSecond(start));
  for (int i = 0; i < 50; ++i) rate.Add(start);
  EXPECT_EQ(50.0, rate.PerSecond(start));
  EXPECT_EQ(50.0, rate.PerSecond(start + milliseconds(500)));
  EXPECT_EQ(25.0, rate.PerSecond(start + seconds(2)));
  EXPECT_EQ(5.0, rate.PerSecond(start + seconds(10)));
  EXPECT_EQ(0.0, rate.PerSecond(start + seconds(11)));
}

TEST(RateTest, IsSteadyOverALongTime) {
  Rate rate;
  Point now{};
  for (int i = 0; i < 100 * 60; ++i) {
    rate.Add(now);
    now += milliseconds(10);
  }
  EXPECT_NEAR(100.0, rate.PerSecond(now), 2.0);
}

class ProgressTest : public ::testing::Test {
 protected:
  ProgressTest() {
    progress_.SetFolders(std::make_shared<const FolderRules>(
        std::vector<FolderRule>{Folder("/s/a"), Folder("/s/a/b"), PausedFolder("/s/p")}));
  }

  Json::Value FolderReport(const std::string& path, bool paused = false) const {
    const Json::Value report = progress_.Report(paused);
    for (const Json::Value& folder : report["folders"]) {
      if (folder["path"] == path) return folder;
    }
    return Json::Value();
  }

  Point now_{};
  Progress progress_{"s", [this] { return now_; }};
};

TEST_F(ProgressTest, CountsForTheGoverningFolderAndForTheShare) {
  progress_.AddWaiting("/v/s/a/x");
  progress_.AddWaiting("/v/s/a/b/y");
  progress_.AddWaiting("/v/s/elsewhere");
  progress_.Begin("/v/s/a/b/y");
  progress_.TakeWaiting("/v/s/a/b/y");
  progress_.Done("/v/s/a/b/y");
  progress_.Failed("/v/s/a/x", "x: unreadable");
  const Json::Value report = progress_.Report(false);
  EXPECT_EQ("s", report["share"].asString());
  EXPECT_EQ(2U, report["waiting"].asUInt());
  EXPECT_EQ(1U, report["done"].asUInt());
  EXPECT_EQ(1U, report["failed"].asUInt());
  EXPECT_EQ(1.0, report["rate"].asDouble());
  EXPECT_EQ("/v/s/a/b/y", report["path"].asString());
  EXPECT_EQ("x: unreadable", report["last_error"].asString());
  EXPECT_EQ(3U, report["folders"].size());
  EXPECT_EQ(1U, FolderReport("/s/a")["waiting"].asUInt());
  EXPECT_EQ(1U, FolderReport("/s/a")["failed"].asUInt());
  EXPECT_EQ(0U, FolderReport("/s/a")["done"].asUInt());
  EXPECT_EQ("", FolderReport("/s/a")["current"].asString());
  EXPECT_EQ(0U, FolderReport("/s/a/b")["waiting"].asUInt());
  EXPECT_EQ(1U, FolderReport("/s/a/b")["done"].asUInt());
  EXPECT_EQ("/v/s/a/b/y", FolderReport("/s/a/b")["current"].asString());
}

TEST_F(ProgressTest, NamesEveryState) {
  EXPECT_EQ("waiting", progress_.Report(false)["state"].asString());
  const std::pair<WorkState, const char*> names[] = {{WorkState::kIdle, "idle"},
                                                     {WorkState::kWaiting, "waiting"},
                                                     {WorkState::kIndexing, "indexing"},
                                                     {WorkState::kRetrying, "retrying"}};
  for (const auto& [state, name] : names) {
    progress_.SetState(state);
    EXPECT_EQ(state, progress_.State());
    EXPECT_EQ(name, progress_.Report(false)["state"].asString());
    EXPECT_EQ(name, FolderReport("/s/a")["state"].asString());
    EXPECT_EQ("paused", FolderReport("/s/p")["state"].asString());
    EXPECT_EQ("paused", progress_.Report(true)["state"].asString());
    EXPECT_EQ("paused", FolderReport("/s/a", true)["state"].asString());
  }
  progress_.SetFolders(
      std::make_shared<const FolderRules>(std::vector<FolderRule>{PausedFolder("/s/p")}));
  EXPECT_EQ("paused", progress_.Report(false)["state"].asString());
}

TEST_F(ProgressTest, AFailedPassIsTheLastErrorUntilTheNextOneEnds) {
  progress_.AddWaiting("/v/s/a/x");
  progress_.Failed("/v/s/a/x", "x: unreadable");
  progress_.EndPass("the engine is not running");
  EXPECT_EQ("the engine is not running", progress_.Report(false)["last_error"].asString());
  EXPECT_EQ("the engine is not running", FolderReport("/s/a")["last_error"].asString());
  EXPECT_EQ(0U, progress_.Report(false)["waiting"].asUInt());
  EXPECT_EQ(0U, FolderReport("/s/a")["waiting"].asUInt());
  progress_.EndPass("");
  EXPECT_EQ("x: unreadable", progress_.Report(false)["last_error"].asString());
}

TEST_F(ProgressTest, WaitingNeverGoesBelowZero) {
  progress_.TakeWaiting("/v/s/a/x");
  EXPECT_EQ(0U, progress_.Report(false)["waiting"].asUInt());
  EXPECT_EQ(0U, FolderReport("/s/a")["waiting"].asUInt());
}

TEST_F(ProgressTest, ReportsAShareWhoseFoldersAreNotLoaded) {
  const Progress progress("t");
  const Json::Value report = progress.Report(false);
  EXPECT_EQ("t", report["share"].asString());
  EXPECT_TRUE(report["folders"].isArray());
  EXPECT_EQ(0U, report["folders"].size());
}

}  // namespace
}  // namespace quarry::fileindexd
