#include "daemons/fileindexd/operation_handler.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tests/daemons/fileindexd/share_fixture.h"

namespace quarry::fileindexd {
namespace {

using fileindex::EVENT_ATTR;
using fileindex::EVENT_CREATE;
using fileindex::EVENT_DELETE;
using fileindex::EVENT_MODIFY;
using fileindex::EVENT_OVERFLOW;
using fileindex::EVENT_REINDEX;
using fileindex::EVENT_RENAME;
using fileindex::EVENT_UPDATE_CFG;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::UnorderedElementsAre;

class OperationHandlerTest : public ShareFixture {};

// Delete.

TEST_F(OperationHandlerTest, DeleteOfWhatIsGoneRemovesTheDocumentAndAllBelow) {
  Queue(EVENT_DELETE, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("delete below /v/s/a.txt", "delete /v/s/a.txt"));
}

TEST_F(OperationHandlerTest, DeleteOfWhatIsThereAgainIndexesIt) {
  disk_.WriteFile("/v/s/a.txt");
  Queue(EVENT_DELETE, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/a.txt content"));
}

TEST_F(OperationHandlerTest, DeleteWhereADirectoryIsNowComparesIt) {
  disk_.WriteFile("/v/s/a/b.txt");
  Queue(EVENT_DELETE, "/v/s/a");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/a", "upsert /v/s/a/b.txt content"));
}

// Index.

TEST_F(OperationHandlerTest, IndexReadsContentWhereTheFolderWantsIt) {
  SetFolders({DocumentFolder("/s")});
  disk_.WriteFile("/v/s/a.txt");
  disk_.WriteFile("/v/s/b.mp3");
  disk_.WriteFile("/v/s/c.unknown-kind");
  Queue(EVENT_CREATE, "/v/s/a.txt");
  Queue(EVENT_MODIFY, "/v/s/b.mp3");
  Queue(EVENT_MODIFY, "/v/s/c.unknown-kind");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/a.txt content", "upsert /v/s/b.mp3",
                                        "upsert /v/s/c.unknown-kind content"));
}

TEST_F(OperationHandlerTest, IndexReadsAFileAgainThoughItLooksTheSame) {
  disk_.WriteFile("/v/s/a.txt");
  Run(true);
  Queue(EVENT_MODIFY, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/a.txt content"));
}

TEST_F(OperationHandlerTest, IndexOfWhatHasVanishedRemovesIt) {
  Queue(EVENT_MODIFY, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("delete below /v/s/a.txt", "delete /v/s/a.txt"));
}

TEST_F(OperationHandlerTest, IndexOfAFileThatVanishesWhileItIsReadRemovesIt) {
  disk_.WriteFile("/v/s/a.txt");
  index_.SetHook([this](const std::string& command) {
    if (command == "upsert /v/s/a.txt content") disk_.Remove("/v/s/a.txt");
  });
  Queue(EVENT_MODIFY, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/a.txt content", "delete below /v/s/a.txt",
                                        "delete /v/s/a.txt"));
}

TEST_F(OperationHandlerTest, IndexOfAFileWhoseContentCannotBeReadKeepsItsName) {
  disk_.WriteFile("/v/s/a.txt");
  index_.MakeContentUnparsable("/v/s/a.txt");
  Queue(EVENT_MODIFY, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/a.txt content", "upsert /v/s/a.txt content",
                                        "upsert /v/s/a.txt"));
  EXPECT_EQ(1U, progress_.FailedCount());
  EXPECT_EQ(1U, index_.All().count("/v/s/a.txt"));
}

TEST_F(OperationHandlerTest, AFileThatCannotBeReadAtAllStopsNothing) {
  disk_.WriteFile("/v/s/a.txt");
  disk_.WriteFile("/v/s/b.txt");
  index_.MakeUnparsable("/v/s/a.txt");
  Queue(EVENT_MODIFY, "/v/s/a.txt");
  Queue(EVENT_MODIFY, "/v/s/b.txt");
  EXPECT_EQ(PassResult::kDone, Run());
  EXPECT_EQ(0U, index_.All().count("/v/s/a.txt"));
  EXPECT_EQ(1U, index_.All().count("/v/s/b.txt"));
  EXPECT_FALSE(HasSnapshot());
}

