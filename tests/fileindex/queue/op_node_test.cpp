#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/queue/optree.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/queue/queue_lines.h"

namespace quarry::fileindex {
namespace {

// A tree that takes itself apart.
class OPNodeTest : public fake::FakePlatformTest {
 protected:
  QueueFile queue_;
  OPTree tree_{queue_.path()};
  std::shared_ptr<OPNode> root_ = tree_.root;
};

template <typename T>
std::string Streamed(const T& value) {
  std::ostringstream stream;
  stream << value;
  return stream.str();
}

TEST_F(OPNodeTest, KindsHaveTheirNumbers) {
  EXPECT_EQ(OP_NONE, 0);
  EXPECT_EQ(OP_DELETE, 1);
  EXPECT_EQ(OP_INDEX, 2);
  EXPECT_EQ(OP_ATTR, 3);
  EXPECT_EQ(OP_UPDATE_CFG, 4);
  EXPECT_EQ(OP_RENAME, 5);
  EXPECT_EQ(OP_REINDEX, 6);
  EXPECT_EQ(OP_FULL_REINDEX, 7);
}

TEST_F(OPNodeTest, NewNodeIsEmpty) {
  const OPNode node(root_, "x");
  EXPECT_EQ(node.name, "x");
  EXPECT_EQ(node.parent, root_);
  EXPECT_TRUE(node.children.empty());
  EXPECT_TRUE(node.ops.empty());
}

TEST_F(OPNodeTest, NewRecordHasWhatItIsGiven) {
  const auto node = root_->GetChild("a");
  const OP plain(node, OP_ATTR);
  EXPECT_EQ(plain.node, node);
  EXPECT_EQ(plain.op, OP_ATTR);
  EXPECT_EQ(plain.src, "");
  EXPECT_TRUE(plain.data.isNull());
  const OP whole(node, OP_RENAME, "/old", Json::Value(7));
  EXPECT_EQ(whole.node, node);
  EXPECT_EQ(whole.op, OP_RENAME);
  EXPECT_EQ(whole.src, "/old");
  EXPECT_EQ(whole.data, Json::Value(7));
}

TEST_F(OPNodeTest, SameNameIsTheSameChild) {
  const auto a = root_->GetChild("a");
  EXPECT_EQ(root_->GetChild("a"), a);
  EXPECT_EQ(root_->children.size(), 1u);
  EXPECT_EQ(a->parent, root_);
  EXPECT_NE(root_->GetChild("A"), a);
  EXPECT_NE(root_->GetChild(std::string("a\0", 2)), a);
  EXPECT_NE(root_->GetChild(""), a);
  EXPECT_EQ(root_->children.size(), 4u);
}

TEST_F(OPNodeTest, ManyChildrenAreFoundAndKeepTheirOrder) {
  std::vector<std::shared_ptr<OPNode>> made;
  for (int i = 0; i < 100; ++i) {
    made.push_back(root_->GetChild("name of some length " + std::to_string(99 - i)));
  }
  for (int i = 0; i < 100; ++i) {
    EXPECT_EQ(root_->GetChild("name of some length " + std::to_string(99 - i)), made[size_t(i)]);
  }
  EXPECT_EQ(root_->children, made);
}

TEST_F(OPNodeTest, FirstOfTwoChildrenOfOneNameIsFound) {
  for (const int more : {0, 20}) {
    const auto parent = root_->GetChild("parent" + std::to_string(more));
    for (int i = 0; i < more; ++i) parent->GetChild(std::to_string(i));
    const auto first = std::make_shared<OPNode>(parent, "twin");
    parent->children.push_back(first);
    parent->children.push_back(std::make_shared<OPNode>(parent, "twin"));
    EXPECT_EQ(parent->GetChild("twin"), first);
    EXPECT_EQ(parent->children.size(), size_t(more) + 2);
  }
}

// The lists are open to everybody.
TEST_F(OPNodeTest, ChildTakenAwayIsMadeAnew) {
  for (const int kept : {0, 20}) {
    const auto parent = root_->GetChild("parent" + std::to_string(kept));
    for (int i = 0; i < kept; ++i) parent->GetChild(std::to_string(i));
    const auto gone = parent->GetChild("child");
    parent->children.pop_back();
    const auto made = parent->GetChild("child");
    EXPECT_NE(made, gone);
    EXPECT_EQ(parent->children.back(), made);
    EXPECT_EQ(parent->children.size(), size_t(kept) + 1);
    for (size_t i = 0; i < size_t(kept); ++i) {
      EXPECT_EQ(parent->GetChild(std::to_string(i)), parent->children[i]);
    }
    EXPECT_EQ(parent->children.size(), size_t(kept) + 1);
  }
}

TEST_F(OPNodeTest, RecordsTakenAwayPlayNoPartAnyMore) {
  const auto node = tree_.GetNodeByPath("/a");
  const auto rename_to_node = [&] {
    const auto rec = std::make_shared<OP>(node, OP_NONE, "", Json::Value());
    rec->src = "/from";
    tree_.HandleRename(node, rec);
  };
  const auto modify = [&] {
    tree_.HandleModify(node, std::make_shared<OP>(node, OP_NONE, "", Json::Value()));
  };
  for (int i = 0; i < 100; ++i) rename_to_node();
  modify();
  modify();
  EXPECT_EQ(Text(*node->ops.back()), "index /a");
  EXPECT_EQ(node->ops.size(), 101u);
  node->ops.resize(50);
  modify();
  EXPECT_EQ(Text(*node->ops.back()), "index /a");
  EXPECT_EQ(node->ops.size(), 51u);
}

TEST_F(OPNodeTest, PathJoinsTheNames) {
  EXPECT_EQ(root_->GetPath(), "");
  EXPECT_EQ(root_->GetChild("volume1")->GetChild("s")->GetChild("a")->GetPath(), "/volume1/s/a");
}

TEST_F(OPNodeTest, TraverseShowsEachRecordInOrderCancelledOnesToo) {
  const auto node = root_->GetChild("a");
  for (const FileIndexOP kind : {OP_INDEX, OP_NONE, OP_RENAME}) {
    node->ops.push_back(std::make_shared<OP>(node, kind, "", Json::Value()));
  }
  std::vector<std::shared_ptr<OP>> seen;
  node->TraverseOP([&seen](std::shared_ptr<OP> op) {
    seen.push_back(op);
    op->op = OP_ATTR;
  });
  EXPECT_EQ(seen, node->ops);
  for (const auto& op : node->ops) EXPECT_EQ(op->op, OP_ATTR);
}

TEST_F(OPNodeTest, RecordsChangedByATraversalTakePartInTheRules) {
  const auto node = tree_.GetNodeByPath("/a");
  for (int i = 0; i < 100; ++i) {
    const auto rec = std::make_shared<OP>(node, OP_NONE, "", Json::Value());
    rec->src = "/from";
    tree_.HandleRename(node, rec);
    rec->op = OP_NONE;
  }
  tree_.HandleDelete(node, std::make_shared<OP>(node, OP_NONE, "", Json::Value()));
  node->ops.back()->op = OP_NONE;
  node->TraverseOP([](std::shared_ptr<OP> op) { op->op = OP_ATTR; });
  tree_.HandleModify(node, std::make_shared<OP>(node, OP_NONE, "", Json::Value()));
  EXPECT_EQ(node->ops.size(), 101u);
  for (const auto& op : node->ops) EXPECT_EQ(op->op, OP_INDEX);
}

TEST_F(OPNodeTest, RecordPrintsItsKindPathAndData) {
  const auto node = root_->GetChild("s")->GetChild("b");
  EXPECT_EQ(Streamed(OP(node, OP_INDEX, "", Json::Value())), "[2] /s/b, data=null");
  EXPECT_EQ(Streamed(OP(node, OP_RENAME, "/s/a", Json::Value())), "[5] /s/a -> /s/b, data=null");
  EXPECT_EQ(Streamed(OP(node, OP_UPDATE_CFG, "", Parsed(R"({"audio":true})"))),
            "[4] /s/b, data={\"audio\":true}");
  EXPECT_EQ(Streamed(OP(root_, OP_FULL_REINDEX, "", Json::Value())), "[7] , data=null");
  EXPECT_EQ(Streamed(OP(nullptr, OP_FULL_REINDEX, "", Json::Value())), "[7] , data=null");
}

TEST_F(OPNodeTest, NodePrintsItsRecordsIndented) {
  const auto node = root_->GetChild("a");
  EXPECT_EQ(Streamed(*node), "Node[a]: \n");
  node->ops.push_back(std::make_shared<OP>(node, OP_RENAME, "/b", Json::Value()));
  node->ops.push_back(std::make_shared<OP>(node, OP_NONE, "", Json::Value()));
  EXPECT_EQ(Streamed(*node), "Node[a]: \n  [5] /b -> /a, data=null\n  [0] /a, data=null\n");
}

class MergeDataTest : public OPNodeTest {
 protected:
  std::string Merged(const std::string& data, const std::string& other) {
    OP op(root_, OP_UPDATE_CFG, "", Parsed(data));
    op.MergeData(Parsed(other));
    return toString(op.data);
  }
  // The reason with which it fails; the data must be left as it was.
  std::string Reason(const std::string& data, const std::string& other) {
    OP op(root_, OP_UPDATE_CFG, "", Parsed(data));
    try {
      op.MergeData(Parsed(other));
    } catch (const Error& error) {
      EXPECT_EQ(error.code(), 120);
      EXPECT_EQ(op.data, Parsed(data));
      return error.reason();
    }
    ADD_FAILURE() << "merged " << data << " with " << other;
    return "";
  }
};

TEST_F(MergeDataTest, NullBecomesAnObjectOfTheFourSwitches) {
  EXPECT_EQ(Parsed(Merged("null", "null")),
            Parsed(R"({"document":false,"audio":false,"video":false,"photo":false})"));
  EXPECT_EQ(Parsed(Merged("null", R"({"photo":true})")),
            Parsed(R"({"document":false,"audio":false,"video":false,"photo":true})"));
}

TEST_F(MergeDataTest, EachSwitchIsTrueWhenEitherIs) {
  for (const std::string name : {"document", "audio", "video", "photo"}) {
    for (int bits = 0; bits < 4; ++bits) {
      Json::Value data;
      Json::Value other;
      data[name] = (bits & 1) != 0;
      other[name] = (bits & 2) != 0;
      OP op(root_, OP_UPDATE_CFG, "", data);
      op.MergeData(other);
      EXPECT_EQ(op.data.size(), 4u);
      for (const std::string key : {"document", "audio", "video", "photo"}) {
        EXPECT_TRUE(op.data[key].isBool());
        EXPECT_EQ(op.data[key].asBool(), key == name && bits != 0) << name << bits << key;
      }
    }
  }
}

TEST_F(MergeDataTest, OtherKeysAreLeftAlone) {
  EXPECT_EQ(Parsed(Merged(R"({"x":1,"audio":true})", R"({"y":2,"audio":false})")),
            Parsed(R"({"x":1,"document":false,"audio":true,"video":false,"photo":false})"));
}

TEST_F(MergeDataTest, WhatIsNoSwitchCountsAsFalse) {
  EXPECT_EQ(Parsed(Merged(R"({"audio":1,"video":"true"})", R"({"photo":"true"})")),
            Parsed(R"({"document":false,"audio":false,"video":false,"photo":false})"));
  // The incoming one is read as anything that converts to a truth value.
  EXPECT_EQ(Parsed(Merged("{}", R"({"photo":1})")),
            Parsed(R"({"document":false,"audio":false,"video":false,"photo":true})"));
}

TEST_F(MergeDataTest, WhatIsNoObjectIsRefused) {
  EXPECT_EQ(Reason("{}", "5"), "Not an object, data=5");
  EXPECT_EQ(Reason("{\"audio\":true}", "[true]"), "Not an object, data=[true]");
  EXPECT_EQ(Reason("5", "{\"audio\":true}"), "Not an object, data=5");
  EXPECT_EQ(Reason("\"x\"", "null"), "Not an object, data=\"x\"");
  EXPECT_TRUE(fake::Logs().empty());
}

}  // namespace
}  // namespace quarry::fileindex
