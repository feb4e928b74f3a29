// What the tree remembers about its nodes beside their lists, so that no rule walks what cannot
// matter to it: children by name, the way down to pending records, and which records of a long list
// still take part.
//
// The public lists of a node stay as they are: cancelled records and emptied nodes remain in them.

#ifndef QUARRY_FILEINDEX_QUEUE_LEDGER_H_
#define QUARRY_FILEINDEX_QUEUE_LEDGER_H_

#include <cstddef>
#include <memory>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "fileindex/queue/optree.h"

namespace quarry::fileindex {

struct OPNode::ChildIndex {
  std::unordered_map<std::string_view, std::size_t> positions;  // only for nodes of many children
  std::size_t indexed = 0;  // how many of the children are in `positions`

  // The children at or below which a reindex may find something to cancel, and those where a rename
  // may find something to move. They may turn out to hold nothing: whoever walks a list empties it,
  // and a record that is attached later lists the way down to its node again. So each walk costs no
  // more than the attachments since the last one.
  std::vector<OPNode*> reindexable;
  std::vector<OPNode*> movable;
};

// The records of a node's list by the part that they can still play. Cancelled ones play none and
// are left out; renames are only counted, for every rule keeps clear of them.
struct OPNode::RecordIndex {
  std::size_t seen = 0;      // how many entries of the list are accounted for
  std::vector<OP*> own;      // about this node, in order of attachment
  std::vector<OP*> foreign;  // moved here, about the node where they came from
  std::size_t renames = 0;
};

// All functions cost time in proportion to what they hand out or change, over all calls on a tree.
// `current` is the record that is being folded: it may be attached already, and its kind is not
// settled before the event is through.
class Ledger {
 public:
  // The child of that name, created if there is none, and touched.
  static std::shared_ptr<OPNode> Child(OPNode& node, std::string_view name);

  // Makes sure that walks from above come by this node.
  static void Touch(OPNode& node);

  // Empties a list of ChildIndex and hands its nodes out, the movable ones in order of creation.
  static std::vector<OPNode*> TakeReindexable(OPNode& node);
  static std::vector<OPNode*> TakeMovable(OPNode& node);

  // Calls `rule` for each record that is about this node and takes part in rules, in order, but not
  // for `current`. The rule may change the record's kind and data.
  template <typename Rule>
  static void ForEachOwn(OPNode& node, const OP* current, Rule rule) {
    if (IsShort(node.ops)) {
      for (const std::shared_ptr<OP>& rec : node.ops) {
        if (rec->node.get() == &node && rec.get() != current && rec->op != OP_NONE) rule(*rec);
      }
      return;
    }
    for (OP* rec : Sift(node, current).own) {
      if (rec != current) rule(*rec);
    }
  }

  // Whether a record in the node's list is not cancelled.
  static bool HasPending(OPNode& node);

  // A node's whole list, on its way to another node.
  struct Bundle {
    std::vector<std::shared_ptr<OP>> ops;
    std::unique_ptr<OPNode::RecordIndex> index;  // for a long list
  };
  static Bundle Take(OPNode& node);
  static void Receive(OPNode& node, Bundle bundle, const OP* current);

  // Forgets what is known about the node's list, for someone else may have changed its records.
  static void Forget(OPNode& node);

  // Moves the node's children to `orphans` and drops its records.
  static void Dismantle(OPNode& node, std::vector<std::shared_ptr<OPNode>>& orphans);

 private:
  static bool IsShort(const std::vector<std::shared_ptr<OP>>& ops) { return ops.size() <= 32; }
  static OPNode::ChildIndex& Children(OPNode& node);
  static const std::shared_ptr<OPNode>* Find(OPNode& node, std::string_view name);
  static void Adopt(OPNode& node);
  static void Enter(OPNode& node, OPNode::RecordIndex& index, OP* rec);
  static OPNode::RecordIndex& Sift(OPNode& node, const OP* current);
};

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_QUEUE_LEDGER_H_
