// How much is worked on at a time in the whole daemon.

#ifndef QUARRY_DAEMONS_FILEINDEXD_SLOTS_H_
#define QUARRY_DAEMONS_FILEINDEXD_SLOTS_H_

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <iterator>
#include <list>
#include <mutex>

namespace quarry::fileindexd {

// A number of slots for tasks of all workers. One that has been held for `patience` is given to
// somebody else besides: whoever holds it waits, as for an engine that is busy, and tasks of one
// share that all wait must not hold up the other shares. May be used from any thread.
class Slots {
 public:
  using Clock = std::chrono::steady_clock;
  // The times since which slots are held, in ascending order.
  using Held = std::list<Clock::time_point>;

  explicit Slots(std::size_t count, std::chrono::milliseconds patience = std::chrono::seconds(10))
      : count_(count), patience_(patience) {}

  // Blocks until a slot is free.
  Held::iterator Acquire() {
    std::unique_lock<std::mutex> lock(mutex_);
    for (auto oldest = OldestInTheWay(); oldest != held_.end(); oldest = OldestInTheWay()) {
      const Clock::time_point given_away = *oldest + patience_;
      released_.wait_until(lock, given_away);
    }
    return held_.insert(held_.end(), Clock::now());
  }

  void Release(Held::iterator slot) {
    const std::lock_guard<std::mutex> lock(mutex_);
    held_.erase(slot);
    released_.notify_one();
  }

 private:
  // The slot that will be given away first; the end when one is free.
  Held::iterator OldestInTheWay() {
    const Clock::time_point expired = Clock::now() - patience_;
    const auto oldest = std::upper_bound(held_.begin(), held_.end(), expired);
    const auto in_the_way = static_cast<std::size_t>(std::distance(oldest, held_.end()));
    return in_the_way < count_ ? held_.end() : oldest;
  }

  std::mutex mutex_;
  std::condition_variable released_;
  const std::size_t count_;
  const std::chrono::milliseconds patience_;
  Held held_;
};

// Holds a slot as long as it lives.
class SlotHolder {
 public:
  explicit SlotHolder(Slots& slots) : slots_(slots), slot_(slots.Acquire()) {}
  ~SlotHolder() { slots_.Release(slot_); }
  SlotHolder(const SlotHolder&) = delete;
  SlotHolder& operator=(const SlotHolder&) = delete;

 private:
  Slots& slots_;
  const Slots::Held::iterator slot_;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_SLOTS_H_
