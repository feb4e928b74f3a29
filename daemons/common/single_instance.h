// Making sure that a daemon runs once.

#ifndef QUARRY_DAEMONS_COMMON_SINGLE_INSTANCE_H_
#define QUARRY_DAEMONS_COMMON_SINGLE_INSTANCE_H_

#include <sys/types.h>

#include <string>

#include "common/unique_fd.h"

namespace quarry::daemon {

// RootedPath("/var/run/" + name + ".pid").
std::string PidFilePath(const std::string& name);

// The process that holds the lock on the pid file, or 0 when no daemon of that name runs. Does not
// block. A daemon that is just starting may count as not running.
pid_t RunningPid(const std::string& pid_path);

// Holds the daemon's pid file, locked, as long as the object lives. The file stays behind, empty
// and unlocked: removing it would let two processes lock two files of the same name.
class SingleInstance {
 public:
  // Locks the pid file and writes this process's id and a line feed into it, creating missing
  // directories above it. Waits for 0.1 s at most. Throws Error 506 when another process holds it,
  // naming that process, and Error 502 on a system failure.
  explicit SingleInstance(const std::string& name);
  // The same with a pid file of its own; `name` is used in messages only.
  SingleInstance(const std::string& name, const std::string& pid_path);
  ~SingleInstance();
  SingleInstance(const SingleInstance&) = delete;
  SingleInstance& operator=(const SingleInstance&) = delete;

 private:
  UniqueFd fd_;
};

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_SINGLE_INSTANCE_H_
