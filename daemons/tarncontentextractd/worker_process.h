// The daemon's end of one worker.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_PROCESS_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_PROCESS_H_

#include <sys/types.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "common/unique_fd.h"
#include "daemons/tarncontentextractd/extractor.h"

namespace quarry::extract {

// How handing a file to a worker ended. After anything but kDone the worker is of no more use.
enum class WorkerOutcome {
  kDone,
  kDied,      // it ended, or answered what no worker would
  kTimedOut,  // it has not answered in time
  kStopped,   // the daemon is about to stop
};

// A running worker, in a process group of its own. It is killed, with all its group, when the
// object ends. One thread at a time.
class WorkerProcess {
 public:
  // Starts `command` (program and arguments), which finds its channel as descriptor 3, and waits up
  // to `timeout` until it says that it is ready. Gives up early once `stop_fd` is readable. Throws
  // Error 502 that says why the worker is not to be used.
  WorkerProcess(const std::vector<std::string>& command, std::chrono::milliseconds timeout,
                int stop_fd);
  ~WorkerProcess();
  WorkerProcess(const WorkerProcess&) = delete;
  WorkerProcess& operator=(const WorkerProcess&) = delete;

  // Has the worker parse `file`, which stays the caller's. Blocks for at most `timeout`, or until
  // `stop_fd` is readable. `out` is set for kDone and is empty otherwise.
  WorkerOutcome Parse(int file, const std::string& extension, std::chrono::milliseconds timeout,
                      std::vector<Field>* out);

  // Files that this worker has parsed.
  std::size_t FilesDone() const { return files_done_; }
  pid_t pid() const { return pid_; }

  // Ends the process and says how it ended: "ended with code 4", "was ended by signal 11". May be
  // called again.
  std::string End();

 private:
  using Deadline = std::chrono::steady_clock::time_point;

  void Spawn(const std::vector<std::string>& command, int channel);
  WorkerOutcome ReadAll(char* buffer, std::size_t size, Deadline deadline);
  WorkerOutcome ReadMessage(std::string* text, Deadline deadline);
  bool HasSpoken() const;
  WorkerOutcome WaitReadable(Deadline deadline) const;

  pid_t pid_ = -1;
  int stop_fd_;
  UniqueFd channel_;
  std::size_t files_done_ = 0;
  std::string ending_;
};

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_PROCESS_H_
