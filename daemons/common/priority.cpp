#include "daemons/common/priority.h"

#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>

#include "daemons/common/log.h"

namespace quarry::daemon {
namespace {

constexpr int kSelf = 0;

// As <linux/ioprio.h> has them, which is no C++.
constexpr int kWhoProcess = 1;
constexpr int kClassIdle = 3;
constexpr int kClassShift = 13;

bool LowerProcessorPriority() {
  errno = 0;
  const int nice = getpriority(PRIO_PROCESS, kSelf);
  if (nice == -1 && errno != 0) return false;
  return nice >= kBackgroundNice || setpriority(PRIO_PROCESS, kSelf, kBackgroundNice) == 0;
}

bool LowerDiskPriority() {
  return syscall(SYS_ioprio_set, kWhoProcess, kSelf, kClassIdle << kClassShift) == 0;
}

}  // namespace

void WorkInBackground() {
  if (LowerProcessorPriority() && LowerDiskPriority()) return;
  LogWarning("Cannot work in the background: " + std::generic_category().message(errno));
}

}  // namespace quarry::daemon
