#include "fileindex/queue/ledger.h"

#include <algorithm>
#include <iterator>
#include <string>

namespace quarry::fileindex {
namespace {

// Below this, comparing names one by one is faster than hashing.
constexpr std::size_t kFewChildren = 8;

bool IsWork(FileIndexOP kind) {
  return kind == OP_INDEX || kind == OP_ATTR || kind == OP_REINDEX;
}

// Appends the shorter to the longer, and leaves the result in `to`.
template <typename T>
void Pour(std::vector<T>& from, std::vector<T>& to) {
  if (to.size() < from.size()) to.swap(from);
  to.insert(to.end(), std::make_move_iterator(from.begin()), std::make_move_iterator(from.end()));
  from.clear();
}

using Records = std::vector<std::shared_ptr<OP>>;

void Append(Records& from, Records& to) {
  to.insert(to.end(), std::make_move_iterator(from.begin()), std::make_move_iterator(from.end()));
  from.clear();
}

void AppendReversed(Records& from, Records& to) {
  to.insert(to.end(), std::make_move_iterator(from.rbegin()), std::make_move_iterator(from.rend()));
  from.clear();
}

// Appends one list to another, each with its front. Only the shorter one's records are touched.
void Join(Records& list, Records& front, Records& later, Records& later_front) {
  if (list.size() + front.size() >= later.size() + later_front.size()) {
    AppendReversed(later_front, list);
    Append(later, list);
    return;
  }
  AppendReversed(list, later_front);
  Append(front, later_front);
  list.swap(later);
  front.swap(later_front);
}

// Appends the records of `later` to those of `set`.
template <typename RecordSet>
void AppendSet(RecordSet& set, RecordSet& later) {
  for (std::size_t kind = 0; kind < set.kinds.size(); ++kind) {
    if (later.kinds[kind].recs.empty()) continue;
    set.kinds[kind].last = set.entered + later.kinds[kind].last;
    Pour(later.kinds[kind].recs, set.kinds[kind].recs);
  }
  set.entered += later.entered;
}

template <typename RecordSet>
bool IsEmpty(const RecordSet& set) {
  return std::all_of(set.kinds.begin(), set.kinds.end(),
                     [](const auto& of_kind) { return of_kind.recs.empty(); });
}

}  // namespace

OPNode::ChildIndex& Ledger::Children(OPNode& node) {
  if (!node.child_index_) node.child_index_ = std::make_unique<OPNode::ChildIndex>();
  return *node.child_index_;
}

// `children` is open to everybody: what is found there is accounted for late rather than never.
void Ledger::Adopt(OPNode& node) {
  if (node.adopted_ > node.children.size()) {
    node.adopted_ = 0;
    node.child_index_.reset();
  }
  for (; node.adopted_ < node.children.size(); ++node.adopted_) {
    OPNode& child = *node.children[node.adopted_];
    child.position_ = node.adopted_;
    Touch(child);
  }
}

const std::shared_ptr<OPNode>* Ledger::Find(OPNode& node, std::string_view name) {
  const auto& children = node.children;
  if (children.size() <= kFewChildren) {
    const auto found = std::find_if(children.begin(), children.end(),
                                    [name](const auto& child) { return child->name == name; });
    return found == children.end() ? nullptr : &*found;
  }
  OPNode::ChildIndex& index = Children(node);
  for (; index.indexed < children.size(); ++index.indexed) {
    index.positions.emplace(children[index.indexed]->name, index.indexed);
  }
  const auto found = index.positions.find(name);
  return found == index.positions.end() ? nullptr : &children[found->second];
}

std::shared_ptr<OPNode> Ledger::Child(OPNode& node, std::string_view name) {
  Adopt(node);
  if (const std::shared_ptr<OPNode>* found = Find(node, name)) {
    Touch(**found);
    return *found;
  }
  node.children.push_back(std::make_shared<OPNode>(node.shared_from_this(), std::string(name)));
  Adopt(node);
  return node.children.back();
}

void Ledger::Touch(OPNode& node) {
  for (OPNode* at = &node; at->parent; at = at->parent.get()) {
    // Whoever is in a list has all nodes above it in the list of their parents.
    if (at->reindexable_ && at->movable_) return;
    OPNode::ChildIndex& index = Children(*at->parent);
    if (!std::exchange(at->reindexable_, true)) index.reindexable.push_back(at);
    if (!std::exchange(at->movable_, true)) index.movable.push_back(at);
  }
}

std::vector<OPNode*> Ledger::TakeReindexable(OPNode& node) {
  Adopt(node);
  if (!node.child_index_) return {};
  std::vector<OPNode*> taken = std::exchange(node.child_index_->reindexable, {});
  for (OPNode* child : taken) child->reindexable_ = false;
  return taken;
}

std::vector<OPNode*> Ledger::TakeMovable(OPNode& node) {
  Adopt(node);
  if (!node.child_index_) return {};
  std::vector<OPNode*> taken = std::exchange(node.child_index_->movable, {});
  for (OPNode* child : taken) child->movable_ = false;
  const auto earlier = [](const OPNode* a, const OPNode* b) { return a->position_ < b->position_; };
  if (!std::is_sorted(taken.begin(), taken.end(), earlier)) {
    std::sort(taken.begin(), taken.end(), earlier);
  }
  return taken;
}

void Ledger::Enter(OPNode::RecordIndex& index, OP* rec) {
  if (rec->op == OP_NONE) return;
  if (rec->op == OP_RENAME) {
    ++index.renames;
    return;
  }
  OPNode::RecordIndex::RecordSet& set = index.about[rec->node.get()];
  OPNode::RecordIndex::OfKind& of_kind = set.Of(rec->op);
  of_kind.recs.push_back(rec);
  of_kind.last = ++set.entered;
}

// All records of a kind have changed alike, or none has.
void Ledger::Refile(OPNode::RecordIndex::RecordSet& set, FileIndexOP kind) {
  OPNode::RecordIndex::OfKind& from = set.Of(kind);
  if (from.recs.empty()) return;
  const FileIndexOP changed = from.recs.front()->op;
  OPNode::RecordIndex::OfKind& to = set.Of(changed);
  if (&to == &from) return;
  if (changed == OP_NONE) {
    from.recs.clear();
    return;
  }
  to.last = to.recs.empty() ? from.last : std::max(to.last, from.last);
  Pour(from.recs, to.recs);
}

OPNode::RecordIndex& Ledger::Sift(OPNode& node, const OP* current) {
  if (!node.record_index_ || node.record_index_->seen > node.ops.size()) {
    node.record_index_ = std::make_unique<OPNode::RecordIndex>();
  }
  OPNode::RecordIndex& index = *node.record_index_;
  if (index.unsettled != nullptr && index.unsettled != current) {
    Enter(index, std::exchange(index.unsettled, nullptr));
  }
  for (; index.seen < node.ops.size(); ++index.seen) {
    OP* const rec = node.ops[index.seen].get();
    if (rec == current) {
      index.unsettled = rec;
    } else {
      Enter(index, rec);
    }
  }
  return index;
}

// The same when no event is being folded at this node. Afterwards only what is pending is listed.
OPNode::RecordIndex& Ledger::SiftSettled(OPNode& node) {
  OPNode::RecordIndex& index = Sift(node, nullptr);
  const auto own = index.about.find(&node);
  if (own != index.about.end() && IsEmpty(own->second)) index.about.erase(own);
  return index;
}

FileIndexOP Ledger::TakeWork(OPNode& node) {
  FileIndexOP work = OP_NONE;
  if (IsShort(node)) {
    for (const std::shared_ptr<OP>& rec : node.ops) {
      if (rec->node.get() == &node && IsWork(rec->op)) work = std::exchange(rec->op, OP_NONE);
    }
    return work;
  }
  OPNode::RecordIndex::RecordSet& own = Sift(node, nullptr).about[&node];
  std::size_t last = 0;
  for (const FileIndexOP kind : {OP_INDEX, OP_ATTR, OP_REINDEX}) {
    OPNode::RecordIndex::OfKind& of_kind = own.Of(kind);
    if (of_kind.recs.empty()) continue;
    if (of_kind.last > last) work = kind;
    last = std::max(last, of_kind.last);
    for (OP* rec : of_kind.recs) rec->op = OP_NONE;
    of_kind.recs.clear();
  }
  return work;
}

bool Ledger::HasPending(OPNode& node) {
  if (IsShort(node)) {
    return std::any_of(node.ops.begin(), node.ops.end(),
                       [](const auto& rec) { return rec->op != OP_NONE; });
  }
  const OPNode::RecordIndex& index = SiftSettled(node);
  return index.renames > 0 || !index.about.empty();
}

Ledger::Bundle Ledger::Take(OPNode& node) {
  Bundle bundle;
  if (!IsShort(node)) {
    SiftSettled(node);
    bundle.index = std::move(node.record_index_);
  }
  bundle.ops = std::exchange(node.ops, {});
  node.record_index_.reset();
  return bundle;
}

// The records of the longer index stay where they are, so that one that is moved to and fro costs
// little.
void Ledger::Merge(OPNode::RecordIndex& index, OPNode::RecordIndex& later) {
  const bool swapped = index.about.size() < later.about.size();
  if (swapped) index.about.swap(later.about);
  for (auto& [node, set] : later.about) {
    const auto [entry, is_new] = index.about.try_emplace(node);
    if (swapped && !is_new) std::swap(entry->second, set);
    AppendSet(entry->second, set);
  }
  index.renames += later.renames;
}

bool Ledger::Receive(OPNode& node, Bundle bundle, const OP* current) {
  if (!bundle.index && IsShort(node)) {
    Append(bundle.ops, node.ops);
    return false;
  }
  OPNode::RecordIndex& index = Sift(node, current);
  if (bundle.index) {
    Merge(index, *bundle.index);
    Join(node.ops, index.front, bundle.ops, bundle.index->front);
  } else {
    for (const auto& rec : bundle.ops) Enter(index, rec.get());
    Append(bundle.ops, node.ops);
  }
  index.seen = node.ops.size();
  return HasFront(node);
}

void Ledger::Settle(OPNode& node) {
  if (!HasFront(node)) return;
  OPNode::RecordIndex& index = *node.record_index_;
  index.seen += index.front.size();
  std::reverse(index.front.begin(), index.front.end());
  Append(node.ops, index.front);
  node.ops = std::exchange(index.front, {});
}

void Ledger::Forget(OPNode& node) {
  Settle(node);
  node.record_index_.reset();
  Touch(node);
}

void Ledger::Dismantle(OPNode& node, std::vector<std::shared_ptr<OPNode>>& orphans) {
  orphans.insert(orphans.end(), std::make_move_iterator(node.children.begin()),
                 std::make_move_iterator(node.children.end()));
  node.children.clear();
  node.ops.clear();
  node.child_index_.reset();
  node.record_index_.reset();
  node.adopted_ = 0;
}

}  // namespace quarry::fileindex
