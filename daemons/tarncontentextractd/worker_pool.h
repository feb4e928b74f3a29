// A fixed number of workers, and what becomes of the files that they cannot take.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_POOL_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_POOL_H_

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "common/unique_fd.h"
#include "daemons/tarncontentextractd/extractor.h"
#include "daemons/tarncontentextractd/worker_process.h"

namespace quarry::extract {

struct WorkerPoolOptions {
  // The program that is a worker, and its arguments.
  std::vector<std::string> command;
  std::size_t workers = 1;
  std::chrono::milliseconds start_timeout = std::chrono::seconds(10);
  std::chrono::milliseconds file_timeout = std::chrono::seconds(30);
  // A worker that has parsed so many files is replaced, whatever it may have gathered.
  std::size_t files_per_worker = 10000;
  // After so many failed starts in a row the trouble is not with one file or one moment ...
  int start_attempts = 3;
  // ... and the next start is tried only after a pause, which doubles up to 32 times this.
  std::chrono::milliseconds pause = std::chrono::seconds(5);
};

enum class PoolOutcome {
  kDone,
  kBadFile,  // the file kills or stalls whoever parses it
  kBroken,   // no worker can be started at present; says nothing about the file
  kStopped,  // the pool is stopping; says nothing about the file
};

// A file to be parsed. The descriptor stays the caller's.
struct PoolFile {
  int fd = -1;
  std::string extension;
  std::string name;  // what log lines call it
};

struct PoolResult {
  PoolOutcome outcome = PoolOutcome::kBroken;
  std::vector<Field> fields;  // empty unless kDone
};

// Workers are started when they are first needed. Any thread, any number of threads at once.
class WorkerPool {
 public:
  explicit WorkerPool(WorkerPoolOptions options);
  // Nobody may be inside Parse() any more: Stop() sees to that.
  ~WorkerPool();
  WorkerPool(const WorkerPool&) = delete;
  WorkerPool& operator=(const WorkerPool&) = delete;

  // Has one worker parse the files, one after the other. Blocks until a worker is free, and for at
  // most the two timeouts for each file, and at most twice that for a file whose worker died or
  // did not answer: before a file is blamed it is given to a new worker by itself, since another
  // may have done the harm. Returns what became of the files in their order. It ends early
  // only behind one that timed out, as those behind it have waited long enough, and once the texts
  // are many megabytes; the others may be given to Parse() again.
  std::vector<PoolResult> Parse(const std::vector<PoolFile>& files);

  // Makes all that wait in Parse(), and all that come, return kStopped soon. Does not wait for
  // them.
  void Stop();

  // Running workers, for reports and tests.
  std::size_t WorkerCount() const;

 private:
  using Clock = std::chrono::steady_clock;
  using Slot = std::unique_ptr<WorkerProcess>;
  class Lease;
  class Run;

  Slot* Acquire();
  void Release(Slot* slot);
  void Drop(Slot& slot);
  PoolOutcome Ensure(Slot& slot);
  bool Stopping() const;
  bool MayStart();
  void NoteStarted();
  void NoteStartFailed(const std::string& reason);

  WorkerPoolOptions options_;
  UniqueFd stop_event_;
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<Slot> slots_;
  std::vector<Slot*> free_;
  bool stopping_ = false;
  std::size_t running_ = 0;
  int failed_starts_ = 0;
  Clock::time_point next_start_{};
};

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_POOL_H_
