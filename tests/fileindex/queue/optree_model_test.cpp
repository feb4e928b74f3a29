// The tree against the plain model, on random queues.

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "common/error.h"
#include "fileindex/queue/optree.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/queue/naive_tree.h"
#include "tests/fileindex/queue/queue_lines.h"

namespace quarry::fileindex {
namespace {

struct Mix {
  const char* name;
  int names;   // how many names a directory may hold
  int depth;   // the longest path, in components
  int events;  // per queue
  int seeds;
  int rename_odds;  // one in so many events is a rename, one a reindex
  int bits_odds;    // one in so many events has several bits
  bool odd_paths;   // "/", "//a/", ""
  bool bad_data;    // configuration changes that cannot be merged
};

std::ostream& operator<<(std::ostream& stream, const Mix& mix) {
  return stream << mix.name;
}

class Generator {
 public:
  Generator(const Mix& mix, unsigned int seed) : mix_(mix), random_(seed) {}

  NaiveEvent Next() {
    NaiveEvent event;
    event.op = Kind();
    event.is_dir = Pick(4) == 0;
    event.path = Path();
    if (event.op & EVENT_RENAME) event.path_old = Pick(4) == 0 ? Near(event.path) : Path();
    if (event.op & EVENT_UPDATE_CFG) event.data = Data();
    return event;
  }

 private:
  int Pick(int count) { return std::uniform_int_distribution<int>(0, count - 1)(random_); }

  std::uint32_t Kind() {
    static const std::uint32_t kKinds[] = {EVENT_MODIFY, EVENT_ATTR, EVENT_CREATE, EVENT_DELETE,
                                           EVENT_UPDATE_CFG};
    if (Pick(mix_.rename_odds) == 0) return EVENT_RENAME;
    if (Pick(mix_.rename_odds) == 0) return EVENT_REINDEX;
    std::uint32_t kind = kKinds[Pick(5)];
    if (Pick(mix_.bits_odds) != 0) return kind;
    for (const std::uint32_t bit : {0x1u, 0x2u, 0x4u, 0x40u, 0x80u, 0x100u, 0x10000u, 0x20000u}) {
      if (Pick(3) == 0) kind |= bit;
    }
    return kind;
  }

  std::string Path() {
    if (mix_.odd_paths && Pick(30) == 0) return Pick(2) == 0 ? "/" : "";
    std::string path;
    for (int left = 1 + Pick(mix_.depth); left > 0; --left) {
      path += mix_.odd_paths && Pick(20) == 0 ? "//" : "/";
      path += static_cast<char>('a' + Pick(mix_.names));
    }
    return mix_.odd_paths && Pick(20) == 0 ? path + "/" : path;
  }

  // A place above or below, so that renames go into themselves.
  std::string Near(const std::string& path) {
    if (Pick(2) == 0) return path + Path();
    return path.substr(0, path.rfind('/') == std::string::npos ? 0 : path.rfind('/'));
  }

  Json::Value Data() {
    Json::Value data;
    if (mix_.bad_data && Pick(12) == 0) return Json::Value(7);
    for (const char* name : {"document", "audio", "video", "photo", "other"}) {
      if (Pick(3) == 0) data[name] = Switch();
    }
    return data;
  }

  Json::Value Switch() {
    switch (Pick(6)) {
      case 0:
        return Json::Value(Pick(2));
      case 1:
        return Json::Value("true");
      default:
        return Json::Value(Pick(2) == 0);
    }
  }

