// How much is worked on at a time in the whole daemon.

#ifndef QUARRY_DAEMONS_FILEINDEXD_SLOTS_H_
#define QUARRY_DAEMONS_FILEINDEXD_SLOTS_H_

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <mutex>

namespace quarry::fileindexd {

// A number of slots for tasks of all workers. Whoever has waited for `patience` goes on without a
// slot: an engine that is busy makes its callers sleep for a quarter of an hour, and tasks of one
// share that all sleep must not hold up the other shares. May be used from any thread.
class Slots {
 public:
  explicit Slots(std::size_t count, std::chrono::milliseconds patience = std::chrono::seconds(10))
      : free_(count), patience_(patience) {}

  // Blocks until a slot is free. Returns whether one was taken and is to be released.
  bool Acquire() {
    std::unique_lock<std::mutex> lock(mutex_);
    if (!released_.wait_for(lock, patience_, [this] { return free_ > 0; })) return false;
    --free_;
    return true;
  }

  void Release() {
    const std::lock_guard<std::mutex> lock(mutex_);
    ++free_;
    released_.notify_one();
  }

 private:
  std::mutex mutex_;
  std::condition_variable released_;
  std::size_t free_;
  std::chrono::milliseconds patience_;
};

// Holds a slot as long as it lives.
class SlotHolder {
 public:
  explicit SlotHolder(Slots& slots) : slots_(slots), taken_(slots.Acquire()) {}
  ~SlotHolder() {
    if (taken_) slots_.Release();
  }
  SlotHolder(const SlotHolder&) = delete;
  SlotHolder& operator=(const SlotHolder&) = delete;

 private:
  Slots& slots_;
  const bool taken_;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_SLOTS_H_
