#include "daemons/common/stop_signal.h"

#include <pthread.h>
#include <sys/signalfd.h>

#include <cerrno>

#include "daemons/common/system_error.h"

namespace quarry::daemon {
namespace {

sigset_t StopSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  return signals;
}

}  // namespace

StopSignal::StopSignal() {
  const sigset_t signals = StopSignals();
  errno = pthread_sigmask(SIG_BLOCK, &signals, &old_mask_);
  if (errno != 0) ThrowSystemError("Cannot block the stop signals");
  fd_.Reset(signalfd(-1, &signals, SFD_NONBLOCK | SFD_CLOEXEC));
  if (!fd_.valid()) {
    const int saved = errno;
    pthread_sigmask(SIG_SETMASK, &old_mask_, nullptr);
    errno = saved;
    ThrowSystemError("Cannot receive the stop signals");
  }
}

StopSignal::~StopSignal() {
  Requested();
  pthread_sigmask(SIG_SETMASK, &old_mask_, nullptr);
}

bool StopSignal::Requested() {
  signalfd_siginfo info;
  while (true) {
    const ssize_t got = read(fd_.get(), &info, sizeof(info));
    if (got == static_cast<ssize_t>(sizeof(info))) {
      requested_ = true;
    } else if (got >= 0 || errno != EINTR) {
      return requested_;
    }
  }
}

}  // namespace quarry::daemon