// The directory of what is created, deleted or renamed.

TEST_F(OperationHandlerTest, WhatChangesInADirectoryChangesItsAttributesOnce) {
  disk_.WriteFile("/v/s/d/a.txt");
  disk_.WriteFile("/v/s/d/b.txt");
  Run(true);
  disk_.Remove("/v/s/d/a.txt");
  disk_.WriteFile("/v/s/d/c.txt");
  Queue(EVENT_DELETE, "/v/s/d/a.txt");
  Queue(EVENT_CREATE, "/v/s/d/c.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("delete below /v/s/d/a.txt", "delete /v/s/d/a.txt",
                                        "upsert /v/s/d/c.txt content", "attributes /v/s/d"));
  ExpectInLine();
}

TEST_F(OperationHandlerTest, AMoveChangesBothDirectories) {
  disk_.WriteFile("/v/s/from/a.txt");
  disk_.AddDir("/v/s/to");
  Run(true);
  disk_.Rename("/v/s/from/a.txt", "/v/s/to/a.txt");
  Queue(EVENT_RENAME, "/v/s/to/a.txt", false, "/v/s/from/a.txt");
  Run();
  ExpectInLine();
}

TEST_F(OperationHandlerTest, ADirectoryThatDidNotChangeStaysAsItIs) {
  disk_.WriteFile("/v/s/a.txt");
  Run(true);
  disk_.WriteFile("/v/s/a.txt");
  Queue(EVENT_MODIFY, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/a.txt content"));
}

TEST_F(OperationHandlerTest, ADirectoryThatTheIndexDoesNotHaveComesWithItsOwnEvent) {
  disk_.WriteFile("/v/s/d/a.txt");
  Queue(EVENT_CREATE, "/v/s/d/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/d/a.txt content"));
}

// What is not indexed.

TEST_F(OperationHandlerTest, PlacesThatAreNotWantedAreRemoved) {
  SetFolders({Folder("/s/in")});
  disk_.AddOther("/v/s/in/link");
  disk_.WriteFile("/v/s/in/.DS_Store");
  disk_.WriteFile("/v/s/in/@eaDir/x.txt");
  disk_.WriteFile("/v/s/out.txt");
  disk_.AddMount("/v/s/in/mnt");
  disk_.WriteFile("/v/s/in/mnt/x.txt");
  for (const char* path : {"/v/s/in/link", "/v/s/in/.DS_Store", "/v/s/in/@eaDir/x.txt",
                           "/v/s/out.txt", "/v/s/in/mnt", "/v/s/in/mnt/x.txt"}) {
    index_.Put({path, false, "", ""});
    Queue(EVENT_MODIFY, path);
    EXPECT_THAT(CommandsOf(),
                ElementsAre("delete below " + std::string(path), "delete " + std::string(path)));
  }
  EXPECT_THAT(index_.All(), IsEmpty());
}

TEST_F(OperationHandlerTest, RecycleBinsAreNotIndexed) {
  bins_ = {"/v/s/#recycle"};
  disk_.WriteFile("/v/s/#recycle/a.txt");
  Queue(EVENT_MODIFY, "/v/s/#recycle/a.txt");
  EXPECT_THAT(CommandsOf(),
              ElementsAre("delete below /v/s/#recycle/a.txt", "delete /v/s/#recycle/a.txt"));
  // Once it is an ordinary directory again it is walked as one.
  bins_.clear();
  Queue(EVENT_REINDEX, "/v/s/#recycle");
  EXPECT_THAT(CommandsOf(),
              ElementsAre("upsert /v/s/#recycle", "upsert /v/s/#recycle/a.txt content"));
}

TEST_F(OperationHandlerTest, PlacesThatCannotBeAreIgnored) {
  for (const char* path : {"/v/s/../x", "/v/s/./x", "relative", "/", ""}) {
    Queue(EVENT_MODIFY, path);
  }
  Run();
  EXPECT_THAT(index_.Commands(), ::testing::Not(::testing::Contains(::testing::HasSubstr(".."))));
}

