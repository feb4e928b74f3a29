#include "daemons/fileindexd/survey.h"

#include <gtest/gtest.h>

#include <climits>

#include "common/error.h"
#include "tests/daemons/fileindexd/share_fixture.h"

namespace quarry::fileindexd {
namespace {

TEST(CanonicalTest, IsTheShortestFormOfAPlaceThatCanBe) {
  EXPECT_EQ("/a/b", Canonical("/a/b"));
  EXPECT_EQ("/a/b", Canonical("//a///b/"));
  EXPECT_EQ("/...", Canonical("/..."));
  for (const std::string& path :
       {std::string(), std::string("/"), std::string("a/b"), std::string("/a/../b"),
        std::string("/a/./b"), std::string("/.."), std::string("/a\0b", 4)}) {
    EXPECT_EQ("", Canonical(path)) << path;
  }
}

class SurveyTest : public ShareFixture {
 protected:
  // What is found at the place, which both ways of looking must agree on.
  Verdict At(const std::string& path) const {
    const Verdict verdict = survey_.Examine(path).verdict;
    EXPECT_EQ(verdict, survey_.ExamineEntry(path).verdict) << path;
    return verdict;
  }
};

TEST_F(SurveyTest, FilesAndDirectoriesOfAFolderAreWanted) {
  disk_.WriteFile("/v/s/d/a.txt");
  EXPECT_EQ(Verdict::kWanted, At("/v/s/d"));
  EXPECT_EQ(Verdict::kWanted, At("/v/s/d/a.txt"));
  EXPECT_EQ(Verdict::kWanted, survey_.Examine("/v/s").verdict);
  EXPECT_EQ(PlaceKind::kDirectory, survey_.Examine("/v/s/d").place.kind);
  EXPECT_EQ(PlaceKind::kFile, survey_.Examine("/v/s/d/a.txt").place.kind);
}

TEST_F(SurveyTest, NothingElseIsWanted) {
  disk_.AddOther("/v/s/link");
  disk_.AddMount("/v/s/mount");
  disk_.WriteFile("/v/s/.DS_Store");
  disk_.WriteFile("/v/s/@eaDir/x");
  bins_.insert("/v/s/#recycle");
  disk_.WriteFile("/v/s/#recycle/a.txt");
  for (const char* path :
       {"/v/s/link", "/v/s/mount", "/v/s/.DS_Store", "/v/s/@eaDir", "/v/s/#recycle", "/v/s/none"}) {
    EXPECT_EQ(Verdict::kUnwanted, At(path)) << path;
  }
  for (const char* path : {"/v/t", "/v", "/v/sx", "/v/s/@eaDir/x", "/v/s/link/x", "/v/s/none/x",
                           "/v/s/#recycle/a.txt"}) {
    EXPECT_EQ(Verdict::kUnwanted, survey_.Examine(path).verdict) << path;
  }
}

TEST_F(SurveyTest, AFoldersOwnPlaceIsWantedWhateverItIs) {
  SetFolders({Folder("/s/@eaDir/f"), Folder("/s/m")});
  disk_.WriteFile("/v/s/@eaDir/f/a.txt");
  disk_.AddMount("/v/s/m");
  disk_.WriteFile("/v/s/m/b.txt");
  for (const char* path : {"/v/s/@eaDir/f", "/v/s/@eaDir/f/a.txt", "/v/s/m", "/v/s/m/b.txt"}) {
    EXPECT_EQ(Verdict::kWanted, survey_.Examine(path).verdict) << path;
  }
  EXPECT_EQ(Verdict::kWanted, survey_.ExamineEntry("/v/s/m").verdict);
}

TEST_F(SurveyTest, PausedFoldersAreLeftAside) {
  SetFolders({Folder("/s"), PausedFolder("/s/p"), Folder("/s/p/q")});
  disk_.WriteFile("/v/s/p/a.txt");
  disk_.WriteFile("/v/s/p/q/b.txt");
  EXPECT_EQ(Verdict::kAside, At("/v/s/p"));
  EXPECT_EQ(Verdict::kAside, At("/v/s/p/a.txt"));
  EXPECT_EQ(Verdict::kAside, At("/v/s/p/gone"));
  EXPECT_EQ(Verdict::kWanted, At("/v/s/p/q/b.txt"));
  EXPECT_TRUE(survey_.IsAside("/v/s/p/gone"));
  EXPECT_FALSE(survey_.IsAside("/v/s/p/q"));
  EXPECT_FALSE(survey_.IsAside("/v/elsewhere"));
}

TEST_F(SurveyTest, WhatCannotBeToldIsDoubtful) {
  disk_.WriteFile("/v/s/d/a.txt");
  disk_.MakeUnreadable("/v/s/d");
  EXPECT_EQ(Verdict::kDoubtful, At("/v/s/d"));
  EXPECT_EQ(Verdict::kDoubtful, survey_.Examine("/v/s/d/a.txt").verdict);
  const std::string deep = "/v/s/" + std::string(PATH_MAX, 'x');
  disk_.WriteFile(deep);
  EXPECT_EQ(Verdict::kDoubtful, At(deep));
}

TEST_F(SurveyTest, ContentIsWantedOfFilesOnly) {
  disk_.WriteFile("/v/s/a.mp3");
  disk_.AddDir("/v/s/d");
  Place file;
  file.kind = PlaceKind::kFile;
  Place dir;
  dir.kind = PlaceKind::kDirectory;
  EXPECT_TRUE(survey_.WantsContent("/v/s/a.mp3", file));
  EXPECT_FALSE(survey_.WantsContent("/v/s/a.mp3", dir));
  SetFolders({DocumentFolder("/s")});
  EXPECT_FALSE(survey_.WantsContent("/v/s/a.mp3", file));
  EXPECT_TRUE(survey_.WantsContent("/v/s/a.txt", file));
  EXPECT_TRUE(survey_.WantsContent("/v/s/a.unknown", file));
  EXPECT_FALSE(survey_.WantsContent("/v/t/a.txt", file));
}

TEST_F(SurveyTest, HandsOutWhatLoadingTheRulesThrows) {
  const Survey survey(
      disk_, []() -> Survey::Rules { throw Error(504, "Cannot load json"); },
      [](const std::string&) { return false; });
  EXPECT_THROW(survey.Examine("/v/s/a"), Error);
  EXPECT_THROW(survey.ExamineEntry("/v/s/a"), Error);
  EXPECT_THROW(survey.IsAside("/v/s/a"), Error);
}

}  // namespace
}  // namespace quarry::fileindexd
