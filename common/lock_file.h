// Exclusion between processes by lock files, and between threads by mutexes.

#ifndef QUARRY_COMMON_LOCK_FILE_H_
#define QUARRY_COMMON_LOCK_FILE_H_

#include <pthread.h>

#include <string>

#include "common/export.h"

namespace quarry {

// An advisory lock on a file, held as long as the object lives. Two objects on one path conflict
// even within a process.
class QUARRY_EXPORT LockFile {
 public:
  // Opens `path`, creating it with mode 0644 if it is missing, and locks it: exclusively, or shared
  // with other shared holders. Blocks for up to about a minute, in at most 64 attempts with pauses
  // of 0 to 0.9 seconds. Throws Error 506 when the file cannot be opened, which is logged, or
  // locked. Leaves errno as it was when it succeeds. The descriptor is not inherited by programs.
  LockFile(const std::string& path, bool exclusive);
  // Gives the lock up; the file stays. Leaves errno as it was.
  ~LockFile();
  LockFile(const LockFile&) = delete;
  LockFile& operator=(const LockFile&) = delete;

 private:
  int fd_;
  std::string path_;
};

// A plain mutex, not recursive: a thread that locks it twice waits for itself.
class QUARRY_EXPORT Mutex {
 public:
  Mutex();
  ~Mutex();
  Mutex(const Mutex&) = delete;
  Mutex& operator=(const Mutex&) = delete;

  // Each returns whether the call succeeded. Lock() blocks until the mutex is free, TryLock() does
  // not and returns false when it is taken. Unlock() is for the thread that has locked.
  bool Lock();
  bool TryLock();
  bool Unlock();

 private:
  pthread_mutex_t mutex_{};
};

// Holds a mutex as long as the object lives. The mutex must outlive it.
class QUARRY_EXPORT LockMutex {
 public:
  explicit LockMutex(Mutex& mutex);
  ~LockMutex();
  LockMutex(const LockMutex&) = delete;
  LockMutex& operator=(const LockMutex&) = delete;

 private:
  Mutex& mutex_;
};

}  // namespace quarry

#endif  // QUARRY_COMMON_LOCK_FILE_H_