TEST_F(OperationHandlerTest, PlacesThatCannotBeSeenAreLeftAlone) {
  disk_.WriteFile("/v/s/d/a.txt");
  Run(true);
  disk_.MakeUnreadable("/v/s/d");
  Queue(EVENT_MODIFY, "/v/s/d/a.txt");
  Queue(EVENT_REINDEX, "/v/s/d", true);
  EXPECT_THAT(CommandsOf(), IsEmpty());
  EXPECT_EQ(1U, index_.All().count("/v/s/d/a.txt"));
  EXPECT_GT(progress_.FailedCount(), 0U);
}

TEST_F(OperationHandlerTest, PausedFoldersAreLeftAlone) {
  SetFolders({Folder("/s"), PausedFolder("/s/p")});
  disk_.WriteFile("/v/s/p/new.txt");
  index_.Put({"/v/s/p/gone.txt", false, "", ""});
  for (const unsigned int event : {EVENT_MODIFY, EVENT_ATTR, EVENT_DELETE, EVENT_REINDEX}) {
    Queue(event, "/v/s/p/new.txt");
    Queue(event, "/v/s/p/gone.txt");
    EXPECT_THAT(CommandsOf(), IsEmpty());
  }
  Queue(EVENT_OVERFLOW, "/v/s");
  CommandsOf();
  EXPECT_EQ(1U, index_.All().count("/v/s/p/gone.txt"));
  EXPECT_EQ(0U, index_.All().count("/v/s/p/new.txt"));
}

// Attributes.

TEST_F(OperationHandlerTest, AttributesAreMergedIntoTheDocument) {
  disk_.WriteFile("/v/s/a.txt");
  Run(true);
  disk_.Touch("/v/s/a.txt");
  Queue(EVENT_ATTR, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("attributes /v/s/a.txt"));
  ExpectInLine();
}

TEST_F(OperationHandlerTest, AttributesOfADirectoryAreMergedWithoutAWalk) {
  disk_.WriteFile("/v/s/d/a.txt");
  Run(true);
  Queue(EVENT_ATTR, "/v/s/d", true);
  EXPECT_THAT(CommandsOf(), ElementsAre("attributes /v/s/d"));
}

