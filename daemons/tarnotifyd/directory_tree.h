// Where directories are, known by their handles.
//
// The kernel names the directory of a change by a handle, which stays the same wherever the
// directory is moved. Its path is found by climbing: each directory is remembered with its parent's
// handle and its own name, until a watched directory is met. So a renamed directory changes one
// entry here, whatever lies below it; and the same place, mounted twice, has the path of the
// watched directory that leads to it.
//
// What is told may be newer than the event that is told, never older than the last one: with the
// event of a rename an entry is forgotten, and asked for at the disk when it is needed, which may
// be ahead of the events. (The event itself may be behind: the kernel tells of a rename in the
// place of an earlier one that was the same, however often it was undone in between.) A path may
// then be one that is only now right, or that is right no more. Nothing is lost by that. Whoever
// works on the lines looks at the places that they name, whole below directories that appear,
// vanish or are renamed. Take the last event that put a place, or a directory above it, where it is
// or that took it away: nothing above that event's entry has moved afterwards, or that would have
// been the last one. So this event is told with its true path, and that place is compared with the
// disk. Everything told wrongly before it lies at or below a place that a later line names.
//
// For the same reason nothing need be said about a directory that is gone: the last of its parents
// that is left has told, or will tell, that an entry was deleted, moved away or replaced.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_DIRECTORY_TREE_H_
#define QUARRY_DAEMONS_TARNOTIFYD_DIRECTORY_TREE_H_

#include <cstddef>
#include <map>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <utility>
#include <vector>

namespace quarry::notify {

// A directory's entry in its parent.
struct DirectoryPlace {
  std::string parent;  // handle; empty for what has no parent that can be reached
  std::string name;
};

// Asks the file system.
class DirectoryLookup {
 public:
  enum class Answer {
    kFound,
    kGone,    // there is no such directory any more
    kFailed,  // it may well exist, but cannot be found now
  };

  virtual ~DirectoryLookup() = default;
  virtual Answer Find(std::string_view handle, DirectoryPlace* place) = 0;
  // Of what is no directory: one of its places. Those that the kernel has not met since it came up
  // are not known to it: kFailed.
  virtual Answer FindFile(std::string_view handle, DirectoryPlace* place) = 0;
};

// The directories of one file system. One thread.
class DirectoryTree {
 public:
  // `lookup` must outlive the tree.
  explicit DirectoryTree(DirectoryLookup& lookup) : lookup_(lookup) {}

  // Below these names nothing is watched.
  void SetIgnored(const std::vector<std::string>& names);

  // A watched directory: one handle may be watched under several paths. Returns false, and has
  // added nothing, when it or one above it cannot be looked up.
  bool AddRoot(const std::string& handle, const std::string& path);
  void RemoveRoot(const std::string& path);
  // The paths of all watched directories.
  std::vector<std::string> Roots() const;
  // Those that were, when they were added, the directory of this entry or below it.
  std::vector<std::string> RootsAt(std::string_view directory, std::string_view name) const;

  // The paths of the entry `name` (of the directory itself for ".") below watched directories; none
  // where it lies outside, is ignored or is gone. Returns false when some may be missing because a
  // directory could not be looked up.
  bool PathsOf(std::string_view directory, std::string_view name, std::vector<std::string>* paths);

  // The same of any place of the file `file`, for which false is more likely.
  bool PathsOfFile(std::string_view file, std::vector<std::string>* paths);

  // Takes note of events, in their order: a directory was made, and was moved or removed. One whose
  // handle is empty may be any.
  void Placed(std::string_view directory, std::string_view parent, std::string_view name);
  void Removed(std::string_view directory);
  void Forget();

  // How many directories are remembered.
  std::size_t size() const { return recent_.size() + older_.size(); }
  static constexpr std::size_t kRemembered = 32768;

 private:
  using Places = std::unordered_map<std::string, DirectoryPlace>;
  using Entry = std::pair<std::string, std::string>;  // a directory's handle, and a name in it

  enum class Climbing { kComplete, kIncomplete, kCircle };

  Climbing Climb(std::string_view directory, std::string_view name,
                 std::vector<std::string>* paths);
  const DirectoryPlace* Find(const std::string& directory, bool* failed);
  const DirectoryPlace* Remember(const std::string& directory, DirectoryPlace place);
  void AddPaths(const std::string& directory, const std::vector<std::string>& names,
                std::vector<std::string>* paths) const;

  DirectoryLookup& lookup_;
  std::unordered_set<std::string> ignored_;
  std::unordered_map<std::string, std::vector<std::string>> roots_;  // by handle
  std::multimap<Entry, std::string> above_;  // what leads to each watched directory, and its path
  // Two generations: the older one is dropped when the recent one is full, which keeps what is in
  // use without the cost of an order.
  Places recent_;
  Places older_;
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_DIRECTORY_TREE_H_
