#include "daemons/common/single_instance.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <thread>
#include <utility>

#include "common/error.h"
#include "common/paths.h"
#include "daemons/common/system_error.h"

namespace quarry::daemon {
namespace {

// The number in the file, 0 when there is none.
pid_t ReadPid(int fd) {
  char text[32] = {};
  const ssize_t got = pread(fd, text, sizeof(text) - 1, 0);
  if (got <= 0) return 0;
  const long pid = std::strtol(text, nullptr, 10);
  return pid > 0 && pid <= 0x7fffffff ? static_cast<pid_t>(pid) : 0;
}

bool IsStillNamed(int fd, const std::string& path) {
  struct stat held {};
  struct stat named {};
  return fstat(fd, &held) == 0 && stat(path.c_str(), &named) == 0 && held.st_dev == named.st_dev &&
         held.st_ino == named.st_ino;
}

// RunningPid() holds the lock for a moment, and a daemon that has just started has not written its
// number yet: both are over long before the last attempt.
constexpr int kAttempts = 20;
constexpr auto kPause = std::chrono::milliseconds(5);

// Whether the lock was taken; false when another process holds it.
bool TryLock(int fd, const std::string& path) {
  if (flock(fd, LOCK_EX | LOCK_NB) == 0) return true;
  if (errno != EWOULDBLOCK && errno != EINTR) ThrowSystemError("Cannot lock " + path);
  return false;
}

// The locked pid file. An administrator may remove the file between the open and the lock; then the
// lock is worth nothing and is taken anew.
UniqueFd LockPidFile(const std::string& name, const std::string& path) {
  pid_t pid = 0;
  for (int attempt = 0; attempt < kAttempts; ++attempt) {
    UniqueFd fd(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0644));
    if (!fd.valid()) ThrowSystemError("Cannot open " + path);
    if (TryLock(fd.get(), path)) {
      if (IsStillNamed(fd.get(), path)) return fd;
      continue;
    }
    pid = ReadPid(fd.get());
    std::this_thread::sleep_for(kPause);
  }
  throw Error(kErrorLock, name + " is already running" +
                              (pid > 0 ? " as process " + std::to_string(pid) : "") + " (" + path +
                              " is locked).");
}

}  // namespace

std::string PidFilePath(const std::string& name) {
  return RootedPath("/var/run/" + name + ".pid");
}

pid_t RunningPid(const std::string& pid_path) {
  const UniqueFd fd(open(pid_path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  if (!fd.valid()) return 0;
  if (flock(fd.get(), LOCK_SH | LOCK_NB) == 0 || errno != EWOULDBLOCK) return 0;
  return ReadPid(fd.get());
}

SingleInstance::SingleInstance(const std::string& name) : SingleInstance(name, PidFilePath(name)) {}

SingleInstance::SingleInstance(const std::string& name, const std::string& pid_path) {
  MakeParentDirectories(pid_path);
  UniqueFd fd = LockPidFile(name, pid_path);
  const std::string text = std::to_string(getpid()) + "\n";
  if (ftruncate(fd.get(), 0) != 0 ||
      pwrite(fd.get(), text.data(), text.size(), 0) != static_cast<ssize_t>(text.size())) {
    ThrowSystemError("Cannot write " + pid_path);
  }
  fd_ = std::move(fd);
}

SingleInstance::~SingleInstance() {
  // Nobody reads the number once the lock is gone, so a failure to empty the file does no harm.
  if (ftruncate(fd_.get(), 0) != 0) errno = 0;
}

}  // namespace quarry::daemon
