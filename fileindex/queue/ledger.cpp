#include "fileindex/queue/ledger.h"

#include <algorithm>
#include <iterator>
#include <string>

namespace quarry::fileindex {
namespace {

// Below this, comparing names one by one is faster than hashing.
constexpr std::size_t kFewChildren = 8;

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

void Ledger::Enter(OPNode& node, OPNode::RecordIndex& index, OP* rec) {
  if (rec->node.get() == &node) {
    index.own.push_back(rec);
  } else if (rec->op == OP_RENAME) {
    ++index.renames;
  } else if (rec->op != OP_NONE) {
    index.foreign.push_back(rec);
  }
}

OPNode::RecordIndex& Ledger::Sift(OPNode& node, const OP* current) {
  if (!node.record_index_ || node.record_index_->seen > node.ops.size()) {
    node.record_index_ = std::make_unique<OPNode::RecordIndex>();
  }
  OPNode::RecordIndex& index = *node.record_index_;
  for (; index.seen < node.ops.size(); ++index.seen) {
    Enter(node, index, node.ops[index.seen].get());
  }
  const auto is_settled = [&index, current](const OP* rec) {
    if (rec == current) return false;
    if (rec->op == OP_RENAME) ++index.renames;
    return rec->op == OP_RENAME || rec->op == OP_NONE;
  };
  index.own.erase(std::remove_if(index.own.begin(), index.own.end(), is_settled), index.own.end());
  return index;
}

bool Ledger::HasPending(OPNode& node) {
  if (IsShort(node.ops)) {
    return std::any_of(node.ops.begin(), node.ops.end(),
                       [](const auto& rec) { return rec->op != OP_NONE; });
  }
  const OPNode::RecordIndex& index = Sift(node, nullptr);
  return index.renames > 0 || !index.own.empty() || !index.foreign.empty();
}

Ledger::Bundle Ledger::Take(OPNode& node) {
  if (!IsShort(node.ops)) Sift(node, nullptr);
  Bundle bundle;
  bundle.index = IsShort(node.ops) ? nullptr : std::move(node.record_index_);
  bundle.ops = std::exchange(node.ops, {});
  node.record_index_.reset();
  return bundle;
}

void Ledger::Receive(OPNode& node, Bundle bundle, const OP* current) {
  if (bundle.index || !IsShort(node.ops)) {
    OPNode::RecordIndex& index = Sift(node, current);
    if (bundle.index) {
      for (OP* rec : bundle.index->own) Enter(node, index, rec);
      for (OP* rec : bundle.index->foreign) Enter(node, index, rec);
      index.renames += bundle.index->renames;
    } else {
      for (const auto& rec : bundle.ops) Enter(node, index, rec.get());
    }
    index.seen = node.ops.size() + bundle.ops.size();
    // The short list joins the long one, so that a list which is moved to and fro costs little. The
    // order that rules see is the index's.
    if (node.ops.size() < bundle.ops.size()) node.ops.swap(bundle.ops);
  }
  node.ops.insert(node.ops.end(), std::make_move_iterator(bundle.ops.begin()),
                  std::make_move_iterator(bundle.ops.end()));
}

void Ledger::Forget(OPNode& node) {
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
