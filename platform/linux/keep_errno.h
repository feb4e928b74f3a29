// Leaving errno as it was.

#ifndef QUARRY_PLATFORM_LINUX_KEEP_ERRNO_H_
#define QUARRY_PLATFORM_LINUX_KEEP_ERRNO_H_

#include <cerrno>

namespace quarry::platform {

// Restores errno at the end of the scope. Callers log errno with whatever fails next, so that a
// call that succeeded must not leave there what failed on its way.
class KeepErrno {
 public:
  KeepErrno() = default;
  ~KeepErrno() { errno = saved_; }
  KeepErrno(const KeepErrno&) = delete;
  KeepErrno& operator=(const KeepErrno&) = delete;

 private:
  int saved_ = errno;
};

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_KEEP_ERRNO_H_
