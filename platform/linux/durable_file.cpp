#include "platform/linux/durable_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>

#include "common/unique_fd.h"
#include "platform/linux/keep_errno.h"

namespace quarry::platform {
namespace {

bool WriteAll(int fd, const std::string& text) {
  std::size_t done = 0;
  while (done < text.size()) {
    const ssize_t written = write(fd, text.data() + done, text.size() - done);
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return false;
    done += static_cast<std::size_t>(written);
  }
  return true;
}

// Reads until the end or until `text` is longer than it may be.
bool ReadAll(int fd, std::size_t max_bytes, std::string* text) {
  char piece[65536];
  while (true) {
    const ssize_t got = read(fd, piece, sizeof(piece));
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return false;
    if (got == 0) return true;
    text->append(piece, static_cast<std::size_t>(got));
    if (text->size() > max_bytes) {
      errno = EFBIG;
      return false;
    }
  }
}

void UnlinkKeepingErrno(const std::string& path) {
  const KeepErrno keep;
  unlink(path.c_str());
}

UniqueFd OpenDirectory(const std::string& path) {
  return UniqueFd(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

bool IsDirectory(const std::string& path) {
  struct stat info {};
  return stat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

bool MakeDirectory(const std::string& path, mode_t mode) {
  const int before = errno;
  if (mkdir(path.c_str(), mode) == 0) return SyncDirectory(ParentDirectory(path));
  if (errno != EEXIST) return false;
  const bool is_directory = IsDirectory(path);
  errno = is_directory ? before : ENOTDIR;
  return is_directory;
}

}  // namespace

bool WriteFileDurably(const std::string& path, const std::string& text) {
  // Opened first, so that nothing has changed yet when it cannot be.
  const UniqueFd directory = OpenDirectory(ParentDirectory(path));
  if (!directory.valid()) return false;
  std::string temporary = path + ".XXXXXX";
  const UniqueFd fd(mkostemp(temporary.data(), O_CLOEXEC));
  if (!fd.valid()) return false;
  const bool written =
      WriteAll(fd.get(), text) && fchmod(fd.get(), 0644) == 0 && fsync(fd.get()) == 0;
  if (!written || rename(temporary.c_str(), path.c_str()) != 0) {
    UnlinkKeepingErrno(temporary);
    return false;
  }
  return fsync(directory.get()) == 0;
}

bool ReadWholeFile(const std::string& path, std::size_t max_bytes, std::string* text) {
  text->clear();
  // A FIFO in place of the file must not hold the caller.
  const UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  if (!fd.valid()) return false;
  struct stat info {};
  if (fstat(fd.get(), &info) != 0) return false;
  if (!S_ISREG(info.st_mode)) {
    errno = EINVAL;
    return false;
  }
  return ReadAll(fd.get(), max_bytes, text);
}

bool MakeDirectories(const std::string& path, mode_t mode) {
  for (std::size_t end = path.find('/', 1); end != std::string::npos;
       end = path.find('/', end + 1)) {
    if (!MakeDirectory(path.substr(0, end), 0755)) return false;
  }
  return MakeDirectory(path, mode);
}

bool SyncDirectory(const std::string& path) {
  const UniqueFd fd = OpenDirectory(path);
  return fd.valid() && fsync(fd.get()) == 0;
}

std::string ParentDirectory(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos) return ".";
  return slash == 0 ? "/" : path.substr(0, slash);
}

}  // namespace quarry::platform
