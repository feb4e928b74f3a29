// Asking for the calling thread's I/O class.

#ifndef QUARRY_TESTS_DAEMONS_COMMON_IO_CLASS_H_
#define QUARRY_TESTS_DAEMONS_COMMON_IO_CLASS_H_

#include <sys/syscall.h>
#include <unistd.h>

namespace quarry::test {

inline constexpr long kIdleIoClass = 3;

// 0 is the default, 1 real-time, 2 best effort, 3 idle.
inline long IoClass() {
  constexpr int kWhoProcess = 1;
  constexpr int kClassShift = 13;
  return syscall(SYS_ioprio_get, kWhoProcess, 0) >> kClassShift;
}

}  // namespace quarry::test

#endif  // QUARRY_TESTS_DAEMONS_COMMON_IO_CLASS_H_
