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

PoolOutcome WorkerPool::ParseOnce(Slot& slot, int file, const std::string& extension,
                                  const std::string& name, std::vector<Field>* out, bool* retry) {
  const bool fresh = slot->FilesDone() == 0;
  const WorkerOutcome outcome = slot->Parse(file, extension, options_.file_timeout, out);
  if (outcome == WorkerOutcome::kDone) return PoolOutcome::kDone;
  const std::string ending = slot->End();
  Drop(slot);
  if (outcome == WorkerOutcome::kStopped) return PoolOutcome::kStopped;
  const bool died = outcome == WorkerOutcome::kDied;
  *retry = died && !fresh;
  if (!*retry) {
    daemon::LogWarning("Content of " + name + " cannot be read: its worker " +
                       (died ? ending : "did not answer in time"));
  }
  return PoolOutcome::kBadFile;
}

PoolOutcome WorkerPool::Parse(int file, const std::string& extension, const std::string& name,
                              std::vector<Field>* out) {
  out->clear();
  const Lease lease(*this);
  if (lease.slot() == nullptr) return PoolOutcome::kStopped;
  bool retry = true;
  PoolOutcome outcome = PoolOutcome::kBroken;
  while (retry) {
    retry = false;
    outcome = Ensure(*lease.slot());
    if (outcome != PoolOutcome::kDone) return outcome;
    outcome = ParseOnce(*lease.slot(), file, extension, name, out, &retry);
  }
  return outcome;
}

}  // namespace quarry::extract
