// One share's event queue: the live file that the monitor appends to, and the snapshot that is
// being worked off.

#ifndef QUARRY_FILEINDEX_QUEUE_QUEUE_MGR_H_
#define QUARRY_FILEINDEX_QUEUE_QUEUE_MGR_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "common/export.h"
#include "fileindex/queue/event.h"
#include "fileindex/queue/optree.h"

namespace quarry {

class UniqueFd;

namespace fileindex {

// Keeps the trees that it has built: take a new manager for each pass over the queue. One thread at
// a time; other processes may append to the live queue meanwhile.
class QUARRY_EXPORT QueueMgr {
 public:
  // `queue_path` is the absolute path of the live queue, which need not exist; the snapshot's is
  // the same with ".tmp" appended. Throws Error 120 for a path that cannot name a queue (empty,
  // relative, ending in "/" or holding a NUL byte), so that nothing else is ever renamed or
  // removed.
  explicit QueueMgr(const std::string& queue_path);

  // Renames the live queue to the snapshot, under the queue's lock (may block for up to a minute).
  // A snapshot that is there already stays, and the live queue with it; nothing happens without a
  // live queue. Throws Error 502 when the rename fails, Error 506 when the lock cannot be had.
  void PrepareTmpQueue();

  // Removes the snapshot: 0, or -1 with errno set. To be called once all its operations are
  // applied. Of a manager that has looked for a snapshot, only the one that it found is removed:
  // when that is gone, or none was there, the result is -1 with ENOENT, and what others have put
  // there since stays for another pass. May block while another process removes the same snapshot.
  int DeleteTmp();

  // The tree of the live queue, or of the snapshot, as the file was at the first call. Throws Error
  // 502 when the file cannot be read.
  std::shared_ptr<OPTree> GetOPTree() const;
  std::shared_ptr<OPTree> GetOPTreeTmp() const;

  // Hands the pending operations to `fn`, in order: with `use_tmp` those of the snapshot, after
  // PrepareTmpQueue(), else those of the live queue. Returns the number of records examined,
  // cancelled ones included; 0 when there is no queue. Deletes nothing. Throws what building the
  // tree and what `fn` throws.
  std::int32_t ProcessOP(std::function<void(std::shared_ptr<OP>)> fn, bool use_tmp);

  // How many lines of the snapshot whose operations were handed out were skipped, because they are
  // no events or could not be folded; 0 while none was. Nobody knows what they told of.
  std::size_t SkippedLines() const;

  // The three questions below read the live queue and then the snapshot, and throw Error 502 when
  // one cannot be read and what Event throws for a malformed line that is met before the answer.

  // Whether an event is waiting on `full_path` or below it, or a rename away from there.
  bool IsFullPathProcessing(const std::string& full_path);

  // Whether a reindex, and nothing else in the same line, is waiting on `full_path` or below it.
  bool IsFullPathHasReindex(const std::string& full_path);

  // Whether a reindex, and nothing else in the same line, is waiting on `full_path` or above it:
  // one that will cover the path. Those of a snapshot that a living manager, of any process, has
  // handed out by ProcessOP() and not removed are no longer waiting. A last line that is not ended
  // and no event is none yet: it is being written, or its writer was killed.
  bool IsReindexWaitingFor(const std::string& full_path);

 private:
  using Predicate = std::function<bool(std::shared_ptr<Event>)>;

  enum class TornLine { kIsMalformed, kIsNone };

  static bool FindQueue(TornLine torn, const std::string& path, const Predicate& predicate);
  bool FindInQueues(const Predicate& predicate) const;
  bool HoldSeenSnapshot() const;

  std::string queue_path_;
  std::string queue_path_tmp_;
  mutable std::shared_ptr<OPTree> op_tree_;
  mutable std::shared_ptr<OPTree> op_tree_tmp_;
  // The snapshot that was found, kept open so that no later file can pass for it; without a
  // descriptor when there was none. Null while nobody has looked.
  mutable std::shared_ptr<const UniqueFd> seen_;
};

}  // namespace fileindex
}  // namespace quarry

#endif  // QUARRY_FILEINDEX_QUEUE_QUEUE_MGR_H_
