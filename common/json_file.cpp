// Documents in files.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <string>

#include "common/file_util.h"
#include "common/json.h"
#include "common/unique_fd.h"

namespace quarry {
namespace {

// Far above any state file; below what could exhaust memory.
constexpr off_t kMaxFileSize = 64LL << 20;

bool HasNul(const std::string& path) {
  if (path.find('\0') == std::string::npos) return false;
  errno = EINVAL;
  return true;
}

// Opens a regular file of acceptable size, or returns an invalid descriptor with errno set.
UniqueFd OpenRegular(const std::string& path) {
  if (HasNul(path)) return UniqueFd();
  // Without O_NONBLOCK a named pipe would hold the caller for ever.
  UniqueFd file(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  struct stat info {};
  if (!file.valid() || fstat(file.get(), &info) != 0) return UniqueFd();
  if (S_ISREG(info.st_mode) && info.st_size <= kMaxFileSize) return file;
  errno = S_ISDIR(info.st_mode) ? EISDIR : S_ISREG(info.st_mode) ? EFBIG : EINVAL;
  return UniqueFd();
}

bool ReadAll(int fd, std::string& text) {
  std::array<char, 65536> buffer;
  while (text.size() <= static_cast<size_t>(kMaxFileSize)) {
    const ssize_t got = read(fd, buffer.data(), buffer.size());
    if (got == 0) return true;
    if (got < 0 && errno != EINTR) return false;
    if (got > 0) text.append(buffer.data(), static_cast<size_t>(got));
  }
  errno = EFBIG;  // it grew while it was read
  return false;
}

bool WriteAll(int fd, const std::string& text) {
  size_t done = 0;
  while (done < text.size()) {
    const ssize_t put = write(fd, text.data() + done, text.size() - done);
    if (put == 0) errno = ENOSPC;
    if (put == 0 || (put < 0 && errno != EINTR)) return false;
    if (put > 0) done += static_cast<size_t>(put);
  }
  return true;
}

// What a file is replaced with keeps its mode, and its owner where the process may give it away.
bool KeepAttributes(int fd, const struct stat& old) {
  struct stat made {};
  if (fstat(fd, &made) != 0) return false;
  const bool same_owner = made.st_uid == old.st_uid && made.st_gid == old.st_gid;
  if (!same_owner && fchown(fd, old.st_uid, old.st_gid) != 0 && errno != EPERM) return false;
  return fchmod(fd, old.st_mode & 0777) == 0;
}

// A file beside the one it is going to replace, removed unless that happened.
class Replacement {
 public:
  explicit Replacement(const std::string& directory) : path_(directory + UniqueName()) {
    fd_.Reset(open(path_.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0666));
  }
  ~Replacement() {
    const int saved_errno = errno;
    if (fd_.valid() && !renamed_) unlink(path_.c_str());
    errno = saved_errno;
  }
  Replacement(const Replacement&) = delete;
  Replacement& operator=(const Replacement&) = delete;

  bool Fill(const std::string& text, const struct stat* old) {
    return fd_.valid() && (old == nullptr || KeepAttributes(fd_.get(), *old)) &&
           WriteAll(fd_.get(), text) && fsync(fd_.get()) == 0;
  }
  bool TakePlaceOf(const std::string& path) {
    renamed_ = rename(path_.c_str(), path.c_str()) == 0;
    return renamed_;
  }

 private:
  // Short, whatever the replaced file is called; unique among the writers alive at one time. With
  // the time in it what a killed process of the same id left behind is not in the way.
  static std::string UniqueName() {
    static std::atomic<unsigned int> counter{0};
    timespec now{};
    clock_gettime(CLOCK_REALTIME, &now);
    return "/.quarry-" + std::to_string(getpid()) + "-" + std::to_string(++counter) + "-" +
           std::to_string(now.tv_nsec) + ".tmp";
  }

  std::string path_;
  UniqueFd fd_;
  bool renamed_ = false;
};

// The directory that holds `path`, without a "/" at its end.
std::string DirectoryOf(const std::string& path) {
  if (path.find('/') == std::string::npos) return ".";
  return Dirname(path);
}

// Some file systems cannot sync a directory and need not.
bool SyncDirectory(int fd) {
  return fsync(fd) == 0 || errno == EINVAL;
}

bool Replace(const std::string& path, const std::string& text) {
  struct stat old {};
  const bool exists = stat(path.c_str(), &old) == 0;
  if (!exists && errno != ENOENT) return false;
  if (exists && !S_ISREG(old.st_mode)) {
    errno = S_ISDIR(old.st_mode) ? EISDIR : EINVAL;
    return false;
  }
  const std::string directory = DirectoryOf(path);
  const UniqueFd opened(open((directory + "/").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!opened.valid()) return false;
  Replacement replacement(directory);
  return replacement.Fill(text, exists ? &old : nullptr) && replacement.TakePlaceOf(path) &&
         SyncDirectory(opened.get());
}

}  // namespace

bool fromFile(Json::Value& out, const std::string& path) {
  const int saved_errno = errno;
  std::string text;
  const UniqueFd file = OpenRegular(path);
  if (file.valid() && ReadAll(file.get(), text)) {
    errno = saved_errno;
    return fromString(out, text);
  }
  out = Json::Value();
  return false;
}

bool toFile(const Json::Value& value, const std::string& path) {
  if (HasNul(path)) return false;
  // A link is kept, and what it leads to is replaced.
  const int saved_errno = errno;
  const std::string target = RealPath(path);
  if (!Replace(target.empty() ? path : target, toString(value))) return false;
  errno = saved_errno;
  return true;
}

}  // namespace quarry
