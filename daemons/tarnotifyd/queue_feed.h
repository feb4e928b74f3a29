// What one queue still has to be told.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_QUEUE_FEED_H_
#define QUARRY_DAEMONS_TARNOTIFYD_QUEUE_FEED_H_

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <utility>

#include "daemons/tarnotifyd/change_fold.h"
#include "daemons/tarnotifyd/change_source.h"

namespace quarry::notify {

// Collects changes for a moment and writes them together. Once something was lost, an overflow line
// takes the place of everything that is not written yet, and is tried again until the queue has it.
// One thread.
class QueueFeed {
 public:
  // How long changes are collected.
  static constexpr std::chrono::milliseconds kGather{40};
  // Changes that are collected at most; with so many they are written at once.
  static constexpr std::size_t kMaxGathered = 8192;
  // Changes that wait at most for somebody else's lock. Beyond that they are given up.
  static constexpr std::size_t kMaxWaiting = std::size_t{1} << 16;

  // `is_wanted` tells whether the queue is still to be written, also after it was taken away.
  QueueFeed(const std::string& queue, std::function<bool()> is_wanted)
      : queue_(queue), is_wanted_(std::move(is_wanted)) {}

  void Add(const Change& change, Clock::time_point now);

  // Changes at or below `directory` were lost.
  void Doubt(const std::string& directory);

  // Writes what is due. Does not wait for locks.
  void Step(Clock::time_point now);

  // When Step() has something to do.
  std::optional<Clock::time_point> Due() const;

  // How many overflow lines the queue was given.
  std::uint64_t Overflows() const { return overflows_; }
  // Why the queue cannot be written at present; "" when it can.
  const std::string& Problem() const { return problem_; }

  // Writes everything now, if it can: the last thing before the end.
  void Finish(Clock::time_point now);

 private:
  bool HasLines() const { return doubtful_ || !unwritten_.empty() || fold_.Ready() > 0; }
  bool MustGather(Clock::time_point now) const;
  void Write(Clock::time_point now);
  void Fail(Clock::time_point now);

  const std::string queue_;
  const std::function<bool()> is_wanted_;
  ChangeFold fold_;
  Clock::time_point gathering_since_{};
  std::string unwritten_;    // lines that wait for the lock, and
  std::size_t waiting_ = 0;  // how many they are
  std::string last_path_;    // what the last change was about
  bool doubtful_ = false;
  std::string doubtful_directory_;
  Clock::time_point not_before_{};  // no attempt to write before
  std::chrono::milliseconds backoff_{0};
  std::uint64_t overflows_ = 0;
  std::string problem_;
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_QUEUE_FEED_H_
