// Being told to stop.

#ifndef QUARRY_DAEMONS_COMMON_STOP_SIGNAL_H_
#define QUARRY_DAEMONS_COMMON_STOP_SIGNAL_H_

#include <csignal>

#include "common/unique_fd.h"

namespace quarry::daemon {

// Turns SIGTERM and SIGINT into a readable descriptor as long as the object lives. Make it before
// any thread is started: threads inherit the blocked signals. Programs that are started meanwhile
// inherit them too and must unblock them. One object at a time.
class StopSignal {
 public:
  // Throws Error 502 on a system failure.
  StopSignal();
  // Restores the signal mask of the calling thread. A signal that nobody asked for is dropped.
  ~StopSignal();
  StopSignal(const StopSignal&) = delete;
  StopSignal& operator=(const StopSignal&) = delete;

  // Readable once a signal has come, until Requested() is called. Stays this object's.
  int Fd() const { return fd_.get(); }

  // Whether a signal has come since this object was made. Does not block.
  bool Requested();

 private:
  UniqueFd fd_;
  bool requested_ = false;
  sigset_t old_mask_{};
};

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_STOP_SIGNAL_H_
