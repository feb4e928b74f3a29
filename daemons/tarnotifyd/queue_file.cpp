#include "daemons/tarnotifyd/queue_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/json.h"
#include "common/named_file.h"
#include "common/unique_fd.h"
#include "daemons/common/log.h"
#include "fileindex/queue/event.h"
#include "fileindex/queue/queue_append.h"

namespace quarry::notify {
namespace {

// More than an overflow line ever has: two escaped bytes for each of a path's.
constexpr off_t kTailBytes = 1 << 15;

// The queue, locked; without a descriptor, with errno set, when it cannot be opened or is locked
// (EWOULDBLOCK). Whoever renames the queue away holds its lock, so one that still has its name once
// it is locked keeps it.
UniqueFd LockQueue(const std::string& queue) {
  UniqueFd fd(open(queue.c_str(), O_RDWR | O_APPEND | O_CREAT | O_CLOEXEC | O_NONBLOCK, 0644));
  if (!fd.valid()) return fd;
  if (flock(fd.get(), LOCK_EX | LOCK_NB) != 0) return UniqueFd();
  if (IsStillNamed(queue, fd.get())) return fd;
  errno = EWOULDBLOCK;
  return UniqueFd();
}

bool IsEmpty(int fd) {
  struct stat status {};
  return fstat(fd, &status) == 0 && status.st_size == 0;
}

// The last line of the file without its end, "" when it is torn or too long to be an overflow.
std::string LastLine(int fd) {
  struct stat status {};
  if (fstat(fd, &status) != 0) return {};
  std::string tail(static_cast<std::size_t>(std::min(status.st_size, kTailBytes)), '\0');
  const off_t from = status.st_size - static_cast<off_t>(tail.size());
  if (pread(fd, tail.data(), tail.size(), from) != static_cast<ssize_t>(tail.size())) return {};
  if (tail.size() < 2 || tail.back() != '\n') return {};
  tail.pop_back();
  const std::size_t end = tail.rfind('\n');
  if (end == std::string::npos) return from == 0 ? tail : std::string();
  return tail.substr(end + 1);
}

bool EndsInOverflow(int fd) {
  Json::Value event;
  if (!fromString(event, LastLine(fd)) || !event.isObject()) return false;
  return event["path"].isString() && event["event"].isUInt() &&
         (event["event"].asUInt() & fileindex::EVENT_OVERFLOW) != 0;
}

std::string Line(std::uint32_t kind, bool is_dir, const std::string& path,
                 const std::string& path_old) {
  Json::Value line(Json::objectValue);
  line["event"] = kind;
  line["is_dir"] = is_dir;
  line["path"] = path;
  line["path_old"] = path_old;
  return toString(line) + "\n";
}

}  // namespace

std::string QueueLines(const std::vector<Change>& changes) {
  std::string lines;
  for (const Change& change : changes) {
    lines += Line(change.kind, change.is_dir, change.path, change.path_old);
  }
  return lines;
}

std::string OverflowLine(const std::string& directory) {
  return Line(fileindex::EVENT_OVERFLOW, true, directory, "");
}

WriteResult AppendToQueue(const std::string& queue, const std::string& lines,
                          const std::function<bool()>& is_wanted) {
  const UniqueFd fd = LockQueue(queue);
  if (!fd.valid()) {
    return errno == EWOULDBLOCK || errno == EINTR ? WriteResult::kBusy : WriteResult::kFailed;
  }
  if (IsEmpty(fd.get()) && !is_wanted()) {
    unlink(queue.c_str());
    return WriteResult::kDone;
  }
  if (EndsInOverflow(fd.get())) return WriteResult::kDone;
  int cut_error = 0;
  if (fileindex::AppendLines(fd.get(), lines, &cut_error)) return WriteResult::kDone;
  if (cut_error != 0) {
    daemon::LogError("Cannot cut a torn line off " + queue + ": " + std::strerror(cut_error));
  }
  return WriteResult::kFailed;
}

}  // namespace quarry::notify