TEST_F(OperationHandlerTest, AttributesWithoutADocumentMakeOne) {
  disk_.WriteFile("/v/s/a.txt");
  Queue(EVENT_ATTR, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/a.txt content"));
}

TEST_F(OperationHandlerTest, AttributesOfWhatIsGoneRemoveIt) {
  Queue(EVENT_ATTR, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("delete below /v/s/a.txt", "delete /v/s/a.txt"));
}

TEST_F(OperationHandlerTest, AFileThatVanishesWhileItsAttributesAreReadIsRemoved) {
  disk_.WriteFile("/v/s/a.txt");
  Run(true);
  index_.SetHook([this](const std::string& command) {
    if (command == "attributes /v/s/a.txt") disk_.Remove("/v/s/a.txt");
  });
  Queue(EVENT_ATTR, "/v/s/a.txt");
  CommandsOf();
  EXPECT_EQ(0U, index_.All().count("/v/s/a.txt"));
}

TEST_F(OperationHandlerTest, AttributesOfAFileInADirectorysPlaceReplaceIt) {
  disk_.WriteFile("/v/s/d/a.txt");
  Run(true);
  disk_.Remove("/v/s/d");
  disk_.WriteFile("/v/s/d");
  Queue(EVENT_ATTR, "/v/s/d");
  EXPECT_THAT(CommandsOf(), ElementsAre("delete below /v/s/d", "upsert /v/s/d content"));
  EXPECT_EQ(0U, index_.All().count("/v/s/d/a.txt"));
}

// Rename.

TEST_F(OperationHandlerTest, RenameMovesTheDocument) {
  disk_.WriteFile("/v/s/a.txt");
  Run(true);
  disk_.Rename("/v/s/a.txt", "/v/s/b.txt");
  Queue(EVENT_RENAME, "/v/s/b.txt", false, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(),
              ElementsAre("delete below /v/s/b.txt", "delete /v/s/b.txt",
                          "rename /v/s/a.txt /v/s/b.txt", "delete below /v/s/a.txt",
                          "delete /v/s/a.txt", "attributes /v/s/b.txt", "attributes /v/s"));
}

TEST_F(OperationHandlerTest, RenameToAnotherExtensionReadsTheFileAgain) {
  disk_.WriteFile("/v/s/a.txt");
  Run(true);
  disk_.Rename("/v/s/a.txt", "/v/s/a.html");
  Queue(EVENT_RENAME, "/v/s/a.html", false, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ::testing::Contains("upsert /v/s/a.html content"));
}

TEST_F(OperationHandlerTest, RenameOfADirectoryMovesDocumentsWithoutReadingOne) {
  for (int i = 0; i < 100; ++i) disk_.WriteFile("/v/s/d/e/" + std::to_string(i) + ".txt");
  Run(true);
  disk_.Rename("/v/s/d", "/v/s/f");
  Queue(EVENT_RENAME, "/v/s/f", true, "/v/s/d");
  EXPECT_THAT(CommandsOf(), ElementsAre("delete below /v/s/f", "delete /v/s/f",
                                        "rename /v/s/d /v/s/f", "delete below /v/s/d",
                                        "delete /v/s/d", "attributes /v/s/f", "attributes /v/s"));
  EXPECT_EQ(103U, index_.All().size());
}

TEST_F(OperationHandlerTest, RenameOfWhatWasNotIndexedIndexesIt) {
  disk_.WriteFile("/v/s/b.txt");
  Queue(EVENT_RENAME, "/v/s/b.txt", false, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("delete below /v/s/a.txt", "delete /v/s/a.txt",
                                        "upsert /v/s/b.txt content"));
}

TEST_F(OperationHandlerTest, RenameOutOfTheFoldersRemoves) {
  SetFolders({Folder("/s/in")});
  disk_.WriteFile("/v/s/in/a.txt");
  Run(true);
  disk_.Rename("/v/s/in/a.txt", "/v/s/a.txt");
  Queue(EVENT_RENAME, "/v/s/a.txt", false, "/v/s/in/a.txt");
  EXPECT_THAT(CommandsOf(), ::testing::Not(::testing::Contains(::testing::StartsWith("rename"))));
  EXPECT_EQ(0U, index_.All().count("/v/s/in/a.txt"));
  EXPECT_EQ(0U, index_.All().count("/v/s/a.txt"));
}

// A pass that is done again may find another file at the old place, which looks the same.
TEST_F(OperationHandlerTest, RenameMovesNoDocumentOfAnotherFile) {
  disk_.WriteFile("/v/s/b.txt");
  disk_.WriteFile("/v/s/a.txt");
  Run(true);
  Document twin = index_.All()["/v/s/a.txt"];
  twin.content_stamp = disk_.Peek("/v/s/b.txt").content_stamp;
  index_.Put(twin);
  index_.Delete("/v/s/b.txt");
  Queue(EVENT_RENAME, "/v/s/b.txt", false, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/a.txt content", "upsert /v/s/b.txt content"));
}

TEST_F(OperationHandlerTest, RenameOfWhatHasMovedOnRemovesIt) {
  disk_.WriteFile("/v/s/a.txt");
  Run(true);
  disk_.Remove("/v/s/a.txt");
  Queue(EVENT_RENAME, "/v/s/b.txt", false, "/v/s/a.txt");
  CommandsOf();
  EXPECT_EQ(0U, index_.All().count("/v/s/a.txt"));
  EXPECT_EQ(0U, index_.All().count("/v/s/b.txt"));
}

TEST_F(OperationHandlerTest, RenameOverAFileLeavesOneDocument) {
  disk_.WriteFile("/v/s/a.txt");
  disk_.WriteFile("/v/s/b.txt");
  Run(true);
  disk_.Rename("/v/s/a.txt", "/v/s/b.txt");
  Queue(EVENT_RENAME, "/v/s/b.txt", false, "/v/s/a.txt");
  CommandsOf();
  EXPECT_EQ(0U, index_.All().count("/v/s/a.txt"));
  EXPECT_EQ(1U, index_.All().count("/v/s/b.txt"));
}

TEST_F(OperationHandlerTest, RenameFindsWhatTheOldPlaceDidNotHave) {
  disk_.WriteFile("/v/s/d/a.txt");
  Run(true);
  disk_.WriteFile("/v/s/d/new.txt");
  disk_.Rename("/v/s/d", "/v/s/e");
  Queue(EVENT_RENAME, "/v/s/e", true, "/v/s/d");
  EXPECT_THAT(CommandsOf(), ::testing::Contains("upsert /v/s/e/new.txt content"));
}

TEST_F(OperationHandlerTest, RenameIntoItselfOnlyCompares) {
  disk_.WriteFile("/v/s/d/a.txt");
  Run(true);
  Queue(EVENT_RENAME, "/v/s/d/e", true, "/v/s/d");
  EXPECT_THAT(CommandsOf(), ::testing::Not(::testing::Contains(::testing::StartsWith("rename"))));
  EXPECT_EQ(1U, index_.All().count("/v/s/d/a.txt"));
}

TEST_F(OperationHandlerTest, RenameAroundAPausedFolderMovesNothing) {
  disk_.WriteFile("/v/s/d/p/a.txt");
  Run(true);
  SetFolders({Folder("/s"), PausedFolder("/s/d/p")});
  disk_.Rename("/v/s/d", "/v/s/e");
  Queue(EVENT_RENAME, "/v/s/e", true, "/v/s/d");
  EXPECT_THAT(CommandsOf(), ::testing::Not(::testing::Contains(::testing::StartsWith("rename"))));
  EXPECT_EQ(1U, index_.All().count("/v/s/d/p/a.txt"));
}

TEST_F(OperationHandlerTest, RenameOfTheShareMovesEachFolder) {
  // The index still has the places of the share's old name.
  disk_.WriteFile("/v/s/x/a.txt");
  disk_.WriteFile("/v/s/y/z/b.txt");
  SetFolders({Folder("/s/x"), Folder("/s/y/z")});
  Run(true);
  for (const auto& [path, document] : index_.All()) {
    Document old = document;
    old.path = "/v/old" + path.substr(4);
    index_.Put(old);
    index_.Delete(path);
  }
  Queue(EVENT_RENAME, "/v/s", true, "/v/old");
  const std::vector<std::string> commands = CommandsOf();
  EXPECT_THAT(commands, ::testing::Contains("rename /v/old/x /v/s/x"));
  EXPECT_THAT(commands, ::testing::Contains("rename /v/old/y/z /v/s/y/z"));
  EXPECT_THAT(commands, ::testing::Not(::testing::Contains(::testing::StartsWith("upsert"))));
  ExpectInLine();
}

TEST_F(OperationHandlerTest, RenameWithoutAnOldPlaceIndexesTheNewOne) {
  disk_.WriteFile("/v/s/a.txt");
  Queue(EVENT_RENAME, "/v/s/a.txt");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/a.txt content"));
}

// Reindex, configuration update, full reindex.

TEST_F(OperationHandlerTest, ReindexComparesThePlaceAndAllBelow) {
  disk_.WriteFile("/v/s/d/a.txt");
  disk_.WriteFile("/v/s/d/e/b.txt");
  disk_.WriteFile("/v/s/other.txt");
  Queue(EVENT_REINDEX, "/v/s/d");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/d", "upsert /v/s/d/a.txt content",
                                        "upsert /v/s/d/e", "upsert /v/s/d/e/b.txt content"));
  Queue(EVENT_REINDEX, "/v/s/d");
  EXPECT_THAT(CommandsOf(), IsEmpty());
}

