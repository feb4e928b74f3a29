#include "tests/daemons/fileindexd/fake_disk.h"

#include "common/file_util.h"

namespace quarry::fileindexd {
namespace {

bool IsBelow(const std::string& path, const std::string& dir) {
  return StringStartWith(path, dir + "/");
}

}  // namespace

FakeDisk::Node& FakeDisk::Put(const std::string& path, PlaceKind kind) {
  const std::string parent = Dirname(path);
  if (!parent.empty() && nodes_.count(parent) == 0) Put(parent, PlaceKind::kDirectory);
  Node& node = nodes_[path];
  ++clock_;
  if (node.inode == 0 || node.kind != kind) {
    node = Node();
    node.inode = clock_;
    ChangeParent(path);
  }
  node.kind = kind;
  node.mtime = node.ctime = clock_;
  return node;
}

void FakeDisk::ChangeParent(const std::string& path) {
  const auto parent = nodes_.find(Dirname(path));
  if (parent != nodes_.end()) parent->second.mtime = parent->second.ctime = ++clock_;
}

void FakeDisk::AddDir(const std::string& path) {
  const std::lock_guard<std::mutex> lock(mutex_);
  Put(path, PlaceKind::kDirectory);
}

void FakeDisk::WriteFile(const std::string& path) {
  const std::lock_guard<std::mutex> lock(mutex_);
  ++Put(path, PlaceKind::kFile).size;
}

void FakeDisk::AddOther(const std::string& path) {
  const std::lock_guard<std::mutex> lock(mutex_);
  Put(path, PlaceKind::kOther);
}

void FakeDisk::AddMount(const std::string& path) {
  const std::lock_guard<std::mutex> lock(mutex_);
  Put(path, PlaceKind::kForeign);
}

void FakeDisk::MakeUnreadable(const std::string& path) {
  const std::lock_guard<std::mutex> lock(mutex_);
  nodes_.at(path).kind = PlaceKind::kUnknown;
}

void FakeDisk::Touch(const std::string& path) {
  const std::lock_guard<std::mutex> lock(mutex_);
  nodes_.at(path).ctime = ++clock_;
}

void FakeDisk::Remove(const std::string& path) {
  const std::lock_guard<std::mutex> lock(mutex_);
  std::erase_if(
      nodes_, [&](const auto& entry) { return entry.first == path || IsBelow(entry.first, path); });
  ChangeParent(path);
}

void FakeDisk::Rename(const std::string& from, const std::string& to) {
  Remove(to);
  const std::lock_guard<std::mutex> lock(mutex_);
  std::map<std::string, Node> moved;
  for (auto it = nodes_.begin(); it != nodes_.end();) {
    if (it->first == from || IsBelow(it->first, from)) {
      moved[to + it->first.substr(from.size())] = it->second;
      it = nodes_.erase(it);
    } else {
      ++it;
    }
  }
  nodes_.merge(moved);
  nodes_.at(to).ctime = ++clock_;
  ChangeParent(from);
  ChangeParent(to);
}

std::vector<std::string> FakeDisk::Tree(const std::string& path) const {
  const std::lock_guard<std::mutex> lock(mutex_);
  std::vector<std::string> all;
  for (const auto& [place, node] : nodes_) {
    if (place == path || IsBelow(place, path)) all.push_back(place);
  }
  return all;
}

bool FakeDisk::Has(const std::string& path) const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return nodes_.count(path) > 0;
}

Place FakeDisk::At(const std::string& path) const {
  Place place;
  const auto found = nodes_.find(path);
  if (found == nodes_.end()) return place;
  const Node& node = found->second;
  place.kind = node.kind;
  const std::string content = std::to_string(node.size) + ":" + std::to_string(node.mtime);
  place.attribute_stamp =
      "7:" + std::to_string(node.inode) + ":" + content + ":" + std::to_string(node.ctime);
  if (node.kind == PlaceKind::kFile) place.content_stamp = "1:" + content;
  return place;
}

bool FakeDisk::Blocked(const std::string& base, const std::string& path, Place& place) const {
  for (std::size_t end = path.find('/', base.size()); end != std::string::npos && end < path.size();
       end = path.find('/', end + 1)) {
    const PlaceKind kind = At(path.substr(0, end)).kind;
    if (kind == PlaceKind::kDirectory) continue;
    if (kind == PlaceKind::kForeign && end == base.size()) continue;
    place = Place();
    if (kind == PlaceKind::kForeign || kind == PlaceKind::kUnknown) place.kind = kind;
    return true;
  }
  return false;
}

Place FakeDisk::Look(const std::string& base, const std::string& path) {
  const std::lock_guard<std::mutex> lock(mutex_);
  Place place = At(path);
  if (Blocked(base, path, place)) return place;
  if (base == path && place.kind == PlaceKind::kForeign) place.kind = PlaceKind::kDirectory;
  return place;
}

Place FakeDisk::Peek(const std::string& path) {
  const std::lock_guard<std::mutex> lock(mutex_);
  return At(path);
}

PlaceKind FakeDisk::List(const std::string& dir, std::vector<std::string>& names) {
  const std::lock_guard<std::mutex> lock(mutex_);
  names.clear();
  const PlaceKind kind = At(dir).kind;
  if (kind != PlaceKind::kDirectory && kind != PlaceKind::kForeign) {
    return kind == PlaceKind::kUnknown ? kind : PlaceKind::kAbsent;
  }
  for (const auto& [path, node] : nodes_) {
    if (IsBelow(path, dir) && Dirname(path) == dir) names.push_back(Basename(path));
  }
  return PlaceKind::kDirectory;
}

Identity FakeDisk::Identify(const std::string& dir) {
  const std::lock_guard<std::mutex> lock(mutex_);
  Identity identity;
  const auto found = nodes_.find(dir);
  if (found == nodes_.end()) return identity;
  identity.exists = true;
  identity.inode = found->second.inode;
  identity.mount_root = found->second.kind == PlaceKind::kForeign;
  return identity;
}

}  // namespace quarry::fileindexd
