#include "daemons/tarnotifyd/directory_tree.h"

#include <gmock/gmock.h>

#include "tests/daemons/tarnotifyd/support/fanotify_bytes.h"

namespace quarry::notify {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::UnorderedElementsAre;

// top/share/a/b and top/other/x; "share" is watched as /s.
class DirectoryTreeTest : public testing::Test {
 protected:
  DirectoryTreeTest() {
    lookup_.Put("top", "", "");
    lookup_.Put("share", "top", "share");
    lookup_.Put("a", "share", "a");
    lookup_.Put("b", "a", "b");
    lookup_.Put("other", "top", "other");
    lookup_.Put("x", "other", "x");
    tree_.AddRoot(HandleOf("share"), "/s");
  }

  std::vector<std::string> Paths(const std::string& handle, const std::string& name) {
    std::vector<std::string> paths;
    complete_ = tree_.PathsOf(HandleOf(handle), name, &paths);
    return paths;
  }

  FakeLookup lookup_;
  DirectoryTree tree_{lookup_};
  bool complete_ = false;
};

TEST_F(DirectoryTreeTest, PathIsThatOfTheWatchedDirectory) {
  EXPECT_THAT(Paths("b", "f"), ElementsAre("/s/a/b/f"));
  EXPECT_THAT(Paths("share", "f"), ElementsAre("/s/f"));
  EXPECT_TRUE(complete_);
}

TEST_F(DirectoryTreeTest, DotIsTheDirectoryItself) {
  EXPECT_THAT(Paths("b", "."), ElementsAre("/s/a/b"));
  EXPECT_THAT(Paths("share", "."), ElementsAre("/s"));
}

TEST_F(DirectoryTreeTest, OutsideHasNoPath) {
  EXPECT_THAT(Paths("x", "f"), IsEmpty());
  EXPECT_THAT(Paths("top", "share"), IsEmpty());
  EXPECT_TRUE(complete_);
}

TEST_F(DirectoryTreeTest, GoneHasNoPathAndIsNoFailure) {
  EXPECT_THAT(Paths("nowhere", "f"), IsEmpty());
  EXPECT_TRUE(complete_);
}

TEST_F(DirectoryTreeTest, FailureIsToldAndNotRemembered) {
  lookup_.fails = true;
  EXPECT_THAT(Paths("b", "f"), IsEmpty());
  EXPECT_FALSE(complete_);
  lookup_.fails = false;
  EXPECT_THAT(Paths("b", "f"), ElementsAre("/s/a/b/f"));
  EXPECT_TRUE(complete_);
}

TEST_F(DirectoryTreeTest, WatchedDirectoryNeedsNoLookup) {
  tree_.Forget();
  lookup_.fails = true;
  EXPECT_THAT(Paths("share", "f"), ElementsAre("/s/f"));
  EXPECT_FALSE(complete_);  // it may lie within another one
}

TEST_F(DirectoryTreeTest, IgnoredNamesAtAnyDepth) {
  tree_.SetIgnored({"a", "@tmp"});
  EXPECT_THAT(Paths("b", "f"), IsEmpty());
  EXPECT_THAT(Paths("share", "a"), IsEmpty());
  EXPECT_THAT(Paths("share", "@tmp"), IsEmpty());
  EXPECT_THAT(Paths("share", "@tmp2"), ElementsAre("/s/@tmp2"));
  tree_.SetIgnored({});
  EXPECT_THAT(Paths("b", "f"), ElementsAre("/s/a/b/f"));
}

TEST_F(DirectoryTreeTest, IgnoredNameAboveAWatchedDirectoryDoesNotMatter) {
  tree_.SetIgnored({"share"});
  EXPECT_THAT(Paths("b", "f"), ElementsAre("/s/a/b/f"));
}

TEST_F(DirectoryTreeTest, WatchedDirectoriesWithinEachOtherGiveOnePath) {
  tree_.AddRoot(HandleOf("a"), "/s/a");
  EXPECT_THAT(Paths("b", "f"), ElementsAre("/s/a/b/f"));
}

TEST_F(DirectoryTreeTest, OnePlaceWatchedUnderSeveralPaths) {
  tree_.AddRoot(HandleOf("share"), "/bind");
  tree_.AddRoot(HandleOf("a"), "/deep");
  EXPECT_THAT(Paths("b", "f"), UnorderedElementsAre("/s/a/b/f", "/bind/a/b/f", "/deep/b/f"));
  EXPECT_THAT(tree_.Roots(), ElementsAre("/bind", "/deep", "/s"));
  tree_.RemoveRoot("/bind");
  EXPECT_THAT(Paths("b", "f"), UnorderedElementsAre("/s/a/b/f", "/deep/b/f"));
  tree_.RemoveRoot("/s");
  tree_.RemoveRoot("/deep");
  EXPECT_THAT(Paths("b", "f"), IsEmpty());
  EXPECT_THAT(tree_.Roots(), IsEmpty());
}

TEST_F(DirectoryTreeTest, RootOfEverything) {
  tree_.AddRoot(HandleOf("top"), "/");
  EXPECT_THAT(Paths("x", "f"), ElementsAre("/other/x/f"));
  EXPECT_THAT(Paths("top", "f"), ElementsAre("/f"));
  EXPECT_THAT(Paths("top", "."), ElementsAre("/"));
}

TEST_F(DirectoryTreeTest, RenamedAncestorChangesAllBelow) {
  EXPECT_THAT(Paths("b", "f"), ElementsAre("/s/a/b/f"));
  tree_.Placed(HandleOf("a"), HandleOf("share"), "renamed");
  EXPECT_THAT(Paths("b", "f"), ElementsAre("/s/renamed/b/f"));
  tree_.Placed(HandleOf("a"), HandleOf("other"), "away");
  EXPECT_THAT(Paths("b", "f"), IsEmpty());
}

TEST_F(DirectoryTreeTest, UnknownDirectoryThatMovedMakesItAskAgain) {
  EXPECT_THAT(Paths("b", "f"), ElementsAre("/s/a/b/f"));
  lookup_.Put("a", "share", "renamed");
  EXPECT_THAT(Paths("b", "f"), ElementsAre("/s/a/b/f"));
  tree_.Placed("", HandleOf("share"), "renamed");
  EXPECT_THAT(Paths("b", "f"), ElementsAre("/s/renamed/b/f"));
}

TEST_F(DirectoryTreeTest, NewDirectoryNeedsNoLookup) {
  Paths("a", "f");
  const int asked = lookup_.asked;
  tree_.Placed(HandleOf("new"), HandleOf("a"), "new");
  EXPECT_THAT(Paths("new", "f"), ElementsAre("/s/a/new/f"));
  EXPECT_EQ(lookup_.asked, asked);
  tree_.Removed(HandleOf("new"));
  EXPECT_THAT(Paths("new", "f"), IsEmpty());
  EXPECT_EQ(lookup_.asked, asked + 1);
}

// One was learnt before something moved, the other afterwards.
TEST_F(DirectoryTreeTest, CircleMakesItAskAgain) {
  for (const std::string parent : {"a", "b"}) {
    tree_.Placed(HandleOf("a"), HandleOf(parent), "a");
    EXPECT_THAT(Paths("b", "f"), ElementsAre("/s/a/b/f"));
    EXPECT_TRUE(complete_);
  }
}

TEST_F(DirectoryTreeTest, CircleThatStaysIsAFailure) {
  tree_.Forget();
  lookup_.Put("share", "b", "share");
  Paths("b", "f");
  EXPECT_FALSE(complete_);
  EXPECT_FALSE(tree_.AddRoot(HandleOf("a"), "/deep"));
}

TEST_F(DirectoryTreeTest, WatchedDirectoryHasToBeFound) {
  lookup_.fails = true;
  EXPECT_FALSE(tree_.AddRoot(HandleOf("a"), "/deep"));
  lookup_.fails = false;
  EXPECT_FALSE(tree_.AddRoot(HandleOf("nowhere"), "/deep"));
  EXPECT_THAT(tree_.Roots(), ElementsAre("/s"));
  EXPECT_THAT(tree_.RootsAt(HandleOf("share"), "a"), IsEmpty());
}

TEST_F(DirectoryTreeTest, WhatLeadsToAWatchedDirectory) {
  EXPECT_TRUE(tree_.AddRoot(HandleOf("b"), "/deep"));
  EXPECT_THAT(tree_.RootsAt(HandleOf("top"), "share"), UnorderedElementsAre("/deep", "/s"));
  EXPECT_THAT(tree_.RootsAt(HandleOf("share"), "a"), ElementsAre("/deep"));
  EXPECT_THAT(tree_.RootsAt(HandleOf("a"), "b"), ElementsAre("/deep"));
  EXPECT_THAT(tree_.RootsAt(HandleOf("b"), "f"), IsEmpty());
  EXPECT_THAT(tree_.RootsAt(HandleOf("top"), "other"), IsEmpty());
  tree_.RemoveRoot("/s");
  EXPECT_THAT(tree_.RootsAt(HandleOf("top"), "share"), ElementsAre("/deep"));
}

TEST_F(DirectoryTreeTest, RemembersABoundedNumberAndFindsTheOthersAgain) {
  const std::size_t count = 3 * DirectoryTree::kRemembered;
  for (std::size_t i = 0; i < count; ++i) {
    const std::string name = "d" + std::to_string(i);
    lookup_.Put(name, "share", name);
    EXPECT_THAT(Paths(name, "f"), ElementsAre("/s/" + name + "/f"));
  }
  EXPECT_LE(tree_.size(), DirectoryTree::kRemembered);
  EXPECT_GE(tree_.size(), DirectoryTree::kRemembered / 2);
  EXPECT_THAT(Paths("d0", "f"), ElementsAre("/s/d0/f"));
}

TEST_F(DirectoryTreeTest, WhatIsInUseStaysKnown) {
  for (std::size_t i = 0; i < DirectoryTree::kRemembered; ++i) {
    const std::string name = "d" + std::to_string(i);
    tree_.Placed(HandleOf(name), HandleOf("share"), name);
    Paths("b", "f");
  }
  EXPECT_LE(lookup_.asked, 4);
}

TEST_F(DirectoryTreeTest, DepthWithoutRecursion) {
  std::string expected = "/s";
  std::string parent = "share";
  for (int i = 0; i < 20000; ++i) {
    const std::string name = "d" + std::to_string(i);
    lookup_.Put(name, parent, "d");
    parent = name;
    expected += "/d";
  }
  EXPECT_THAT(Paths(parent, "f"), ElementsAre(expected + "/f"));
  EXPECT_TRUE(complete_);
}

}  // namespace
}  // namespace quarry::notify
