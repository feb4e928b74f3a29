// What happens when two events meet at one path: every cell of the rules, as lines of a queue where
// lines can lead there.

#include <gtest/gtest.h>

#include <array>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "common/error.h"
#include "fileindex/queue/optree.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/queue/queue_lines.h"

namespace quarry::fileindex {
namespace {

using Handler = void (OPTree::*)(std::shared_ptr<OPNode>, std::shared_ptr<OP>);

// What becomes of a pending record and of the new one.
struct Outcome {
  FileIndexOP pending;
  bool dropped;
};

struct Row {
  const char* name;
  Handler handler;
  FileIndexOP kind;
  // For a pending NONE, DELETE, INDEX, ATTR, UPDATE_CFG, RENAME, REINDEX, FULL_REINDEX.
  std::array<Outcome, 8> outcomes;
};

const Row kRows[] = {
    {"delete",
     &OPTree::HandleDelete,
     OP_DELETE,
     {{{OP_NONE, false},
       {OP_DELETE, true},
       {OP_DELETE, true},
       {OP_DELETE, true},
       {OP_UPDATE_CFG, false},
       {OP_RENAME, false},
       {OP_REINDEX, false},
       {OP_FULL_REINDEX, false}}}},
    {"create",
     &OPTree::HandleCreate,
     OP_INDEX,
     {{{OP_NONE, false},
       {OP_INDEX, true},
       {OP_INDEX, true},
       {OP_INDEX, true},
       {OP_UPDATE_CFG, true},
       {OP_RENAME, false},
       {OP_REINDEX, true},
       {OP_FULL_REINDEX, false}}}},
    {"modify",
     &OPTree::HandleModify,
     OP_INDEX,
     {{{OP_NONE, false},
       {OP_DELETE, true},
       {OP_INDEX, true},
       {OP_INDEX, true},
       {OP_UPDATE_CFG, true},
       {OP_RENAME, false},
       {OP_REINDEX, true},
       {OP_FULL_REINDEX, false}}}},
    {"attr",
     &OPTree::HandleAttr,
     OP_ATTR,
     {{{OP_NONE, false},
       {OP_DELETE, true},
       {OP_INDEX, true},
       {OP_ATTR, true},
       {OP_UPDATE_CFG, true},
       {OP_RENAME, false},
       {OP_REINDEX, true},
       {OP_FULL_REINDEX, false}}}},
    {"config",
     &OPTree::HandleUpdateCfg,
     OP_UPDATE_CFG,
     {{{OP_NONE, false},
       {OP_DELETE, true},
       {OP_UPDATE_CFG, true},
       {OP_UPDATE_CFG, true},
       {OP_UPDATE_CFG, true},
       {OP_RENAME, false},
       {OP_REINDEX, true},
       {OP_FULL_REINDEX, false}}}},
    {"reindex",
     &OPTree::HandleReindex,
     OP_REINDEX,
     {{{OP_NONE, false},
       {OP_DELETE, true},
       {OP_REINDEX, true},
       {OP_REINDEX, true},
       {OP_REINDEX, true},
       {OP_RENAME, false},
       {OP_REINDEX, true},
       {OP_FULL_REINDEX, false}}}},
};

class RulesTest : public fake::FakePlatformTest {
 protected:
  // An attached record of that kind at `node`, got by way of a rule and then set.
  static std::shared_ptr<OP> Pending(OPTree& tree, const std::shared_ptr<OPNode>& node,
                                     FileIndexOP kind) {
    const auto rec = std::make_shared<OP>(node, OP_NONE, "", Json::Value());
    rec->src = "/from";
    tree.HandleRename(node, rec);
    rec->src.clear();
    rec->op = kind;
    return rec;
  }

