// Queues of such sizes and shapes that anything but linear cost would not end in time, and anything
// that recurses with the depth of a path would not end well.

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "common/error.h"
#include "fileindex/queue/optree.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/queue/queue_lines.h"

namespace quarry::fileindex {
namespace {

using Strings = std::vector<std::string>;

class BoundsTest : public fake::FakePlatformTest {
 protected:
  BoundsTest() { log_level = 6; }
  ~BoundsTest() override { log_level = 7; }

  void Insert(std::uint32_t kind, const std::string& path, const std::string& path_old = "") {
    event_->op = kind;
    event_->path = path;
    event_->path_old = path_old;
    tree_.InsertEvent(event_);
  }

  // The last records that are handed out.
  Strings Last(size_t count) {
    Strings texts;
    for (auto op = tree_.ops.rbegin(); op != tree_.ops.rend() && texts.size() < count; ++op) {
      if ((*op)->op != OP_NONE) texts.insert(texts.begin(), Text(**op));
    }
    return texts;
  }

  int Pending() {
    int pending = 0;
    tree_.ProcessOP([&pending](std::shared_ptr<OP>) { ++pending; });
    return pending;
  }

  QueueFile queue_;
  OPTree tree_{queue_.path()};
  std::shared_ptr<Event> event_ = std::make_shared<Event>(R"({"event":0,"path":""})");
};

std::string Nth(const std::string& prefix, int i) {
  return prefix + std::to_string(i);
}

TEST_F(BoundsTest, DirectoryOfAMillionFiles) {
  for (int i = 0; i < 1'000'000; ++i) Insert(EVENT_MODIFY, Nth("/s/d/file-", i));
  for (int i = 0; i < 1'000'000; i += 10) Insert(EVENT_ATTR, Nth("/s/d/file-", i));
  EXPECT_EQ(tree_.GetNodeByPath("/s/d")->children.size(), 1'000'000u);
  EXPECT_EQ(tree_.ops.size(), 1'000'000u);
  EXPECT_EQ(Pending(), 1'000'000);
}

// More than are remembered at a time; each is met again when it has been forgotten.
TEST_F(BoundsTest, FilesInManyDirectoriesInTurn) {
  std::string lines;
  for (int turn = 0; turn < 2; ++turn) {
    for (int i = 0; i < 140'000; ++i) {
      lines += "{\"event\":2,\"path\":\"" + Nth("/s/directory-", i) + Nth("/file-", turn) + "\"}\n";
    }
  }
  const QueueFile queue(lines);
  OPTree tree(queue.path());
  ASSERT_EQ(tree.ops.size(), 280'000u);
  EXPECT_EQ(tree.GetNodeByPath("/s")->children.size(), 140'000u);
  for (const int i : {0, 131'071, 131'072, 139'999}) {
    const auto& files = tree.GetNodeByPath(Nth("/s/directory-", i))->children;
    ASSERT_EQ(files.size(), 2u);
    EXPECT_EQ(files[0]->name, "file-0");
    EXPECT_EQ(files[1]->name, "file-1");
    EXPECT_EQ(files[1]->ops.size(), 1u);
  }
}

TEST_F(BoundsTest, PathOfTwoThousandComponents) {
  std::string path;
  for (int i = 0; i < 2000; ++i) path += Nth("/component-", i);
  for (int i = 0; i < 1000; ++i) Insert(EVENT_MODIFY, Nth(path + "/f", i));
  Insert(EVENT_RENAME, path + "x", path);
  EXPECT_EQ(Last(1), Strings{"index " + path + "x/f999"});
  EXPECT_EQ(Pending(), 1001);
  Insert(EVENT_REINDEX, "/component-0");
  EXPECT_EQ(Pending(), 2);
}

TEST_F(BoundsTest, PathOfHundredsOfThousandsOfComponents) {
  std::string path;
  for (int i = 0; i < 300'000; ++i) path += "/d";
  Insert(EVENT_MODIFY, path);
  Insert(EVENT_RENAME, "/e", "/d");
  EXPECT_EQ(Last(1), Strings{"index /e" + path.substr(2)});
  int nodes = 0;
  tree_.TraverseNodeDescendant(
      tree_.root, [&nodes](std::shared_ptr<OPNode>) { ++nodes; }, true);
  EXPECT_EQ(nodes, 600'000);
  Insert(EVENT_REINDEX, "/e");
  EXPECT_EQ(Pending(), 2);
}

TEST_F(BoundsTest, RecordKeepsAllNodesAboveItUntilItGoes) {
  std::string path;
  for (int i = 0; i < 300'000; ++i) path += "/d";
  std::shared_ptr<OP> kept;
  {
    OPTree tree(queue_.path());
    event_->op = EVENT_MODIFY;
    event_->path = path;
    tree.InsertEvent(event_);
    kept = tree.ops.front();
  }
  EXPECT_EQ(kept->node->GetPath(), path);
  const std::weak_ptr<OPNode> node = kept->node;
  kept.reset();
  EXPECT_TRUE(node.expired());
}

TEST_F(BoundsTest, RenameOfADirectoryWithManyPendingDescendants) {
  for (int i = 0; i < 100'000; ++i)
    Insert(EVENT_MODIFY, "/s/d/" + Nth("dir", i / 100) + Nth("/f", i));
  Insert(EVENT_RENAME, "/s/e", "/s/d");
  EXPECT_EQ(tree_.ops.size(), 200'001u);
  EXPECT_EQ(Pending(), 100'001);
  EXPECT_EQ(tree_.ops[100'000]->op, OP_RENAME);
  EXPECT_EQ(Text(*tree_.ops[100'001]), "index /s/e/dir0/f0");
  EXPECT_EQ(Last(1), Strings{"index /s/e/dir999/f99999"});
}

TEST_F(BoundsTest, ModifyBelowAndReindexInTurn) {
  for (int i = 0; i < 100'000; ++i) {
    Insert(EVENT_MODIFY, "/s/d/e/f");
    Insert(EVENT_REINDEX, "/s/d");
  }
  EXPECT_EQ(Pending(), 1);
  EXPECT_EQ(tree_.GetNodeByPath("/s/d/e/f")->ops.size(), 100'000u);
}

TEST_F(BoundsTest, ModifyOfAnotherFileBelowAndReindexInTurn) {
  for (int i = 0; i < 100'000; ++i) {
    Insert(EVENT_MODIFY, Nth("/s/d/", i) + "/f");
    Insert(EVENT_REINDEX, "/s/d");
  }
  EXPECT_EQ(Pending(), 1);
  EXPECT_EQ(tree_.ops.size(), 100'001u);
}

TEST_F(BoundsTest, ManyReindexesAboveManySurvivors) {
  for (int i = 0; i < 100'000; ++i) Insert(EVENT_RENAME, Nth("/s/d/to", i), Nth("/from/", i));
  for (int i = 0; i < 100'000; ++i) Insert(EVENT_REINDEX, "/s/d");
  EXPECT_EQ(Pending(), 100'001);
}

TEST_F(BoundsTest, RenamesOfADirectoryWhereAllIsCancelled) {
  for (int i = 0; i < 100'000; ++i) Insert(EVENT_MODIFY, Nth("/s/d/", i));
  Insert(EVENT_REINDEX, "/s/d");
  for (int i = 0; i < 50'000; ++i) {
    Insert(EVENT_RENAME, "/s/e", "/s/d");
    Insert(EVENT_RENAME, "/s/d", "/s/e");
  }
  EXPECT_EQ(Last(2), (Strings{"rename /s/e -> /s/d", "reindex /s/d"}));
  EXPECT_EQ(tree_.GetNodeByPath("/s/d")->children.size(), 100'000u);
  EXPECT_EQ(tree_.GetNodeByPath("/s/e")->children.size(), 0u);
}

TEST_F(BoundsTest, RenamesOntoOnePlaceAndItsDeletionInTurn) {
  for (int i = 0; i < 100'000; ++i) {
    Insert(EVENT_RENAME, "/s/f", "/s/x");
    Insert(EVENT_DELETE, "/s/f");
  }
  EXPECT_EQ(Last(2), (Strings{"rename /s/x -> /s/f", "delete /s/f"}));
  EXPECT_EQ(Pending(), 100'001);
}

// Each time a long list comes behind a short one.
TEST_F(BoundsTest, RenamesToAndFroWithDeletionsInTurn) {
  std::string lines;
  for (int i = 0; i < 50'000; ++i) {
    lines += Line(EVENT_DELETE, "/s/g") + RenameLine("/s/f", "/s/g");
    lines += Line(EVENT_DELETE, "/s/f") + RenameLine("/s/g", "/s/f");
  }
  const QueueFile queue(lines);
  OPTree tree(queue.path());
  EXPECT_EQ(tree.ops.size(), 200'000u);
  const auto& moved = tree.GetNodeByPath("/s/f")->ops;
  ASSERT_EQ(moved.size(), 200'000u);
  EXPECT_EQ(Text(*moved[0]), "none /s/f");
  EXPECT_EQ(Text(*moved[1]), "none /s/g");
  EXPECT_EQ(Text(*moved.back()), "rename /s/g -> /s/f");
}

TEST_F(BoundsTest, SavingByRenamingInTurn) {
  for (int i = 0; i < 50'000; ++i) {
    Insert(EVENT_CREATE, "/s/new");
    Insert(EVENT_RENAME, "/s/old", "/s/f");
    Insert(EVENT_RENAME, "/s/f", "/s/new");
    Insert(EVENT_DELETE, "/s/old");
  }
  EXPECT_EQ(Last(3), (Strings{"delete /s/old", "rename /s/new -> /s/f", "index /s/f"}));
}

// Directories that are made under one name and published under another, over and over. Their
// reindexes stay at the new place, and nothing may look at all of them each time.
TEST_F(BoundsTest, DirectoriesPublishedByRenaming) {
  for (int i = 0; i < 100'000; ++i) {
    Insert(EVENT_REINDEX, "/s/new");
    Insert(EVENT_RENAME, "/s/public", "/s/new");
    Insert(EVENT_ATTR, "/s/public");
  }
  EXPECT_EQ(Pending(), 200'000);
  EXPECT_EQ(Last(2), (Strings{"rename /s/new -> /s/public", "reindex /s/public"}));
}

TEST_F(BoundsTest, FilesPublishedWithTheirDirectory) {
  for (int i = 0; i < 100'000; ++i) {
    Insert(EVENT_MODIFY, "/s/new/x");
    Insert(EVENT_RENAME, "/s/public", "/s/new");
    Insert(EVENT_MODIFY, "/s/public/x");
  }
  EXPECT_EQ(Pending(), 200'000);
  Insert(EVENT_DELETE, "/s/public/x");
  EXPECT_EQ(Last(2), (Strings{"rename /s/new -> /s/public", "delete /s/public/x"}));
}

TEST_F(BoundsTest, FilesReplacedWithTheirDirectory) {
  for (int i = 0; i < 100'000; ++i) {
    Insert(EVENT_MODIFY, "/s/new/x");
    Insert(EVENT_DELETE, "/s/public/x");
    Insert(EVENT_RENAME, "/s/public", "/s/new");
  }
  EXPECT_EQ(Pending(), 200'001);
  EXPECT_EQ(Last(2), (Strings{"rename /s/new -> /s/public", "index /s/public/x"}));
}

TEST_F(BoundsTest, ManyDeletionsThatAreMovedToAndFro) {
  for (int i = 0; i < 100'000; ++i) {
    Insert(EVENT_DELETE, "/s/a");
    Insert(EVENT_RENAME, "/s/b", "/s/a");
  }
  for (int i = 0; i < 50'000; ++i) {
    Insert(EVENT_RENAME, "/s/c", "/s/b");
    Insert(EVENT_RENAME, "/s/b", "/s/c");
  }
  Insert(EVENT_RENAME, "/s/a", "/s/b");
  EXPECT_EQ(Pending(), 300'001);
  Insert(EVENT_CREATE, "/s/a");
  EXPECT_EQ(Text(*tree_.ops[0]), "index /s/a");
  EXPECT_EQ(Pending(), 300'001);
  for (int i = 0; i < 100'000; ++i) Insert(EVENT_MODIFY, "/s/a");
  EXPECT_EQ(Pending(), 300'001);
}

TEST_F(BoundsTest, BadConfigurationChangesAmongManyRecords) {
  for (int i = 0; i < 100'000; ++i) Insert(EVENT_RENAME, "/s/a", "/s/x");
  event_->data = Json::Value(Json::objectValue);
  Insert(EVENT_UPDATE_CFG, "/s/a");
  event_->data = 5;
  for (int i = 0; i < 100'000; ++i) {
    EXPECT_THROW(Insert(EVENT_UPDATE_CFG, "/s/a"), Error);
  }
  EXPECT_EQ(Last(1), Strings{"config /s/a {}"});
}

TEST_F(BoundsTest, LineOfManyMegabytes) {
  const std::string name(20'000'000, 'n');
  const std::string rubbish(20'000'000, '{');
  test::WriteFile(queue_.path(),
                  Line(EVENT_MODIFY, "/" + name) + rubbish + "\n" + Line(EVENT_MODIFY, "/a"));
  OPTree tree(queue_.path());
  ASSERT_EQ(tree.ops.size(), 2u);
  EXPECT_EQ(tree.ops[0]->node->name, name);
  EXPECT_EQ(Text(*tree.ops[1]), "index /a");
}

TEST_F(BoundsTest, LineNestedTooDeepIsSkipped) {
  const std::string deep = std::string(100'000, '[') + std::string(100'000, ']');
  EXPECT_EQ(Folded("{\"data\":" + deep + ",\"event\":2,\"path\":\"/a\"}\n" + deep + "\n" +
                   Line(EVENT_MODIFY, "/b")),
            Strings{"index /b"});
  EXPECT_EQ(fake::LogsWith("code=906").size(), 2u);
}

}  // namespace
}  // namespace quarry::fileindex
