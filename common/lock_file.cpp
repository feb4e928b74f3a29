#include "common/lock_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "common/log.h"
#include "common/named_file.h"
#include "common/unique_fd.h"

namespace quarry {
namespace {

constexpr int kAttempts = 64;

// Opens the lock file, or returns -1 with errno set.
int OpenLockFile(const std::string& path) {
  if (path.find('\0') != std::string::npos) {
    errno = EINVAL;
    return -1;
  }
  return open(path.c_str(), O_RDONLY | O_CREAT | O_CLOEXEC, 0644);
}

void SleepBeforeNextAttempt() {
  usleep(static_cast<useconds_t>((rand() % 10) * 100000));
}

}  // namespace

LockFile::LockFile(const std::string& path, bool exclusive) : fd_(-1), path_(path) {
  const int saved_errno = errno;
  const int operation = (exclusive ? LOCK_EX : LOCK_SH) | LOCK_NB;
  for (int attempt = 0; attempt < kAttempts; ++attempt) {
    UniqueFd file(OpenLockFile(path_));
    if (!file.valid()) {
      Fail(QUARRY_SITE_AT("lock_file", 15),
           "0 > (fd_ = open(path_.c_str(), O_RDONLY | O_CREAT, 0644))", kErrorLock,
           "open failed, path=" + path_ + ", reason=" + strerror(errno));
    }
    if (flock(file.get(), operation) != 0) {
      if (errno != EAGAIN && errno != EINTR) throw Error(kErrorLock, strerror(errno));
      file.Reset();
      SleepBeforeNextAttempt();
    } else if (IsStillNamed(path_, file.get())) {
      // Whoever removes a lock file while it is waited for leaves the waiter with a lock on a file
      // that nobody else can find, so that two would hold "the" lock.
      fd_ = file.Release();
      errno = saved_errno;
      return;
    }
  }
  throw Error(kErrorLock, "Exceed max retry, path=" + path_);
}

LockFile::~LockFile() {
  const int saved_errno = errno;
  flock(fd_, LOCK_UN);
  close(fd_);
  errno = saved_errno;
}

Mutex::Mutex() {
  pthread_mutex_init(&mutex_, nullptr);
}

Mutex::~Mutex() {
  pthread_mutex_destroy(&mutex_);
}

bool Mutex::Lock() {
  return pthread_mutex_lock(&mutex_) == 0;
}

bool Mutex::TryLock() {
  return pthread_mutex_trylock(&mutex_) == 0;
}

bool Mutex::Unlock() {
  return pthread_mutex_unlock(&mutex_) == 0;
}

LockMutex::LockMutex(Mutex& mutex) : mutex_(mutex) {
  mutex_.Lock();
}

LockMutex::~LockMutex() {
  mutex_.Unlock();
}

}  // namespace quarry
