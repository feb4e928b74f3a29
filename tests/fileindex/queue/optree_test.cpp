#include "fileindex/queue/optree.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "fileindex/queue/pool.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/queue/queue_lines.h"

namespace quarry::fileindex {
namespace {

using Strings = std::vector<std::string>;

class OPTreeTest : public fake::FakePlatformTest {
 protected:
  ~OPTreeTest() override { log_level = 7; }

  // A logged line of this process without its unit's line number.
  static std::string ErrorLine(const std::string& function, const std::string& text) {
    return fake::AnyLine(fake::LogHead("optree", 1, function)) + text;
  }
  static Strings AnyLines(const Strings& logs) {
    Strings lines;
    for (const std::string& log : logs) lines.push_back(fake::AnyLine(log));
    return lines;
  }
};

TEST_F(OPTreeTest, EmptyFile) {
  const QueueFile queue;
  OPTree tree(queue.path());
  EXPECT_FALSE(tree.crashed);
  EXPECT_EQ(tree.queue_path, queue.path());
  EXPECT_EQ(tree.root->name, "");
  EXPECT_EQ(tree.root->parent, nullptr);
  EXPECT_TRUE(tree.root->children.empty());
  EXPECT_TRUE(tree.ops.empty());
  EXPECT_EQ(tree.ProcessOP([](std::shared_ptr<OP>) { FAIL(); }), 0);
  EXPECT_TRUE(fake::Logs().empty());
}

TEST_F(OPTreeTest, MissingFile) {
  const test::TempDir dir;
  try {
    OPTree tree(dir / "none");
    FAIL();
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), 502);
    EXPECT_EQ(error.reason(), "Failed to open queue, reason=No such file or directory");
  }
  EXPECT_EQ(
      AnyLines(fake::Logs()),
      Strings{ErrorLine("BuildTree",
                        "Failed [!input_stream], reason: Failed to open queue, reason=No such "
                        "file or directory [err: No such file or directory]")});
  EXPECT_EQ(errno, 0);
}

TEST_F(OPTreeTest, FileThatCannotBeOpened) {
  const QueueFile queue(Line(EVENT_MODIFY, "/a"));
  fake::FailSystemCall("open", 1, EACCES);
  try {
    OPTree tree(queue.path());
    FAIL();
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), 502);
    EXPECT_EQ(error.reason(), "Failed to open queue, reason=Permission denied");
  }
}

// A directory can be opened but not read: an error, lest it pass for an empty queue.
TEST_F(OPTreeTest, FileThatCannotBeRead) {
  const test::TempDir dir;
  try {
    OPTree tree(dir.path());
    FAIL();
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), 502);
    EXPECT_EQ(error.reason(), "Failed to open queue, reason=Is a directory");
  }
}

// Half a queue must not pass for a whole one.
TEST_F(OPTreeTest, FileThatCannotBeReadToItsEnd) {
  log_level = 6;
  std::string lines;
  while (lines.size() < 200'000) lines += Line(EVENT_MODIFY, "/a");
  const QueueFile queue(lines);
  errno = 0;
  fake::FailSystemCall("read", 2, EIO);
  try {
    OPTree tree(queue.path());
    FAIL();
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), 502);
    EXPECT_EQ(error.reason(), "Failed to open queue, reason=Input/output error");
  }
  EXPECT_EQ(AnyLines(fake::Logs()),
            Strings{ErrorLine("BuildTree",
                              "Failed [!input_stream], reason: Failed to open queue, "
                              "reason=Input/output error [err: Input/output error]")});
}

TEST_F(OPTreeTest, InterruptedReadIsRepeated) {
  const QueueFile queue(Line(EVENT_MODIFY, "/a"));
  fake::FailSystemCall("read", 1, EINTR);
  OPTree tree(queue.path());
  EXPECT_EQ(HandedOut(tree), Strings{"index /a"});
}

TEST_F(OPTreeTest, EveryLineIsLoggedWhileDebugging) {
  const std::string a = Line(EVENT_MODIFY, "/a");
  const QueueFile queue(a + Line(EVENT_MODIFY, "/b"));
  { OPTree tree(queue.path()); }
  EXPECT_EQ(AnyLines(fake::Logs()),
            (Strings{"optree.cpp:N Got event: {\"event\":2,\"path\":\"/a\"}",
                     "optree.cpp:N Got event: {\"event\":2,\"path\":\"/b\"}"}));
  fake::ClearLogs();
  for (const int level : {6, 8, 0, -7}) {
    log_level = level;
    OPTree tree(queue.path());
    EXPECT_TRUE(fake::Logs().empty()) << level;
  }
}

