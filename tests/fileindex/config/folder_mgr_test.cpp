#include "fileindex/config/folder_mgr.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <memory>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include "common/file_util.h"
#include "common/json.h"
#include "common/paths.h"
#include "tests/fileindex/config/folder_mgr_fixture.h"

namespace quarry::fileindex {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

// ---- The file

TEST_F(FolderMgrTest, TheFileHasItsFixedPlace) {
  EXPECT_EQ(kFileIndexFoldersCfgPath, RootedPath("/var/packages/Quarry/etc/fileindex.folders"));
  EXPECT_EQ(kFileIndexFoldersMax, 1000U);
}

TEST_F(FolderMgrTest, NoFileAndAnEmptyArrayAreAnEmptyList) {
  EXPECT_THAT(FolderMgr().GetFolders(), IsEmpty());
  Store("[]");
  EXPECT_THAT(FolderMgr().GetFolders(), IsEmpty());
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(FolderMgrTest, WhatIsSavedIsLoadedInItsOrder) {
  FolderMgr folders = ListOf({"/s/b", "/s/a", "/t"});
  folders.GetFolders()[1]->SetPaused(true);
  folders.GetFolders()[2]->SetVolumeToBeClean("/volume1");
  folders.Save();
  const FolderMgr loaded;
  EXPECT_THAT(Paths(loaded.GetFolders()), ElementsAre("/s/b", "/s/a", "/t"));
  EXPECT_TRUE(loaded.GetFolders()[1]->IsPaused());
  EXPECT_EQ(loaded.GetFolders()[2]->GetVolumeToBeClean(), "/volume1");
}

TEST_F(FolderMgrTest, TheFileIsAnArrayOfRecords) {
  FolderMgr().Save();
  EXPECT_EQ(Stored(), "[]");
  ListOf({"/s/a"}).Save();
  EXPECT_EQ(Stored(), R"([{"audio":true,"document":true,"name":"n","path":"/s/a","paused":false,)"
                      R"("photo":true,"privileged":false,"video":true,"volume_to_be_clean":""}])");
}

TEST_F(FolderMgrTest, NamesAreKeptByteForByte) {
  FolderMgr folders;
  const std::string name = "caf\xc3\xa9 \xff \"\\\n";
  Upsert(folders, Make("/s/\xff", "d", name));
  folders.Save();
  EXPECT_EQ(FolderMgr().GetFolders()[0]->GetName(), name);
  EXPECT_TRUE(FolderMgr().HasFolder("/s/\xff"));
}

TEST_F(FolderMgrTest, AFileThatIsNotJsonIsRefused) {
  for (const std::string& text : {std::string(), std::string("["), std::string("[]x")}) {
    Store(text);
    errno = 0;
    fake::ClearLogs();
    EXPECT_EQ(LoadFailure(), "504 Cannot load json: " + kFileIndexFoldersCfgPath) << text;
    ASSERT_EQ(fake::Logs().size(), 1U);
    EXPECT_EQ(fake::Logs()[0].substr(0, fake::Logs()[0].find(" [err: ")),
              fake::LogHead("folder_mgr", 39, "FolderMgr") +
                  "Failed [IsFileExist(kFileIndexFoldersCfgPath) && "
                  "!folders.fromFile(kFileIndexFoldersCfgPath)], reason: Cannot load json: " +
                  kFileIndexFoldersCfgPath);
    EXPECT_EQ(Stored(), text);
  }
}

TEST_F(FolderMgrTest, AFileNestedBeyondReasonIsRefused) {
  Store(std::string(100000, '[') + std::string(100000, ']'));
  EXPECT_EQ(LoadFailure(), "504 Cannot load json: " + kFileIndexFoldersCfgPath);
}

TEST_F(FolderMgrTest, SomethingThatIsNoRegularFileIsRefused) {
  const std::string refused = "504 Cannot load json: " + kFileIndexFoldersCfgPath;
  test::MakeDirs(kFileIndexFoldersCfgPath);
  EXPECT_EQ(LoadFailure(), refused);
  ASSERT_EQ(rmdir(kFileIndexFoldersCfgPath.c_str()), 0);
  ASSERT_EQ(symlink("/nowhere/at/all", kFileIndexFoldersCfgPath.c_str()), 0);
  EXPECT_EQ(LoadFailure(), refused);
  ASSERT_EQ(unlink(kFileIndexFoldersCfgPath.c_str()), 0);
  ASSERT_EQ(mkfifo(kFileIndexFoldersCfgPath.c_str(), 0600), 0);
  EXPECT_EQ(LoadFailure(), refused);
}

TEST_F(FolderMgrTest, ARootThatIsNoArrayIsRefused) {
  for (const char* text : {"{}", "null", "\"x\"", "5", "true"}) {
    Store(text);
    EXPECT_EQ(LoadFailure(), std::string("120 Not an array, data=") + text);
    EXPECT_EQ(Stored(), text);
  }
}

TEST_F(FolderMgrTest, OneBadRecordFailsTheWholeLoad) {
  const std::string good = toString(Make("/s/a", "d")->GetData());
  Store("[" + good + ",5]");
  EXPECT_EQ(LoadFailure(), "120 Not an object, data=5");
  Store("[" + good + ",{\"name\":\"n\"}]");
  EXPECT_EQ(LoadFailure(), "120 Missing property: path, data={\"name\":\"n\"}");
}

TEST_F(FolderMgrTest, LoadingTestsNeitherNumberNorRepetitionNorPaths) {
  Json::Value list(Json::arrayValue);
  for (int i = 0; i < 1001; ++i) list.append(Make("/gone", "d")->GetData());
  list.append(Make("no slash", "d")->GetData());
  Store(toString(list));
  EXPECT_EQ(FolderMgr().GetFolders().size(), 1002U);
}

TEST_F(FolderMgrTest, TheFileIsWrittenAsRootAndReadableByAll) {
  FolderMgr().Save();
  EXPECT_EQ(test::FileMode(kFileIndexFoldersCfgPath), 0644U);
  EXPECT_EQ(fake::CallsOf("ResetCredentialsByName").front(), "ResetCredentialsByName(root, true)");
}

TEST_F(FolderMgrTest, NothingIsWrittenWhereRootCannotBeBecome) {
  fake::FailCall("ResetCredentialsByName");
  EXPECT_EQ(FailureOf([] { FolderMgr().Save(); }).substr(0, 3), "503");
  EXPECT_EQ(access(kFileIndexFoldersCfgPath.c_str(), F_OK), -1);
}

TEST_F(FolderMgrTest, AFailedWriteIsReportedAndKeepsTheOldFile) {
  Store("[]");
  const FolderMgr folders = ListOf({"/s/a"});
  fake::FailEverySystemCall("rename", EIO);
  EXPECT_EQ(FailureOf([&] { folders.Save(); }), "505 " + kFileIndexFoldersCfgPath);
  EXPECT_THAT(fake::Logs(),
              ElementsAre(fake::LogHead("folder_mgr", 229, "Save") +
                          "Failed [!folders.toFile(kFileIndexFoldersCfgPath)], reason: " +
                          kFileIndexFoldersCfgPath + " [err: Input/output error]"));
  EXPECT_EQ(Stored(), "[]");
}

TEST_F(FolderMgrTest, AFailedChangeOfModeIsReported) {
  const FolderMgr folders;
  fake::FailEverySystemCall("chmod", EPERM);
  EXPECT_EQ(FailureOf([&] { folders.Save(); }), "502 " + kFileIndexFoldersCfgPath);
  EXPECT_THAT(fake::Logs(),
              ElementsAre(fake::LogHead("folder_mgr", 231, "Save") +
                          "Failed [-1 == chmod(kFileIndexFoldersCfgPath, 0644)], reason: " +
                          kFileIndexFoldersCfgPath + " [err: Operation not permitted]"));
}

// ---- Questions

TEST_F(FolderMgrTest, GetHandsOutTheFirstRecordOfThePath) {
  Store("[" + toString(Make("/s/a", "d", "one")->GetData()) + "," +
        toString(Make("/s/a", "d", "two")->GetData()) + "]");
  FolderPtr folder;
  FolderMgr().Get(folder, "/s/a");
  EXPECT_EQ(folder->GetName(), "one");
}

TEST_F(FolderMgrTest, GetOfAnUnknownPathIsLoggedAndFails) {
  const FolderMgr folders = ListOf({"/s/a"});
  for (const char* path : {"/s", "/s/a/", "/S/a", "", "/s/a/b"}) {
    fake::ClearLogs();
    FolderPtr folder = Make("/kept", "");
    EXPECT_EQ(FailureOf([&] { folders.Get(folder, path); }), "902 ");
    EXPECT_EQ(PathOf(folder), "/kept");
    ASSERT_EQ(fake::Logs().size(), 1U);
    EXPECT_EQ(fake::AnyLine(fake::Logs()[0]), fake::AnyLine(fake::LogHead("folder_mgr", 1, "Get")) +
                                                  "Failed [it == folders_.end()], reason: ");
  }
}

TEST_F(FolderMgrTest, HasFolderComparesWholePaths) {
  const FolderMgr folders = ListOf({"/s/a"});
  EXPECT_TRUE(folders.HasFolder("/s/a"));
  for (const char* path : {"/s", "/s/a/", "/s/ab", "/s/a/b", ""}) {
    EXPECT_FALSE(folders.HasFolder(path)) << path;
  }
}

TEST_F(FolderMgrTest, TheDeepestFolderGoverns) {
  const FolderMgr folders = ListOf({"/s/a", "/s/a/b"});
  const std::vector<std::pair<std::string, std::string>> rows = {
      {"/s/a/b/c.txt", "/s/a/b"}, {"/s/a/b", "/s/a/b"}, {"/s/a/x", "/s/a"},
      {"/s/a/bc", "/s/a"},        {"/s/a", "/s/a"},     {"/s/a/", "/s/a"},
      {"/s/ab", "none"},          {"/s", "none"},       {"/s/", "none"},
      {"/s/A", "none"},           {"", "none"},         {"/t/a", "none"},
      {"/s/a//b", "/s/a"},        {"/s/a/b/", "/s/a/b"}};
  for (const auto& [place, governing] : rows) {
    EXPECT_EQ(PathOf(folders.GetMostSuitableCfg(volume_ + place)), governing) << place;
    EXPECT_EQ(folders.IsFullPathIndexed(volume_ + place), governing != "none") << place;
  }
  EXPECT_EQ(PathOf(folders.GetMostSuitableCfg("")), "none");
  EXPECT_EQ(PathOf(folders.GetMostSuitableCfg("/s/a")), "none");  // a share path is no full path
}

TEST_F(FolderMgrTest, TheOrderOfTheListDoesNotMatterToWhoGoverns) {
  const FolderMgr folders = ListOf({"/s/a/b", "/s/a/b/c", "/s", "/s/a"});
  EXPECT_EQ(PathOf(folders.GetMostSuitableCfg(volume_ + "/s/a/b/c/d")), "/s/a/b/c");
  EXPECT_EQ(PathOf(folders.GetMostSuitableCfg(volume_ + "/s/a/b/d")), "/s/a/b");
  EXPECT_EQ(PathOf(folders.GetMostSuitableCfg(volume_ + "/s/x")), "/s");
}

TEST_F(FolderMgrTest, OfTwoRecordsOfOnePathTheEarlierGoverns) {
  Store("[" + toString(Make("/s/a", "d", "one")->GetData()) + "," +
        toString(Make("/s/a", "d", "two")->GetData()) + "]");
  EXPECT_EQ(FolderMgr().GetMostSuitableCfg(volume_ + "/s/a/x")->GetName(), "one");
}

TEST_F(FolderMgrTest, AFolderWithASlashAtItsEndGovernsOnlyWhatHasTwo) {
  Store("[" + toString(Make("/s/a/", "d")->GetData()) + "]");
  const FolderMgr folders;
  EXPECT_TRUE(folders.IsFullPathIndexed(volume_ + "/s/a/"));
  EXPECT_TRUE(folders.IsFullPathIndexed(volume_ + "/s/a//x"));
  EXPECT_FALSE(folders.IsFullPathIndexed(volume_ + "/s/a"));
  EXPECT_FALSE(folders.IsFullPathIndexed(volume_ + "/s/a/x"));
}

// The rule as it is written down, for random trees.
TEST_F(FolderMgrTest, CoveringAgreesWithThePlainRule) {
  std::mt19937 random(7);
  const auto random_path = [&] {
    std::string path = "/s";
    for (auto depth = random() % 5; depth > 0; --depth) {
      path += std::vector<std::string>{"/a", "/b", "/ab", "/", "/a/"}[random() % 5];
    }
    return path;
  };
  for (int round = 0; round < 50; ++round) {
    FolderMgr folders;
    for (int i = 0; i < 8; ++i) Upsert(folders, Make(random_path(), "d"));
    for (int i = 0; i < 50; ++i) {
      const std::string place = volume_ + random_path();
      FolderPtr best;
      for (const FolderPtr& folder : folders.GetFolders()) {
        const std::string own = volume_ + folder->GetPath();
        if (!StringStartWith(place + "/", own + "/")) continue;
        if (!best || own.size() > best->GetFullPath().size()) best = folder;
      }
      EXPECT_EQ(folders.GetMostSuitableCfg(place), best) << place;
      EXPECT_EQ(folders.IsFullPathIndexed(place), best != nullptr) << place;
    }
  }
}

TEST_F(FolderMgrTest, TheGoverningFolderDecidesByKind) {
  const std::vector<std::pair<std::string, char>> files = {
      {"x.txt", 'd'}, {"x", 'd'}, {"x.mp3", 'a'}, {"x.MKV", 'v'}, {"x.jpg", 'p'}};
  for (const std::string kinds : {"", "d", "a", "v", "p", "davp"}) {
    FolderMgr folders;
    Upsert(folders, Make("/s/a", kinds));
    for (const auto& [file, kind] : files) {
      EXPECT_EQ(folders.IsFullPathNeedMeta(volume_ + "/s/a/" + file),
                kinds.find(kind) != std::string::npos)
          << kinds << " " << file;
    }
    EXPECT_TRUE(folders.IsFullPathNeedMeta(volume_ + "/s/a/x.unknown"));
    EXPECT_FALSE(folders.IsFullPathNeedMeta(volume_ + "/s/x.unknown"));
  }
}

TEST_F(FolderMgrTest, ADeeperFolderOverrulesTheKinds) {
  FolderMgr folders;
  Upsert(folders, Make("/s", "davp"));
  Upsert(folders, Make("/s/a", "p"));
  EXPECT_TRUE(folders.IsFullPathNeedMeta(volume_ + "/s/x.txt"));
  EXPECT_FALSE(folders.IsFullPathNeedMeta(volume_ + "/s/a/x.txt"));
  EXPECT_TRUE(folders.IsFullPathNeedMeta(volume_ + "/s/a/x.png"));
}

TEST_F(FolderMgrTest, OwnConfigurationIsAnExactMatch) {
  const FolderMgr folders = ListOf({"/s/a"});
  EXPECT_TRUE(folders.IsFullPathHasOwnCfg(volume_ + "/s/a"));
  for (const char* place : {"/s", "/s/a/", "/s/a/b", "/s/ab"}) {
    EXPECT_FALSE(folders.IsFullPathHasOwnCfg(volume_ + place)) << place;
  }
}

TEST_F(FolderMgrTest, SharesThatHaveFoldersAreIndexed) {
  const FolderMgr folders = ListOf({"/t/x", "/s", "/s/a"});
  EXPECT_TRUE(folders.IsShareIndexed("s"));
  EXPECT_TRUE(folders.IsShareIndexed("t"));
  EXPECT_FALSE(folders.IsShareIndexed("x"));
  EXPECT_FALSE(folders.IsShareIndexed(""));
  EXPECT_FALSE(folders.IsShareIndexed("S"));
  EXPECT_THAT(folders.GetIndexedShares(), ElementsAre("s", "t"));
  EXPECT_THAT(FolderMgr().GetIndexedShares(), IsEmpty());
}

TEST_F(FolderMgrTest, AFolderOfARenamedShareIsIndexedUnderTheNewName) {
  const FolderMgr folders = ListOf({"/s/a"});
  folders.GetFolders()[0]->SetShare("t");
  EXPECT_FALSE(folders.IsShareIndexed("s"));
  EXPECT_TRUE(folders.IsShareIndexed("t"));
  EXPECT_THAT(folders.GetIndexedShares(), ElementsAre("t"));
}

TEST_F(FolderMgrTest, AVanishedShareFailsTheQuestionsAboutFullPathsOnly) {
  const FolderMgr folders = ListOf({"/s/a"});
  folders.Save();
  fake::RemoveShare("s");
  const FolderMgr loaded;
  EXPECT_EQ(FailureOf([&] { loaded.GetMostSuitableCfg("/x"); }).substr(0, 3), "800");
  EXPECT_EQ(FailureOf([&] { loaded.IsFullPathIndexed("/x"); }).substr(0, 3), "800");
  EXPECT_EQ(FailureOf([&] { loaded.IsFullPathHasOwnCfg("/x"); }).substr(0, 3), "800");
  EXPECT_EQ(FailureOf([&] { loaded.IsFullPathNeedMeta("/x"); }).substr(0, 3), "800");
  EXPECT_TRUE(loaded.IsShareIndexed("s"));
  EXPECT_TRUE(loaded.HasFolder("/s/a"));
}

TEST_F(FolderMgrTest, ARecordWithoutALeadingSlashFailsWhatAsksForItsShare) {
  Store("[" + toString(Make("odd", "d")->GetData()) + "]");
  const FolderMgr folders;
  EXPECT_EQ(FailureOf([&] { folders.IsShareIndexed("s"); }), "120 odd");
  EXPECT_EQ(FailureOf([&] { folders.GetIndexedShares(); }), "120 odd");
  EXPECT_EQ(FailureOf([&] { folders.GetMostSuitableCfg("/s"); }), "120 odd");
}

TEST_F(FolderMgrTest, ThePlatformIsAskedOncePerFolder) {
  const FolderMgr folders = ListOf({"/s/a", "/s/b"});
  folders.GetMostSuitableCfg("/x");
  fake::ClearCalls();
  folders.GetMostSuitableCfg(volume_ + "/s/a/x");
  folders.IsFullPathIndexed(volume_ + "/s/b/x");
  EXPECT_THAT(fake::Calls(), IsEmpty());
}

// ---- Changes

TEST_F(FolderMgrTest, DiffCfgNamesTheKindsThatDiffer) {
  const std::string all = "davp";
  for (unsigned int now = 0; now < 16; ++now) {
    for (unsigned int before = 0; before < 16; ++before) {
      const auto letters = [&](unsigned int bits) {
        std::string kinds;
        for (unsigned int i = 0; i < 4; ++i) {
          if ((bits >> i & 1U) != 0) kinds += all[i];
        }
        return kinds;
      };
      EXPECT_EQ(Kinds(FolderMgr::DiffCfg(Make("/s", letters(now)), Make("/t", letters(before)))),
                letters(now ^ before));
    }
  }
}

TEST_F(FolderMgrTest, DiffCfgCarriesPathAndNameAlone) {
  const auto now = std::make_shared<Folder>("/s/a", "now", true, false, false, false, true, true);
  now->SetVolumeToBeClean("/volume1");
  const FolderPtr diff = FolderMgr::DiffCfg(now, Make("/s", "", "before"));
  EXPECT_EQ(diff->GetPath(), "/s/a");
  EXPECT_EQ(diff->GetName(), "now");
  EXPECT_FALSE(diff->IsPrivileged());
  EXPECT_FALSE(diff->IsPaused());
  EXPECT_EQ(diff->GetVolumeToBeClean(), "");
  EXPECT_EQ(Kinds(FolderMgr::DiffCfg(Make("/s/a", ""), nullptr)), "davp");
}

TEST_F(FolderMgrTest, UpsertReportsTheChangeAgainstWhatGovernedBefore) {
  FolderMgr folders;
  EXPECT_EQ(Kinds(Upsert(folders, Make("/s/a", "davp"))), "davp");
  const FolderPtr diff = Upsert(folders, Make("/s/a/b", "p", "sub"));
  EXPECT_EQ(Kinds(diff), "dav");
  EXPECT_EQ(diff->GetPath(), "/s/a/b");
  EXPECT_EQ(diff->GetName(), "sub");
  EXPECT_EQ(Kinds(Upsert(folders, Make("/s/c", "p"))), "davp");   // nothing around it
  EXPECT_EQ(Kinds(Upsert(folders, Make("/s/a/b", "dp"))), "d");   // its own old record
  EXPECT_EQ(Kinds(Upsert(folders, Make("/s/a/b/c", "dp"))), "");  // as the one around it
}

TEST_F(FolderMgrTest, UpsertReplacesAndMovesToTheEnd) {
  FolderMgr folders = ListOf({"/s/a", "/s/b"});
  const FolderPtr folder = Make("/s/a", "davp", "again");
  EXPECT_EQ(Kinds(Upsert(folders, folder)), "");
  EXPECT_THAT(Paths(folders.GetFolders()), ElementsAre("/s/b", "/s/a"));
  EXPECT_EQ(folders.GetFolders()[1], folder);
  EXPECT_EQ(access(kFileIndexFoldersCfgPath.c_str(), F_OK), -1);
}

TEST_F(FolderMgrTest, UpsertReplacesEveryRecordOfThePath) {
  const std::string record = toString(Make("/s/a", "d")->GetData());
  Store("[" + record + "," + record + "]");
  FolderMgr folders;
  Upsert(folders, Make("/s/a", "d"));
  EXPECT_THAT(Paths(folders.GetFolders()), ElementsAre("/s/a"));
}

TEST_F(FolderMgrTest, UpsertOfAnUnknownShareChangesNothing) {
  FolderMgr folders = ListOf({"/s/a"});
  FolderPtr diff;
  EXPECT_EQ(FailureOf([&] { folders.Upsert(diff, Make("/gone", "d")); }).substr(0, 3), "800");
  EXPECT_THAT(Paths(folders.GetFolders()), ElementsAre("/s/a"));
  EXPECT_EQ(diff, nullptr);
}

TEST_F(FolderMgrTest, AThousandFoldersFitAndOneMoreDoesNot) {
  FolderMgr folders;
  for (int i = 0; i < 1000; ++i) Upsert(folders, Make("/s/" + std::to_string(i), "d"));
  Upsert(folders, Make("/s/999", "d"));  // a replacement is no addition
  EXPECT_EQ(folders.GetFolders().size(), 1000U);
  EXPECT_THAT(fake::Logs(), IsEmpty());

  EXPECT_EQ(FailureOf([&] { Upsert(folders, Make("/s/1000", "d")); }), "900 ");
  EXPECT_THAT(fake::Logs(),
              ElementsAre(fake::LogHead("folder_mgr", 76, "Upsert") +
                          "Failed [folders_.size() > kFileIndexFoldersMax], reason: "));
  EXPECT_EQ(folders.GetFolders().size(), 1001U);
  EXPECT_EQ(folders.GetFolders().back()->GetPath(), "/s/1000");
}

TEST_F(FolderMgrTest, DeleteReportsTheChangeToWhatGovernsNow) {
  FolderMgr folders;
  Upsert(folders, Make("/s/a", "davp"));
  Upsert(folders, Make("/s/a/b", "p", "sub"));
  const FolderPtr diff = Delete(folders, "/s/a/b");
  EXPECT_EQ(Kinds(diff), "dav");
  EXPECT_EQ(diff->GetPath(), "/s/a/b");
  EXPECT_EQ(diff->GetName(), "sub");
  EXPECT_EQ(Kinds(Delete(folders, "/s/a")), "davp");
  EXPECT_THAT(folders.GetFolders(), IsEmpty());
}

TEST_F(FolderMgrTest, DeleteRemovesEveryRecordOfThePath) {
  const std::string record = toString(Make("/s/a", "d")->GetData());
  Store("[" + record + "," + record + "," + toString(Make("/s/b", "d")->GetData()) + "]");
  FolderMgr folders;
  Delete(folders, "/s/a");
  EXPECT_THAT(Paths(folders.GetFolders()), ElementsAre("/s/b"));
}

TEST_F(FolderMgrTest, DeleteBelowAFolderWithoutARecordReportsNoKind) {
  FolderMgr folders = ListOf({"/s/a"});
  EXPECT_EQ(Kinds(Delete(folders, "/s/a/x")), "");
  EXPECT_THAT(Paths(folders.GetFolders()), ElementsAre("/s/a"));
}

TEST_F(FolderMgrTest, DeleteWhereNothingGovernsFails) {
  FolderMgr folders = ListOf({"/s/a"});
  FolderPtr diff;
  EXPECT_EQ(FailureOf([&] { folders.Delete(diff, "/s"); }), "902 ");
  EXPECT_EQ(FailureOf([&] { folders.Delete(diff, "/s/ab"); }), "902 ");
  ASSERT_EQ(fake::Logs().size(), 2U);
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("folder_mgr", 1, "Delete")) + "Failed [!before], reason: ");
  EXPECT_EQ(diff, nullptr);
  EXPECT_THAT(Paths(folders.GetFolders()), ElementsAre("/s/a"));
}

TEST_F(FolderMgrTest, DeleteOfAPathOfNoShareFails) {
  FolderMgr folders = ListOf({"/s/a"});
  EXPECT_EQ(FailureOf([&] { Delete(folders, "s/a"); }), "120 s/a");
  EXPECT_EQ(FailureOf([&] { Delete(folders, "/gone/a"); }).substr(0, 3), "800");
}

TEST_F(FolderMgrTest, DeleteByShareRemovesItsFoldersAlone) {
  FolderMgr folders = ListOf({"/s", "/t/s", "/s/a", "/t"});
  folders.DeleteByShare("s");
  EXPECT_THAT(Paths(folders.GetFolders()), ElementsAre("/t/s", "/t"));
  folders.DeleteByShare("gone");
  EXPECT_THAT(Paths(folders.GetFolders()), ElementsAre("/t/s", "/t"));
}

}  // namespace
}  // namespace quarry::fileindex
