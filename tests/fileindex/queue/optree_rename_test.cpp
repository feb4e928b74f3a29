// Renames and reindexes: the events that reach beyond their own path.

#include <gtest/gtest.h>

#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "fileindex/queue/optree.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/queue/queue_lines.h"

namespace quarry::fileindex {
namespace {

using Strings = std::vector<std::string>;

class RenameTest : public fake::FakePlatformTest {};
class ReindexTest : public fake::FakePlatformTest {};

const Json::Value kChange = [] {
  Json::Value change;
  change["audio"] = true;
  return change;
}();

// The texts of all records at a path of the tree of these lines.
Strings At(OPTree& tree, const std::string& path) {
  return Texts(tree.GetNodeByPath(path)->ops);
}

TEST_F(RenameTest, PendingWorkIsDoneOnceAtTheNewPathAfterTheRename) {
  const QueueFile queue(Line(EVENT_MODIFY, "/s/a") + RenameLine("/s/a", "/s/b"));
  OPTree tree(queue.path());
  EXPECT_EQ(HandedOut(tree), (Strings{"rename /s/a -> /s/b", "index /s/b"}));
  EXPECT_EQ(Texts(tree.ops), (Strings{"none /s/a", "rename /s/a -> /s/b", "index /s/b"}));
  EXPECT_EQ(At(tree, "/s/a"), Strings{});
  EXPECT_EQ(At(tree, "/s/b"), (Strings{"none /s/a", "rename /s/a -> /s/b", "index /s/b"}));
}

TEST_F(RenameTest, KindsThatAreCarried) {
  EXPECT_EQ(Folded(Line(EVENT_ATTR, "/a") + RenameLine("/a", "/b")),
            (Strings{"rename /a -> /b", "attr /b"}));
  EXPECT_EQ(Folded(Line(EVENT_REINDEX, "/a") + RenameLine("/a", "/b")),
            (Strings{"rename /a -> /b", "reindex /b"}));
}

TEST_F(RenameTest, KindsThatAreMovedKeepTheirPathAndTheirPlaceInTheOrder) {
  const QueueFile queue(Line(EVENT_DELETE, "/d/a") + Line(EVENT_UPDATE_CFG, "/d/b", "", kChange) +
                        RenameLine("/x", "/d/c") + RenameLine("/d", "/e"));
  OPTree tree(queue.path());
  EXPECT_EQ(HandedOut(tree), (Strings{"delete /d/a", R"(config /d/b {"audio":true})",
                                      "rename /x -> /d/c", "rename /d -> /e"}));
  EXPECT_EQ(At(tree, "/d/a"), Strings{});
  EXPECT_EQ(At(tree, "/d/b"), Strings{});
  EXPECT_EQ(At(tree, "/d/c"), Strings{});
  EXPECT_EQ(At(tree, "/e/a"), Strings{"delete /d/a"});
  EXPECT_EQ(At(tree, "/e/b"), Strings{R"(config /d/b {"audio":true})"});
  EXPECT_EQ(At(tree, "/e/c"), Strings{"rename /x -> /d/c"});
}

TEST_F(RenameTest, RenamesAloneAreMovedToo) {
  // So many that they are no longer looked at one by one.
  constexpr std::size_t kMany = 50;
  std::string lines;
  Strings expected;
  for (std::size_t i = 0; i < kMany; ++i) {
    lines += RenameLine("/x", "/d/c");
    expected.push_back("rename /x -> /d/c");
  }
  const QueueFile queue(lines + RenameLine("/d", "/e"));
  OPTree tree(queue.path());
  EXPECT_EQ(At(tree, "/d/c"), Strings{});
  EXPECT_EQ(At(tree, "/e/c"), expected);
  expected.push_back("rename /d -> /e");
  EXPECT_EQ(HandedOut(tree), expected);
}

// Rounds of: `event` at /e/c, and /e is moved to /d.
std::string RoundsOf(EventKind event, int rounds) {
  std::string lines;
  for (int i = 0; i < rounds; ++i) lines += Line(event, "/e/c") + RenameLine("/e", "/d");
  return lines;
}

TEST_F(RenameTest, ListWithoutARenameOfItsOwnIsMovedHoweverLong) {
  for (const int rounds : {1, 50}) {
    const QueueFile queue(RoundsOf(EVENT_DELETE, rounds) + RenameLine("/d", "/f"));
    OPTree tree(queue.path());
    EXPECT_EQ(At(tree, "/d/c"), Strings{});
    EXPECT_EQ(At(tree, "/f/c"), Strings(static_cast<std::size_t>(rounds), "delete /e/c"));
  }
}

TEST_F(RenameTest, ListWhereAllIsCancelledStaysHoweverLong) {
  for (const int rounds : {1, 50}) {
    const QueueFile queue(RoundsOf(EVENT_MODIFY, rounds) + Line(EVENT_REINDEX, "/d") +
                          RenameLine("/d", "/f"));
    OPTree tree(queue.path());
    Strings cancelled;
    for (int i = 0; i < rounds; ++i) {
      cancelled.push_back("none /e/c");
      cancelled.push_back("none /d/c");
    }
    EXPECT_EQ(At(tree, "/d/c"), cancelled);
    EXPECT_EQ(At(tree, "/f/c"), Strings{});
    EXPECT_EQ(HandedOut(tree).back(), "reindex /f");
  }
}

TEST_F(RenameTest, NothingPendingMeansNothingToCarry) {
  const QueueFile queue(RenameLine("/s/a", "/s/b"));
  OPTree tree(queue.path());
  EXPECT_EQ(Texts(tree.ops), Strings{"rename /s/a -> /s/b"});
}

TEST_F(RenameTest, DeletionIsNotCarried) {
  EXPECT_EQ(Folded(Line(EVENT_DELETE, "/a") + RenameLine("/a", "/b")),
            (Strings{"delete /a", "rename /a -> /b"}));
}

TEST_F(RenameTest, LastOfSeveralKindsIsCarried) {
  // A reindex of /a and, brought there by a rename, the attributes of what was /x.
  const QueueFile queue(Line(EVENT_REINDEX, "/a") + Line(EVENT_ATTR, "/x") +
                        RenameLine("/x", "/a") + RenameLine("/a", "/b"));
  OPTree tree(queue.path());
  EXPECT_EQ(HandedOut(tree), (Strings{"rename /x -> /a", "rename /a -> /b", "attr /b"}));
}

TEST_F(RenameTest, WhatIsPendingAtTheDestinationIsReplaced) {
  for (const auto kind : {EVENT_DELETE, EVENT_MODIFY, EVENT_ATTR}) {
    EXPECT_EQ(Folded(Line(kind, "/s/b") + RenameLine("/s/a", "/s/b")),
              Strings{"rename /s/a -> /s/b"});
  }
}

TEST_F(RenameTest, OtherKindsStayAtTheDestination) {
  EXPECT_EQ(Folded(Line(EVENT_REINDEX, "/b") + RenameLine("/a", "/b")),
            (Strings{"reindex /b", "rename /a -> /b"}));
  EXPECT_EQ(Folded(Line(EVENT_UPDATE_CFG, "/b", "", kChange) + RenameLine("/a", "/b")),
            (Strings{R"(config /b {"audio":true})", "rename /a -> /b"}));
  EXPECT_EQ(Folded(RenameLine("/x", "/b") + RenameLine("/a", "/b")),
            (Strings{"rename /x -> /b", "rename /a -> /b"}));
}

TEST_F(RenameTest, WorkBelowIsCarriedInWalkOrder) {
  const QueueFile queue(Line(EVENT_MODIFY, "/d/b/2") + Line(EVENT_ATTR, "/d/a") +
                        Line(EVENT_MODIFY, "/d/b/1") + Line(EVENT_REINDEX, "/d/c") +
                        Line(EVENT_MODIFY, "/d") + Line(EVENT_ATTR, "/d/b") +
                        RenameLine("/d", "/e"));
  OPTree tree(queue.path());
  EXPECT_EQ(HandedOut(tree), (Strings{"rename /d -> /e", "index /e", "attr /e/b", "index /e/b/2",
                                      "index /e/b/1", "attr /e/a", "reindex /e/c"}));
  EXPECT_EQ(tree.ops.size(), 13u);
}

TEST_F(RenameTest, CarriedWorkStandsBesideWhatIsPendingBelowTheDestination) {
  EXPECT_EQ(
      Folded(Line(EVENT_DELETE, "/e/x") + Line(EVENT_MODIFY, "/d/x") + RenameLine("/d", "/e")),
      (Strings{"delete /e/x", "rename /d -> /e", "index /e/x"}));
}

TEST_F(RenameTest, NeighboursWithTheSameBeginningStay) {
  EXPECT_EQ(
      Folded(Line(EVENT_MODIFY, "/dd/x") + Line(EVENT_MODIFY, "/d/x") + RenameLine("/d", "/e")),
      (Strings{"index /dd/x", "rename /d -> /e", "index /e/x"}));
}

TEST_F(RenameTest, ChainCarriesTheWorkToItsEnd) {
  EXPECT_EQ(Folded(Line(EVENT_MODIFY, "/a/x") + RenameLine("/a", "/b") +
                   RenameLine("/b/x", "/b/y") + RenameLine("/b", "/c")),
            (Strings{"rename /a -> /b", "rename /b/x -> /b/y", "rename /b -> /c", "index /c/y"}));
}

TEST_F(RenameTest, LaterEventsAtTheNewPathMeetTheCarriedWork) {
  EXPECT_EQ(Folded(Line(EVENT_ATTR, "/a") + RenameLine("/a", "/b") + Line(EVENT_MODIFY, "/b")),
            (Strings{"rename /a -> /b", "index /b"}));
  EXPECT_EQ(Folded(Line(EVENT_MODIFY, "/a") + RenameLine("/a", "/b") + Line(EVENT_DELETE, "/b")),
            (Strings{"rename /a -> /b", "delete /b"}));
}

TEST_F(RenameTest, LaterEventsAtTheNewPathPassOverMovedRecords) {
  // The deletion is the old path's: a creation at the new one must not turn it into indexing there.
  EXPECT_EQ(Folded(Line(EVENT_DELETE, "/a") + RenameLine("/a", "/b") + Line(EVENT_CREATE, "/b")),
            (Strings{"delete /a", "rename /a -> /b", "index /b"}));
  EXPECT_EQ(
      Folded(Line(EVENT_UPDATE_CFG, "/a", "", kChange) + RenameLine("/a", "/b") +
             Line(EVENT_UPDATE_CFG, "/b", "", Parsed(R"({"video":true})"))),
      (Strings{R"(config /a {"audio":true})", "rename /a -> /b", R"(config /b {"video":true})"}));
  EXPECT_EQ(Folded(Line(EVENT_DELETE, "/a") + RenameLine("/a", "/b") + RenameLine("/c", "/b")),
            (Strings{"delete /a", "rename /a -> /b", "rename /c -> /b"}));
  EXPECT_EQ(Folded(Line(EVENT_DELETE, "/a") + RenameLine("/a", "/d/b") + Line(EVENT_REINDEX, "/d")),
            (Strings{"delete /a", "rename /a -> /d/b", "reindex /d"}));
}

TEST_F(RenameTest, LaterEventsAtTheOldPathDoNotMeetMovedRecords) {
  EXPECT_EQ(Folded(Line(EVENT_DELETE, "/a") + RenameLine("/a", "/b") + Line(EVENT_CREATE, "/a")),
            (Strings{"delete /a", "rename /a -> /b", "index /a"}));
}

TEST_F(RenameTest, RecordThatIsMovedBackHomeTakesPartAgain) {
  EXPECT_EQ(Folded(Line(EVENT_UPDATE_CFG, "/a", "", kChange) + RenameLine("/a", "/b") +
                   RenameLine("/b", "/a") +
                   Line(EVENT_UPDATE_CFG, "/a", "", Parsed(R"({"video":true})"))),
            (Strings{R"(config /a {"audio":true,"document":false,"photo":false,"video":true})",
                     "rename /a -> /b", "rename /b -> /a"}));
}

TEST_F(RenameTest, SamePlaceIsOnlyRecorded) {
  EXPECT_EQ(
      Folded(Line(EVENT_MODIFY, "/a") + Line(EVENT_MODIFY, "/a/x") + RenameLine("/a", "//a/")),
      (Strings{"index /a", "index /a/x", "rename /a -> /a"}));
  EXPECT_EQ(Folded(Line(EVENT_MODIFY, "/") + RenameLine("//", "/")),
            (Strings{"index ", "rename // -> "}));
}

TEST_F(RenameTest, OldPathWithoutComponentsMovesNothing) {
  const std::string pending =
      Line(EVENT_MODIFY, "/") + Line(EVENT_MODIFY, "/a") + Line(EVENT_MODIFY, "/b");
  EXPECT_EQ(Folded(pending + Line(EVENT_RENAME, "/b")),
            (Strings{"index ", "index /a", "rename /b"}));
  EXPECT_EQ(Folded(pending + RenameLine("/", "/b")),
            (Strings{"index ", "index /a", "rename / -> /b"}));
}

TEST_F(RenameTest, IntoItsOwnDescendant) {
  const QueueFile queue(Line(EVENT_MODIFY, "/a") + Line(EVENT_MODIFY, "/a/x") +
                        Line(EVENT_REINDEX, "/a/b/c") + Line(EVENT_MODIFY, "/a/b/c/y") +
                        Line(EVENT_ATTR, "/a/b") + Line(EVENT_ATTR, "/a/b/z") +
                        RenameLine("/a", "/a/b/c"));
  OPTree tree(queue.path());
  EXPECT_EQ(HandedOut(tree),
            (Strings{"reindex /a/b/c", "index /a/b/c/y", "rename /a -> /a/b/c", "index /a/b/c",
                     "index /a/b/c/x", "attr /a/b/c/b", "attr /a/b/c/b/z"}));
  // The way down to what was passed by is not lost.
  tree.InsertEvent(std::make_shared<Event>(Line(EVENT_REINDEX, "/a")));
  EXPECT_EQ(HandedOut(tree), (Strings{"rename /a -> /a/b/c", "reindex /a"}));
}

TEST_F(RenameTest, IntoItsOwnDescendantAndOn) {
  EXPECT_EQ(
      Folded(Line(EVENT_MODIFY, "/a/b/y") + RenameLine("/a", "/a/b") + RenameLine("/a", "/q")),
      (Strings{"rename /a -> /a/b", "rename /a -> /q", "index /q/b/y"}));
}

TEST_F(RenameTest, OntoItsOwnAncestor) {
  EXPECT_EQ(
      Folded(Line(EVENT_MODIFY, "/a/b/c") + Line(EVENT_MODIFY, "/a/b/b/c") +
             Line(EVENT_ATTR, "/a/b/b") + Line(EVENT_ATTR, "/a/b") + RenameLine("/a/b", "/a")),
      (Strings{"rename /a/b -> /a", "attr /a", "index /a/c", "attr /a/b", "index /a/b/c"}));
}

TEST_F(RenameTest, OntoTheRoot) {
  EXPECT_EQ(Folded(Line(EVENT_MODIFY, "/a/b/c") + RenameLine("/a/b", "/")),
            (Strings{"rename /a/b -> ", "index /c"}));
}

TEST_F(RenameTest, EachRecordIsMovedOnceWhereThePlacesOverlap) {
  // What comes to /a/b/c from below must not be taken on to /a/c with what was there.
  const QueueFile queue(Line(EVENT_DELETE, "/a/b/b/c") + Line(EVENT_DELETE, "/a/b/c") +
                        RenameLine("/a/b", "/a"));
  OPTree tree(queue.path());
  EXPECT_EQ(At(tree, "/a/c"), Strings{"delete /a/b/c"});
  EXPECT_EQ(At(tree, "/a/b/c"), Strings{"delete /a/b/b/c"});
  EXPECT_EQ(At(tree, "/a/b/b/c"), Strings{});
}

TEST_F(RenameTest, LongListsAreMovedWhole) {
  std::string lines;
  for (int i = 0; i < 100; ++i) lines += RenameLine("/x", "/d/a") + Line(EVENT_DELETE, "/d/a");
  const QueueFile queue(lines + Line(EVENT_MODIFY, "/e/a") + RenameLine("/d", "/e") +
                        Line(EVENT_CREATE, "/d/a") + Line(EVENT_MODIFY, "/e/a"));
  OPTree tree(queue.path());
  EXPECT_EQ(tree.GetNodeByPath("/d/a")->ops.size(), 1u);
  EXPECT_EQ(tree.GetNodeByPath("/e/a")->ops.size(), 201u);
  const Strings handed_out = HandedOut(tree);
  ASSERT_EQ(handed_out.size(), 104u);
  EXPECT_EQ(Strings(handed_out.begin() + 100, handed_out.end()),
            (Strings{"delete /d/a", "index /e/a", "rename /d -> /e", "index /d/a"}));
}

// However many there are, and whether or not there were fewer at the new place.
TEST_F(RenameTest, MovedRecordsComeBehindThoseThatAreThere) {
  std::string lines;
  Strings there;
  Strings moved;
  const auto rename = [&lines](const std::string& from, const std::string& to, Strings& list) {
    lines += RenameLine(from, to);
    list.push_back("rename " + from + " -> " + to);
  };
  for (int i = 0; i < 3; ++i) rename("/x" + std::to_string(i), "/b", there);
  for (int i = 0; i < 40; ++i) rename("/y" + std::to_string(i), "/a", moved);
  rename("/a", "/b", moved);
  there.insert(there.end(), moved.begin(), moved.end());
  // And again, with records on either side of the long list.
  Strings again;
  rename("/z", "/c", again);
  lines += RenameLine("/b", "/c");
  there.insert(there.begin(), again.begin(), again.end());
  there.push_back("rename /b -> /c");

  const QueueFile queue(lines);
  OPTree built(queue.path());
  EXPECT_EQ(At(built, "/c"), there);
  const QueueFile empty;
  OPTree tree(empty.path());
  std::istringstream input(lines);
  for (std::string line; std::getline(input, line);) {
    tree.InsertEvent(std::make_shared<Event>(line));
  }
  EXPECT_EQ(At(tree, "/c"), there);
}

TEST_F(RenameTest, LastOfSeveralKindsIsCarriedFromALongListToo) {
  std::string renames;
  for (int i = 0; i < 50; ++i) renames += RenameLine("/x", "/a");
  const std::string attr_comes = Line(EVENT_ATTR, "/y") + RenameLine("/y", "/a");
  const std::string reindex_comes = Line(EVENT_REINDEX, "/z") + RenameLine("/z", "/a");
  // The attributes do not stand against the reindex that is moved over them.
  const std::string go = RenameLine("/a", "/b");
  EXPECT_EQ(Folded(renames + reindex_comes + attr_comes + go).back(), "attr /b");
  EXPECT_EQ(Folded(renames + attr_comes + reindex_comes + go).back(), "reindex /b");
  // A creation turns the deletion that came home into indexing, in the deletion's place.
  const std::string home = Line(EVENT_DELETE, "/a") + RenameLine("/a", "/h");
  const std::string back = RenameLine("/h", "/a") + Line(EVENT_CREATE, "/a");
  EXPECT_EQ(Folded(home + renames + reindex_comes + back + go).back(), "index /b");
  EXPECT_EQ(Folded(home + RenameLine("/h", "/a") + renames + reindex_comes +
                   Line(EVENT_CREATE, "/a") + go)
                .back(),
            "reindex /b");
}

// ---- Reindexes

TEST_F(ReindexTest, WhatIsBelowIsCancelled) {
  const QueueFile queue(Line(EVENT_MODIFY, "/s/d/f") + Line(EVENT_DELETE, "/s/d/e/g") +
                        Line(EVENT_UPDATE_CFG, "/s/d/e", "", kChange) + Line(EVENT_ATTR, "/s/d/h") +
                        Line(EVENT_REINDEX, "/s/d/i/j") + Line(EVENT_REINDEX, "/s/d"));
  OPTree tree(queue.path());
  EXPECT_EQ(HandedOut(tree), Strings{"reindex /s/d"});
  EXPECT_EQ(Texts(tree.ops),
            (Strings{"none /s/d/f", "none /s/d/e/g", R"(none /s/d/e {"audio":true})", "none /s/d/h",
                     "none /s/d/i/j", "reindex /s/d"}));
  EXPECT_EQ(At(tree, "/s/d/f"), Strings{"none /s/d/f"});
  EXPECT_EQ(tree.GetNodeByPath("/s/d")->children.size(), 4u);
}

TEST_F(ReindexTest, RenamesBelowSurvive) {
  EXPECT_EQ(Folded(RenameLine("/s/d/a", "/s/d/b") + Line(EVENT_REINDEX, "/s/d")),
            (Strings{"rename /s/d/a -> /s/d/b", "reindex /s/d"}));
}

TEST_F(ReindexTest, AboveAndBesideNothingIsCancelled) {
  EXPECT_EQ(Folded(Line(EVENT_MODIFY, "/s") + Line(EVENT_MODIFY, "/s/dd") +
                   Line(EVENT_MODIFY, "/s/c/x") + Line(EVENT_REINDEX, "/s/d")),
            (Strings{"index /s", "index /s/dd", "index /s/c/x", "reindex /s/d"}));
}

TEST_F(ReindexTest, WhatIsBelowIsCancelledEvenWhenTheReindexItselfIsDropped) {
  EXPECT_EQ(
      Folded(Line(EVENT_DELETE, "/d") + Line(EVENT_MODIFY, "/d/f") + Line(EVENT_REINDEX, "/d")),
      Strings{"delete /d"});
  EXPECT_EQ(
      Folded(Line(EVENT_REINDEX, "/d") + Line(EVENT_MODIFY, "/d/f") + Line(EVENT_REINDEX, "/d")),
      Strings{"reindex /d"});
}

TEST_F(ReindexTest, LaterEventsBelowStand) {
  EXPECT_EQ(
      Folded(Line(EVENT_MODIFY, "/d/f") + Line(EVENT_REINDEX, "/d") + Line(EVENT_MODIFY, "/d/f")),
      (Strings{"reindex /d", "index /d/f"}));
}

TEST_F(ReindexTest, RootCoversEverything) {
  EXPECT_EQ(Folded(Line(EVENT_MODIFY, "/d/f") + Line(EVENT_REINDEX, "/")), Strings{"reindex "});
}

TEST_F(ReindexTest, CancelledWorkIsNotCarriedAndDoesNotComeBack) {
  EXPECT_EQ(Folded(Line(EVENT_MODIFY, "/d/f") + Line(EVENT_REINDEX, "/d") + RenameLine("/d", "/e") +
                   Line(EVENT_MODIFY, "/d/f")),
            (Strings{"rename /d -> /e", "reindex /e", "index /d/f"}));
}

TEST_F(ReindexTest, RecordsAttachedByOthersAreCancelledToo) {
  const QueueFile queue;
  OPTree tree(queue.path());
  const auto below = tree.GetNodeByPath("/d/e/f");
  below->ops.push_back(std::make_shared<OP>(below, OP_INDEX, "", Json::Value()));
  tree.InsertEvent(std::make_shared<Event>(Line(EVENT_REINDEX, "/d")));
  EXPECT_EQ(below->ops[0]->op, OP_NONE);
}

}  // namespace
}  // namespace quarry::fileindex