TEST_F(OPTreeTest, BadLinesAreLoggedAndSkipped) {
  log_level = 6;
  const QueueFile queue("rubbish\n" + Line(EVENT_MODIFY, "/a") + "\n{\"path\":\"/b\"}\n" +
                        Line(EVENT_ATTR, "/c"));
  errno = 0;
  OPTree tree(queue.path());
  EXPECT_EQ(HandedOut(tree), (Strings{"index /a", "attr /c"}));
  EXPECT_EQ(
      AnyLines(fake::Logs()),
      (Strings{
          ErrorLine("Event",
                    "Failed [!data.fromString(event_raw)], reason: Malformed event_raw: rubbish"),
          ErrorLine("BuildTree",
                    "InsertEvent failed, event_raw=rubbish, code=906, reason=Malformed "
                    "event_raw: rubbish"),
          ErrorLine("Event", "Failed [!data.fromString(event_raw)], reason: Malformed event_raw: "),
          ErrorLine("BuildTree",
                    "InsertEvent failed, event_raw=, code=906, reason=Malformed event_raw: "),
          ErrorLine("BuildTree",
                    "InsertEvent failed, event_raw={\"path\":\"/b\"}, code=120, reason=Missing "
                    "property: event, data={\"path\":\"/b\"}")}));
}

TEST_F(OPTreeTest, BadLineIsLoggedWithErrnoWhichIsCleared) {
  log_level = 6;
  const QueueFile queue("{\"path\":\"/b\"}\n");
  errno = EBUSY;
  OPTree tree(queue.path());
  EXPECT_EQ(AnyLines(fake::Logs()),
            Strings{ErrorLine("BuildTree",
                              "InsertEvent failed, event_raw={\"path\":\"/b\"}, code=120, "
                              "reason=Missing property: event, data={\"path\":\"/b\"} "
                              "[err: Device or resource busy]")});
  EXPECT_EQ(errno, 0);
}

TEST_F(OPTreeTest, OnlyBadLines) {
  const QueueFile queue("a\nb\n[]\n\n");
  OPTree tree(queue.path());
  EXPECT_EQ(tree.ProcessOP([](std::shared_ptr<OP>) { FAIL(); }), 0);
}

TEST_F(OPTreeTest, LastLineNeedNotBeEnded) {
  std::string lines = Line(EVENT_MODIFY, "/a") + Line(EVENT_MODIFY, "/b");
  lines.pop_back();
  EXPECT_EQ(Folded(lines), (Strings{"index /a", "index /b"}));
}

TEST_F(OPTreeTest, CutAtEveryByte) {
  const std::string lines =
      Line(EVENT_MODIFY, "/a") + Line(EVENT_DELETE, "/b") + RenameLine("/c", "/d");
  const Strings whole = Folded(lines);
  ASSERT_EQ(whole.size(), 3u);
  for (size_t length = 0; length <= lines.size(); ++length) {
    const std::string cut = lines.substr(0, length);
    size_t ended = static_cast<size_t>(std::count(cut.begin(), cut.end(), '\n'));
    // A line that lacks nothing but its end counts.
    if (length < lines.size() && lines[length] == '\n') ++ended;
    EXPECT_EQ(Folded(cut), Strings(whole.begin(), whole.begin() + long(ended))) << length;
  }
}

TEST_F(OPTreeTest, LinesOfAnyBytes) {
  const std::string rubbish("\0\xff{\"event\":2,\r\t\x01", 16);
  EXPECT_EQ(Folded(rubbish + "\n" + Line(EVENT_MODIFY, "/\xff\xfe") + rubbish),
            Strings{"index /\xff\xfe"});
}

TEST_F(OPTreeTest, CarriageReturnIsWhiteSpace) {
  EXPECT_EQ(Folded("{\"event\":2,\"path\":\"/a\"}\r\n"), Strings{"index /a"});
}

TEST_F(OPTreeTest, PathsWithNulBytesAreSkipped) {
  log_level = 6;
  EXPECT_EQ(Folded("{\"event\":128,\"path\":\"/a\\u0000b\"}\n"
                   "{\"event\":256,\"path\":\"/c\",\"path_old\":\"/\\u0000\"}\n"),
            Strings{});
  EXPECT_EQ(fake::LogsWith("code=120, reason=NUL byte in path: /").size(), 2u);
}

