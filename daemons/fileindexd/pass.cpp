#include "daemons/fileindexd/pass.h"

#include <algorithm>
#include <memory>

#include "daemons/common/log.h"
#include "daemons/fileindexd/rename_chain.h"
#include "fileindex/queue/queue_mgr.h"

namespace quarry::fileindexd {
namespace {

using fileindex::OP;
using fileindex::QueueMgr;

using Operations = std::vector<std::shared_ptr<OP>>;

Operations TakeOperations(QueueMgr& queue) {
  Operations operations;
  queue.ProcessOP([&](std::shared_ptr<OP> op) { operations.push_back(op); }, true);
  return operations;
}

bool IsFullReindex(const std::shared_ptr<OP>& op) {
  return op->op == fileindex::OP_FULL_REINDEX;
}

bool IsWalk(const std::shared_ptr<OP>& op) {
  return op->op == fileindex::OP_REINDEX || op->op == fileindex::OP_UPDATE_CFG || IsFullReindex(op);
}

// Nobody knows what a line told of that cannot be read: only the whole share is sure to hold it.
bool HasLostLines(const QueueMgr& queue, const std::string& queue_path) {
  const std::size_t lines = queue.SkippedLines();
  if (lines == 0) return false;
  daemon::LogWarning("The queue " + queue_path + " has lines that cannot be read: " +
                     std::to_string(lines) + "; comparing the whole share");
  return true;
}

class Pass {
 public:
  explicit Pass(const PassSetup& setup)
      : setup_(setup),
        // The culprit is only found where each piece of work is done by itself.
        lane_(setup.threads, setup.slots, &setup.gate,
              setup.aside.IsSearching() ? 1 : TaskLane::kMostTogether),
        writer_(setup.index, setup.survey.files(), lane_, setup.progress, setup.aside,
                [this] { CheckRoot(); }),
        handler_(
            {setup.index, setup.survey, writer_, lane_, setup.gate, setup.progress, setup.aside},
            setup.share_root) {}
  // Tasks still use what is destroyed before the lane.
  ~Pass() { lane_.End(); }
  Pass(const Pass&) = delete;
  Pass& operator=(const Pass&) = delete;

  PassResult Run(bool full) {
    const std::string epoch = setup_.index.Epoch();
    setup_.aside.BeginPass(setup_.index.CanRead());
    QueueMgr queue(setup_.queue_path);
    Operations operations = TakeOperations(queue);
    full = full || HasLostLines(queue, setup_.queue_path) ||
           std::any_of(operations.begin(), operations.end(), IsFullReindex);
    // Comparing the whole share includes all smaller walks.
    if (full) std::erase_if(operations, IsWalk);
    Do(operations);
    if (full) {
      handler_.HandleFullReindex();
    } else {
      handler_.RefreshParents();
    }
    lane_.Drain();
    setup_.index.Commit();
    if (full && handler_.RemoveOrphans()) {
      lane_.Drain();
      setup_.index.Commit();
    }
    if (setup_.index.Epoch() != epoch) return PassResult::kAgain;
    queue.DeleteTmp();
    return PassResult::kDone;
  }

 private:
  // Moves what was renamed. Returns what is left to do, in order: the places of a rename are still
  // to be compared.
  std::vector<Operation> MoveAhead(const Operations& taken) {
    std::vector<Operation> operations;
    for (const auto& op : taken) operations.push_back({op->op, op->node->GetPath(), op->src});
    FollowRenames(&operations);
    std::vector<Operation> left;
    for (const Operation& operation : operations) {
      if (operation.kind != fileindex::OP_RENAME) {
        left.push_back(operation);
        continue;
      }
      handler_.MoveRenamed(operation);
      if (!operation.old_path.empty())
        left.push_back({fileindex::OP_REINDEX, operation.old_path, ""});
      left.push_back({fileindex::OP_REINDEX, operation.path, ""});
    }
    return left;
  }

  void Do(const Operations& taken) {
    const std::vector<Operation> operations = MoveAhead(taken);
    for (const Operation& operation : operations) setup_.progress.AddWaiting(operation.path);
    for (const Operation& operation : operations) {
      setup_.gate.Pass();
      setup_.progress.Begin(operation.path);
      handler_.Handle(operation);
      setup_.progress.TakeWaiting(operation.path);
    }
  }

  // A disk that is gone looks as if all its files had been deleted.
  void CheckRoot() const {
    if (setup_.survey.files().Identify(setup_.share_root) == setup_.root_identity) return;
    throw Error(kErrorSystem, "The share's directory " + setup_.share_root + " is gone");
  }

  const PassSetup& setup_;
  TaskLane lane_;
  DocumentWriter writer_;
  OperationHandler handler_;
};

}  // namespace

PassResult RunPass(const PassSetup& setup, bool full) {
  return Pass(setup).Run(full);
}

}  // namespace quarry::fileindexd
