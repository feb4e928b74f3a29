#include "daemons/tarnotifyd/combined_source.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>

#include "fileindex/queue/event.h"
#include "tests/daemons/tarnotifyd/support/disk_model.h"
#include "tests/daemons/tarnotifyd/support/fake_source.h"

namespace quarry::notify {
namespace {

using test::FakeSource;
using ::testing::ElementsAre;
using Names = std::vector<std::string>;

class CombinedSourceTest : public ::testing::Test {
 protected:
  bool IsReady() const {
    pollfd polled{source_.Descriptor(), POLLIN, 0};
    return poll(&polled, 1, 0) > 0;
  }
  Names Told() {
    const Names told = model_.Told();
    model_.ForgetTold();
    return told;
  }

  FakeSource* first_ = new FakeSource;
  FakeSource* second_ = new FakeSource;
  Names left_{"/b"};
  CombinedSource source_{std::unique_ptr<ChangeSource>(first_),
                         std::unique_ptr<ChangeSource>(second_), [this] { return left_; }};
  test::DiskModel model_{"/nowhere", {}};
};

TEST_F(CombinedSourceTest, TheSecondWatchesWhatTheFirstLeaves) {
  source_.SetDirectories({"/a", "/b"}, {"x"}, model_);
  EXPECT_THAT(first_->directories_, ElementsAre("/a", "/b"));
  EXPECT_THAT(second_->directories_, ElementsAre("/b"));
  EXPECT_THAT(second_->ignore_, ElementsAre("x"));
  source_.SetDirectories({"/a", "/b"}, {"y"}, model_);
  EXPECT_THAT(second_->ignore_, ElementsAre("y"));
}

TEST_F(CombinedSourceTest, WhatIsLeftMayChangeByItself) {
  source_.SetDirectories({"/a", "/b"}, {}, model_);
  Told();
  left_ = {"/a"};
  source_.Refresh(model_);
  EXPECT_THAT(second_->directories_, ElementsAre("/a"));
  EXPECT_THAT(Told(), ElementsAre("doubt /a"));
  source_.Refresh(model_);
  EXPECT_THAT(Told(), ElementsAre());
  EXPECT_EQ(first_->refreshed_, 2);
  EXPECT_EQ(second_->refreshed_, 2);
}

TEST_F(CombinedSourceTest, TellsWhatEitherTells) {
  const auto tell = [](const std::string& path) {
    return [path](ChangeSink& sink) {
      sink.OnChange({fileindex::EVENT_CREATE, false, false, path, ""});
    };
  };
  EXPECT_FALSE(IsReady());
  first_->Tell(tell("/a/f"));
  EXPECT_TRUE(IsReady());
  source_.Read(model_);
  second_->Tell(tell("/b/f"));
  EXPECT_TRUE(IsReady());
  source_.Read(model_);
  EXPECT_FALSE(IsReady());
  EXPECT_THAT(Told(), ElementsAre("create file /a/f", "create file /b/f"));
}

}  // namespace
}  // namespace quarry::notify
