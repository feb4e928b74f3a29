// What holds a worker up: a pause, or the end.

#ifndef QUARRY_DAEMONS_FILEINDEXD_GATE_H_
#define QUARRY_DAEMONS_FILEINDEXD_GATE_H_

#include <chrono>
#include <condition_variable>
#include <mutex>

namespace quarry::fileindexd {

// Thrown by Gate::Pass() to leave a pass from any depth. Not an Error: nothing went wrong.
struct Interrupted {};

// All members may be called from any thread.
class Gate {
 public:
  void Stop();
  void SetPaused(bool paused);
  // Ends a WaitFor that is going on, or the next one.
  void Wake();

  bool Stopping() const;
  bool Paused() const;

  // Blocks while paused. Throws Interrupted once Stop() was called.
  void Pass();

  // Waits that long. Throws Interrupted once Stop() was called, be it meanwhile.
  void Rest(std::chrono::milliseconds time);

  // Waits that long, or until Stop() or Wake(). Returns whether it was woken.
  bool WaitFor(std::chrono::milliseconds time);

 private:
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  bool stopping_ = false;
  bool paused_ = false;
  bool woken_ = false;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_GATE_H_
