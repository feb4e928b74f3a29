#include "daemons/tarnotifyd/queue_feed.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "daemons/common/log.h"
#include "daemons/tarnotifyd/queue_file.h"

namespace quarry::notify {
namespace {

using std::chrono::milliseconds;

constexpr milliseconds kLockPause{20};
constexpr milliseconds kFirstBackoff{250};
constexpr milliseconds kLongestBackoff{30'000};

}  // namespace

void QueueFeed::Add(const Change& change, Clock::time_point now) {
  // The overflow that is to be written says it too.
  if (doubtful_) return;
  if (fold_.Ready() == 0) gathering_since_ = now;
  fold_.Add(change, now);
  last_path_ = change.path;
  if (fold_.Ready() + waiting_ > kMaxWaiting) Doubt(last_path_);
}

void QueueFeed::Doubt(const std::string& directory) {
  if (!doubtful_) doubtful_directory_ = directory;
  doubtful_ = true;
  fold_.Clear();
  unwritten_.clear();
  waiting_ = 0;
}

// A moment later there may be more to write under the same lock, or less, because it folds.
bool QueueFeed::MustGather(Clock::time_point now) const {
  return !doubtful_ && unwritten_.empty() && fold_.Ready() < kMaxGathered &&
         now < gathering_since_ + kGather;
}

void QueueFeed::Step(Clock::time_point now) {
  const bool was_empty = fold_.Ready() == 0;
  fold_.Release(now);
  // What was held back long enough need not wait for company.
  if (was_empty) gathering_since_ = now - kGather;
  if (HasLines() && now >= not_before_ && !MustGather(now)) Write(now);
}

std::optional<Clock::time_point> QueueFeed::Due() const {
  if (doubtful_ || !unwritten_.empty()) return not_before_;
  if (fold_.Ready() > 0) return std::max(not_before_, gathering_since_ + kGather);
  return fold_.NextRelease();
}

void QueueFeed::Finish(Clock::time_point now) {
  fold_.ReleaseAll();
  if (HasLines()) Write(now);
}

void QueueFeed::Write(Clock::time_point now) {
  if (!doubtful_) {
    waiting_ += fold_.Ready();
    unwritten_ += QueueLines(fold_.Take());
  }
  const std::string lines = doubtful_ ? OverflowLine(doubtful_directory_) : unwritten_;
  switch (AppendToQueue(queue_, lines, is_wanted_)) {
    case WriteResult::kBusy:
      not_before_ = now + kLockPause;
      return;
    case WriteResult::kFailed:
      return Fail(now);
    case WriteResult::kDone:
      break;
  }
  if (!problem_.empty()) daemon::LogInfo("The queue " + queue_ + " takes changes again");
  backoff_ = milliseconds(0);
  problem_.clear();
  if (doubtful_) ++overflows_;
  doubtful_ = false;
  unwritten_.clear();
  waiting_ = 0;
}

void QueueFeed::Fail(Clock::time_point now) {
  const bool is_new = problem_.empty();
  problem_ = std::strerror(errno);
  if (is_new) {
    daemon::LogError("Cannot write to the queue " + queue_ + ": " + problem_ +
                     ". What it misses will be told as an overflow");
  }
  Doubt(last_path_);
  backoff_ = std::clamp(2 * backoff_, kFirstBackoff, kLongestBackoff);
  not_before_ = now + backoff_;
}

}  // namespace quarry::notify
