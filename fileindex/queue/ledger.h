// What the tree remembers about its nodes beside their lists, so that no rule walks what cannot
// matter to it: children by name, the way down to pending records, and which records of a long list
// still take part.
//
// The public lists of a node stay as they are: cancelled records and emptied nodes remain in them.

#ifndef QUARRY_FILEINDEX_QUEUE_LEDGER_H_
#define QUARRY_FILEINDEX_QUEUE_LEDGER_H_

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "fileindex/queue/name_table.h"
#include "fileindex/queue/optree.h"
#include "fileindex/queue/pool.h"

namespace quarry::fileindex {

// What is pending in a node's long list. Cancelled records play no part any more and are left out;
// renames are only counted, for every rule keeps clear of them.
struct OPNode::RecordIndex {
  struct OfKind {
    std::vector<OP*> recs;  // in no order: records about one node and of one kind always fare alike
    std::size_t last = 0;   // number of the last one among all records of its RecordSet
  };
  // Records about one node.
  struct RecordSet {
    OfKind& Of(FileIndexOP kind) { return kinds[Slot(kind)]; }
    // Kinds that no rule knows fare as OP_FULL_REINDEX does.
    static std::size_t Slot(FileIndexOP kind) {
      return std::min<std::size_t>(static_cast<std::uint32_t>(kind), OP_FULL_REINDEX);
    }

    std::array<OfKind, OP_FULL_REINDEX + 1> kinds;
    std::size_t entered = 0;
  };

  std::size_t seen = 0;  // how many entries of the list are accounted for
  std::unordered_map<const OPNode*, RecordSet> about;  // moved ones are about where they came from
  std::size_t renames = 0;
  std::vector<std::shared_ptr<OP>> front;  // what stands before the list, last first, see Settle
  OP* unsettled = nullptr;  // in the list, but of a kind that the event being folded may yet change
};

struct OPNode::Books {
  // The children at or below which a reindex may find something to cancel, and those where a rename
  // may find something to move: the places of the first ones, who know the next. They may turn out
  // to hold nothing: whoever walks a list empties it, and a record that is attached later lists the
  // way down to its node again. So each walk costs no more than the attachments since the last one.
  std::uint32_t first_reindexable = kEnd;
  std::uint32_t first_movable = kEnd;
  std::uint32_t adopted = 0;  // how many of the children are accounted for
  NameTable names;            // of those, only where they are many

  std::unique_ptr<RecordIndex> records;  // only for a long list

  static constexpr std::uint32_t kEnd = kNone - 1;  // no place; the last one's next
};

// All functions cost time in proportion to what they hand out or change, over all calls on a tree.
// `current` is the record that is being folded: it may be attached already, and its kind is not
// settled before the event is through.
class Ledger {
 public:
  // The child of that name, created if there is none, in `pool` if there is one, and touched. The
  // reference holds until the next child is created.
  static const std::shared_ptr<OPNode>& Child(OPNode& node, std::string_view name, Pool* pool) {
    return Child(node, name, NameTable::HashOf(name), pool);
  }
  static const std::shared_ptr<OPNode>& Child(OPNode& node, std::string_view name,
                                              std::uint32_t hash, Pool* pool);
  // The same where PrefetchPlace has said at what place the child is expected.
  static const std::shared_ptr<OPNode>& Child(OPNode& node, std::string_view name,
                                              std::uint32_t hash, std::uint32_t place, Pool* pool);

  // Ask for the memory that Child and ForEachOwn will look at, each for what the one before has
  // asked for. What is expected as a child may be null, or another.
  static void PrefetchDirectory(const OPNode& node);
  static void PrefetchBooks(const OPNode& node);
  static void PrefetchName(const OPNode& node, std::uint32_t hash);
  static std::uint32_t PrefetchPlace(const OPNode& node, std::uint32_t hash);
  static const OPNode* PrefetchChild(const OPNode& node, std::uint32_t place);
  static void PrefetchList(const OPNode& node);
  static void PrefetchRecord(const OPNode& node);

  // Makes sure that walks from above come by this node.
  static void Touch(OPNode& node) {
    if (!IsListed(node)) List(node);
  }

  // Empties a list of ChildIndex and hands its nodes out, the movable ones in order of creation.
  static std::vector<OPNode*> TakeReindexable(OPNode& node);
  static std::vector<OPNode*> TakeMovable(OPNode& node);

