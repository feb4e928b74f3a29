// Keeping the index daemon away from a share for a while.

#ifndef QUARRY_CLI_WORKER_BREAK_H_
#define QUARRY_CLI_WORKER_BREAK_H_

#include <string>

namespace quarry::cli {

// The share's worker rests as long as the object lives. A daemon that does not run has none; one
// that is started meanwhile begins with one. A share that has no folder at the end gets no worker.
class WorkerBreak {
 public:
  // Stops the worker and waits until it has ended what it had in hand, at most a minute. Throws
  // Problem when it has not.
  explicit WorkerBreak(const std::string& share);
  ~WorkerBreak();
  WorkerBreak(const WorkerBreak&) = delete;
  WorkerBreak& operator=(const WorkerBreak&) = delete;

 private:
  std::string share_;
};

}  // namespace quarry::cli

#endif  // QUARRY_CLI_WORKER_BREAK_H_
