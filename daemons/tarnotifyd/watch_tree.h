// The watched directories, in little memory.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_WATCH_TREE_H_
#define QUARRY_DAEMONS_TARNOTIFYD_WATCH_TREE_H_

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace quarry::notify {

// A hash table of numbers that stand for something else: 4 bytes each, and as many free.
class IdTable {
 public:
  using Id = std::uint32_t;
  static constexpr Id kNone = ~Id{0};
  using HashOf = std::function<std::size_t(Id)>;

  // `hash_of` gives the hash of an id that is in the table.
  explicit IdTable(HashOf hash_of) : hash_of_(std::move(hash_of)) {}

  // The id with this hash for which `matches` holds, else kNone.
  template <typename Matches>
  Id Find(std::size_t hash, const Matches& matches) const {
    if (slots_.empty()) return kNone;
    for (std::size_t slot = Home(hash); slots_[slot] != kNone; slot = Next(slot)) {
      if (matches(slots_[slot])) return slots_[slot];
    }
    return kNone;
  }
  void Insert(Id id);
  // The id is in the table, with the hash that it was inserted with.
  void Erase(Id id);
  std::size_t size() const { return used_; }

 private:
  std::size_t Home(std::size_t hash) const { return hash & (slots_.size() - 1); }
  std::size_t Next(std::size_t slot) const { return (slot + 1) & (slots_.size() - 1); }
  void Place(Id id);
  void Grow();

  HashOf hash_of_;
  std::vector<Id> slots_;
  std::size_t used_ = 0;
};

// Directories known by their parent and name, each perhaps with the number of a watch. Moving one
// with all below it costs the same whatever lies below. One thread.
class WatchTree {
 public:
  using Id = IdTable::Id;
  static constexpr Id kNone = IdTable::kNone;

  // A directory, or nothing once that was removed, whatever has its number by then.
  struct Ref {
    Id id = kNone;
    std::uint32_t life = 0;
  };

  WatchTree();
  WatchTree(const WatchTree&) = delete;
  WatchTree& operator=(const WatchTree&) = delete;

  // A directory without a parent, known by its full path.
  Id AddRoot(const std::string& path);
  // There is no child of that name yet.
  Id AddChild(Id parent, std::string_view name);
  Id Child(Id parent, std::string_view name) const;
  // The directory at the full path `path`, if it is known at or below `root`; else kNone.
  Id Descendant(Id root, std::string_view path) const;
  // Of a root kNone.
  Id Parent(Id id) const { return nodes_[id].parent; }
  Id RootOf(Id id) const;
  bool IsAtOrBelow(Id id, Id above) const;
  bool HasChildren(Id id) const { return nodes_[id].first_child != kNone; }
  std::string Path(Id id) const;

  // Gives the directory another place: not below itself, and one where no other is.
  void Move(Id id, Id parent, std::string_view name);

  // Removes the directory, or only what is below it. The watches of what is removed are appended.
  void Remove(Id id, std::vector<int>* watches);
  void RemoveChildren(Id id, std::vector<int>* watches);

  // -1 stands for no watch. No other directory has the same.
  int Watch(Id id) const { return nodes_[id].watch; }
  void SetWatch(Id id, int watch);
  Id FindWatch(int watch) const;

  Ref RefTo(Id id) const { return {id, nodes_[id].life}; }
  bool IsAlive(Ref ref) const { return ref.id < nodes_.size() && nodes_[ref.id].life == ref.life; }

  // How many directories there are.
  std::size_t size() const { return nodes_.size() - free_.size(); }
  // How many of them have a watch.
  std::size_t Watches() const { return by_watch_.size(); }

 private:
  struct Node {
    Id parent = kNone;
    Id first_child = kNone;
    Id next = kNone;  // siblings, in no order
    Id previous = kNone;
    int watch = -1;
    std::uint32_t life = 0;  // raised when the node is removed
    std::string name;        // of a root its path
  };

  Id NewNode();
  void Link(Id id, Id parent, std::string_view name);
  void Unlink(Id id);
  void Free(Id id, std::vector<int>* watches);

  // Grows without copying.
  std::deque<Node> nodes_;
  std::vector<Id> free_;
  IdTable by_name_;
  IdTable by_watch_;
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_WATCH_TREE_H_
