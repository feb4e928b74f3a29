// Reading indexes through.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "daemons/tarnelasticd/index_files.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"
#include "tests/support/files.h"

namespace quarry::engine {
namespace {

class EngineCheckTest : public EngineTest {
 protected:
  EngineCheckTest() {
    Create();
    for (int i = 0; i < 300; ++i) {
      Upsert(FileDocument("/s/" + std::to_string(i), "alpha beta" + std::to_string(i)));
    }
    Commit();
  }
  int Check(const char* data = R"({"id":"a"})") { return AskError("index_check", Parse(data)); }
  std::string Problem() {
    return Ask("engine_status", Json::objectValue)["indexes"][0U]["problem"].asString();
  }
  void Restart() {
    engine_.reset();
    engine_ = std::make_unique<Engine>(options_);
  }

  std::string database_ = DatabasePath(DirectoryOf("a"));
};

TEST_F(EngineCheckTest, ASoundIndexIsFoundSoundAlsoWhilePausedAndWithWorkOpen) {
  EXPECT_EQ(Check(), 0);
  Upsert(FileDocument("/s/open", "alpha"));
  EXPECT_EQ(Check(), 0);
  EXPECT_EQ(AskError("index_pause", Parse(R"({"id":"a"})")), 0);
  EXPECT_EQ(Check(), 0);
  EXPECT_EQ(Problem(), "");
}

TEST_F(EngineCheckTest, RequestsOfTheWrongShapeAndUnknownIndexes) {
  EXPECT_EQ(Check("{}"), 1402);
  EXPECT_EQ(Check(R"({"id":7})"), 1402);
  EXPECT_EQ(Check(R"({"id":"nobody"})"), 1404);
}

TEST_F(EngineCheckTest, DamageThatNobodyHasMetIsFoundAndRemembered) {
  engine_.reset();
  const std::string content = test::ReadFile(database_);
  int found = 0;
  for (std::size_t page = 4096; page < content.size(); page += 4096) {
    std::string damaged = content;
    damaged.replace(page, 4096, 4096, '\x55');
    test::WriteFile(database_, damaged);
    Restart();
    // Opening reads some of the pages.
    const bool met = !Problem().empty();
    EXPECT_EQ(Check(), 1405) << page;
    EXPECT_NE(Problem(), "") << page;
    if (!met) ++found;
    engine_.reset();
  }
  EXPECT_GT(found, 0);
  Restart();
  EXPECT_EQ(Check(), 1405);
  EXPECT_THAT(Problem(), testing::Not(testing::HasSubstr("\n")));
  EXPECT_EQ(AskError("index_create", CreateRequest("a", DirectoryOf("a"))["data"]), 0);
  EXPECT_EQ(Check(), 0);
  EXPECT_EQ(Problem(), "");
}

TEST_F(EngineCheckTest, DamageUnderARunningEngineIsFound) {
  Restart();  // all of the index is in its file now
  EXPECT_EQ(Check(), 0);
  const std::string content = test::ReadFile(database_);
  test::WriteFile(database_, content.substr(0, 4096) + std::string(content.size() - 4096, '\x55'));
  EXPECT_EQ(Check(), 1405);
}

TEST_F(EngineCheckTest, WhatCannotBeOpenedIsDamaged) {
  engine_.reset();
  test::WriteFile(database_, std::string(8192, 'x'));
  engine_ = std::make_unique<Engine>(options_);
  EXPECT_EQ(Check(), 1405);
}

TEST_F(EngineCheckTest, AnIndexThatIsTooLargeForTheTimeIsGivenUp) {
  engine_.reset();
  options_.search_time = std::chrono::seconds(-1);
  engine_ = std::make_unique<Engine>(options_);
  for (int i = 0; i < 3000; ++i) Upsert(FileDocument("/t/" + std::to_string(i), "alpha"));
  Commit();
  EXPECT_EQ(Check(), 1411);
  EXPECT_EQ(Problem(), "");
}

}  // namespace
}  // namespace quarry::engine
