// Adding lines to a queue file that is open, by whoever holds the queue's lock.

#ifndef QUARRY_FILEINDEX_QUEUE_QUEUE_APPEND_H_
#define QUARRY_FILEINDEX_QUEUE_QUEUE_APPEND_H_

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <string>

namespace quarry::fileindex {

// Whether the file's last line lacks its end, as a writer that was killed leaves it.
inline bool IsLastLineTorn(int fd, off_t size) {
  char last = '\n';
  return size > 0 && pread(fd, &last, 1, size - 1) == 1 && last != '\n';
}

// False with errno set when not all of it could be written.
inline bool WriteAll(int fd, const std::string& text) {
  std::size_t done = 0;
  while (done < text.size()) {
    const ssize_t count = write(fd, text.data() + done, text.size() - done);
    if (count == 0) errno = ENOSPC;
    if (count == 0 || (count < 0 && errno != EINTR)) return false;
    if (count > 0) done += static_cast<std::size_t>(count);
  }
  return true;
}

// Appends `lines`, each with its "\n", all of them or none, behind a torn last line where there is
// one. `fd` is open for reading and appending. False with errno set on failure; `cut_error` is 0,
// or why a piece that was written could not be cut off again.
inline bool AppendLines(int fd, const std::string& lines, int* cut_error) {
  *cut_error = 0;
  struct stat before {};
  if (fstat(fd, &before) != 0) return false;
  if (WriteAll(fd, IsLastLineTorn(fd, before.st_size) ? "\n" + lines : lines)) return true;
  const int reason = errno;
  if (ftruncate(fd, before.st_size) != 0) *cut_error = errno;
  errno = reason;
  return false;
}

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_QUEUE_QUEUE_APPEND_H_
