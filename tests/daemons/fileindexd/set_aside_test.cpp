#include "daemons/fileindexd/set_aside.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "common/error.h"
#include "common/json.h"

namespace quarry::fileindexd {
namespace {

class SetAsideTest : public ::testing::Test {
 protected:
  // A pass in which the work of that name fails; nothing fails without a name. Returns what was set
  // aside.
  std::string Pass(const std::string& culprit, const Error& error = Error(-7, "no idea")) {
    aside_.BeginPass(can_read_);
    try {
      for (const char* name : {"a", "b", "c"}) {
        aside_.Try(name, [&] {
          if (name == culprit) throw error;
          done_ += name;
        });
      }
    } catch (const Error&) {
      const std::optional<SetAside::Work> work = aside_.Failed();
      return work ? work->name : "";
    }
    aside_.Succeeded();
    return "";
  }

  // What a pass without failures does.
  std::string Done() {
    done_.clear();
    Pass("");
    return done_;
  }

  void FailUntilAside(const std::string& culprit) {
    for (int i = 0; i < 4; ++i) EXPECT_EQ("", Pass(culprit));
    EXPECT_EQ(culprit, Pass(culprit));
  }

  SetAside::TimePoint now_{};
  SetAside aside_{[this] { return now_; }};
  bool can_read_ = true;
  std::string done_;
};

TEST_F(SetAsideTest, LeavesOutWhatFailedInSeveralPasses) {
  EXPECT_FALSE(aside_.IsSearching());
  EXPECT_EQ("", Pass("b"));
  EXPECT_TRUE(aside_.IsSearching());
  for (int i = 0; i < 3; ++i) EXPECT_EQ("", Pass("b"));
  EXPECT_TRUE(aside_.IsEmpty());
  EXPECT_EQ("[]", toString(aside_.Report()));
  EXPECT_EQ("b", Pass("b"));
  EXPECT_FALSE(aside_.IsEmpty());
  EXPECT_FALSE(aside_.IsSearching());
  EXPECT_EQ("ac", Done());
  EXPECT_EQ(R"text([{"error":"no idea (code -7)","path":"b"}])text", toString(aside_.Report()));
}

TEST_F(SetAsideTest, APassThatSucceedsEndsTheCount) {
  for (int i = 0; i < 4; ++i) Pass("b");
  EXPECT_EQ("abc", Done());
  EXPECT_FALSE(aside_.IsSearching());
  FailUntilAside("b");
  EXPECT_EQ("ac", Done());
}

TEST_F(SetAsideTest, FindsSeveralOneAfterTheOther) {
  FailUntilAside("a");
  FailUntilAside("c");
  EXPECT_EQ("b", Done());
  EXPECT_EQ(2U, aside_.Report().size());
}

TEST_F(SetAsideTest, OnlyTheFirstFailureOfAPassCounts) {
  for (int i = 0; i < 5; ++i) {
    aside_.BeginPass(true);
    EXPECT_THROW(aside_.Try("outer", [&] { aside_.Try("inner", [] { throw Error(-7, ""); }); }),
                 Error);
    EXPECT_THROW(aside_.Try("later", [] { throw Error(-7, ""); }), Error);
    aside_.Failed();
  }
  EXPECT_EQ("inner", aside_.Report()[0]["path"].asString());
  EXPECT_EQ(1U, aside_.Report().size());
}

TEST_F(SetAsideTest, AFailureBetweenPassesIsNobodysFault) {
  for (int i = 0; i < 4; ++i) Pass("b");
  EXPECT_FALSE(aside_.Failed());
  EXPECT_EQ("b", Pass("b"));
}

TEST_F(SetAsideTest, WhatIsNoSingleWorksFaultIsNotCounted) {
  for (const int code : {502, 1003, 1400, 1404, 1407}) {
    for (int i = 0; i < 10; ++i) EXPECT_EQ("", Pass("b", Error(code, ""))) << code;
  }
  EXPECT_FALSE(aside_.IsSearching());
  EXPECT_EQ("abc", Done());
}

TEST_F(SetAsideTest, AReaderThatDidNotRunIsNoFilesFault) {
  can_read_ = false;
  for (int i = 0; i < 10; ++i) EXPECT_EQ("", Pass("b", Error(kErrorParseDocument, "")));
  EXPECT_FALSE(aside_.IsSearching());
  can_read_ = true;
  for (int i = 0; i < 4; ++i) EXPECT_EQ("", Pass("b", Error(kErrorParseDocument, "")));
  EXPECT_EQ("b", Pass("b", Error(kErrorParseDocument, "")));
}

TEST_F(SetAsideTest, OtherExceptionsCountToo) {
  for (int i = 0; i < 5; ++i) {
    aside_.BeginPass(true);
    EXPECT_THROW(aside_.Try("a", [] { throw std::runtime_error("odd"); }), std::runtime_error);
    aside_.Failed();
  }
  EXPECT_EQ(R"([{"error":"odd","path":"a"}])", toString(aside_.Report()));
}

TEST_F(SetAsideTest, HasAnotherChanceAfterAWhile) {
  EXPECT_FALSE(aside_.IsDue());
  FailUntilAside("b");
  EXPECT_FALSE(aside_.IsDue());
  now_ += std::chrono::minutes(59);
  EXPECT_FALSE(aside_.IsDue());
  now_ += std::chrono::minutes(1);
  EXPECT_TRUE(aside_.IsDue());
  aside_.GiveAnotherChance();
  EXPECT_FALSE(aside_.IsDue());
  EXPECT_TRUE(aside_.IsSearching());
  EXPECT_EQ("b", Pass("b"));
  EXPECT_FALSE(aside_.IsDue());
  aside_.GiveAnotherChance();
  EXPECT_EQ("abc", Done());
  EXPECT_TRUE(aside_.IsEmpty());
  EXPECT_FALSE(aside_.IsSearching());
}

// Where everything fails leaving out one thing after the other does not help.
TEST_F(SetAsideTest, SetsOnlySoMuchAside) {
  for (int i = 0; i < 40; ++i) {
    for (int pass = 0; pass < 5; ++pass) {
      aside_.BeginPass(true);
      EXPECT_THROW(aside_.Try(std::to_string(i), [] { throw Error(-7, ""); }), Error);
      aside_.Failed();
    }
  }
  EXPECT_EQ(16U, aside_.Report().size());
}

// What failed once long ago makes room for what fails now.
TEST_F(SetAsideTest, ManyThatFailOnceDoNotHideTheOneThatAlwaysDoes) {
  for (int i = 0; i < 100; ++i) {
    aside_.BeginPass(true);
    EXPECT_THROW(aside_.Try(std::to_string(i), [] { throw Error(-7, ""); }), Error);
    aside_.Failed();
  }
  FailUntilAside("b");
}

}  // namespace
}  // namespace quarry::fileindexd