  const Mix& mix_;
  std::mt19937 random_;
};

std::string Show(const NaiveEvent& event) {
  return std::to_string(event.op) + (event.is_dir ? "d " : " ") + event.path_old + " -> " +
         event.path + " " + toString(event.data);
}

std::string Show(const std::vector<NaiveEvent>& history) {
  std::string text;
  for (const NaiveEvent& event : history) text += Show(event) + "\n";
  return text;
}

std::string Show(int op, const std::string& src, const std::string& path, const Json::Value& data) {
  return std::to_string(op) + " " + src + " -> " + path + " " + toString(data);
}

std::vector<std::string> Show(const NaiveList& list) {
  std::vector<std::string> texts;
  for (const auto& e : list) texts.push_back(Show(e->op, e->src, e->path, e->data));
  return texts;
}

std::vector<std::string> Show(const std::vector<std::shared_ptr<OP>>& list) {
  std::vector<std::string> texts;
  for (const auto& e : list) texts.push_back(Show(e->op, e->src, e->node->GetPath(), e->data));
  return texts;
}

// Texts are made only when something is wrong, for they cost more than the tree.
bool Same(const std::vector<std::shared_ptr<OP>>& list, const NaiveList& model) {
  return std::equal(list.begin(), list.end(), model.begin(), model.end(),
                    [](const auto& a, const auto& b) {
                      return a->op == b->op && a->src == b->src && a->data == b->data &&
                             a->node->GetPath() == b->path;
                    });
}

// Whether both say that the event cannot be folded, or both that it can.
bool SameVerdict(OPTree& tree, NaiveTree& model, const NaiveEvent& event) {
  const auto real = std::make_shared<Event>(R"({"event":0,"path":""})");
  real->op = event.op;
  real->is_dir = event.is_dir;
  real->path = event.path;
  real->path_old = event.path_old;
  real->data = event.data;
  bool refused = false;
  bool model_refused = false;
  try {
    tree.InsertEvent(real);
  } catch (const Error&) {
    refused = true;
  }
  try {
    model.Insert(event);
  } catch (const NaiveFailure&) {
    model_refused = true;
  }
  return refused == model_refused;
}

std::string Difference(const OPTree& tree, const NaiveTree& model) {
  std::string text;
  for (const std::string& line : Show(tree.ops)) text += "tree  " + line + "\n";
  for (const std::string& line : Show(model.ops)) text += "model " + line + "\n";
  return text;
}

void CompareNodes(OPTree& tree, const NaiveTree& model) {
  std::vector<std::string> paths;
  tree.TraverseNodeDescendant(
      tree.root,
      [&](std::shared_ptr<OPNode> node) {
        const std::string path = node->GetPath();
        paths.push_back(path);
        if (!Same(node->ops, model.At(path))) {
          EXPECT_EQ(Show(node->ops), Show(model.At(path))) << path;
        }
        std::vector<std::string> children;
        for (const auto& child : node->children) children.push_back(child->GetPath());
        EXPECT_EQ(children, model.ChildrenOf(path));
      },
      false);
  std::sort(paths.begin(), paths.end());
  EXPECT_EQ(paths, model.Paths());
}

std::string Lines(const std::vector<NaiveEvent>& history) {
  std::string lines;
  for (const NaiveEvent& event : history) {
    Json::Value json;
    json["event"] = event.op;
    json["is_dir"] = event.is_dir;
    json["path"] = event.path;
    json["path_old"] = event.path_old;
    json["data"] = event.data;
    lines += toString(json) + "\n";
  }
  return lines;
}

class ModelTest : public fake::FakePlatformTest, public ::testing::WithParamInterface<Mix> {};

TEST_P(ModelTest, TreeAndModelAgree) {
  const QueueFile queue;
  for (int seed = 0; seed < GetParam().seeds; ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    Generator generator(GetParam(), static_cast<unsigned int>(seed));
    OPTree tree(queue.path());
    NaiveTree model;
    std::vector<NaiveEvent> history;
    for (int i = 0; i < GetParam().events; ++i) {
      const NaiveEvent event = generator.Next();
      history.push_back(event);
      ASSERT_TRUE(SameVerdict(tree, model, event)) << Show(history);
      if (GetParam().events > 100 && i % 50 != 0) continue;
      ASSERT_TRUE(Same(tree.ops, model.ops)) << Difference(tree, model) << Show(history);
    }
    ASSERT_TRUE(Same(tree.ops, model.ops)) << Difference(tree, model) << Show(history);
    CompareNodes(tree, model);
    log_level = 6;
    const QueueFile whole(Lines(history));
    OPTree built(whole.path());
    log_level = 7;
    ASSERT_TRUE(Same(built.ops, model.ops)) << Difference(built, model) << Show(history);
    CompareNodes(built, model);
    ASSERT_FALSE(HasFailure()) << Show(history);
  }
}

// How far a long list has been gone through when a change turns out to be bad is left open.
INSTANTIATE_TEST_SUITE_P(
    Mixes, ModelTest,
    ::testing::Values(Mix{"small", 2, 2, 20, 1500, 3, 6, false, true},
                      Mix{"deep", 2, 5, 40, 500, 3, 6, false, true},
                      Mix{"wide", 12, 2, 60, 200, 4, 8, false, true},
                      Mix{"crowded", 100, 2, 400, 40, 4, 8, false, true},
                      Mix{"odd", 2, 3, 30, 800, 3, 3, true, true},
                      Mix{"calm", 3, 3, 60, 300, 15, 50, false, true},
                      Mix{"one_place", 1, 1, 300, 60, 6, 4, true, false},
                      Mix{"two_places", 2, 1, 500, 60, 5, 8, false, false},
                      Mix{"long_lists", 2, 2, 400, 60, 4, 6, false, false},
                      Mix{"very_long_lists", 2, 2, 1500, 8, 4, 6, false, false},
                      Mix{"long_lists_of_renames", 2, 1, 400, 60, 2, 10, true, false}),
    ::testing::PrintToStringParamName());

}  // namespace
}  // namespace quarry::fileindex
