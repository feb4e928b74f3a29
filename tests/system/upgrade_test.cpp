// What an older release has left is brought up to date by itself.

#include <gtest/gtest.h>

#include "common/file_util.h"
#include "common/json.h"
#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/schema.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/system/running_system.h"

namespace quarry::test {
namespace {

class UpgradeTest : public testing::Test {
 protected:
  void SetUp() override {
    for (int i = 0; i < 20; ++i) {
      WriteFile(docs_ + "/d" + std::to_string(i % 4) + "/f" + std::to_string(i) + ".txt",
                "capybara number " + std::to_string(i));
    }
    system_.Start();
    system_.IndexShare(docs_);
  }
  void TearDown() override { system_.Stop(); }

  // Makes the only index one that a release with another layout has written.
  static void ChangeLayout(int version) {
    const std::string indexes = TestRoot() + "/var/lib/quarry/index/";
    const std::vector<std::string> names = ListDir(indexes);
    ASSERT_EQ(names.size(), 1U);
    engine::Database(indexes + names[0] + "/quarry.db")
        .Execute("UPDATE meta SET value=" + std::to_string(version) + " WHERE key='layout'");
  }

  // Searches fail while the index cannot be used.
  bool Finds(int hits) {
    return WaitUntil([&] {
      Json::Value found;
      return fromString(found, system_.Quarry({"search", "capybara", "--json"}).output) &&
             found["total"] == hits;
    });
  }
  bool LogSays(const std::string& words) {
    return WaitUntil([&] { return system_.Log().find(words) != std::string::npos; });
  }

  RunningSystem system_;
  const std::string docs_ = system_.Files() + "/docs";
};

TEST_F(UpgradeTest, AnIndexOfAnotherLayoutIsMadeAnew) {
  for (const int layout : {engine::kLayoutVersion - 1, engine::kLayoutVersion + 1}) {
    system_.Stop();
    ChangeLayout(layout);
    // What is only in the old index must not come back, and what changed meanwhile be seen.
    Unlink(docs_ + "/d0/f0.txt");
    WriteFile(docs_ + "/d1/f0.txt", "capybara too");
    system_.Start();
    EXPECT_TRUE(Finds(20));
    ASSERT_TRUE(system_.WaitUntilIdle());
    EXPECT_EQ(system_.Documents(docs_), Listing(docs_));
    EXPECT_EQ(system_.Run({"doctor", "--check"}), "All is well.\n");
    EXPECT_EQ(system_.QuarryJson({"status"})["folders"][0]["state"], "finished");
  }
  EXPECT_TRUE(LogSays("The index's database is of another version"));
  EXPECT_TRUE(LogSays("made it anew"));
}

// Searches and the status say why nothing is found, rather than that there is nothing.
TEST_F(UpgradeTest, APausedIndexOfAnotherLayoutIsNamedUntilItIsMadeAnew) {
  system_.Run({"pause"});
  system_.Stop();
  ChangeLayout(engine::kLayoutVersion - 1);
  system_.Start();
  const std::string why = "The index's database is of another version";
  const std::string search = system_.Quarry({"search", "capybara"}).output;
  EXPECT_NE(search.find(why), std::string::npos) << search;
  const std::string status = system_.Quarry({"status"}).output;
  EXPECT_NE(status.find("The index of the share docs cannot be used (" + why), std::string::npos)
      << status;
  system_.Run({"resume"});
  EXPECT_TRUE(Finds(20));
}

}  // namespace
}  // namespace quarry::test
