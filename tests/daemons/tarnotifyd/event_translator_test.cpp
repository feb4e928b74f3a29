#include "daemons/tarnotifyd/event_translator.h"

#include <gmock/gmock.h>

#include "tests/daemons/tarnotifyd/support/fanotify_bytes.h"

namespace quarry::notify {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

using Told = std::vector<std::string>;

// "share" is watched as /s and has the directory d; "out" lies beside it.
class EventTranslatorTest : public testing::Test {
 protected:
  EventTranslatorTest() {
    lookup_.Put("top", "", "");
    lookup_.Put("share", "top", "share");
    lookup_.Put("d", "share", "d");
    lookup_.Put("out", "top", "out");
    tree_.AddRoot(HandleOf("share"), "/s");
    tree_.SetIgnored({"@ea"});
  }

  Told Tell(const std::string& events) {
    translator_.Translate(events, sink_);
    return sink_.Take();
  }
  Told Finish() {
    translator_.Finish(sink_);
    return sink_.Take();
  }

  FakeLookup lookup_;
  DirectoryTree tree_{lookup_};
  EventTranslator translator_{tree_};
  TellingSink sink_;
};

struct MaskRow {
  std::uint64_t mask;
  Told told;
};

TEST_F(EventTranslatorTest, EveryKindOfAnEntry) {
  const std::vector<MaskRow> rows = {
      {FAN_CREATE, {"create /s/d/f"}},
      {FAN_MODIFY, {"modify /s/d/f ..."}},
      {FAN_CLOSE_WRITE, {"modify /s/d/f"}},
      {FAN_ATTRIB, {"attr /s/d/f"}},
      {FAN_DELETE, {"delete /s/d/f"}},
      {FAN_CREATE | FAN_MODIFY | FAN_CLOSE_WRITE, {"create /s/d/f"}},
      {FAN_MODIFY | FAN_CLOSE_WRITE, {"modify /s/d/f"}},
      {FAN_MODIFY | FAN_ATTRIB, {"modify /s/d/f ..."}},
      {FAN_MODIFY | FAN_DELETE, {"delete /s/d/f"}},
      {FAN_ATTRIB | FAN_DELETE, {"delete /s/d/f"}},
      {FAN_CREATE | FAN_DELETE, {"create /s/d/f", "delete /s/d/f"}},
      {FAN_MOVED_TO | FAN_MODIFY, {"create /s/d/f"}},
      {FAN_MOVED_FROM | FAN_CREATE, {"create /s/d/f", "delete /s/d/f"}},
      {FAN_CREATE | FAN_ONDIR, {"create dir /s/d/f"}},
      {FAN_DELETE | FAN_ONDIR, {"delete dir /s/d/f"}},
      {FAN_ATTRIB | FAN_ONDIR, {"attr dir /s/d/f"}},
      {FAN_OPEN, {}},
  };
  for (const MaskRow& row : rows) {
    EXPECT_EQ(Tell(EntryEvent(row.mask, "d", "f", "target")), row.told) << std::hex << row.mask;
  }
}

TEST_F(EventTranslatorTest, ChangedDirectoryNamesItself) {
  EXPECT_THAT(Tell(EntryEvent(FAN_ATTRIB | FAN_ONDIR, "d", ".")), ElementsAre("attr dir /s/d"));
}

TEST_F(EventTranslatorTest, OutsideAndIgnoredAreNotTold) {
  EXPECT_THAT(Tell(EntryEvent(FAN_CREATE, "out", "f") + EntryEvent(FAN_CREATE, "d", "@ea") +
                   EntryEvent(FAN_CREATE, "gone", "f")),
              IsEmpty());
}

TEST_F(EventTranslatorTest, OrderIsKept) {
  EXPECT_THAT(Tell(EntryEvent(FAN_CREATE, "d", "b") + EntryEvent(FAN_CREATE, "d", "a") +
                   EntryEvent(FAN_DELETE, "d", "b")),
              ElementsAre("create /s/d/b", "create /s/d/a", "delete /s/d/b"));
}

TEST_F(EventTranslatorTest, RenamesInsideInAndOut) {
  EXPECT_THAT(Tell(RenameEvent("d", "a", "share", "b", "t")), ElementsAre("rename /s/d/a -> /s/b"));
  EXPECT_THAT(Tell(RenameEvent("out", "a", "d", "b", "t")), ElementsAre("create /s/d/b"));
  EXPECT_THAT(Tell(RenameEvent("d", "a", "out", "b", "t")), ElementsAre("delete /s/d/a"));
  EXPECT_THAT(Tell(RenameEvent("out", "a", "out", "b", "t")), IsEmpty());
  EXPECT_THAT(Tell(RenameEvent("d", "@ea", "d", "b", "t")), ElementsAre("create /s/d/b"));
  EXPECT_THAT(Tell(RenameEvent("d", "a", "d", "@ea", "t")), ElementsAre("delete /s/d/a"));
  EXPECT_THAT(Tell(RenameEvent("gone", "a", "d", "b", "t")), ElementsAre("create /s/d/b"));
}

TEST_F(EventTranslatorTest, WhatFollowsTheRenameOfADirectoryHasItsNewPath) {
  EXPECT_THAT(Tell(EntryEvent(FAN_CREATE, "d", "f")), ElementsAre("create /s/d/f"));
  lookup_.Put("d", "share", "e");
  EXPECT_THAT(Tell(RenameEvent("share", "d", "share", "e", "d", FAN_ONDIR) +
                   EntryEvent(FAN_CREATE, "d", "g")),
              ElementsAre("rename dir /s/d -> /s/e", "create /s/e/g"));
  lookup_.Put("d", "out", "x");
  EXPECT_THAT(Tell(RenameEvent("share", "e", "out", "x", "d", FAN_ONDIR) +
                   EntryEvent(FAN_CREATE, "d", "h")),
              ElementsAre("delete dir /s/e"));
  lookup_.Put("d", "share", "i");
  EXPECT_THAT(Tell(RenameEvent("out", "x", "share", "i", "d", FAN_ONDIR) +
                   EntryEvent(FAN_CREATE, "d", "j")),
              ElementsAre("create dir /s/i", "create /s/i/j"));
}

// The kernel folds a rename into an earlier one that was the same, which was undone in between.
TEST_F(EventTranslatorTest, LastRenameMayNotBeTheLastOneTold) {
  lookup_.Put("d", "share", "e");
  EXPECT_THAT(Tell(RenameEvent("share", "d", "share", "e", "d", FAN_ONDIR) +
                   RenameEvent("share", "e", "share", "d", "d", FAN_ONDIR) +
                   EntryEvent(FAN_CREATE, "d", "f")),
              ElementsAre("rename dir /s/d -> /s/e", "rename dir /s/e -> /s/d", "create /s/e/f"));
}

// It may be looked at while it is away, and be back before anybody notices.
TEST_F(EventTranslatorTest, WhatLeadsToAWatchedDirectoryIsMoved) {
  tree_.AddRoot(HandleOf("d"), "/d");
  EXPECT_THAT(Tell(RenameEvent("top", "share", "top", "away", "share", FAN_ONDIR) +
                   RenameEvent("top", "away", "top", "share", "share", FAN_ONDIR)),
              ElementsAre("doubt /s", "doubt /d", "doubt /s", "doubt /d"));
  Tell(EntryEvent(FAN_MOVED_FROM | FAN_ONDIR, "top", "share"));
  EXPECT_THAT(Finish(), ElementsAre("doubt /s", "doubt /d"));
  EXPECT_THAT(Tell(EntryEvent(FAN_MOVED_TO | FAN_ONDIR, "top", "share")),
              ElementsAre("doubt /s", "doubt /d"));
  EXPECT_THAT(Tell(RenameEvent("top", "share", "top", "file", "share")), IsEmpty());
}

TEST_F(EventTranslatorTest, DirectoryThatIsMadeAndFilled) {
  EXPECT_THAT(Tell(EntryEvent(FAN_CREATE | FAN_ONDIR, "share", "new", "new") +
                   EntryEvent(FAN_CREATE, "new", "f") +
                   EntryEvent(FAN_DELETE | FAN_ONDIR, "share", "new", "new") +
                   EntryEvent(FAN_MODIFY, "new", "f")),
              ElementsAre("create dir /s/new", "create /s/new/f", "delete dir /s/new"));
}

TEST_F(EventTranslatorTest, EveryPathOfAPlaceThatIsWatchedTwice) {
  tree_.AddRoot(HandleOf("share"), "/bind");
  EXPECT_THAT(Tell(EntryEvent(FAN_CREATE, "d", "f") + RenameEvent("d", "f", "share", "g", "t") +
                   RenameEvent("share", "g", "out", "g", "t")),
              ElementsAre("create /s/d/f", "create /bind/d/f", "rename /s/d/f -> /s/g",
                          "rename /bind/d/f -> /bind/g", "delete /s/g", "delete /bind/g"));
}

TEST_F(EventTranslatorTest, FullQueuePutsAllInDoubtAndForgetsPaths) {
  tree_.AddRoot(HandleOf("out"), "/o");
  Tell(EntryEvent(FAN_CREATE, "d", "f"));
  lookup_.Put("d", "share", "renamed");
  EXPECT_THAT(Tell(RawEvent(FAN_Q_OVERFLOW, "") + EntryEvent(FAN_CREATE, "d", "g")),
              ElementsAre("doubt /o", "doubt /s", "create /s/renamed/g"));
}

TEST_F(EventTranslatorTest, WhatIsNoEventPutsAllInDoubt) {
  const std::string good = EntryEvent(FAN_CREATE, "d", "f");
  EXPECT_THAT(Tell(good + "rubbish" + good), ElementsAre("create /s/d/f", "doubt /s"));
  EXPECT_THAT(Tell(good), ElementsAre("create /s/d/f"));
}

TEST_F(EventTranslatorTest, FailedLookupPutsAllInDoubt) {
  lookup_.fails = true;
  EXPECT_THAT(Tell(EntryEvent(FAN_CREATE, "d", "f")), ElementsAre("doubt /s"));
}

TEST_F(EventTranslatorTest, HalvesOfAMoveMakeARename) {
  EXPECT_THAT(Tell(EntryEvent(FAN_MOVED_FROM, "d", "a") + EntryEvent(FAN_MOVED_TO, "share", "b")),
              ElementsAre("rename /s/d/a -> /s/b"));
  EXPECT_THAT(Tell(EntryEvent(FAN_MOVED_FROM, "out", "a") + EntryEvent(FAN_MOVED_TO, "d", "b")),
              ElementsAre("create /s/d/b"));
  EXPECT_THAT(Finish(), IsEmpty());
}

TEST_F(EventTranslatorTest, HalvesMayComeInTwoReads) {
  EXPECT_THAT(Tell(EntryEvent(FAN_MOVED_FROM, "d", "a")), IsEmpty());
  EXPECT_THAT(Tell(EntryEvent(FAN_MOVED_TO, "d", "b")), ElementsAre("rename /s/d/a -> /s/d/b"));
}

TEST_F(EventTranslatorTest, HalfThatStaysAloneIsADeletionOrACreation) {
  EXPECT_THAT(Tell(EntryEvent(FAN_MOVED_TO, "d", "b")), ElementsAre("create /s/d/b"));
  EXPECT_THAT(Tell(EntryEvent(FAN_MOVED_FROM, "d", "a")), IsEmpty());
  EXPECT_THAT(Finish(), ElementsAre("delete /s/d/a"));
  EXPECT_THAT(Tell(EntryEvent(FAN_MOVED_FROM, "d", "a") + EntryEvent(FAN_CREATE, "d", "c") +
                   EntryEvent(FAN_MOVED_TO, "d", "b")),
              ElementsAre("delete /s/d/a", "create /s/d/c", "create /s/d/b"));
  EXPECT_THAT(Tell(EntryEvent(FAN_MOVED_FROM, "d", "a") + RawEvent(FAN_Q_OVERFLOW, "")),
              ElementsAre("delete /s/d/a", "doubt /s"));
}

TEST_F(EventTranslatorTest, HalvesThatDoNotBelongTogether) {
  EXPECT_THAT(
      Tell(EntryEvent(FAN_MOVED_FROM, "d", "a", "", 1) + EntryEvent(FAN_MOVED_TO, "d", "b", "", 2)),
      ElementsAre("delete /s/d/a", "create /s/d/b"));
  EXPECT_THAT(
      Tell(EntryEvent(FAN_MOVED_FROM, "d", "a") + EntryEvent(FAN_MOVED_TO | FAN_ONDIR, "d", "b")),
      ElementsAre("delete /s/d/a", "create dir /s/d/b"));
  EXPECT_THAT(
      Tell(EntryEvent(FAN_MOVED_FROM, "d", "a") + EntryEvent(FAN_MOVED_TO | FAN_CREATE, "d", "b")),
      ElementsAre("delete /s/d/a", "create /s/d/b"));
  EXPECT_THAT(Tell(EntryEvent(FAN_MOVED_FROM, "d", "a") + EntryEvent(FAN_MOVED_FROM, "d", "b") +
                   EntryEvent(FAN_MOVED_TO, "d", "c")),
              ElementsAre("delete /s/d/a", "rename /s/d/b -> /s/d/c"));
}

TEST_F(EventTranslatorTest, HalvesOfADirectoryMakeItAskAgain) {
  Tell(EntryEvent(FAN_CREATE, "d", "f"));
  lookup_.Put("d", "share", "e");
  EXPECT_THAT(
      Tell(EntryEvent(FAN_MOVED_FROM | FAN_ONDIR, "share", "d") +
           EntryEvent(FAN_MOVED_TO | FAN_ONDIR, "share", "e") + EntryEvent(FAN_CREATE, "d", "g")),
      ElementsAre("rename dir /s/d -> /s/e", "create /s/e/g"));
}

std::string FileEvent(std::uint64_t mask, const std::string& file) {
  return RawEvent(mask, Record(FAN_EVENT_INFO_TYPE_FID, file));
}

// As tools for backups make by the hundred thousand: each has an event of the file as such.
TEST_F(EventTranslatorTest, LinksAreNoReasonForDoubt) {
  for (std::size_t i = 0; i < EventTranslator::kMaxUnplaced + 100; ++i) {
    const std::string file = "f" + std::to_string(i);
    EXPECT_THAT(Tell(FileEvent(FAN_ATTRIB, file) + EntryEvent(FAN_CREATE, "out", "x", file)),
                IsEmpty());
  }
  EXPECT_THAT(Finish(), IsEmpty());
  EXPECT_THAT(Finish(), IsEmpty());
}

TEST_F(EventTranslatorTest, FileThatWasReachedWithoutItsDirectory) {
  lookup_.files["f"] = {HandleOf("d"), "f"};
  EXPECT_THAT(Tell(FileEvent(FAN_MODIFY, "f") + FileEvent(FAN_CLOSE_WRITE, "f")), IsEmpty());
  EXPECT_THAT(Finish(), ElementsAre("modify /s/d/f"));
  EXPECT_THAT(Finish(), IsEmpty());
}

TEST_F(EventTranslatorTest, FileThatNobodyFindsAnyMoreIsNotTold) {
  EXPECT_THAT(Tell(FileEvent(FAN_MODIFY | FAN_ATTRIB, "temporary")), IsEmpty());
  EXPECT_THAT(Finish(), IsEmpty());
}

TEST_F(EventTranslatorTest, FileWhosePlaceIsUnknownPutsAllInDoubtNowAndThen) {
  lookup_.fails = true;
  Tell(FileEvent(FAN_MODIFY, "f"));
  EXPECT_THAT(Finish(), ElementsAre("doubt /s"));
  Tell(FileEvent(FAN_MODIFY, "f"));
  for (int i = 1; i < EventTranslator::kDoubtPause; ++i) ASSERT_THAT(Finish(), IsEmpty()) << i;
  EXPECT_THAT(Finish(), ElementsAre("doubt /s"));
  for (int i = 0; i < 2 * EventTranslator::kDoubtPause; ++i) ASSERT_THAT(Finish(), IsEmpty());
}

TEST_F(EventTranslatorTest, NameLessThatADeletionExplains) {
  lookup_.places.erase("f");
  Tell(FileEvent(FAN_ATTRIB, "f"));
  EXPECT_THAT(Tell(EntryEvent(FAN_DELETE, "d", "link", "f")), ElementsAre("delete /s/d/link"));
  lookup_.fails = true;
  EXPECT_THAT(Finish(), IsEmpty());
  lookup_.fails = false;
  // It may be later than the next look.
  Tell(FileEvent(FAN_ATTRIB, "f"));
  EXPECT_THAT(Finish(), IsEmpty());
  Tell(EntryEvent(FAN_DELETE, "d", "link", "f"));
  lookup_.fails = true;
  EXPECT_THAT(Finish(), IsEmpty());
  // What was written meanwhile is not explained by it.
  Tell(FileEvent(FAN_ATTRIB | FAN_MODIFY, "f"));
  lookup_.fails = false;
  Tell(EntryEvent(FAN_DELETE, "d", "link", "f"));
  lookup_.fails = true;
  EXPECT_THAT(Finish(), ElementsAre("doubt /s"));
}

TEST_F(EventTranslatorTest, NameLessThatAMoveExplains) {
  Tell(RenameEvent("d", "new", "d", "old", "t") + FileEvent(FAN_ATTRIB, "f") +
       EntryEvent(FAN_MOVED_FROM, "d", "a") + EntryEvent(FAN_MOVED_TO, "d", "b") +
       FileEvent(FAN_ATTRIB, "f"));
  lookup_.fails = true;
  EXPECT_THAT(Finish(), IsEmpty());
  EXPECT_THAT(Finish(), IsEmpty());
  Tell(FileEvent(FAN_ATTRIB, "f"));
  EXPECT_THAT(Finish(), IsEmpty());
  EXPECT_THAT(Finish(), ElementsAre("doubt /s"));
}

TEST_F(EventTranslatorTest, MoveOfAnotherProcessExplainsNothing) {
  lookup_.fails = true;
  Tell(RawEvent(FAN_RENAME, "", 1) + RawEvent(FAN_ATTRIB, "", 2) +
       RawEvent(FAN_ATTRIB, Record(FAN_EVENT_INFO_TYPE_FID, "f"), 1));
  Finish();
  EXPECT_THAT(Finish(), IsEmpty());
  Tell(RawEvent(FAN_RENAME, "", 1) + RawEvent(FAN_ATTRIB, Record(FAN_EVENT_INFO_TYPE_FID, "f"), 2));
  Finish();
  EXPECT_THAT(Finish(), ElementsAre("doubt /s"));
}

TEST_F(EventTranslatorTest, FilesWithoutPlaceAreBounded) {
  for (std::size_t i = 0; i <= EventTranslator::kMaxUnplaced; ++i) {
    Tell(FileEvent(FAN_MODIFY, std::to_string(i)));
  }
  EXPECT_THAT(Finish(), ElementsAre("doubt /s"));
}

}  // namespace
}  // namespace quarry::notify
