// FolderReindex and FolderDelete, by the whole sequence of what they do.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <string>
#include <utility>
#include <vector>

#include "common/json.h"
#include "fileindex/index_mgr.h"
#include "tests/fileindex/operation_fixture.h"

namespace quarry::fileindex {
namespace {

using ::testing::ElementsAre;
using ::testing::ElementsAreArray;
using ::testing::IsEmpty;

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

// What both say about a list of the wrong shape.
class PathListTest : public OperationTest {
 protected:
  void ExpectRefused(const std::string& function, const std::string& list, const std::string& text,
                     const std::string& condition) {
    Begin();
    EXPECT_EQ(FailureOf([&] {
                function == "FolderDelete" ? FolderDelete(Parse(list)) : FolderReindex(Parse(list));
              }),
              "120 " + text);
    EXPECT_THAT(effects_->All(), IsEmpty());
    ASSERT_EQ(fake::Logs().size(), 1U);
    EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
              fake::AnyLine(fake::LogHead("index_mgr", 1, function)) + "Failed [" + condition +
                  "], reason: " + text);
    End();
  }
};

TEST_F(PathListTest, WhatIsNoArrayIsRefused) {
  for (const char* function : {"FolderReindex", "FolderDelete"}) {
    for (const char* text : {"\"/photo/a\"", "null", "{\"a\":1}", "5"}) {
      ExpectRefused(function, text, text, "!path_list.isArray()");
    }
  }
}

TEST_F(PathListTest, ElementsThatAreNoStringsAreRefused) {
  SaveList({Record("/photo/a")});
  for (const char* function : {"FolderReindex", "FolderDelete"}) {
    for (const char* text : {"5", "null", "[\"/photo/a\"]", "{}"}) {
      ExpectRefused(function, std::string("[") + text + ",\"/photo/a\"]", text, "!it.isString()");
    }
  }
}

TEST_F(PathListTest, AListThatCannotBeLoadedIsReportedFirst) {
  test::WriteFile(kFileIndexFoldersCfgPath, "[");
  const std::string failure = "504 Cannot load json: " + kFileIndexFoldersCfgPath;
  EXPECT_EQ(FailureOf([] { FolderDelete(Parse("5")); }), failure);
  EXPECT_EQ(FailureOf([] { FolderReindex(Parse("5")); }), failure);
  test::WriteFile(kFileIndexStatusCfgPath, "[");
  EXPECT_EQ(FailureOf([] { FolderReindex(Parse("5")); }),
            "504 Cannot load json: " + kFileIndexStatusCfgPath);
}

// ---- FolderReindex

class FolderReindexTest : public OperationTest {
 protected:
  FolderReindexTest() { SaveList({Record("/photo/a"), Record("/music")}); }

