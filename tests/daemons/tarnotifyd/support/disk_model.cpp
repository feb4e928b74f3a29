#include "tests/daemons/tarnotifyd/support/disk_model.h"

#include <dirent.h>
#include <poll.h>
#include <sys/stat.h>

#include <chrono>
#include <memory>

#include "fileindex/queue/event.h"

namespace quarry::test {
namespace {

using namespace fileindex;

struct CloseDir {
  void operator()(DIR* dir) const { closedir(dir); }
};

std::string NameOf(std::uint32_t kind) {
  switch (kind) {
    case EVENT_MODIFY:
      return "modify";
    case EVENT_ATTR:
      return "attr";
    case EVENT_CREATE:
      return "create";
    case EVENT_DELETE:
      return "delete";
    case EVENT_RENAME:
      return "rename";
    default:
      return "kind " + std::to_string(kind);
  }
}

// The number of links changes without an event of its own, and with it the time of the change.
std::string StampOf(const struct stat& status) {
  if (!S_ISREG(status.st_mode)) return "";
  return std::to_string(status.st_ino) + ":" + std::to_string(status.st_size) + ":" +
         std::to_string(status.st_mtim.tv_sec) + ":" + std::to_string(status.st_mtim.tv_nsec) +
         ":" + std::to_string(status.st_mode);
}

std::set<std::string> PathsOf(const StampedTree& tree) {
  std::set<std::string> paths;
  for (const auto& [path, stamp] : tree) paths.insert(path);
  return paths;
}

}  // namespace

StampedTree StampTree(const std::string& top, const std::set<std::string>& ignored) {
  StampedTree found;
  std::vector<std::string> left{top};
  while (!left.empty()) {
    const std::string path = left.back();
    left.pop_back();
    struct stat status {};
    if (lstat(path.c_str(), &status) != 0) continue;
    found[path] = StampOf(status);
    if (!S_ISDIR(status.st_mode)) continue;
    const std::unique_ptr<DIR, CloseDir> dir(opendir(path.c_str()));
    while (const dirent* entry = dir ? readdir(dir.get()) : nullptr) {
      const std::string name = entry->d_name;
      if (name != "." && name != ".." && ignored.count(name) == 0)
        left.push_back(path + "/" + name);
    }
  }
  return found;
}

std::set<std::string> ListTree(const std::string& top, const std::set<std::string>& ignored) {
  return PathsOf(StampTree(top, ignored));
}

std::string InWords(const notify::Change& change) {
  return NameOf(change.kind) + (change.is_dir ? " dir " : " file ") +
         (change.kind == EVENT_RENAME ? change.path_old + " -> " : "") + change.path;
}

std::set<std::string> DiskModel::Paths() const {
  return PathsOf(paths_);
}

bool DiskModel::IsWithin(const std::string& path) const {
  return path == top_ || path.compare(0, top_.size() + 1, top_ + "/") == 0;
}

// A directory in the place of a file that is told of has come later: that will be told, too.
void DiskModel::LookAt(const std::string& path, bool and_below) {
  if (!IsWithin(path)) return;
  struct stat status {};
  const bool exists = lstat(path.c_str(), &status) == 0;
  if (exists && !and_below) {
    paths_[path] = StampOf(status);
    return;
  }
  const std::string below = path + "/";
  paths_.erase(path);
  auto entry = paths_.lower_bound(below);
  while (entry != paths_.end() && entry->first.compare(0, below.size(), below) == 0) {
    entry = paths_.erase(entry);
  }
  paths_.merge(StampTree(path, ignored_));
}

// Of what was told to be there.
void DiskModel::Restamp(const std::string& path) {
  const auto entry = paths_.find(path);
  struct stat status {};
  if (entry == paths_.end() || lstat(path.c_str(), &status) != 0) return;
  entry->second = StampOf(status);
}

void DiskModel::OnChange(const notify::Change& change) {
  told_.push_back(InWords(change));
  if ((change.kind & (EVENT_MODIFY | EVENT_ATTR)) != 0) return Restamp(change.path);
  const bool is_rename = change.kind == EVENT_RENAME;
  if (is_rename) LookAt(change.path_old, true);
  LookAt(change.path, change.is_dir || is_rename);
}

void DiskModel::OnDoubt(const std::string& directory) {
  told_.push_back("doubt " + directory);
  ++doubts_;
  LookAt(top_, true);
}

void ReadAll(notify::ChangeSource& source, notify::ChangeSink& sink) {
  const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(20);
  pollfd polled{source.Descriptor(), POLLIN, 0};
  // Longer than any source waits by itself for the other half of something.
  while (poll(&polled, 1, 40) > 0 && std::chrono::steady_clock::now() < end) source.Read(sink);
}

}  // namespace quarry::test
