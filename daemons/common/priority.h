// Working in the background.

#ifndef QUARRY_DAEMONS_COMMON_PRIORITY_H_
#define QUARRY_DAEMONS_COMMON_PRIORITY_H_

namespace quarry::daemon {

inline constexpr int kBackgroundNice = 10;

// The calling thread, and those that it starts from now on, leave the processors to others (nice
// 10, unless it is nicer already), and the disks (I/O class "idle"). Logs a warning where the
// system refuses.
void WorkInBackground();

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_PRIORITY_H_