TEST_F(OperationHandlerTest, ATreeThatIsNewIsNotAskedForDirectoryByDirectory) {
  disk_.WriteFile("/v/s/d/a.txt");
  disk_.WriteFile("/v/s/d/e/f/b.txt");
  std::vector<std::string> questions;
  index_.SetHook([&](const std::string& command) {
    if (command.rfind("children ", 0) == 0) questions.push_back(command);
  });
  Queue(EVENT_REINDEX, "/v/s");
  EXPECT_EQ(6U, CommandsOf().size());
  EXPECT_THAT(questions, IsEmpty());
  ExpectInLine();
}

TEST_F(OperationHandlerTest, WhatIsLeftOfANewTreeIsFoundWithoutTheDirectoriesAboveIt) {
  disk_.WriteFile("/v/s/d/e/f/b.txt");
  index_.Put({"/v/s/d/e/f/gone.txt", false, "", ""});
  Queue(EVENT_REINDEX, "/v/s");
  EXPECT_THAT(CommandsOf(), ::testing::Contains("delete /v/s/d/e/f/gone.txt"));
  ExpectInLine();
}

TEST_F(OperationHandlerTest, ConfigurationUpdateReadsOnlyWhatTheNewKindsAskFor) {
  disk_.WriteFile("/v/s/a.txt");
  disk_.WriteFile("/v/s/b.mp3");
  Run(true);
  SetFolders({DocumentFolder("/s")});
  Queue(EVENT_UPDATE_CFG, "/v/s");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/b.mp3"));
  SetFolders({Folder("/s")});
  Queue(EVENT_UPDATE_CFG, "/v/s");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s/b.mp3 content"));
}

