#include "daemons/tarnotifyd/change_fold.h"

#include <gtest/gtest.h>

#include "fileindex/queue/event.h"
#include "tests/daemons/tarnotifyd/support/disk_model.h"

namespace quarry::notify {
namespace {

using namespace fileindex;
using std::chrono::milliseconds;
using Lines = std::vector<std::string>;

class ChangeFoldTest : public ::testing::Test {
 protected:
  void Add(std::uint32_t kind, const std::string& path, bool is_dir = false) {
    fold_.Add({kind, is_dir, false, path, ""}, now_);
  }
  void Write(const std::string& path) { fold_.Add({EVENT_MODIFY, false, true, path, ""}, now_); }
  void Rename(const std::string& from, const std::string& to, bool is_dir = false) {
    fold_.Add({EVENT_RENAME, is_dir, false, to, from}, now_);
  }
  Lines After(milliseconds time) {
    now_ += time;
    fold_.Release(now_);
    return Take();
  }
  Lines Take() {
    Lines lines;
    for (const Change& change : fold_.Take()) lines.push_back(test::InWords(change));
    return lines;
  }

  Clock::time_point now_ = Clock::now();
  ChangeFold fold_;
};

TEST_F(ChangeFoldTest, AFileThatIsMadeAndWrittenIsOneLine) {
  Add(EVENT_CREATE, "/a");
  Write("/a");
  Add(EVENT_MODIFY, "/a");
  Add(EVENT_ATTR, "/a");
  EXPECT_EQ(Take(), Lines{"create file /a"});
}

TEST_F(ChangeFoldTest, AttributesDoNotCoverContent) {
  Add(EVENT_ATTR, "/a");
  Add(EVENT_ATTR, "/a");
  EXPECT_EQ(Take(), Lines{"attr file /a"});
  Add(EVENT_MODIFY, "/a");
  EXPECT_EQ(Take(), Lines{});
  EXPECT_EQ(After(ChangeFold::kPause), Lines{"modify file /a"});
}

TEST_F(ChangeFoldTest, TheLastChangeIsNeverLost) {
  Add(EVENT_MODIFY, "/a");
  EXPECT_EQ(Take(), Lines{"modify file /a"});
  Add(EVENT_MODIFY, "/a");
  Add(EVENT_ATTR, "/a");
  EXPECT_EQ(fold_.NextRelease(), now_ + ChangeFold::kPause);
  EXPECT_EQ(After(ChangeFold::kPause - milliseconds(1)), Lines{});
  EXPECT_EQ(After(milliseconds(1)), Lines{"modify file /a"});
  EXPECT_EQ(After(ChangeFold::kPause), Lines{});
  EXPECT_EQ(fold_.NextRelease(), std::nullopt);
}

TEST_F(ChangeFoldTest, AnHourOfWritingIsALineInFiveSeconds) {
  Lines all;
  for (int i = 0; i < 36'000; ++i) {
    Write("/log");
    for (const std::string& line : After(milliseconds(100))) all.push_back(line);
  }
  EXPECT_GE(all.size(), 700U);
  EXPECT_LE(all.size(), 721U);
}

TEST_F(ChangeFoldTest, ClosingEndsTheLongPause) {
  Write("/a");
  Take();
  Write("/a");
  EXPECT_EQ(After(ChangeFold::kPause), Lines{});
  Add(EVENT_MODIFY, "/a");
  EXPECT_EQ(After(milliseconds(0)), Lines{"modify file /a"});
}

TEST_F(ChangeFoldTest, WhatIsHeldOfAFileGoesBeforeItsRename) {
  Add(EVENT_MODIFY, "/d/a");
  Take();
  Add(EVENT_MODIFY, "/d/a");
  Rename("/d", "/e", true);
  EXPECT_EQ(Take(), (Lines{"modify file /d/a", "rename dir /d -> /e"}));
  EXPECT_EQ(After(ChangeFold::kBusyPause), Lines{});
}

TEST_F(ChangeFoldTest, WhatIsHeldOfADeletedFileIsDropped) {
  Add(EVENT_MODIFY, "/d/a");
  Add(EVENT_MODIFY, "/d0");
  Take();
  Add(EVENT_MODIFY, "/d/a");
  Add(EVENT_MODIFY, "/d0");
  Add(EVENT_DELETE, "/d", true);
  EXPECT_EQ(Take(), Lines{"delete dir /d"});
  EXPECT_EQ(After(ChangeFold::kPause), Lines{"modify file /d0"});
}

TEST_F(ChangeFoldTest, AFileThatIsMadeAnewIsToldAgain) {
  Add(EVENT_CREATE, "/a");
  Add(EVENT_DELETE, "/a");
  Add(EVENT_CREATE, "/a");
  Add(EVENT_CREATE, "/a");
  EXPECT_EQ(Take(), (Lines{"create file /a", "delete file /a", "create file /a"}));
}

TEST_F(ChangeFoldTest, AfterARenameTheOldLineCoversNothing) {
  Add(EVENT_CREATE, "/a");
  Rename("/a", "/b");
  Add(EVENT_MODIFY, "/b");
  EXPECT_EQ(Take(), (Lines{"create file /a", "rename file /a -> /b", "modify file /b"}));
}

TEST_F(ChangeFoldTest, EverythingIsLetOutAtTheEnd) {
  Write("/a");
  Add(EVENT_ATTR, "/b");
  Take();
  Write("/a");
  Add(EVENT_ATTR, "/b");
  fold_.ReleaseAll();
  EXPECT_EQ(Take(), (Lines{"modify file /a", "attr file /b"}));
}

TEST_F(ChangeFoldTest, BeyondItsMemoryChangesPassUnfolded) {
  for (std::size_t i = 0; i < ChangeFold::kMaxPaths; ++i) Add(EVENT_MODIFY, std::to_string(i));
  Take();
  Add(EVENT_MODIFY, "one more");
  Add(EVENT_MODIFY, "one more");
  EXPECT_EQ(Take(), (Lines{"modify file one more", "modify file one more"}));
}

}  // namespace
}  // namespace quarry::notify
