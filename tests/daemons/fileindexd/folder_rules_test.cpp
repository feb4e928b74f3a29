#include "daemons/fileindexd/folder_rules.h"

#include <gtest/gtest.h>

#include <random>

#include "common/file_util.h"
#include "fileindex/config/folder_mgr.h"
#include "tests/daemons/fileindexd/share_fixture.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace quarry::fileindexd {
namespace {

TEST(FolderRulesTest, TheDeepestFolderGoverns) {
  const FolderRules rules({Folder("/s/a"), Folder("/s/a/b")});
  EXPECT_EQ("/s/a/b", rules.Governing("/v/s/a/b/c.txt")->path);
  EXPECT_EQ("/s/a/b", rules.Governing("/v/s/a/b")->path);
  EXPECT_EQ("/s/a", rules.Governing("/v/s/a/x")->path);
  EXPECT_EQ(nullptr, rules.Governing("/v/s/ab"));
  EXPECT_EQ(nullptr, rules.Governing("/v/s"));
  EXPECT_EQ(nullptr, rules.Governing(""));
  EXPECT_EQ(nullptr, rules.Governing("relative"));
}

TEST(FolderRulesTest, FindsFoldersAtAndBelow) {
  const FolderRules rules({Folder("/s/a"), Folder("/s/a/b"), Folder("/s/ab"), Folder("/s/a-b")});
  EXPECT_EQ("/s/a", rules.At("/v/s/a")->path);
  EXPECT_EQ(nullptr, rules.At("/v/s"));
  EXPECT_TRUE(rules.HasFolderBelow("/v/s"));
  EXPECT_TRUE(rules.HasFolderBelow("/v/s/a"));
  EXPECT_FALSE(rules.HasFolderBelow("/v/s/a/b"));
  EXPECT_FALSE(rules.HasFolderBelow("/v/s/ab"));
  EXPECT_EQ(4U, rules.FoldersBelow("/v/s").size());
  ASSERT_EQ(1U, rules.FoldersBelow("/v/s/a").size());
  EXPECT_EQ("/s/a/b", rules.FoldersBelow("/v/s/a")[0]->path);
}

TEST(FolderRulesTest, KnowsWhatAPauseTouches) {
  const FolderRules rules({Folder("/s"), PausedFolder("/s/p"), Folder("/s/p/q")});
  EXPECT_TRUE(rules.TouchesPaused("/v/s"));
  EXPECT_TRUE(rules.TouchesPaused("/v/s/p/x"));
  EXPECT_FALSE(rules.TouchesPaused("/v/s/p/q/x"));
  EXPECT_FALSE(rules.TouchesPaused("/v/s/x"));
  EXPECT_FALSE(rules.AllPaused());
  EXPECT_TRUE(FolderRules({PausedFolder("/s/p")}).AllPaused());
  EXPECT_TRUE(FolderRules({}).AllPaused());
}

TEST(FolderRulesTest, EachKindHasItsSwitch) {
  const std::pair<const char*, bool FolderRule::*> kinds[] = {{"/v/s/a.txt", &FolderRule::document},
                                                              {"/v/s/a.mp3", &FolderRule::audio},
                                                              {"/v/s/a.mkv", &FolderRule::video},
                                                              {"/v/s/a.jpg", &FolderRule::photo}};
  for (const auto& [path, kind] : kinds) {
    FolderRule none{"/s", "/v/s", false, false, false, false, false};
    EXPECT_FALSE(FolderRules({none}).WantsContent(path)) << path;
    EXPECT_TRUE(FolderRules({none}).WantsContent("/v/s/a.unknown"));
    none.*kind = true;
    EXPECT_TRUE(FolderRules({none}).WantsContent(path)) << path;
  }
  EXPECT_FALSE(FolderRules({}).WantsContent("/v/s/a.unknown"));
}

TEST(FolderRulesTest, TheFirstOfTwoAtOnePlaceCounts) {
  FolderRule second = PausedFolder("/s");
  EXPECT_FALSE(FolderRules({Folder("/s"), second}).At("/v/s")->paused);
}

// The library's own rule, asked about random folders and places.
TEST(FolderRulesTest, AgreesWithTheLibrary) {
  test::ResetTestRoot();
  const test::TempDir volume;
  test::MakeDirs(volume / "s");
  RegisterShare(volume / "s");
  std::mt19937 random(1);
  const auto random_path = [&random] {
    static const char* const kNames[] = {"a", "b", "ab", "a.txt", "b.mp3", "c.jpg", "d.mkv", "e.q"};
    std::string path = "/s";
    for (std::size_t depth = random() % 4; depth > 0; --depth) {
      path += std::string("/") + kNames[random() % 8];
    }
    return path;
  };
  for (int round = 0; round < 20; ++round) {
    fileindex::FolderMgr library;
    std::vector<FolderRule> rules;
    for (int i = 0; i < 4; ++i) {
      const std::string path = random_path();
      if (library.HasFolder(path)) continue;
      bool kinds[4];
      for (bool& kind : kinds) kind = random() % 2 == 0;
      std::shared_ptr<fileindex::Folder> diff;
      library.Upsert(diff, std::make_shared<fileindex::Folder>(path, "name", kinds[0], kinds[1],
                                                               kinds[2], kinds[3], false, false));
      rules.push_back({path, volume.path() + path, kinds[0], kinds[1], kinds[2], kinds[3], false});
    }
    const FolderRules ours(rules);
    for (int i = 0; i < 200; ++i) {
      const std::string place = volume.path() + random_path();
      EXPECT_EQ(library.IsFullPathIndexed(place), ours.Governing(place) != nullptr) << place;
      EXPECT_EQ(library.IsFullPathHasOwnCfg(place), ours.At(place) != nullptr) << place;
      EXPECT_EQ(library.IsFullPathNeedMeta(place), ours.WantsContent(place)) << place;
      const auto folder = library.GetMostSuitableCfg(place);
      if (folder) {
        EXPECT_EQ(folder->GetPath(), ours.Governing(place)->path) << place;
      }
    }
  }
}

}  // namespace
}  // namespace quarry::fileindexd
