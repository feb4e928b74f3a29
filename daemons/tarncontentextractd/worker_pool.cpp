#include "daemons/tarncontentextractd/worker_pool.h"

#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <utility>

#include "common/error.h"
#include "daemons/common/log.h"
#include "daemons/common/system_error.h"

namespace quarry::extract {
namespace {

constexpr int kMaxDoublings = 5;
// No further file is read for who holds so much already. Small files do not come to it, unless
// they have taken their worker over.
constexpr std::size_t kManyAnswerBytes = std::size_t{8} << 20;

}  // namespace

// A place for a worker, taken by one thread until the object ends.
class WorkerPool::Lease {
 public:
  explicit Lease(WorkerPool& pool) : pool_(pool), slot_(pool.Acquire()) {}
  ~Lease() {
    if (slot_ != nullptr) pool_.Release(slot_);
  }
  Lease(const Lease&) = delete;
  Lease& operator=(const Lease&) = delete;

  Slot* slot() const { return slot_; }

 private:
  WorkerPool& pool_;
  Slot* slot_;
};

WorkerPool::WorkerPool(WorkerPoolOptions options)
    : options_(std::move(options)),
      stop_event_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)),
      slots_(std::max<std::size_t>(options_.workers, 1)) {
  if (!stop_event_.valid()) daemon::ThrowSystemError("Cannot make an event");
  for (Slot& slot : slots_) free_.push_back(&slot);
}

WorkerPool::~WorkerPool() {
  Stop();
}

void WorkerPool::Stop() {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    stopping_ = true;
  }
  changed_.notify_all();
  // Never read, so that it wakes everybody, now and later.
  eventfd_write(stop_event_.get(), 1);
}

std::size_t WorkerPool::WorkerCount() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return running_;
}

WorkerPool::Slot* WorkerPool::Acquire() {
  std::unique_lock<std::mutex> lock(mutex_);
  changed_.wait(lock, [this] { return stopping_ || !free_.empty(); });
  if (stopping_) return nullptr;
  // The last that was used: a small load keeps few workers busy and the others unborn.
  Slot* slot = free_.back();
  free_.pop_back();
  return slot;
}

void WorkerPool::Release(Slot* slot) {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    // Places with a running worker are taken before empty ones.
    free_.insert(*slot ? free_.end() : free_.begin(), slot);
  }
  changed_.notify_one();
}

bool WorkerPool::Stopping() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return stopping_;
}

bool WorkerPool::MayStart() {
  const std::lock_guard<std::mutex> lock(mutex_);
  return failed_starts_ < options_.start_attempts || Clock::now() >= next_start_;
}

void WorkerPool::NoteStarted() {
  const std::lock_guard<std::mutex> lock(mutex_);
  ++running_;
  if (failed_starts_ >= options_.start_attempts) daemon::LogInfo("Workers can be started again");
  failed_starts_ = 0;
}

void WorkerPool::NoteStartFailed(const std::string& reason) {
  const std::lock_guard<std::mutex> lock(mutex_);
  daemon::LogError("Refusing a worker. " + reason);
  if (++failed_starts_ < options_.start_attempts) return;
  const int doublings = std::min(failed_starts_ - options_.start_attempts, kMaxDoublings);
  const auto pause = options_.pause * (1 << doublings);
  next_start_ = Clock::now() + pause;
  if (doublings > 0) return;
  daemon::LogError(
      "No worker can be started: files get their attributes without their content "
      "until one can");
}

void WorkerPool::Drop(Slot& slot) {
  slot.reset();
  const std::lock_guard<std::mutex> lock(mutex_);
  --running_;
}

// Sees to it that the slot has a worker.
PoolOutcome WorkerPool::Ensure(Slot& slot) {
  if (slot && slot->FilesDone() >= options_.files_per_worker) Drop(slot);
  while (!slot) {
    if (!MayStart()) return PoolOutcome::kBroken;
    try {
      slot = std::make_unique<WorkerProcess>(options_.command, options_.start_timeout,
                                             stop_event_.get());
      NoteStarted();
    } catch (const Error& error) {
      if (Stopping()) return PoolOutcome::kStopped;
      NoteStartFailed(error.reason());
    }
  }
  return PoolOutcome::kDone;
}

