// The rules of coalescing written down in the plainest way: lists that are searched from end to end
// and paths that are compared as texts. Slow, and obviously right; the tree is tested against it.

#ifndef QUARRY_TESTS_FILEINDEX_QUEUE_NAIVE_TREE_H_
#define QUARRY_TESTS_FILEINDEX_QUEUE_NAIVE_TREE_H_

#include <json/json.h>

#include <algorithm>
#include <cstdint>
#include <map>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

namespace quarry::fileindex {

struct NaiveRecord {
  std::string path;
  int op = 0;
  std::string src;
  Json::Value data;
};
using NaiveList = std::vector<std::shared_ptr<NaiveRecord>>;

struct NaiveEvent {
  std::uint32_t op = 0;
  bool is_dir = false;
  std::string path;
  std::string path_old;
  Json::Value data;
};

// A configuration change that cannot be merged.
struct NaiveFailure : std::runtime_error {
  using std::runtime_error::runtime_error;
};

class NaiveTree {
 public:
  NaiveTree() { nodes_[""]; }

  void Insert(const NaiveEvent& event) {
    const std::string path = Node(event.path);
    const auto rec = std::make_shared<NaiveRecord>();
    rec->path = path;
    if (event.op & 0x40) event.is_dir ? Reindex(rec) : Meet(rec, kCreate);
    if (event.op & 0x04) Meet(rec, kAttr);
    if (event.op & 0x02) Meet(rec, kModify);
    if (event.op & 0x80) event.is_dir ? Reindex(rec) : Meet(rec, kDelete);
    if (event.op & 0x100) {
      rec->src = event.path_old;
      Rename(rec);
    }
    if (event.op & 0x10000) Reindex(rec);
    if (event.op & 0x20000) {
      rec->data = event.data;
      Meet(rec, kConfig);
    }
    if (event.op & 0x200) crashed = true;
  }

  // All records, in order of acceptance.
  NaiveList ops;
  bool crashed = false;

  std::vector<std::string> Paths() const {
    std::vector<std::string> paths;
    for (const auto& [path, node] : nodes_) paths.push_back(path);
    return paths;
  }
  const NaiveList& At(const std::string& path) const { return nodes_.at(path).ops; }
  const std::vector<std::string>& ChildrenOf(const std::string& path) const {
    return nodes_.at(path).children;
  }

 private:
  enum Rules { kDelete, kCreate, kModify, kAttr, kConfig, kReindex };
  struct NodeData {
    std::vector<std::string> children;  // full paths
    NaiveList ops;
  };

  // Creates the node and those above it; returns the path in canonical form.
  std::string Node(const std::string& path) {
    std::string at;
    std::string component;
    for (const char c : path + "/") {
      if (c != '/') {
        component += c;
        continue;
      }
      if (component.empty()) continue;
      const std::string child = at + "/" + component;
      if (nodes_.count(child) == 0) {
        nodes_[child];
        nodes_[at].children.push_back(child);
      }
      at = child;
      component.clear();
    }
    return at;
  }

  void Attach(const std::shared_ptr<NaiveRecord>& rec) {
    if (std::find(ops.begin(), ops.end(), rec) != ops.end()) return;
    ops.push_back(rec);
    nodes_[rec->path].ops.push_back(rec);
  }

  void Meet(const std::shared_ptr<NaiveRecord>& rec, Rules rules) {
    static const int kKinds[] = {1, 2, 2, 3, 4, 6};
    rec->op = kKinds[rules];
    for (const auto& pending : nodes_[rec->path].ops) {
      if (pending == rec || pending->path != rec->path) continue;
      MeetOne(*pending, *rec, rules);
    }
    if (rec->op != 0) Attach(rec);
  }

