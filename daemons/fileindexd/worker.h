// What keeps the index of one share up to date.

#ifndef QUARRY_DAEMONS_FILEINDEXD_WORKER_H_
#define QUARRY_DAEMONS_FILEINDEXD_WORKER_H_

#include <json/json.h>

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "daemons/fileindexd/file_system.h"
#include "daemons/fileindexd/gate.h"
#include "daemons/fileindexd/index.h"
#include "daemons/fileindexd/pass.h"
#include "daemons/fileindexd/progress.h"
#include "daemons/fileindexd/set_aside.h"
#include "daemons/fileindexd/share_host.h"
#include "daemons/fileindexd/slots.h"

namespace quarry::fileindexd {

// One worker's parts, which it owns, and what all workers share.
struct WorkerParts {
  std::unique_ptr<Gate> gate = std::make_unique<Gate>();  // what the index waits at, too
  std::unique_ptr<ShareHost> host;
  std::unique_ptr<Index> index;
  std::unique_ptr<FileSystem> files;
  Slots* slots = nullptr;   // outlives the worker
  std::size_t threads = 1;  // documents in work at a time
  bool full_speed = false;  // else it works in the background
};

// Looks for work, does a pass when there is some, and waits longer and longer while passes fail. It
// begins by comparing the whole share, since nobody knows what happened before it was there. What
// that leaves undone when the process is killed the next start does again.
class Worker {
 public:
  using Milliseconds = std::chrono::milliseconds;

  Worker(const std::string& share, WorkerParts parts);

  // One round: at most one pass. Returns how long to wait for the next one. Does not throw; blocks
  // as long as the pass takes. One thread.
  Milliseconds Step();
  // Step after Step until Stop().
  void Run();

  // The members below may be called from any thread, and do not block.
  void Stop() { gate_.Stop(); }
  void SetPaused(bool paused) { gate_.SetPaused(paused); }
  // The folder list may have changed. A worker that waits after a failure tries again at once.
  void Reload();
  // The status file has changed.
  void CheckStatus() { check_status_ = true; }
  Json::Value Report() const;

 private:
  void RefreshLayout();
  Survey::Rules CurrentRules();
  void ClaimReindex();
  void FollowMark(bool marked);
  void FollowRoot();
  void CompareAll() { ++compares_asked_; }
  bool MustCompare() const { return compares_done_ != compares_asked_; }
  bool HasWork() const;
  void RunOnePass();
  void CheckShareIsThere();
  Milliseconds Fail(const std::string& error);
  void SetCulpritAside();
  void MarkForSetAside();
  void Recover();
  void HandleMissingIndex(const Error& error);

  const std::string share_;
  WorkerParts parts_;
  Gate& gate_;
  Progress progress_;
  SetAside aside_;
  std::atomic<bool> reload_{true};
  std::atomic<bool> check_status_{true};

  // The worker's thread only.
  ShareLayout layout_;
  Survey survey_;
  Identity root_;  // as it was last seen
  bool was_mounted_ = false;
  // Comparing the whole share may be asked for again while a pass does it.
  std::uint64_t compares_asked_ = 1;
  std::uint64_t compares_done_ = 0;
  bool mark_missing_ = false;  // something was set aside, but the share is not yet marked
  bool marked_ = false;        // it is, and nothing has asked since whether that still holds
  int missing_index_ = 0;      // passes in a row that failed for want of it
  std::string last_error_;
  Milliseconds backoff_{0};
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_WORKER_H_