// Files on their way through one place for a worker.
class WorkerPool::Run {
 public:
  Run(WorkerPool& pool, Slot& slot, const std::vector<PoolFile>& files)
      : pool_(pool), slot_(slot), files_(files) {}

  std::vector<PoolResult> ToEnd() {
    while (go_on_ && results_.size() < files_.size()) {
      const PoolOutcome outcome = pool_.Ensure(slot_);
      if (outcome == PoolOutcome::kDone) {
        ParseNext();
      } else {
        End(outcome);
      }
    }
    return std::move(results_);
  }

 private:
  // The files behind those that are done: all that this worker may still take, or one of those that
  // a dead one has left.
  std::vector<WorkerFile> Next() const {
    const std::size_t most = pool_.options_.files_per_worker - slot_->FilesDone();
    const std::size_t begin = results_.size();
    const std::size_t count =
        begin < alone_until_ ? 1 : std::min(std::max<std::size_t>(most, 1), files_.size() - begin);
    std::vector<WorkerFile> next;
    for (std::size_t i = begin; i < begin + count; ++i) {
      next.push_back({files_[i].fd, files_[i].extension});
    }
    return next;
  }

  void ParseNext() {
    const bool fresh = slot_->FilesDone() == 0;
    const std::vector<WorkerFile> next = Next();
    const std::size_t end = results_.size() + next.size();
    std::vector<std::vector<Field>> done;
    const WorkerOutcome outcome = slot_->Parse(next, pool_.options_.file_timeout, &done);
    for (std::vector<Field>& fields : done) Keep(std::move(fields));
    if (outcome != WorkerOutcome::kDone) Lose(outcome, fresh, next.size() > 1, end);
  }

  void Keep(std::vector<Field> fields) {
    bytes_ += TextBytes(fields);
    results_.push_back({PoolOutcome::kDone, std::move(fields)});
    go_on_ = go_on_ && bytes_ < kManyAnswerBytes;
  }

  // The worker is of no more use.
  void Lose(WorkerOutcome outcome, bool fresh, bool together, std::size_t end) {
    const std::string ending = slot_->End();
    pool_.Drop(slot_);
    if (outcome == WorkerOutcome::kStopped) return End(PoolOutcome::kStopped);
    const bool died = outcome == WorkerOutcome::kDied;
    // Of several files any may be the cause, as a worker may hold answers back for a moment; and an
    // earlier file may have done the harm.
    if (together || (died && !fresh)) {
      alone_until_ = std::max(alone_until_, end);
      return;
    }
    daemon::LogWarning("Content of " + files_[results_.size()].name +
                       " cannot be read: its worker " + (died ? ending : "did not answer in time"));
    results_.push_back({PoolOutcome::kBadFile, {}});
    go_on_ = go_on_ && died;
  }

  // What holds for all that are left.
  void End(PoolOutcome outcome) {
    while (results_.size() < files_.size()) results_.push_back({outcome, {}});
  }

  WorkerPool& pool_;
  Slot& slot_;
  const std::vector<PoolFile>& files_;
  std::vector<PoolResult> results_;
  std::size_t alone_until_ = 0;
  std::size_t bytes_ = 0;  // of what the results hold
  bool go_on_ = true;
};

std::vector<PoolResult> WorkerPool::Parse(const std::vector<PoolFile>& files) {
  const Lease lease(*this);
  if (lease.slot() != nullptr) return Run(*this, *lease.slot(), files).ToEnd();
  std::vector<PoolResult> stopped(files.size());
  for (PoolResult& each : stopped) each.outcome = PoolOutcome::kStopped;
  return stopped;
}

}  // namespace quarry::extract
