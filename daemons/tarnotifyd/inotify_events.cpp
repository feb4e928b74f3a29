#include "daemons/tarnotifyd/inotify_events.h"

#include <sys/inotify.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <utility>
#include <vector>

namespace quarry::notify {
namespace {

constexpr std::size_t kBufferBytes = 64 * 1024;

}  // namespace

void InotifyEvents::Fill(int fd, Clock::time_point now) {
  alignas(inotify_event) char buffer[kBufferBytes];
  while (events_.size() < kMaxEvents) {
    const ssize_t got = read(fd, buffer, sizeof(buffer));
    if (got <= 0) {
      if (got < 0 && errno == EINTR) continue;
      return;
    }
    Append(buffer, static_cast<std::size_t>(got), now);
  }
}

void InotifyEvents::Append(const char* bytes, std::size_t size, Clock::time_point now) {
  for (std::size_t at = 0; at < size;) {
    inotify_event head{};
    std::memcpy(&head, bytes + at, sizeof(head));
    InotifyEvent event{head.wd, head.mask, head.cookie, {}, now};
    // The name is padded with NUL bytes.
    const char* name = bytes + at + sizeof(head);
    event.name.assign(name, strnlen(name, head.len));
    if ((event.mask & IN_MOVED_TO) != 0) arrivals_[event.cookie] = first_ + events_.size();
    events_.push_back(std::move(event));
    at += sizeof(head) + head.len;
  }
}

bool InotifyEvents::MustWait(const InotifyEvent& event, Clock::time_point now) const {
  return (event.mask & IN_MOVED_FROM) != 0 && arrivals_.count(event.cookie) == 0 &&
         now < event.read + kPatience && events_.size() < kMaxEvents;
}

void InotifyEvents::SkipTaken() {
  while (!events_.empty() && events_.front().mask == 0) {
    events_.pop_front();
    ++first_;
  }
}

std::optional<InotifyEvent> InotifyEvents::Next(Clock::time_point now) {
  SkipTaken();
  if (events_.empty() || MustWait(events_.front(), now)) return std::nullopt;
  InotifyEvent event = std::move(events_.front());
  events_.pop_front();
  ++first_;
  if ((event.mask & IN_MOVED_TO) != 0) arrivals_.erase(event.cookie);
  return event;
}

std::optional<InotifyEvent> InotifyEvents::TakeArrival(std::uint32_t cookie) {
  const auto arrival = arrivals_.find(cookie);
  if (arrival == arrivals_.end()) return std::nullopt;
  InotifyEvent& place = events_[static_cast<std::size_t>(arrival->second - first_)];
  arrivals_.erase(arrival);
  InotifyEvent event = std::move(place);
  place = InotifyEvent();  // taken
  return event;
}

std::optional<Clock::time_point> InotifyEvents::NextDue() const {
  for (const InotifyEvent& event : events_) {
    if (event.mask == 0) continue;
    return MustWait(event, event.read) ? event.read + kPatience : event.read;
  }
  return std::nullopt;
}

void InotifyEvents::Clear() {
  first_ += events_.size();
  events_.clear();
  arrivals_.clear();
}

}  // namespace quarry::notify
