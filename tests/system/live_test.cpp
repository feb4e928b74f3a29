// What changes on the disk is found without anybody asking.

#include <gtest/gtest.h>

#include <csignal>
#include <filesystem>
#include <functional>

#include "tests/support/files.h"
#include "tests/system/running_system.h"

namespace quarry::test {
namespace {

class LiveTest : public testing::Test {
 protected:
  void SetUp() override {
    WriteFile(docs_ + "/first.txt", "an aardvark");
    system_.Start();
    ASSERT_EQ(system_.Quarry({"share", "add", docs_}).end, "exit code 0");
    ASSERT_EQ(system_.Quarry({"folder", "add", "/docs"}).end, "exit code 0");
    ASSERT_TRUE(Comes([this] { return Finds("aardvark", 1); }));
  }

  bool Finds(const std::string& word, unsigned count) {
    return system_.QuarryJson({"search", word})["hits"].size() == count;
  }
  static bool Comes(const std::function<bool()>& condition) {
    return WaitUntil(condition, std::chrono::seconds(60));
  }
  bool IndexIsLikeTheDisk() {
    return Comes([this] { return system_.Documents(docs_) == Listing(docs_); });
  }

  RunningSystem system_;
  std::string docs_ = system_.Files() + "/docs";
};

TEST_F(LiveTest, ChangesAreFoundByThemselves) {
  WriteFile(docs_ + "/new.txt", "a pangolin");
  EXPECT_TRUE(Comes([this] { return Finds("pangolin", 1); }));
  WriteFile(docs_ + "/new.txt", "an okapi");
  EXPECT_TRUE(Comes([this] { return Finds("okapi", 1) && Finds("pangolin", 0); }));
  WriteFile(docs_ + "/deep/er/and/deeper.txt", "a quokka");
  EXPECT_TRUE(Comes([this] { return Finds("quokka", 1); }));
  std::filesystem::rename(docs_ + "/deep", docs_ + "/elsewhere");
  EXPECT_TRUE(IndexIsLikeTheDisk());
  WriteFile(docs_ + "/elsewhere/er/and/more.txt", "a numbat");
  EXPECT_TRUE(Comes([this] { return Finds("numbat", 1); }));
  std::filesystem::remove_all(docs_ + "/elsewhere");
  EXPECT_TRUE(Comes([this] { return Finds("quokka", 0) && Finds("numbat", 0); }));
  EXPECT_TRUE(IndexIsLikeTheDisk());
  system_.Stop();
}

TEST_F(LiveTest, ARenamedShareIsFollowedToItsNewPlace) {
  ASSERT_EQ(system_.Quarry({"share", "rename", "docs", "papers"}).end, "exit code 0");
  docs_ = system_.Files() + "/papers";
  WriteFile(docs_ + "/new/place.txt", "a pangolin");
  EXPECT_TRUE(Comes([this] { return Finds("pangolin", 1); }));
  WriteFile(docs_ + "/new/later.txt", "a tapir");
  EXPECT_TRUE(Comes([this] { return Finds("tapir", 1); }));
  EXPECT_TRUE(IndexIsLikeTheDisk());
  system_.Stop();
}

TEST_F(LiveTest, AFolderThatIsAddedLaterIsFollowed) {
  const std::string other = system_.Files() + "/other";
  WriteFile(other + "/first.txt", "a dugong");
  ASSERT_EQ(system_.Quarry({"share", "add", other}).end, "exit code 0");
  ASSERT_EQ(system_.Quarry({"folder", "add", "/other"}).end, "exit code 0");
  EXPECT_TRUE(Comes([this] { return Finds("dugong", 1); }));
  WriteFile(other + "/second.txt", "a manatee");
  EXPECT_TRUE(Comes([this] { return Finds("manatee", 1); }));
  system_.Stop();
}

TEST_F(LiveTest, WhatAMonitorThatIsKilledMissesIsFound) {
  const pid_t before = system_.Pid("tarnotifyd");
  ASSERT_GT(before, 0);
  kill(before, SIGKILL);
  WriteFile(docs_ + "/missed/file.txt", "an axolotl");
  EXPECT_TRUE(Comes([this] { return Finds("axolotl", 1); }));
  ASSERT_TRUE(Comes([&] {
    const pid_t now = system_.Pid("tarnotifyd");
    return now > 0 && now != before;
  }));
  WriteFile(docs_ + "/missed/later.txt", "a tapir");
  EXPECT_TRUE(Comes([this] { return Finds("tapir", 1); }));
  system_.Stop();
}

}  // namespace
}  // namespace quarry::test