  static void MeetOne(NaiveRecord& pending, NaiveRecord& rec, Rules rules) {
    const int e = pending.op;
    if (e == 0 || e == 5 || e == 7) return;
    switch (rules) {
      case kDelete:
        if (e == 4 || e == 6) return;
        pending.op = 1;
        break;
      case kCreate:
        if (e == 1 || e == 3) pending.op = 2;
        break;
      case kModify:
        if (e == 3) pending.op = 2;
        break;
      case kAttr:
        break;
      case kConfig:
        if (e == 2 || e == 3) {
          pending.op = 4;
          pending.data = rec.data;
        }
        if (e == 4) MergeSwitches(pending.data, rec.data);
        break;
      case kReindex:
        if (e == 2 || e == 3 || e == 4) pending.op = 6;
        break;
    }
    rec.op = 0;
  }

  static void MergeSwitches(Json::Value& data, const Json::Value& other) {
    for (const Json::Value* value : {&other, static_cast<const Json::Value*>(&data)}) {
      if (!value->isNull() && !value->isObject()) throw NaiveFailure("not an object");
    }
    for (const char* name : {"document", "audio", "video", "photo"}) {
      const bool theirs = !other.isNull() && IsTrue(other[name]);
      const bool ours = data[name].isBool() && data[name].asBool();
      data[name] = theirs || ours;
    }
  }

  // Numbers count, texts do not.
  static bool IsTrue(const Json::Value& value) {
    return value.isBool() ? value.asBool() : value.isInt() && value.asInt() != 0;
  }

  void Reindex(const std::shared_ptr<NaiveRecord>& rec) {
    Meet(rec, kReindex);
    for (const std::string& below : Below(rec->path)) {
      for (const auto& pending : nodes_[below].ops) {
        if (pending->path == below && pending->op != 5) pending->op = 0;
      }
    }
  }

  // Parents first, children in order of creation.
  std::vector<std::string> Below(const std::string& path) {
    std::vector<std::string> found;
    for (const std::string& child : nodes_[path].children) {
      found.push_back(child);
      const std::vector<std::string> more = Below(child);
      found.insert(found.end(), more.begin(), more.end());
    }
    return found;
  }

  void Rename(const std::shared_ptr<NaiveRecord>& rec) {
    const std::string source = Node(rec->src);
    const std::string& destination = rec->path;
    rec->op = 5;
    NaiveList carriers;
    if (source != destination) {
      for (const auto& pending : nodes_[destination].ops) {
        const bool replaced = pending->op == 1 || pending->op == 2 || pending->op == 3;
        if (pending->path == destination && replaced) pending->op = 0;
      }
      if (!source.empty()) carriers = Carry(source, destination);
    }
    Attach(rec);
    for (const auto& carrier : carriers) Attach(carrier);
  }

  NaiveList Carry(const std::string& source, const std::string& destination) {
    std::vector<std::string> from{source};
    for (const std::string& below : Below(source)) {
      const bool into_itself = (below + "/").rfind(destination + "/", 0) == 0 &&
                               (destination + "/").rfind(source + "/", 0) == 0;
      const NaiveList& list = nodes_[below].ops;
      const bool pending =
          std::any_of(list.begin(), list.end(), [](auto& e) { return e->op != 0; });
      if (pending && !into_itself) from.push_back(below);
    }
    std::vector<NaiveList> taken;
    for (const std::string& path : from) taken.push_back(std::exchange(nodes_[path].ops, {}));
    NaiveList carriers;
    for (size_t i = 0; i < from.size(); ++i) {
      const std::string to = Node(destination + from[i].substr(source.size()));
      const auto carrier = std::make_shared<NaiveRecord>();
      carrier->path = to;
      for (const auto& pending : taken[i]) {
        if (pending->path == from[i] &&
            (pending->op == 2 || pending->op == 3 || pending->op == 6)) {
          carrier->op = pending->op;
          pending->op = 0;
        }
        nodes_[to].ops.push_back(pending);
      }
      if (carrier->op != 0) carriers.push_back(carrier);
    }
    return carriers;
  }

  std::map<std::string, NodeData> nodes_;
};

}  // namespace quarry::fileindex

#endif  // QUARRY_TESTS_FILEINDEX_QUEUE_NAIVE_TREE_H_
