// The daemon's end of one worker.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_PROCESS_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_PROCESS_H_

#include <sys/types.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
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

// A file to be parsed. The descriptor stays the caller's.
struct WorkerFile {
  int fd = -1;
  std::string extension;
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

  // Has the worker parse the files one after the other, which it knows of all along, so that it
  // need not wait for the next. Blocks for at most `timeout` for each, or until `stop_fd` is
  // readable. `out` is set to the fields of those that it has answered for, the first ones.
  // Together they are not more bytes than one answer may have. With kDone that is at least one, and
  // less than all where the worker takes no more at a time.
  WorkerOutcome Parse(const std::vector<WorkerFile>& files, std::chrono::milliseconds timeout,
                      std::vector<std::vector<Field>>* out);

  // Files that this worker has parsed.
  std::size_t FilesDone() const { return files_done_; }
  pid_t pid() const { return pid_; }

  // Ends the process and says how it ended: "ended with code 4", "was ended by signal 11". May be
  // called again.
  std::string End();

 private:
  using Deadline = std::chrono::steady_clock::time_point;

  void Spawn(const std::vector<std::string>& command, int channel);
  std::size_t Send(const std::vector<WorkerFile>& files);
  WorkerOutcome ReadMore(std::size_t wanted, Deadline deadline);
  WorkerOutcome ReadMessage(std::string_view* text, Deadline deadline);
  bool HasSpoken() const;
  WorkerOutcome WaitReadable(Deadline deadline) const;

  pid_t pid_ = -1;
  int stop_fd_;
  UniqueFd channel_;
  std::string inbox_;       // room for what has been read
  std::size_t begin_ = 0;   // of what has not been looked at,
  std::size_t end_ = 0;     // and its end
  std::uint32_t next_ = 0;  // the number of the next request
  std::size_t files_done_ = 0;
  std::string ending_;
};

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_WORKER_PROCESS_H_
