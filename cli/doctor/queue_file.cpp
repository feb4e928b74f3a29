#include "cli/doctor/queue_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <system_error>
#include <thread>

#include "cli/problem.h"
#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
#include "common/named_file.h"
#include "common/unique_fd.h"
#include "fileindex/queue/event.h"

namespace quarry::cli {
namespace {

using Clock = std::chrono::steady_clock;

constexpr std::chrono::seconds kPatience{30};
constexpr std::chrono::milliseconds kPause{20};
constexpr std::size_t kPieceBytes = 65536;
// No event is as long: it names two paths at most.
constexpr std::size_t kLongestLine = std::size_t{16} << 20;

[[noreturn]] void Refuse(const std::string& what, const std::string& path) {
  throw Problem("Cannot " + what + " " + path + ": " + std::generic_category().message(errno));
}

bool IsEvent(const std::string& line) {
  Json::Value json;
  // Asked first: the library logs each line that is no JSON.
  if (line.size() > kLongestLine || !fromString(json, line)) return false;
  try {
    const fileindex::Event event(line);
    return event.path.find('\0') == std::string::npos &&
           event.path_old.find('\0') == std::string::npos;
  } catch (const Error&) {
    return false;
  }
}

// Hands out the lines of a file, of which the overlong ones are cut: they are no events anyway.
class Lines {
 public:
  Lines(int fd, std::string path) : fd_(fd), path_(std::move(path)) {}

  bool Next(std::string* line) {
    line->clear();
    ended_ = false;
    bool any = false;
    while (!ended_ && (at_ < piece_.size() || Fill())) {
      any = true;
      const std::size_t end = piece_.find('\n', at_);
      ended_ = end != std::string::npos;
      const std::size_t stop = ended_ ? end : piece_.size();
      if (line->size() <= kLongestLine) line->append(piece_, at_, stop - at_);
      at_ = ended_ ? stop + 1 : stop;
    }
    return any;
  }

  // Whether the last line had its newline.
  bool ended() const { return ended_; }

 private:
  bool Fill() {
    piece_.resize(kPieceBytes);
    ssize_t got;
    do {
      got = read(fd_, piece_.data(), piece_.size());
    } while (got < 0 && errno == EINTR);
    if (got < 0) Refuse("read", path_);
    piece_.resize(static_cast<std::size_t>(got));
    at_ = 0;
    return got > 0;
  }

  int fd_;
  std::string path_;
  std::string piece_;
  std::size_t at_ = 0;
  bool ended_ = false;
};

// The open file; invalid when there is none.
UniqueFd Open(const std::string& path) {
  UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
  if (!fd.valid() && errno != ENOENT) Refuse("open", path);
  struct stat info {};
  if (fd.valid() && (fstat(fd.get(), &info) != 0 || !S_ISREG(info.st_mode))) {
    throw Problem(path + " is no file. Move it out of the way.");
  }
  return fd;
}

// The file, locked as everybody locks it who changes it.
UniqueFd OpenLocked(const std::string& path) {
  const auto end = Clock::now() + kPatience;
  for (;;) {
    UniqueFd fd = Open(path);
    if (!fd.valid()) return fd;
    if (flock(fd.get(), LOCK_EX | LOCK_NB) == 0 && IsStillNamed(path, fd.get())) return fd;
    if (Clock::now() > end) throw Problem("Another process keeps " + path + " locked.");
    std::this_thread::sleep_for(kPause);
  }
}

// A file beside the queue, removed unless it has taken the queue's place. Its name is that of no
// share's queue.
class Draft {
 public:
  explicit Draft(const std::string& path)
      : path_(Dirname(path) + "/.quarry-queue-XXXXXX.tmp"), target_(path) {
    fd_.Reset(mkostemps(path_.data(), 4, O_CLOEXEC));
    if (!fd_.valid()) Refuse("write beside", path);
  }
  ~Draft() {
    if (!path_.empty()) unlink(path_.c_str());
  }
  Draft(const Draft&) = delete;
  Draft& operator=(const Draft&) = delete;

  void Add(const std::string& line) {
    pending_ += line;
    pending_ += '\n';
    if (pending_.size() >= kPieceBytes) Flush();
  }

  void TakePlace(const struct stat& old) {
    Flush();
    const bool owned = (old.st_uid == geteuid() && old.st_gid == getegid()) ||
                       fchown(fd_.get(), old.st_uid, old.st_gid) == 0 || errno == EPERM;
    if (!owned || fchmod(fd_.get(), old.st_mode & 0777) != 0 || fsync(fd_.get()) != 0 ||
        rename(path_.c_str(), target_.c_str()) != 0) {
      Refuse("replace", target_);
    }
    path_.clear();
    const UniqueFd directory(open(Dirname(target_).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!directory.valid() || fsync(directory.get()) != 0) Refuse("sync the directory of", target_);
  }

 private:
  void Flush() {
    std::size_t done = 0;
    while (done < pending_.size()) {
      const ssize_t put = write(fd_.get(), pending_.data() + done, pending_.size() - done);
      if (put < 0 && errno != EINTR) Refuse("write beside", target_);
      if (put > 0) done += static_cast<std::size_t>(put);
    }
    pending_.clear();
  }

  std::string path_;
  std::string target_;
  UniqueFd fd_;
  std::string pending_;
};

std::string ReindexLine(const std::string& share_path) {
  Json::Value event;
  event["event"] = static_cast<unsigned int>(fileindex::EVENT_REINDEX);
  event["path"] = share_path;
  return toString(event);
}

}  // namespace

std::uint64_t CountBadLines(const std::string& path) {
  const UniqueFd fd = Open(path);
  if (!fd.valid()) return 0;
  Lines lines(fd.get(), path);
  std::uint64_t bad = 0;
  std::string line;
  while (lines.Next(&line)) {
    if (lines.ended() && !IsEvent(line)) ++bad;
  }
  return bad;
}

std::uint64_t RemoveBadLines(const std::string& path, const std::string& share_path) {
  const UniqueFd fd = OpenLocked(path);
  if (!fd.valid()) return 0;
  struct stat old {};
  if (fstat(fd.get(), &old) != 0) Refuse("look at", path);
  Draft draft(path);
  Lines lines(fd.get(), path);
  std::uint64_t bad = 0;
  std::string line;
  while (lines.Next(&line)) {
    if (IsEvent(line)) {
      draft.Add(line);
    } else {
      ++bad;
    }
  }
  if (bad == 0) return 0;
  draft.Add(ReindexLine(share_path));
  draft.TakePlace(old);
  return bad;
}

}  // namespace quarry::cli
