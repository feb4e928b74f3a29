// What a rename does to the work that is pending at the old path and below it.

#ifndef QUARRY_FILEINDEX_QUEUE_RELOCATION_H_
#define QUARRY_FILEINDEX_QUEUE_RELOCATION_H_

#include <cstddef>
#include <memory>
#include <vector>

#include "fileindex/queue/ledger.h"
#include "fileindex/queue/optree.h"

namespace quarry::fileindex {

// Moves records from a subtree to the corresponding nodes below another place. All lists are taken
// before the first one is moved, so the two places may lie within each other; the destination's own
// subtree is never moved, for it would move into itself.
class Relocation {
 public:
  // Takes the records of `source` and of the nodes below it where something is pending. Those that
  // can be done at the new place as well are cancelled. Both nodes must outlive this object, and
  // differ. New nodes come out of the pool.
  Relocation(OPNode& source, OPNode& destination, Pool& pool);

  // Hands all records to their new nodes and adds those whose lists are to be settled to
  // `unsettled`. Returns the work to be done there, one record per node, parents first, not
  // attached yet.
  std::vector<std::shared_ptr<OP>> Deliver(const OP* current, std::vector<OPNode*>& unsettled);

 private:
  struct Stop {
    OPNode* from;
    std::size_t above;     // the stop of the parent of `from`; only for the source its own
    OPNode* to = nullptr;  // not looked up before it is needed, so that no empty nodes come up
    bool loaded = false;   // `bundle` has been taken
    FileIndexOP carried = OP_NONE;
    Ledger::Bundle bundle{};
  };

  void Collect(OPNode& source, OPNode& destination);
  static void Load(Stop& stop);
  OPNode& Target(std::size_t index);

  Pool& pool_;
  std::vector<Stop> stops_;  // in walk order, the source first
};

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_QUEUE_RELOCATION_H_
