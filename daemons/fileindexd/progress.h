// How far a worker is.

#ifndef QUARRY_DAEMONS_FILEINDEXD_PROGRESS_H_
#define QUARRY_DAEMONS_FILEINDEXD_PROGRESS_H_

#include <json/json.h>

#include <chrono>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>

#include "daemons/fileindexd/folder_rules.h"

namespace quarry::fileindexd {

// Documents per second over the last ten seconds.
class Rate {
 public:
  using Clock = std::chrono::steady_clock;

  void Add(Clock::time_point now);
  double PerSecond(Clock::time_point now) const;

 private:
  struct Second {
    Clock::time_point begin;
    std::uint64_t count;
  };
  std::deque<Second> seconds_;
};

enum class WorkState { kIdle, kWaiting, kIndexing, kRetrying };

// Counts for a share and for each of its folders. Places are full paths; each counts for the folder
// that governs it, and for the share. All members may be called from any thread.
class Progress {
 public:
  using Clock = std::function<Rate::Clock::time_point()>;

  explicit Progress(
      const std::string& share, Clock clock = [] { return Rate::Clock::now(); });

  void SetFolders(std::shared_ptr<const FolderRules> folders);
  void SetState(WorkState state);
  WorkState State() const;
  // Work at a place is known, is begun, or is no longer waiting. Each AddWaiting is followed by one
  // TakeWaiting, unless the pass ends before.
  void AddWaiting(const std::string& path);
  void Begin(const std::string& path);
  void TakeWaiting(const std::string& path);
  // A document has been dealt with.
  void Done(const std::string& path);
  void Failed(const std::string& path, const std::string& error);
  // The pass is over and nothing waits any more; it failed with `error`, unless that is empty.
  void EndPass(const std::string& error);

  std::uint64_t DoneCount() const;
  std::uint64_t FailedCount() const;

  // The share's element of the status answer. `paused`: everything is.
  Json::Value Report(bool paused) const;

 private:
  struct Counts {
    std::uint64_t waiting = 0;
    std::uint64_t done = 0;
    std::uint64_t failed = 0;
    Rate rate;
    std::string current;
    std::string last_error;
  };

  template <typename Change>
  void ForPlace(const std::string& path, const Change& change);
  Json::Value ReportCounts(const Counts& counts, const char* state, const char* current_key) const;
  const char* StateName(bool paused) const;

  const std::string share_;
  const Clock clock_;
  mutable std::mutex mutex_;
  WorkState state_ = WorkState::kWaiting;
  std::shared_ptr<const FolderRules> folders_;
  std::string pass_error_;
  Counts total_;
  std::map<std::string, Counts> by_folder_;  // by the folder's share path
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_PROGRESS_H_
