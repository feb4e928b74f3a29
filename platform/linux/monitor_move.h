// Changing what is registered with the change monitor when directories move.

#ifndef QUARRY_PLATFORM_LINUX_MONITOR_MOVE_H_
#define QUARRY_PLATFORM_LINUX_MONITOR_MOVE_H_

#include <string>

namespace quarry::platform {

struct MonitorMove {
  std::string old_queue;
  std::string new_queue;  // may be the same
  std::string old_path;   // a directory that has moved
  std::string new_path;
};

// Registers for the new queue what every application registered for the old one, with the new path
// in the place of the old. What is registered for an old queue of another name stays. False, with
// errno set, on failure.
bool CopyRegistrations(const MonitorMove& move);

// Withdraws what every application registered for the queue. False, with errno set, on failure.
bool RemoveRegistrations(const std::string& queue);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_MONITOR_MOVE_H_