TEST_F(OPTreeTest, OverflowFirst) {
  const QueueFile queue(Line(EVENT_OVERFLOW, "") + "rubbish\n" + Line(EVENT_MODIFY, "/a"));
  OPTree tree(queue.path());
  EXPECT_TRUE(tree.crashed);
  EXPECT_TRUE(tree.ops.empty());
  EXPECT_TRUE(fake::LogsWith("rubbish").empty());
  fake::ClearLogs();
  std::vector<std::shared_ptr<OP>> seen;
  EXPECT_EQ(tree.ProcessOP([&seen](std::shared_ptr<OP> op) { seen.push_back(op); }), 1);
  ASSERT_EQ(seen.size(), 1u);
  EXPECT_EQ(seen[0]->op, OP_FULL_REINDEX);
  EXPECT_EQ(seen[0]->node, tree.root);
  EXPECT_EQ(seen[0]->src, "");
  EXPECT_TRUE(seen[0]->data.isNull());
  EXPECT_EQ(AnyLines(fake::Logs()), Strings{"optree.cpp:N Queue crashed: " + queue.path()});
}

TEST_F(OPTreeTest, OverflowLast) {
  const QueueFile queue(Line(EVENT_MODIFY, "/a") + Line(EVENT_OVERFLOW, "/a"));
  OPTree tree(queue.path());
  EXPECT_EQ(tree.ops.size(), 1u);
  EXPECT_EQ(HandedOut(tree), Strings{"full "});
}

TEST_F(OPTreeTest, CountIncludesCancelledRecords) {
  const QueueFile queue(Line(EVENT_MODIFY, "/d/a") + Line(EVENT_MODIFY, "/d/b") +
                        Line(EVENT_REINDEX, "/d"));
  OPTree tree(queue.path());
  int calls = 0;
  EXPECT_EQ(tree.ProcessOP([&calls](std::shared_ptr<OP>) { ++calls; }), 3);
  EXPECT_EQ(calls, 1);
}

TEST_F(OPTreeTest, WhatTheCallbackThrowsPassesThrough) {
  const QueueFile queue(Line(EVENT_MODIFY, "/a") + Line(EVENT_MODIFY, "/b"));
  OPTree tree(queue.path());
  int calls = 0;
  EXPECT_THROW(tree.ProcessOP([&calls](std::shared_ptr<OP>) {
    ++calls;
    throw std::out_of_range("enough");
  }),
               std::out_of_range);
  EXPECT_EQ(calls, 1);
}

TEST_F(OPTreeTest, PathsAreTakenApartAtSlashes) {
  const QueueFile queue;
  OPTree tree(queue.path());
  const auto node = tree.GetNodeByPath("/s/a");
  EXPECT_EQ(node->GetPath(), "/s/a");
  for (const std::string path : {"/s//a/", "s/a", "//s/a//", "s//a"}) {
    EXPECT_EQ(tree.GetNodeByPath(path), node) << path;
  }
  for (const std::string path : {"", "/", "//"}) EXPECT_EQ(tree.GetNodeByPath(path), tree.root);
  EXPECT_NE(tree.GetNodeByPath("/s/./a"), node);
  EXPECT_EQ(tree.root->children.size(), 1u);
}

// New names and known ones in turn, so that what is expected at a place is often another.
TEST_F(OPTreeTest, ManyNamesOfADirectoryAreToldApart) {
  std::string lines;
  Strings expected;
  for (int i = 0; i < 100; ++i) {
    const std::string path = "/s/file-" + std::to_string(i);
    lines += Line(EVENT_ATTR, path);
    for (int back = 0; back <= 20; back += 4) {
      lines += Line(EVENT_MODIFY, "/s/file-" + std::to_string(std::max(i - back, 0)));
    }
    expected.push_back("index " + path);
  }
  const QueueFile queue(lines);
  OPTree tree(queue.path());
  EXPECT_EQ(tree.GetNodeByPath("/s")->children.size(), 100u);
  EXPECT_EQ(HandedOut(tree), expected);
}

