#include "daemons/tarnotifyd/directory_tree.h"

#include <algorithm>
#include <utility>

namespace quarry::notify {
namespace {

// Notices when a walk comes to the same place again: each place is compared with an earlier one,
// which moves up whenever the walk is twice as long.
class CircleDetector {
 public:
  bool IsClosedBy(const std::string& at) {
    if (at == mark_) return true;
    if (++steps_ != renewal_) return false;
    mark_ = at;
    renewal_ *= 2;
    return false;
  }

 private:
  std::string mark_;
  std::size_t steps_ = 0;
  std::size_t renewal_ = 1;
};

std::string Joined(const std::string& root, const std::vector<std::string>& names) {
  std::string path = root == "/" ? std::string() : root;
  for (auto name = names.rbegin(); name != names.rend(); ++name) path += "/" + *name;
  return path.empty() ? "/" : path;
}

}  // namespace

void DirectoryTree::SetIgnored(const std::vector<std::string>& names) {
  ignored_ = {names.begin(), names.end()};
}

bool DirectoryTree::AddRoot(const std::string& handle, const std::string& path) {
  Forget();
  std::vector<Entry> entries;
  CircleDetector detector;
  for (std::string at = handle; !at.empty();) {
    bool failed = false;
    const DirectoryPlace* place = Find(at, &failed);
    if (place == nullptr || detector.IsClosedBy(at)) return false;
    if (!place->parent.empty()) entries.emplace_back(place->parent, place->name);
    at = place->parent;
  }
  for (Entry& entry : entries) above_.emplace(std::move(entry), path);
  roots_[handle].push_back(path);
  return true;
}

void DirectoryTree::RemoveRoot(const std::string& path) {
  for (auto root = roots_.begin(); root != roots_.end();) {
    std::vector<std::string>& paths = root->second;
    paths.erase(std::remove(paths.begin(), paths.end(), path), paths.end());
    root = paths.empty() ? roots_.erase(root) : std::next(root);
  }
  for (auto entry = above_.begin(); entry != above_.end();) {
    entry = entry->second == path ? above_.erase(entry) : std::next(entry);
  }
}

std::vector<std::string> DirectoryTree::RootsAt(std::string_view directory,
                                                std::string_view name) const {
  const auto found = above_.equal_range(Entry(directory, name));
  std::vector<std::string> paths;
  for (auto entry = found.first; entry != found.second; ++entry) paths.push_back(entry->second);
  return paths;
}

std::vector<std::string> DirectoryTree::Roots() const {
  std::vector<std::string> all;
  for (const auto& [handle, paths] : roots_) all.insert(all.end(), paths.begin(), paths.end());
  std::sort(all.begin(), all.end());
  return all;
}

bool DirectoryTree::PathsOf(std::string_view directory, std::string_view name,
                            std::vector<std::string>* paths) {
  Climbing climbing = Climb(directory, name, paths);
  if (climbing == Climbing::kCircle) {
    // What was learnt at different times need not fit together.
    Forget();
    climbing = Climb(directory, name, paths);
  }
  return climbing == Climbing::kComplete;
}

DirectoryTree::Climbing DirectoryTree::Climb(std::string_view directory, std::string_view name,
                                             std::vector<std::string>* paths) {
  paths->clear();
  std::vector<std::string> names;  // from the entry upwards
  if (name != ".") names.emplace_back(name);
  CircleDetector detector;
  for (std::string at(directory); !detector.IsClosedBy(at);) {
    if (!names.empty() && ignored_.count(names.back()) != 0) return Climbing::kComplete;
    AddPaths(at, names, paths);
    bool failed = false;
    const DirectoryPlace* place = Find(at, &failed);
    if (failed) return Climbing::kIncomplete;
    if (place == nullptr || place->parent.empty()) return Climbing::kComplete;
    names.push_back(place->name);
    at = place->parent;
  }
  return Climbing::kCircle;
}

bool DirectoryTree::PathsOfFile(std::string_view file, std::vector<std::string>* paths) {
  paths->clear();
  DirectoryPlace place;
  const DirectoryLookup::Answer answer = lookup_.FindFile(file, &place);
  if (answer != DirectoryLookup::Answer::kFound) return answer == DirectoryLookup::Answer::kGone;
  return PathsOf(place.parent, place.name, paths);
}

void DirectoryTree::AddPaths(const std::string& directory, const std::vector<std::string>& names,
                             std::vector<std::string>* paths) const {
  const auto root = roots_.find(directory);
  if (root == roots_.end()) return;
  for (const std::string& path : root->second) {
    std::string joined = Joined(path, names);
    // Watched directories within each other lead to the same place.
    if (std::find(paths->begin(), paths->end(), joined) == paths->end()) {
      paths->push_back(std::move(joined));
    }
  }
}

// Null when the directory is gone, or cannot be found.
const DirectoryPlace* DirectoryTree::Find(const std::string& directory, bool* failed) {
  const auto recent = recent_.find(directory);
  if (recent != recent_.end()) return &recent->second;
  const auto older = older_.find(directory);
  if (older != older_.end()) {
    DirectoryPlace place = std::move(older->second);
    older_.erase(older);
    return Remember(directory, std::move(place));
  }
  DirectoryPlace place;
  const DirectoryLookup::Answer answer = lookup_.Find(directory, &place);
  *failed = answer == DirectoryLookup::Answer::kFailed;
  if (answer != DirectoryLookup::Answer::kFound) return nullptr;
  return Remember(directory, std::move(place));
}

const DirectoryPlace* DirectoryTree::Remember(const std::string& directory, DirectoryPlace place) {
  if (recent_.size() >= kRemembered / 2) {
    older_ = std::move(recent_);
    recent_.clear();
  }
  DirectoryPlace& remembered = recent_[directory];
  remembered = std::move(place);
  return &remembered;
}

void DirectoryTree::Placed(std::string_view directory, std::string_view parent,
                           std::string_view name) {
  if (directory.empty()) return Forget();
  const std::string key(directory);
  older_.erase(key);
  Remember(key, DirectoryPlace{std::string(parent), std::string(name)});
}

void DirectoryTree::Removed(std::string_view directory) {
  if (directory.empty()) return Forget();
  const std::string key(directory);
  recent_.erase(key);
  older_.erase(key);
}

void DirectoryTree::Forget() {
  recent_.clear();
  older_.clear();
}

}  // namespace quarry::notify
