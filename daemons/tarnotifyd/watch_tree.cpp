#include "daemons/tarnotifyd/watch_tree.h"

#include <utility>

namespace quarry::notify {
namespace {

std::size_t Mix(std::size_t hash) {
  hash *= 0x9e3779b97f4a7c15ULL;
  return hash ^ (hash >> 32);
}

std::size_t NameHash(IdTable::Id parent, std::string_view name) {
  return Mix(std::hash<std::string_view>()(name) + parent);
}

std::size_t WatchHash(int watch) {
  return Mix(static_cast<std::size_t>(watch));
}

}  // namespace

void IdTable::Insert(Id id) {
  if ((used_ + 1) * 2 > slots_.size()) Grow();
  Place(id);
  ++used_;
}

void IdTable::Place(Id id) {
  std::size_t slot = Home(hash_of_(id));
  while (slots_[slot] != kNone) slot = Next(slot);
  slots_[slot] = id;
}

void IdTable::Grow() {
  const std::vector<Id> before =
      std::exchange(slots_, std::vector<Id>(slots_.empty() ? 16 : slots_.size() * 2, kNone));
  for (const Id id : before) {
    if (id != kNone) Place(id);
  }
}

// What follows is moved up, so that no search ends at the gap before what it looks for.
void IdTable::Erase(Id id) {
  std::size_t gap = Home(hash_of_(id));
  while (slots_[gap] != id) gap = Next(gap);
  --used_;
  for (std::size_t slot = Next(gap); slots_[slot] != kNone; slot = Next(slot)) {
    const std::size_t from_home = (slot - Home(hash_of_(slots_[slot]))) & (slots_.size() - 1);
    const std::size_t from_gap = (slot - gap) & (slots_.size() - 1);
    if (from_home < from_gap) continue;
    slots_[gap] = slots_[slot];
    gap = slot;
  }
  slots_[gap] = kNone;
}

WatchTree::WatchTree()
    : by_name_([this](Id id) { return NameHash(nodes_[id].parent, nodes_[id].name); }),
      by_watch_([this](Id id) { return WatchHash(nodes_[id].watch); }) {}

WatchTree::Id WatchTree::NewNode() {
  if (free_.empty()) {
    nodes_.emplace_back();
    return static_cast<Id>(nodes_.size() - 1);
  }
  const Id id = free_.back();
  free_.pop_back();
  return id;
}

WatchTree::Id WatchTree::AddRoot(const std::string& path) {
  const Id id = NewNode();
  nodes_[id].name = path;
  return id;
}

WatchTree::Id WatchTree::AddChild(Id parent, std::string_view name) {
  const Id id = NewNode();
  Link(id, parent, name);
  return id;
}

void WatchTree::Link(Id id, Id parent, std::string_view name) {
  Node& node = nodes_[id];
  Node& above = nodes_[parent];
  node.parent = parent;
  node.name = name;
  node.previous = kNone;
  node.next = above.first_child;
  if (node.next != kNone) nodes_[node.next].previous = id;
  above.first_child = id;
  by_name_.Insert(id);
}

void WatchTree::Unlink(Id id) {
  Node& node = nodes_[id];
  if (node.parent == kNone) return;
  by_name_.Erase(id);
  if (node.next != kNone) nodes_[node.next].previous = node.previous;
  Id& to_this =
      node.previous != kNone ? nodes_[node.previous].next : nodes_[node.parent].first_child;
  to_this = node.next;
  node.parent = kNone;
}

WatchTree::Id WatchTree::Child(Id parent, std::string_view name) const {
  return by_name_.Find(NameHash(parent, name), [&](Id id) {
    return nodes_[id].parent == parent && nodes_[id].name == name;
  });
}

WatchTree::Id WatchTree::Descendant(Id root, std::string_view path) const {
  const std::string& top = nodes_[root].name;
  if (path.substr(0, top.size()) != top) return kNone;
  path.remove_prefix(top.size());
  Id id = root;
  while (id != kNone && !path.empty()) {
    if (path[0] != '/') return kNone;
    path.remove_prefix(1);
    const std::string_view name = path.substr(0, path.find('/'));
    id = Child(id, name);
    path.remove_prefix(name.size());
  }
  return id;
}

WatchTree::Id WatchTree::RootOf(Id id) const {
  while (nodes_[id].parent != kNone) id = nodes_[id].parent;
  return id;
}

bool WatchTree::IsAtOrBelow(Id id, Id above) const {
  while (id != above && id != kNone) id = nodes_[id].parent;
  return id == above;
}

std::string WatchTree::Path(Id id) const {
  std::vector<Id> way{id};
  while (nodes_[way.back()].parent != kNone) way.push_back(nodes_[way.back()].parent);
  std::string path = nodes_[way.back()].name;
  for (way.pop_back(); !way.empty(); way.pop_back()) {
    path += '/';
    path += nodes_[way.back()].name;
  }
  return path;
}

void WatchTree::Move(Id id, Id parent, std::string_view name) {
  const std::string new_name(name);  // may be the node's own
  Unlink(id);
  Link(id, parent, new_name);
}

void WatchTree::Free(Id id, std::vector<int>* watches) {
  if (nodes_[id].watch >= 0) watches->push_back(nodes_[id].watch);
  SetWatch(id, -1);
  Unlink(id);
  const std::uint32_t life = nodes_[id].life + 1;
  nodes_[id] = Node();
  nodes_[id].life = life;
  free_.push_back(id);
}

void WatchTree::Remove(Id id, std::vector<int>* watches) {
  RemoveChildren(id, watches);
  Free(id, watches);
}

// Always at a leaf: down to the first child, and up again when there is none left.
void WatchTree::RemoveChildren(Id id, std::vector<int>* watches) {
  Id current = id;
  while (nodes_[id].first_child != kNone) {
    while (nodes_[current].first_child != kNone) current = nodes_[current].first_child;
    const Id parent = nodes_[current].parent;
    Free(current, watches);
    current = parent;
  }
}

void WatchTree::SetWatch(Id id, int watch) {
  if (nodes_[id].watch >= 0) by_watch_.Erase(id);
  nodes_[id].watch = watch;
  if (watch >= 0) by_watch_.Insert(id);
}

WatchTree::Id WatchTree::FindWatch(int watch) const {
  return by_watch_.Find(WatchHash(watch), [&](Id id) { return nodes_[id].watch == watch; });
}

}  // namespace quarry::notify
