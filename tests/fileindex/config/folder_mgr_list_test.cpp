// Sorted pages of the folder list.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <utility>
#include <vector>

#include "tests/fileindex/config/folder_mgr_fixture.h"

namespace quarry::fileindex {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class FolderMgrListTest : public FolderMgrTest {
 protected:
  FolderMgrListTest() {
    Upsert(folders_, Make("/s/B", "dv", "zebra"));
    Upsert(folders_, Make("/s/a", "ap", "Apple"));
    Upsert(folders_, Make("/s/C", "d", "mango"));
    Upsert(folders_, Make("/s/d", "v", "banana"));
  }

  std::vector<std::string> Page(unsigned int offset, unsigned int limit, const std::string& sort_by,
                                const std::string& direction) {
    std::vector<FolderPtr> out = {Make("/old", "")};
    folders_.List(out, total_, offset, limit, sort_by, direction);
    return Paths(out);
  }

  FolderMgr folders_;
  unsigned int total_ = 0;
};

TEST_F(FolderMgrListTest, SortsByTextWithoutRegardToCase) {
  EXPECT_THAT(Page(0, 9, "path", "asc"), ElementsAre("/s/a", "/s/B", "/s/C", "/s/d"));
  EXPECT_THAT(Page(0, 9, "path", "desc"), ElementsAre("/s/d", "/s/C", "/s/B", "/s/a"));
  for (const char* key : {"name", "", "size", "Path", "Photo"}) {
    EXPECT_THAT(Page(0, 9, key, "asc"), ElementsAre("/s/a", "/s/d", "/s/C", "/s/B")) << key;
    EXPECT_THAT(Page(0, 9, key, "desc"), ElementsAre("/s/B", "/s/C", "/s/d", "/s/a")) << key;
  }
  EXPECT_EQ(total_, 4U);
}

TEST_F(FolderMgrListTest, LettersBeyondAsciiHaveNoCaseEither) {
  FolderMgr folders;
  for (const char* name : {"Éb", "éc", "éa"})
    Upsert(folders, Make(std::string("/s/") + name, "", name));
  for (const char* key : {"path", "name"}) {
    std::vector<FolderPtr> out;
    folders.List(out, total_, 0, 9, key, "asc");
    EXPECT_THAT(Paths(out), ElementsAre("/s/éa", "/s/Éb", "/s/éc")) << key;
  }
}

TEST_F(FolderMgrListTest, OnlyTheExactWordTurnsTheOrderRound) {
  for (const char* direction : {"", "asc", "DESC", "desc ", "descending"}) {
    EXPECT_THAT(Page(0, 1, "path", direction), ElementsAre("/s/a")) << direction;
  }
}

TEST_F(FolderMgrListTest, SortsByKindFalseFirst) {
  const std::vector<std::pair<std::string, char>> rows = {
      {"document", 'd'}, {"audio", 'a'}, {"video", 'v'}, {"photo", 'p'}};
  for (const auto& [key, kind] : rows) {
    for (const char* direction : {"asc", "desc"}) {
      std::vector<FolderPtr> out;
      folders_.List(out, total_, 0, 9, key, direction);
      std::string order;
      for (const FolderPtr& folder : out) {
        order += Kinds(folder).find(kind) == std::string::npos ? '0' : '1';
      }
      std::string expected = order;
      std::sort(expected.begin(), expected.end());
      if (direction == std::string("desc")) std::reverse(expected.begin(), expected.end());
      EXPECT_EQ(order, expected) << key << " " << direction;
    }
  }
  EXPECT_THAT(Page(0, 1, "photo", "desc"), ElementsAre("/s/a"));
}

TEST_F(FolderMgrListTest, APageIsCutFromTheSortedList) {
  EXPECT_THAT(Page(1, 2, "path", ""), ElementsAre("/s/B", "/s/C"));
  EXPECT_THAT(Page(3, 2, "path", ""), ElementsAre("/s/d"));
  EXPECT_THAT(Page(1, 2, "path", "desc"), ElementsAre("/s/C", "/s/B"));
  EXPECT_THAT(Page(0, 0, "path", ""), IsEmpty());
  EXPECT_THAT(Page(4, 1, "path", ""), IsEmpty());
  EXPECT_THAT(Page(~0U, ~0U, "path", ""), IsEmpty());
  EXPECT_THAT(Page(2, ~0U, "path", ""), ElementsAre("/s/C", "/s/d"));
  EXPECT_EQ(total_, 4U);
}

TEST_F(FolderMgrListTest, TheListItselfKeepsItsOrder) {
  Page(0, 9, "path", "desc");
  EXPECT_THAT(Paths(folders_.GetFolders()), ElementsAre("/s/B", "/s/a", "/s/C", "/s/d"));
}

TEST_F(FolderMgrListTest, AnEmptyListHasEmptyPages) {
  std::vector<FolderPtr> out = {Make("/old", "")};
  FolderMgr().List(out, total_, 0, 5, "name", "asc");
  EXPECT_THAT(out, IsEmpty());
  EXPECT_EQ(total_, 0U);
}

TEST_F(FolderMgrListTest, ManyEqualKeysAreSortedWithoutLoss) {
  FolderMgr folders;
  for (int i = 0; i < 500; ++i) {
    Upsert(folders, Make("/s/" + std::to_string(i), i % 2 == 0 ? "d" : "", "same"));
  }
  std::vector<FolderPtr> out;
  for (const char* key : {"name", "document", "audio"}) {
    folders.List(out, total_, 0, 1000, key, "desc");
    std::vector<std::string> listed = Paths(out);
    std::vector<std::string> all = Paths(folders.GetFolders());
    std::sort(listed.begin(), listed.end());
    std::sort(all.begin(), all.end());
    EXPECT_EQ(listed, all);
  }
}

}  // namespace
}  // namespace quarry::fileindex