// Each name comes again before the look-ahead can know that it is there.
TEST_F(OPTreeTest, NewNamesThatComeAgainSoonAreTheSame) {
  std::string lines;
  Strings expected;
  for (int i = 0; i < 100; ++i) {
    for (const EventKind kind : {EVENT_ATTR, EVENT_MODIFY}) {
      for (const char* directory : {"/s/a", "/s/b", "/s/c"}) {
        const std::string path = directory + ("/file-" + std::to_string(i));
        lines += Line(kind, path);
        if (kind == EVENT_ATTR) expected.push_back("index " + path);
      }
    }
  }
  const QueueFile queue(lines);
  OPTree tree(queue.path());
  EXPECT_EQ(HandedOut(tree), expected);
  for (const char* directory : {"/s/a", "/s/b", "/s/c"}) {
    EXPECT_EQ(tree.GetNodeByPath(directory)->children.size(), 100u);
  }
}

// The lists are open to everybody, between two readings too.
TEST_F(OPTreeTest, ChildrenTakenAwayAreMadeAnewByTheNextReading) {
  std::string lines;
  for (int i = 0; i < 10; ++i) lines += Line(EVENT_DELETE, "/s/" + std::to_string(i));
  const QueueFile queue(lines);
  OPTree tree(queue.path());
  const std::shared_ptr<OPNode> directory = tree.GetNodeByPath("/s");
  for (const std::size_t left : {7u, 3u, 0u}) {
    directory->children.resize(left);
    tree.BuildTree();
    ASSERT_EQ(directory->children.size(), 10u);
    for (std::size_t i = 0; i < 10; ++i) {
      EXPECT_EQ(directory->children[i]->name, std::to_string(i));
      EXPECT_EQ(directory->children[i]->ops.size(), 1u);
    }
  }
  EXPECT_EQ(tree.ops.size(), 10u + 3u + 7u + 10u);
}

TEST_F(OPTreeTest, AnotherReadingBehindAnOverflowEndsAtItsFirstLine) {
  const QueueFile queue(Line(EVENT_MODIFY, "/a") + Line(EVENT_OVERFLOW, "/") +
                        Line(EVENT_MODIFY, "/b"));
  OPTree tree(queue.path());
  test::WriteFile(queue.path(), Line(EVENT_MODIFY, "/c") + Line(EVENT_MODIFY, "/d"));
  tree.BuildTree();
  EXPECT_EQ(Texts(tree.ops), (Strings{"index /a", "index /c"}));
}

TEST_F(OPTreeTest, OfSeveralChildrenOfOneNameTheFirstIsFound) {
  std::string lines;
  for (int i = 0; i < 10; ++i) lines += Line(EVENT_DELETE, "/s/" + std::to_string(i));
  const QueueFile queue(lines);
  OPTree tree(queue.path());
  const std::shared_ptr<OPNode> directory = tree.GetNodeByPath("/s");
  for (int i = 0; i < 10; ++i) {
    directory->children.push_back(std::make_shared<OPNode>(directory, std::to_string(i)));
  }
  tree.BuildTree();
  ASSERT_EQ(directory->children.size(), 20u);
  for (std::size_t i = 0; i < 20; ++i) {
    EXPECT_EQ(directory->children[i]->ops.size(), i < 10 ? 1u : 0u) << i;
  }
}

TEST_F(OPTreeTest, TreeWithoutARootHasNoNodes) {
  const QueueFile queue;
  OPTree tree(queue.path());
  tree.root.reset();
  for (const std::string path : {"/a", "/"}) {
    try {
      tree.GetNodeByPath(path);
      FAIL();
    } catch (const Error& error) {
      EXPECT_EQ(error.code(), 9999);
      EXPECT_EQ(error.reason(), "GetNodeByPath failed, path=" + path);
    }
  }
  EXPECT_TRUE(fake::Logs().empty());
}

TEST_F(OPTreeTest, TraversalGoesParentsFirstInOrderOfCreation) {
  const QueueFile queue;
  OPTree tree(queue.path());
  for (const char* path : {"/d/b/2", "/d/a", "/d/b/1", "/d/c/x/y", "/e"}) tree.GetNodeByPath(path);
  const auto visit = [&tree](const std::string& path, bool skip_self) {
    Strings seen;
    tree.TraverseNodeDescendant(
        tree.GetNodeByPath(path),
        [&seen](std::shared_ptr<OPNode> node) { seen.push_back(node->GetPath()); }, skip_self);
    return seen;
  };
  const Strings below{"/d/b", "/d/b/2", "/d/b/1", "/d/a", "/d/c", "/d/c/x", "/d/c/x/y"};
  EXPECT_EQ(visit("/d", true), below);
  Strings all{"/d"};
  all.insert(all.end(), below.begin(), below.end());
  EXPECT_EQ(visit("/d", false), all);
  EXPECT_EQ(visit("/e", true), Strings{});
}

