#include "daemons/tarnotifyd/watch_tree.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <random>

namespace quarry::notify {
namespace {

using Id = WatchTree::Id;

TEST(WatchTreeTest, KnowsDirectoriesByNameAndByWatch) {
  WatchTree tree;
  const Id root = tree.AddRoot("/v/s");
  const Id a = tree.AddChild(root, "a");
  const Id b = tree.AddChild(a, "b");
  tree.SetWatch(b, 7);
  EXPECT_EQ(tree.Child(root, "a"), a);
  EXPECT_EQ(tree.Child(root, "b"), WatchTree::kNone);
  EXPECT_EQ(tree.FindWatch(7), b);
  EXPECT_EQ(tree.FindWatch(8), WatchTree::kNone);
  EXPECT_EQ(tree.Path(b), "/v/s/a/b");
  EXPECT_EQ(tree.RootOf(b), root);
  EXPECT_TRUE(tree.IsAtOrBelow(b, a));
  EXPECT_FALSE(tree.IsAtOrBelow(a, b));
}

TEST(WatchTreeTest, MovesWhatIsBelowAlong) {
  WatchTree tree;
  const Id root = tree.AddRoot("/r");
  const Id a = tree.AddChild(root, "a");
  const Id below = tree.AddChild(tree.AddChild(a, "x"), "y");
  const Id other = tree.AddChild(root, "other");
  tree.Move(a, other, "b");
  EXPECT_EQ(tree.Path(below), "/r/other/b/x/y");
  EXPECT_EQ(tree.Child(root, "a"), WatchTree::kNone);
}

TEST(WatchTreeTest, WhatIsRemovedIsGoneForThoseWhoRememberIt) {
  WatchTree tree;
  const Id root = tree.AddRoot("/r");
  const Id a = tree.AddChild(root, "a");
  tree.SetWatch(a, 1);
  tree.SetWatch(tree.AddChild(a, "b"), 2);
  const WatchTree::Ref ref = tree.RefTo(a);
  std::vector<int> watches;
  tree.Remove(a, &watches);
  std::sort(watches.begin(), watches.end());
  EXPECT_EQ(watches, (std::vector<int>{1, 2}));
  EXPECT_FALSE(tree.IsAlive(ref));
  tree.AddChild(root, "a");
  EXPECT_FALSE(tree.IsAlive(ref));
  EXPECT_EQ(tree.size(), 2U);
}

TEST(WatchTreeTest, DepthCostsNoStack) {
  WatchTree tree;
  Id id = tree.AddRoot("/r");
  const Id root = id;
  for (int i = 0; i < 200'000; ++i) id = tree.AddChild(id, "d");
  EXPECT_EQ(tree.Path(id).size(), 2U + 400'000U);
  std::vector<int> watches;
  tree.Remove(root, &watches);
  EXPECT_EQ(tree.size(), 0U);
}

// Against a map from path to watch.
class TreeModel {
 public:
  explicit TreeModel(unsigned seed) : random_(seed) {
    tree_.AddRoot("");
    paths_[""] = -1;
  }

  void DoOne() {
    const std::string at = AnyPath();
    const std::string name(1, static_cast<char>('a' + random_() % 5));
    const Id id = Find(at);
    const std::string path = at + "/" + name;
    if (paths_.count(path) == 0 && std::count(path.begin(), path.end(), '/') < 8) {
      tree_.SetWatch(tree_.AddChild(id, name), next_watch_);
      paths_[path] = next_watch_++;
    } else if (!at.empty() && random_() % 3 == 0) {
      Remove(at, id);
    } else if (!at.empty()) {
      Move(at, id, AnyPath() + "/" + name);
    }
  }

  void Check() const {
    EXPECT_EQ(tree_.size(), paths_.size());
    for (const auto& [path, watch] : paths_) {
      const Id id = Find(path);
      ASSERT_NE(id, WatchTree::kNone) << path;
      EXPECT_EQ(tree_.Path(id), path);
      EXPECT_EQ(tree_.Watch(id), watch);
      EXPECT_EQ(tree_.FindWatch(watch), watch < 0 ? WatchTree::kNone : id);
    }
  }

 private:
  std::string AnyPath() {
    return std::next(paths_.begin(), static_cast<long>(random_() % paths_.size()))->first;
  }
  Id Find(const std::string& path) const {
    Id id = 0;
    for (std::size_t i = 1; i < path.size(); i += 2) id = tree_.Child(id, path.substr(i, 1));
    return id;
  }
  static bool IsBelow(const std::string& path, const std::string& top) {
    return (path + "/").compare(0, top.size() + 1, top + "/") == 0;
  }
  void Remove(const std::string& at, Id id) {
    std::vector<int> removed;
    tree_.Remove(id, &removed);
    std::vector<int> expected;
    for (auto path = paths_.begin(); path != paths_.end();) {
      const bool gone = IsBelow(path->first, at);
      if (gone) expected.push_back(path->second);
      path = gone ? paths_.erase(path) : std::next(path);
    }
    std::sort(removed.begin(), removed.end());
    std::sort(expected.begin(), expected.end());
    EXPECT_EQ(removed, expected);
  }
  void Move(const std::string& from, Id id, const std::string& to) {
    if (IsBelow(to, from) || paths_.count(to) > 0) return;
    tree_.Move(id, Find(to.substr(0, to.size() - 2)), to.substr(to.size() - 1));
    std::map<std::string, int> after;
    for (const auto& [path, watch] : paths_) {
      after[IsBelow(path, from) ? to + path.substr(from.size()) : path] = watch;
    }
    paths_ = after;
  }

  WatchTree tree_;
  std::map<std::string, int> paths_;
  int next_watch_ = 0;
  std::mt19937 random_;
};

TEST(WatchTreeTest, IsLikeAMapOfPaths) {
  for (unsigned seed = 0; seed < 20; ++seed) {
    TreeModel model(seed);
    for (int i = 0; i < 300; ++i) {
      model.DoOne();
      if (i % 30 == 0) model.Check();
    }
    model.Check();
  }
}

}  // namespace
}  // namespace quarry::notify
