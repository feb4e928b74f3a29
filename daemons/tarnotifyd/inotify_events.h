// The kernel's inotify events, with the two halves of each move together.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_INOTIFY_EVENTS_H_
#define QUARRY_DAEMONS_TARNOTIFYD_INOTIFY_EVENTS_H_

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <unordered_map>

#include "daemons/tarnotifyd/change_fold.h"

namespace quarry::notify {

struct InotifyEvent {
  int watch = -1;
  std::uint32_t mask = 0;
  std::uint32_t cookie = 0;
  std::string name;
  Clock::time_point read{};  // when the event was read
};

// Events in their order. The second half of a move is a little later than the first, other events
// may lie between, and the first may have been read before the second is there: then everything
// waits a moment for it. One thread.
class InotifyEvents {
 public:
  static constexpr std::chrono::milliseconds kPatience{10};
  // Events that are kept at a time; the kernel keeps the others.
  static constexpr std::size_t kMaxEvents = 16384;

  // Reads what `fd` has, without blocking, as long as there is room.
  void Fill(int fd, Clock::time_point now);

  // Takes the next event. Nothing when there is none, or its other half may still come.
  std::optional<InotifyEvent> Next(Clock::time_point now);

  // Takes the arrival that belongs to a departure that Next() gave. Nothing when the move leads
  // outside.
  std::optional<InotifyEvent> TakeArrival(std::uint32_t cookie);

  // When Next() will have an event after all; nothing when there are no events.
  std::optional<Clock::time_point> NextDue() const;

  void Clear();

 private:
  void Append(const char* bytes, std::size_t size, Clock::time_point now);
  bool MustWait(const InotifyEvent& event, Clock::time_point now) const;
  void SkipTaken();

  std::deque<InotifyEvent> events_;
  std::uint64_t first_ = 0;                                    // the number of the first event
  std::unordered_map<std::uint32_t, std::uint64_t> arrivals_;  // cookie to number
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_INOTIFY_EVENTS_H_