  static void SetStatus(const std::string& text) { test::WriteFile(kFileIndexStatusCfgPath, text); }
};

TEST_F(FolderReindexTest, QueuesEachPathInItsOrder) {
  Begin();
  FolderReindex(Parse(R"(["/photo/b","/music","/photo/a"])"));
  EXPECT_THAT(effects_->All(),
              ElementsAre("queue photo = " + ReindexLine("/photo/b"),
                          "queue music = " + ReindexLine("/music"),
                          "queue photo = " + ReindexLine("/photo/b") + ReindexLine("/photo/a")));
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(FolderReindexTest, PathsOfSharesWithoutFoldersArePassedOver) {
  SaveList({Record("/photo/a")});
  fake::AddShare("other", volume_ + "/other");
  Begin();
  FolderReindex(Parse(R"(["/music","/other/x","/gone/x","/photo/a"])"));
  EXPECT_THAT(effects_->All(), ElementsAre("queue photo = " + ReindexLine("/photo/a")));
}

TEST_F(FolderReindexTest, AnEmptyListDoesNothing) {
  SetStatus(R"({"share":{"photo":3}})");
  Begin();
  FolderReindex(Parse("[]"));
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(FolderReindexTest, AShareWhoseIndexMustBeRebuiltGetsANewOne) {
  SetStatus(R"({"share":{"music":2,"photo":3}})");
  Begin();
  FolderReindex(Parse(R"(["/photo/a","/photo/b","/music"])"));
  // Bits are taken away only with the one that asks for a reindex.
  EXPECT_THAT(
      effects_->All(),
      ElementsAre("engine index_delete fileindex_music", "engine index_create fileindex_music",
                  "queue music = " + ReindexLine("/music"), "engine index_delete fileindex_photo",
                  "engine index_create fileindex_photo", "queue photo = " + ReindexLine("/photo"),
                  kBecomeRoot, R"(status = {"share":{"music":2,"photo":0}})"));
}

TEST_F(FolderReindexTest, AnIndexThatCannotBeRebuiltEndsItBeforeTheNext) {
  SetStatus(R"({"share":{"music":3,"photo":3}})");
  for (const char* command : {"index_delete", "index_create"}) {
    Begin();
    effects_->Refuse(command, 777);
    EXPECT_EQ(FailureOf([] { FolderReindex(Parse(R"(["/photo/a","/music"])")); }),
              "777 Request failed, msg=no");
    ASSERT_FALSE(effects_->All().empty());
    EXPECT_EQ(effects_->All().back(), std::string("engine ") + command + " fileindex_music");
    EXPECT_EQ(test::ReadFile(kFileIndexStatusCfgPath), R"({"share":{"music":3,"photo":3}})");
    End();
  }
}

TEST_F(FolderReindexTest, TheNeedOfAReindexIsForgottenForTheSharesThatWereTouched) {
  SetStatus(R"({"share":{"music":1,"other":1,"photo":5}})");
  Begin();
  FolderReindex(Parse(R"(["/photo/a","/music"])"));
  EXPECT_THAT(effects_->All(),
              ElementsAre("queue photo = " + ReindexLine("/photo/a"),
                          "queue music = " + ReindexLine("/music"), kBecomeRoot,
                          R"(status = {"share":{"music":0,"other":1,"photo":5}})", kBecomeRoot,
                          R"(status = {"share":{"music":0,"other":1,"photo":4}})"));
}

TEST_F(FolderReindexTest, WhatWasQueuedBeforeAWrongElementStays) {
  SetStatus(R"({"share":{"photo":1}})");
  Begin();
  EXPECT_EQ(FailureOf([] { FolderReindex(Parse(R"(["/photo/a",5,"/music"])")); }), "120 5");
  EXPECT_EQ(FailureOf([] { FolderReindex(Parse(R"(["photo/a"])")); }), "120 photo/a");
  EXPECT_THAT(effects_->All(), ElementsAre("queue photo = " + ReindexLine("/photo/a")));
}

TEST_F(FolderReindexTest, EverySingleFailureEndsIt) {
  ExpectEveryFailureToEndIt(
      [] {
        SaveList({Record("/photo/a"), Record("/music")});
        SetStatus(R"({"share":{"music":1,"photo":3}})");
      },
      [] { FolderReindex(Parse(R"(["/photo/a","/music"])")); });
}

// ---- FolderDelete

class FolderDeleteTest : public OperationTest {
 protected:
  FolderDeleteTest() { Prepare(); }

  static void Prepare() {
    SaveList({Record("/photo/a", "dp"), Record("/photo/b", "d"), Record("/music", "a")});
    test::WriteFile(kFileIndexStatusCfgPath, R"({"share":{"music":1,"photo":2}})");
  }

  // What is done to a share that has lost its last folder.
  Texts Removed(const std::string& share, const std::string& status) const {
    const std::string remove = "call HLIBCExec(/bin/rm, -rf, ";
    return {"engine index_delete fileindex_" + share,
            Unmonitored(share),
            remove + QueueOf(share) + ")",
            remove + QueueOf(share) + ".tmp)",
            remove + fake::IndexPath(volume_ + "/" + share) + ")",
            kBecomeRoot,
            "status = " + status};
  }
};

TEST_F(FolderDeleteTest, DoesAllOfItInThisOrder) {
  Begin();
  EXPECT_EQ(FailureOf([] { FolderDelete(Parse(R"(["/photo/a","/music"])")); }), "");
  EXPECT_THAT(
      effects_->All(),
      ElementsAreArray(Removed("music", R"({"share":{"photo":2}})") +
                       Texts{Monitored("photo", {"/photo/b"}), kBecomeRoot,
                             Saved({Record("/photo/b", "d")}), Told("music", false),
                             Told("photo", false), "queue photo = " + Line("/photo/a", "davp")}));
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(FolderDeleteTest, TheLastFolderStopsTheServices) {
  SaveList({Record("/music", "a")});
  Begin();
  FolderDelete(Parse(R"(["/music"])"));
  EXPECT_THAT(
      effects_->All(),
      ElementsAreArray(Removed("music", R"({"share":{"photo":2}})") +
                       Texts{kBecomeRoot, "list = []", Told("music", false)} + ServicesOff()));
}

TEST_F(FolderDeleteTest, AFolderBelowAnotherQueuesTheKindsThatDiffer) {
  SaveList({Record("/photo/a", "dv"), Record("/photo/a/deep", "vp")});
  Begin();
  FolderDelete(Parse(R"(["/photo/a/deep"])"));
  EXPECT_THAT(effects_->All(), ElementsAre(Monitored("photo", {"/photo/a"}), kBecomeRoot,
                                           Saved({Record("/photo/a", "dv")}), Told("photo", false),
                                           "queue photo = " + Line("/photo/a/deep", "dp")));
}

TEST_F(FolderDeleteTest, EachElementIsComparedWithWhatTheOnesBeforeItLeft) {
  SaveList({Record("/photo/a", "dv"), Record("/photo/a/deep", "vp"), Record("/photo/b")});
  Begin();
  FolderDelete(Parse(R"(["/photo/a","/photo/a/deep"])"));
  EXPECT_EQ(effects_->All().back(),
            "queue photo = " + Line("/photo/a", "davp") + Line("/photo/a/deep", "davp"));
}

TEST_F(FolderDeleteTest, AnEmptyListSaves) {
  test::WriteFile(kFileIndexFoldersCfgPath, " []");
  Begin();
  FolderDelete(Parse("[]"));
  EXPECT_THAT(effects_->All(), ElementsAreArray(Texts{kBecomeRoot, "list = []"} + ServicesOff()));
}

TEST_F(FolderDeleteTest, WhatIsNoFolderIsRefusedBeforeAnythingIsChanged) {
  const std::string logged = fake::AnyLine(fake::LogHead("folder_mgr", 1, "Get")) +
                             "Failed [it == folders_.end()], reason: ";
  for (const char* list : {R"(["/music","/photo/c"])", R"(["/music","/photo/a/deep"])",
                           R"(["/music","/music"])", R"(["/gone/x"])", R"(["music"])"}) {
    Begin();
    const std::string before = StoredList();
    EXPECT_EQ(FailureOf([&] { FolderDelete(Parse(list)); }), "902 ") << list;
    EXPECT_THAT(effects_->All(), IsEmpty());
    EXPECT_EQ(StoredList(), before);
    ASSERT_EQ(fake::Logs().size(), 1U);
    EXPECT_EQ(fake::AnyLine(fake::Logs()[0]), logged);
    End();
  }
}

TEST_F(FolderDeleteTest, AFolderOfAVanishedShareIsRefused) {
  fake::RemoveShare("music");
  Begin();
  EXPECT_EQ(FailureOf([] { FolderDelete(Parse(R"(["/music"])")); }).substr(0, 3), "800");
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(FolderDeleteTest, ALockThatCannotBeHad) {
  test::MakeDirs(kFolderLock);
  test::WriteFile(kFileIndexFoldersCfgPath, "[");  // looked at under the lock only
  Begin();
  std::string failure;
  try {
    FolderDelete(Parse(R"(["/music"])"));
  } catch (const Error& error) {
    failure = std::to_string(error.code());
  }
  EXPECT_EQ(failure, "506");
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(FolderDeleteTest, TheDaemonCannotBeTold) {
  Begin();
  daemon_.reset();
  EXPECT_EQ(FailureOf([] { FolderDelete(Parse(R"(["/photo/a"])")); }).substr(0, 16),
            "502 write failed");
  EXPECT_THAT(effects_->All(),
              ElementsAre(Monitored("photo", {"/photo/b"}), kBecomeRoot,
                          Saved({Record("/photo/b", "d"), Record("/music", "a")})));
}

TEST_F(FolderDeleteTest, EverySingleFailureEndsIt) {
  ExpectEveryFailureToEndIt(&Prepare, [] { FolderDelete(Parse(R"(["/photo/a","/music"])")); });
}

TEST_F(FolderDeleteTest, EverySingleFailureEndsTheRemovalOfTheLastFolder) {
  ExpectEveryFailureToEndIt(
      [] {
        SaveList({Record("/music")});
        fake::SetSpotlight(true);
      },
      [] { FolderDelete(Parse(R"(["/music"])")); });
}

}  // namespace
}  // namespace quarry::fileindex