  QueueFile queue_;
};

TEST_F(RulesTest, EveryCell) {
  for (const Row& row : kRows) {
    for (int kind = OP_NONE; kind <= OP_FULL_REINDEX; ++kind) {
      SCOPED_TRACE(std::string(row.name) + " meets " + std::to_string(kind));
      const Outcome& expected = row.outcomes[size_t(kind)];
      OPTree tree(queue_.path());
      const auto node = tree.GetNodeByPath("/s/a");
      const auto pending = Pending(tree, node, FileIndexOP(kind));
      const auto rec = std::make_shared<OP>(node, OP_NONE, "", Json::Value());
      (tree.*row.handler)(node, rec);

      EXPECT_EQ(pending->op, expected.pending);
      EXPECT_EQ(rec->op, expected.dropped ? OP_NONE : row.kind);
      std::vector<std::shared_ptr<OP>> list{pending};
      if (!expected.dropped) list.push_back(rec);
      EXPECT_EQ(tree.ops, list);
      EXPECT_EQ(node->ops, list);
      EXPECT_EQ(pending->node, node);
    }
  }
}

TEST_F(RulesTest, KindsOutsideTheTableStandBesideAnything) {
  for (const Row& row : kRows) {
    OPTree tree(queue_.path());
    const auto node = tree.GetNodeByPath("/s/a");
    const auto pending = Pending(tree, node, static_cast<FileIndexOP>(8));
    const auto rec = std::make_shared<OP>(node, OP_NONE, "", Json::Value());
    (tree.*row.handler)(node, rec);
    EXPECT_EQ(pending->op, 8);
    EXPECT_EQ(rec->op, row.kind);
  }
}

// A record that one pending record has dropped still changes the others.
TEST_F(RulesTest, DroppedRecordStillMeetsTheRest) {
  for (const Row& row : kRows) {
    for (int first = OP_NONE; first <= OP_FULL_REINDEX; ++first) {
      for (int second = OP_NONE; second <= OP_FULL_REINDEX; ++second) {
        SCOPED_TRACE(std::string(row.name) + " " + std::to_string(first) + std::to_string(second));
        OPTree tree(queue_.path());
        const auto node = tree.GetNodeByPath("/s/a");
        const auto a = Pending(tree, node, OP_RENAME);
        const auto b = Pending(tree, node, FileIndexOP(second));
        a->op = FileIndexOP(first);
        const auto rec = std::make_shared<OP>(node, OP_NONE, "", Json::Value());
        (tree.*row.handler)(node, rec);
        EXPECT_EQ(a->op, row.outcomes[size_t(first)].pending);
        EXPECT_EQ(b->op, row.outcomes[size_t(second)].pending);
        const bool dropped =
            row.outcomes[size_t(first)].dropped || row.outcomes[size_t(second)].dropped;
        EXPECT_EQ(rec->op, dropped ? OP_NONE : row.kind);
        EXPECT_EQ(tree.ops.size(), dropped ? 2u : 3u);
      }
    }
  }
}

// The same rules hold where so many records sit at a node that their list is not walked any more.
TEST_F(RulesTest, EveryCellBehindManyRenames) {
  for (const Row& row : kRows) {
    for (int kind = OP_DELETE; kind <= OP_FULL_REINDEX; ++kind) {
      SCOPED_TRACE(std::string(row.name) + " meets " + std::to_string(kind));
      OPTree tree(queue_.path());
      const auto node = tree.GetNodeByPath("/s/a");
      for (int i = 0; i < 50; ++i) Pending(tree, node, OP_RENAME);
      const auto pending = Pending(tree, node, FileIndexOP(kind));
      for (int i = 0; i < 50; ++i) {
        const auto rename = std::make_shared<OP>(node, OP_RENAME, "", Json::Value());
        node->ops.push_back(rename);
      }
      const auto rec = std::make_shared<OP>(node, OP_NONE, "", Json::Value());
      (tree.*row.handler)(node, rec);
      const Outcome& expected = row.outcomes[size_t(kind)];
      EXPECT_EQ(pending->op, expected.pending);
      EXPECT_EQ(rec->op, expected.dropped ? OP_NONE : row.kind);
      EXPECT_EQ(node->ops.size(), expected.dropped ? 101u : 102u);
    }
  }
}

// There a record that is left as it is speaks for all of its kind, and no other does.
TEST_F(RulesTest, EveryPairOfKindsAmongManyRecords) {
  for (const Row& row : kRows) {
    for (int first = OP_DELETE; first <= OP_FULL_REINDEX; ++first) {
      for (int second = OP_DELETE; second <= OP_FULL_REINDEX; ++second) {
        SCOPED_TRACE(std::string(row.name) + " " + std::to_string(first) + std::to_string(second));
        OPTree tree(queue_.path());
        const auto node = tree.GetNodeByPath("/s/a");
        for (int i = 0; i < 100; ++i) {
          const auto kind = FileIndexOP(i % 3 == 0 ? second : first);
          node->ops.push_back(std::make_shared<OP>(node, kind, "", Json::Value()));
        }
        const auto rec = std::make_shared<OP>(node, OP_NONE, "", Json::Value());
        (tree.*row.handler)(node, rec);
        for (int i = 0; i < 100; ++i) {
          const int kind = i % 3 == 0 ? second : first;
          EXPECT_EQ(node->ops[size_t(i)]->op, row.outcomes[size_t(kind)].pending) << i;
        }
        const bool dropped =
            row.outcomes[size_t(first)].dropped || row.outcomes[size_t(second)].dropped;
        EXPECT_EQ(rec->op, dropped ? OP_NONE : row.kind);
        EXPECT_EQ(node->ops.size(), dropped ? 100u : 101u);
      }
    }
  }
}

TEST_F(RulesTest, ConfigurationUpdateAmongManyRecordsMeetsEachOnce) {
  const Json::Value change = Parsed(R"({"audio":true})");
  OPTree tree(queue_.path());
  const auto node = tree.GetNodeByPath("/s/a");
  for (int i = 0; i < 100; ++i) {
    const auto kind = i % 2 == 0 ? OP_UPDATE_CFG : OP_INDEX;
    node->ops.push_back(std::make_shared<OP>(node, kind, "", Json::Value()));
  }
  tree.HandleUpdateCfg(node, std::make_shared<OP>(node, OP_NONE, "", change));
  for (int i = 0; i < 100; ++i) {
    const OP& op = *node->ops[size_t(i)];
    EXPECT_EQ(op.op, OP_UPDATE_CFG);
    // Merged with the change, or made of it.
    EXPECT_EQ(op.data.size(), i % 2 == 0 ? 4u : 1u) << i;
    EXPECT_TRUE(op.data["audio"].asBool());
  }
  const auto bad = std::make_shared<OP>(node, OP_NONE, "", Json::Value(5));
  EXPECT_THROW(tree.HandleUpdateCfg(node, bad), Error);
  tree.HandleReindex(node, std::make_shared<OP>(node, OP_NONE, "", Json::Value()));
  for (const auto& op : node->ops) EXPECT_EQ(op->op, OP_REINDEX);
  EXPECT_EQ(node->ops.size(), 100u);
}

TEST_F(RulesTest, OnlyAConfigurationUpdateHandsItsDataOver) {
  const Json::Value change = Parsed(R"({"audio":true})");
  for (const Row& row : kRows) {
    OPTree tree(queue_.path());
    const auto node = tree.GetNodeByPath("/s/a");
    const auto pending = Pending(tree, node, OP_ATTR);
    const auto rec = std::make_shared<OP>(node, OP_NONE, "", change);
    (tree.*row.handler)(node, rec);
    EXPECT_EQ(pending->data, row.kind == OP_UPDATE_CFG ? change : Json::Value()) << row.name;
  }
}

TEST_F(RulesTest, ReindexKeepsTheDataOfTheConfigurationUpdateThatItReplaces) {
  EXPECT_EQ(Folded(Line(EVENT_UPDATE_CFG, "/s", "", Parsed(R"({"audio":true})")) +
                   Line(EVENT_REINDEX, "/s")),
            std::vector<std::string>{R"(reindex /s {"audio":true})"});
}

using Strings = std::vector<std::string>;

TEST_F(RulesTest, CreateThenModify) {
  EXPECT_EQ(Folded(Line(EVENT_CREATE, "/s/a") + Line(EVENT_MODIFY, "/s/a")), Strings{"index /s/a"});
}

TEST_F(RulesTest, AttrThenModifyIsIndexedInThePlaceOfTheAttr) {
  EXPECT_EQ(
      Folded(Line(EVENT_ATTR, "/s/a") + Line(EVENT_ATTR, "/s/b") + Line(EVENT_MODIFY, "/s/a")),
      (Strings{"index /s/a", "attr /s/b"}));
}

TEST_F(RulesTest, DeleteThenCreateIsIndexedInThePlaceOfTheDelete) {
  EXPECT_EQ(
      Folded(Line(EVENT_DELETE, "/s/a") + Line(EVENT_ATTR, "/s/b") + Line(EVENT_CREATE, "/s/a")),
      (Strings{"index /s/a", "attr /s/b"}));
}

TEST_F(RulesTest, DeleteStandsAgainstAllButACreate) {
  EXPECT_EQ(Folded(Line(EVENT_DELETE, "/s/a") + Line(EVENT_MODIFY, "/s/a") +
                   Line(EVENT_ATTR, "/s/a") + Line(EVENT_REINDEX, "/s/a") +
                   Line(EVENT_UPDATE_CFG, "/s/a") + Line(EVENT_DELETE, "/s/a")),
            Strings{"delete /s/a"});
}

TEST_F(RulesTest, ConfigurationUpdatesAreMerged) {
  EXPECT_EQ(Folded(Line(EVENT_UPDATE_CFG, "/s/d", "", Parsed(R"({"audio":true})")) +
                   Line(EVENT_UPDATE_CFG, "/s/d", "", Parsed(R"({"video":true})"))),
            Strings{R"(config /s/d {"audio":true,"document":false,"photo":false,"video":true})"});
}

TEST_F(RulesTest, CreatedAndDeletedDirectoriesAreReindexed) {
  EXPECT_EQ(Folded(DirLine(EVENT_CREATE, "/s/d") + DirLine(EVENT_DELETE, "/s/e")),
            (Strings{"reindex /s/d", "reindex /s/e"}));
  EXPECT_EQ(Folded(DirLine(EVENT_ATTR, "/s/d") + DirLine(EVENT_MODIFY, "/s/e")),
            (Strings{"attr /s/d", "index /s/e"}));
}

TEST_F(RulesTest, EachBitLeadsToItsOperation) {
  EXPECT_EQ(Folded(Line(EVENT_MODIFY, "/1") + Line(EVENT_ATTR, "/2") + Line(EVENT_CREATE, "/3") +
                   Line(EVENT_DELETE, "/4") + Line(EVENT_RENAME, "/5", "/old") +
                   Line(EVENT_REINDEX, "/6") +
                   Line(EVENT_UPDATE_CFG, "/7", "", Parsed(R"({"photo":true})"))),
            (Strings{"index /1", "attr /2", "index /3", "delete /4", "rename /old -> /5",
                     "reindex /6", R"(config /7 {"photo":true})"}));
  EXPECT_EQ(Folded(Line(0, "/1") + Line(0xfffcfc39, "/2")), Strings{});
}

// ---- Events of several bits

TEST_F(RulesTest, SeveralBitsLeaveOneRecordOfTheLastKind) {
  EXPECT_EQ(Folded(Line(EVENT_ATTR | EVENT_MODIFY, "/a")), Strings{"index /a"});
  EXPECT_EQ(Folded(Line(EVENT_CREATE | EVENT_MODIFY, "/a")), Strings{"index /a"});
  EXPECT_EQ(Folded(Line(EVENT_CREATE | EVENT_ATTR, "/a")), Strings{"attr /a"});
  EXPECT_EQ(Folded(Line(EVENT_CREATE | EVENT_DELETE, "/a")), Strings{"delete /a"});
  EXPECT_EQ(Folded(Line(EVENT_MODIFY | EVENT_DELETE, "/a")), Strings{"delete /a"});
  EXPECT_EQ(Folded(Line(EVENT_MODIFY | EVENT_REINDEX, "/a")), Strings{"reindex /a"});
  EXPECT_EQ(Folded(Line(EVENT_DELETE | EVENT_RENAME, "/b", "/a")), Strings{"rename /a -> /b"});
  EXPECT_EQ(Folded(Line(EVENT_REINDEX | EVENT_UPDATE_CFG, "/a", "", Parsed("{}"))),
            Strings{"config /a {}"});
  EXPECT_EQ(Folded(Line(EVENT_MODIFY | EVENT_RENAME, "/b", "/a")), Strings{"rename /a -> /b"});
  EXPECT_EQ(Folded(Line(EVENT_RENAME | EVENT_REINDEX, "/b", "/a")), Strings{"reindex /a -> /b"});
  EXPECT_EQ(Folded(Line(EVENT_RENAME | EVENT_UPDATE_CFG, "/b", "/a", Parsed("{}"))),
            Strings{"config /a -> /b {}"});
}

TEST_F(RulesTest, RecordOfSeveralBitsIsAttachedOnce) {
  const QueueFile queue(Line(0x30fc6 & ~std::uint32_t{EVENT_OVERFLOW}, "/b", "/a", Parsed("{}")));
  OPTree tree(queue.path());
  EXPECT_EQ(Texts(tree.ops), Strings{"config /a -> /b {}"});
  EXPECT_EQ(tree.GetNodeByPath("/b")->ops, tree.ops);
  EXPECT_EQ(tree.ProcessOP([](std::shared_ptr<OP>) {}), 1);
}

TEST_F(RulesTest, CopiesOfARecordAreRecordsOfTheirOwn) {
  OPTree tree(queue_.path());
  const auto node = tree.GetNodeByPath("/a");
  const auto rec = Pending(tree, node, OP_RENAME);
  tree.HandleDelete(node, rec);
  ASSERT_EQ(tree.ops.size(), 1u);
  const auto copy = std::make_shared<OP>(*rec);
  copy->op = OP_NONE;
  rec->op = OP_RENAME;
  tree.HandleModify(node, copy);
  EXPECT_EQ(Texts(tree.ops), (Strings{"rename /a", "index /a"}));
  // What is attached stays so, whatever it is told.
  *copy = OP(node, OP_NONE);
  tree.HandleModify(node, copy);
  EXPECT_EQ(Texts(tree.ops), (Strings{"rename /a", "index /a"}));
  EXPECT_EQ(node->ops, tree.ops);
}

TEST_F(RulesTest, RecordKeepsTheStandingThatItsLastBitGivesIt) {
  // The attributes are dropped for the pending configuration update, the deletion is not.
  const Json::Value change = Parsed(R"({"audio":true})");
  EXPECT_EQ(
      Folded(Line(EVENT_UPDATE_CFG, "/a", "", change) + Line(EVENT_ATTR | EVENT_DELETE, "/a")),
      (Strings{R"(config /a {"audio":true})", "delete /a"}));
  // Here the deletion stands beside the pending reindex, the reindex of the same line does not.
  const QueueFile queue(Line(EVENT_REINDEX, "/a") + Line(EVENT_DELETE | EVENT_REINDEX, "/a"));
  OPTree tree(queue.path());
  EXPECT_EQ(Texts(tree.ops), (Strings{"reindex /a", "none /a"}));
  EXPECT_EQ(tree.GetNodeByPath("/a")->ops, tree.ops);
}

TEST_F(RulesTest, BitsMeetThePendingRecordInTheirFixedOrder) {
  // Creation revives the pending deletion, then the deletion of the same line takes it back.
  EXPECT_EQ(Folded(Line(EVENT_DELETE, "/a") + Line(EVENT_CREATE | EVENT_DELETE, "/a")),
            Strings{"delete /a"});
  // The attributes of a line come before its modification.
  EXPECT_EQ(Folded(Line(EVENT_ATTR, "/a") + Line(EVENT_ATTR | EVENT_MODIFY, "/a")),
            Strings{"index /a"});
}

TEST_F(RulesTest, OverflowBitBesideOthers) {
  const QueueFile queue(Line(EVENT_MODIFY | EVENT_OVERFLOW, "/a"));
  OPTree tree(queue.path());
  EXPECT_TRUE(tree.crashed);
  EXPECT_EQ(Texts(tree.ops), Strings{"index /a"});
  EXPECT_EQ(HandedOut(tree), Strings{"full "});
}

// ---- Configuration changes that cannot be merged

TEST_F(RulesTest, UpdateWithWrongDataIsSkippedWhereItHadToBeMerged) {
  const Json::Value change = Parsed(R"({"audio":true})");
  EXPECT_EQ(Folded(Line(EVENT_UPDATE_CFG, "/a", "", change) +
                   Line(EVENT_UPDATE_CFG, "/a", "", Json::Value(5)) + Line(EVENT_ATTR, "/b")),
            (Strings{R"(config /a {"audio":true})", "attr /b"}));
  const auto logs = fake::LogsWith("InsertEvent failed");
  ASSERT_EQ(logs.size(), 1u);
  EXPECT_NE(logs[0].find("event_raw={\"data\":5,\"event\":131072,\"path\":\"/a\"}, code=120, "
                         "reason=Not an object, data=5"),
            std::string::npos)
      << logs[0];
}

TEST_F(RulesTest, UpdateIsSkippedWhereThePendingDataIsWrong) {
  EXPECT_EQ(Folded(Line(EVENT_UPDATE_CFG, "/a", "", Json::Value("x")) +
                   Line(EVENT_UPDATE_CFG, "/a", "", Parsed(R"({"audio":true})"))),
            Strings{"config /a \"x\""});
  EXPECT_EQ(fake::LogsWith("code=120, reason=Not an object, data=\"x\"").size(), 1u);
}

}  // namespace
}  // namespace quarry::fileindex