TEST_F(OPTreeTest, TraversalIsNotDisturbedByNewChildren) {
  const QueueFile queue;
  OPTree tree(queue.path());
  const auto node = tree.GetNodeByPath("/d");
  tree.GetNodeByPath("/d/a");
  tree.GetNodeByPath("/d/b");
  Strings seen;
  tree.TraverseNodeDescendant(
      node,
      [&](std::shared_ptr<OPNode> at) {
        seen.push_back(at->name);
        node->GetChild("new below the start, by " + at->name);
      },
      true);
  EXPECT_EQ(seen, (Strings{"a", "b"}));
  EXPECT_EQ(node->children.size(), 4u);
}

TEST_F(OPTreeTest, TraversalEndsWhenEachVisitAddsAChild) {
  const QueueFile queue;
  OPTree tree(queue.path());
  const auto node = tree.GetNodeByPath("/d");
  tree.GetNodeByPath("/d/a/b");
  Strings seen;
  tree.TraverseNodeDescendant(
      node,
      [&seen](std::shared_ptr<OPNode> at) {
        seen.push_back(at->name);
        at->GetChild("new");
      },
      false);
  EXPECT_EQ(seen, (Strings{"d", "a", "b"}));
}

TEST_F(OPTreeTest, RecordsAndTheirPathsOutliveTheTree) {
  const QueueFile queue(Line(EVENT_MODIFY, "/a/b/c") + Line(EVENT_DELETE, "/a/d") +
                        RenameLine("/a/d", "/e"));
  std::vector<std::shared_ptr<OP>> kept;
  std::weak_ptr<OPNode> root;
  {
    OPTree tree(queue.path());
    root = tree.root;
    tree.ProcessOP([&kept](std::shared_ptr<OP> op) { kept.push_back(op); });
  }
  EXPECT_EQ(Texts(kept), (Strings{"index /a/b/c", "delete /a/d", "rename /a/d -> /e"}));
  EXPECT_FALSE(root.expired());
  kept.clear();
  EXPECT_TRUE(root.expired());
}

// Whatever order they are let go in, and by whichever thread: under the sanitizers this shows that
// no memory is given back too early or never.
TEST_F(OPTreeTest, SomeOfManyRecordsOutliveTheTree) {
  std::string lines;
  for (int i = 0; i < 30'000; ++i) {
    lines += Line(i % 3 == 0 ? EVENT_DELETE : EVENT_MODIFY,
                  "/s/" + std::to_string(i % 7) + "/a name of some length " + std::to_string(i));
  }
  const QueueFile queue(lines + RenameLine("/s/3", "/t"));
  log_level = 6;
  const std::size_t before = Pool::BytesInUse();
  std::vector<std::shared_ptr<OP>> kept;
  {
    OPTree tree(queue.path());
    for (std::size_t i = 0; i < 30'000; i += 1'000) kept.push_back(tree.ops[i]);
  }
  EXPECT_GT(Pool::BytesInUse(), before);
  for (const auto& op : kept) {
    EXPECT_NE(op->node->GetPath().find("/a name of some length "), std::string::npos);
    EXPECT_TRUE(op->node->ops.empty());
    EXPECT_TRUE(op->node->parent->children.empty());
  }
  std::shared_ptr<OPNode> directory = kept[1]->node->parent;
  std::reverse(kept.begin(), kept.end());
  std::thread([&kept] { kept.clear(); }).join();
  EXPECT_EQ(directory->GetChild("new")->GetPath(), directory->GetPath() + "/new");
  directory->children.clear();
  directory.reset();
  EXPECT_EQ(Pool::BytesInUse(), before);
}

TEST_F(OPTreeTest, TreeThatCannotBeBuiltIsReleased) {
  const QueueFile queue(Line(EVENT_MODIFY, "/a/b/c"));
  std::weak_ptr<OPNode> node;
  {
    OPTree tree(queue.path());
    node = tree.GetNodeByPath("/a/b/c");
    tree.queue_path += "/none";
    EXPECT_THROW(tree.BuildTree(), Error);
  }
  EXPECT_TRUE(node.expired());
}

}  // namespace
}  // namespace quarry::fileindex