  // Calls `rule` for the records that are about this node and not cancelled, but not for `current`.
  // It may change the kind and data of a record and says whether it did: one that it leaves as it
  // is may speak for all of its kind, which are not shown then.
  template <typename Rule>
  static void ForEachOwn(OPNode& node, const OP* current, Rule rule) {
    if (IsShort(node)) {
      for (const std::shared_ptr<OP>& rec : node.ops) {
        if (rec->node.get() == &node && rec.get() != current && rec->op != OP_NONE) rule(*rec);
      }
      return;
    }
    OPNode::RecordIndex::RecordSet& own = Sift(node, current).about[&node];
    // Configuration updates come first: what becomes one is not to be merged with itself.
    for (const FileIndexOP kind :
         {OP_UPDATE_CFG, OP_DELETE, OP_INDEX, OP_ATTR, OP_REINDEX, OP_FULL_REINDEX}) {
      for (OP* rec : own.Of(kind).recs) {
        if (!rule(*rec)) break;
      }
      Refile(own, kind);
    }
  }

  // Cancels the records about this node that can be done at another place as well, and returns the
  // kind of the last one; OP_NONE when there are none.
  static FileIndexOP TakeWork(OPNode& node);

  // Whether a record in the node's list is not cancelled.
  static bool HasPending(OPNode& node);

  // A node's whole list, on its way to another node.
  struct Bundle {
    std::vector<std::shared_ptr<OP>> ops;
    std::unique_ptr<OPNode::RecordIndex> index;  // for a long list
  };
  static Bundle Take(OPNode& node);
  // Appends the bundle's records to the node's list. Says whether the list is to be settled: what
  // was there before a longer bundle is kept beside the list, so that one that is moved to and fro
  // is not shifted each time.
  static bool Receive(OPNode& node, Bundle bundle, const OP* current);

  // Puts what is kept beside the node's list back before it.
  static void Settle(OPNode& node);

  // Forgets what is known about the node's list, for someone else may have changed its records.
  static void Forget(OPNode& node);

  // Asks for the memory that Release will look at; the node may be null.
  static void PrefetchRelease(const OPNode* node);

  // Drops the node's records, and the node itself, when its tree is taken apart and the node has no
  // children. The caller holds the node.
  static void Release(OPNode& node);

  // Moves the node's children to `orphans` and drops its records.
  static void Dismantle(OPNode& node, std::vector<std::shared_ptr<OPNode>>& orphans);

 private:
  static bool HasFront(const OPNode& node) {
    return node.books_ && node.books_->records && !node.books_->records->front.empty();
  }
  // A list with a front is long: only what is longer leaves one, see Receive.
  static bool IsShort(const OPNode& node) { return node.ops.size() <= 32; }

  static OPNode::Books& BooksOf(OPNode& node);
  static void Adopt(OPNode& node);
  static void AdoptNext(OPNode& node, OPNode::Books& books);
  static void Place(OPNode& node, OPNode::Books& books);
  static void EnterName(OPNode& node, OPNode::Books& books, std::uint32_t place);
  static bool IsAt(const OPNode& node, std::string_view name, std::uint32_t place);
  // Whoever is in a list has all nodes above it in the lists of their parents.
  static bool IsListed(const OPNode& node) {
    return node.next_reindexable_ != OPNode::kNone && node.next_movable_ != OPNode::kNone;
  }
  static void List(OPNode& node);
  static bool IsBehind(const OPNode& node, std::uint32_t place);
  static const std::shared_ptr<OPNode>& Create(OPNode& node, std::string_view name,
                                               std::uint32_t hash, Pool* pool);
  static bool IsInPlace(const OPNode& node);
  // Places among the node's children.
  static std::uint32_t Find(const OPNode& node, std::string_view name, std::uint32_t hash);
  static std::uint32_t FindEntered(const OPNode& node, std::string_view name, std::uint32_t hash);

  using Link = std::uint32_t OPNode::*;
  static void Prepend(OPNode& node, std::uint32_t& first, Link next);
  static std::vector<OPNode*> TakeList(OPNode& node, std::uint32_t& first, Link next);

  static void Enter(OPNode::RecordIndex& index, OP* rec);
  static void Refile(OPNode::RecordIndex::RecordSet& set, FileIndexOP kind);
  static void Merge(OPNode::RecordIndex& index, OPNode::RecordIndex& later);
  static OPNode::RecordIndex& Sift(OPNode& node, const OP* current);
  static OPNode::RecordIndex& SiftSettled(OPNode& node);
};

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_QUEUE_LEDGER_H_