TEST_F(OperationHandlerTest, RemovingAFolderKeepsTheFoldersBelowIt) {
  disk_.WriteFile("/v/s/a/x.txt");
  disk_.WriteFile("/v/s/a/b/c/y.txt");
  SetFolders({Folder("/s/a"), Folder("/s/a/b/c")});
  Run(true);
  SetFolders({Folder("/s/a/b/c")});
  Queue(EVENT_UPDATE_CFG, "/v/s/a");
  EXPECT_THAT(CommandsOf(), ::testing::Not(::testing::Contains(::testing::StartsWith("upsert"))));
  EXPECT_THAT(index_.All(), UnorderedElementsAre(::testing::Key("/v/s/a/b/c"),
                                                 ::testing::Key("/v/s/a/b/c/y.txt")));
}

TEST_F(OperationHandlerTest, OverflowComparesEveryFolderAndDropsWhatNoneGoverns) {
  SetFolders({Folder("/s/a"), Folder("/s/b/@eaDir/c")});
  disk_.WriteFile("/v/s/a/x.txt");
  disk_.WriteFile("/v/s/b/@eaDir/c/y.txt");
  disk_.WriteFile("/v/s/z.txt");
  index_.Put({"/v/s", true, "", ""});
  index_.Put({"/v/s/z.txt", false, "", ""});
  index_.Put({"/v/s/b/gone.txt", false, "", ""});
  Queue(EVENT_OVERFLOW, "");
  Queue(EVENT_MODIFY, "/v/s/ignored");
  CommandsOf();
  ExpectInLine();
  EXPECT_EQ(4U, index_.All().size());
}

TEST_F(OperationHandlerTest, AFolderBehindAnUnwantedPlaceIsFoundByAWalkAroundIt) {
  SetFolders({Folder("/s"), Folder("/s/@eaDir/f")});
  disk_.WriteFile("/v/s/@eaDir/f/a.txt");
  disk_.WriteFile("/v/s/@eaDir/b.txt");
  Queue(EVENT_OVERFLOW, "");
  CommandsOf();
  ExpectInLine();
  EXPECT_EQ(1U, index_.All().count("/v/s/@eaDir/f/a.txt"));
  EXPECT_EQ(0U, index_.All().count("/v/s/@eaDir/b.txt"));
}

TEST_F(OperationHandlerTest, DocumentsOutsideTheShareAreOrphans) {
  index_.Put({"/elsewhere/s/a.txt", false, "", ""});
  Queue(EVENT_OVERFLOW, "");
  CommandsOf();
  EXPECT_EQ(0U, index_.All().count("/elsewhere/s/a.txt"));
}

TEST_F(OperationHandlerTest, DocumentsOfPausedFoldersAreNoOrphans) {
  SetFolders({Folder("/s"), PausedFolder("/s/p")});
  index_.Put({"/v/s/p", true, "", ""});
  index_.Put({"/v/s/p/gone.txt", false, "", ""});
  Queue(EVENT_OVERFLOW, "");
  EXPECT_THAT(CommandsOf(), ElementsAre("upsert /v/s"));
  EXPECT_EQ(1U, index_.All().count("/v/s/p/gone.txt"));
}

TEST_F(OperationHandlerTest, OrphansAreFoundByAFullReindex) {
  disk_.WriteFile("/v/s/a.txt");
  // No document of /v/s/gone leads to this one.
  index_.Put({"/v/s/gone/deep/b.txt", false, "", ""});
  Queue(EVENT_OVERFLOW, "");
  CommandsOf();
  ExpectInLine();
}

}  // namespace
}  // namespace quarry::fileindexd
