#include "platform/linux/share_move.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include "common/error.h"
#include "common/lock_file.h"
#include "common/unique_fd.h"
#include "platform/include/index_path.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/monitor_move.h"
#include "platform/linux/share_registry.h"

namespace quarry::platform {
namespace {

constexpr char kSnapshot[] = ".tmp";

[[noreturn]] void SystemFailure(const std::string& what) {
  throw Error(kErrorSystem, what + ": " + std::strerror(errno));
}

std::string QueueOf(const std::string& share_path) {
  std::array<char, 4096> buffer{};
  if (FILEIDXQueuePathCompose(share_path.c_str(), buffer.data(), buffer.size()) < 0) {
    SystemFailure("No queue can be named after " + share_path);
  }
  return buffer.data();
}

void RemoveFile(const std::string& path) {
  if (unlink(path.c_str()) != 0 && errno != ENOENT) SystemFailure("Cannot remove " + path);
}

void WriteAll(int fd, const char* bytes, std::size_t size) {
  while (size > 0) {
    const ssize_t count = write(fd, bytes, size);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) SystemFailure("Cannot write a queue");
    bytes += count;
    size -= static_cast<std::size_t>(count);
  }
}

// Appends the lines of a file that need not exist. A writer that was killed leaves a last line
// without its end, which must not swallow the next one.
void AppendLines(int fd, const std::string& path) {
  const UniqueFd source(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!source.valid() && errno == ENOENT) return;
  if (!source.valid()) SystemFailure("Cannot read " + path);
  std::array<char, 65536> piece{};
  char last = '\n';
  while (true) {
    const ssize_t count = read(source.get(), piece.data(), piece.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) SystemFailure("Cannot read " + path);
    if (count == 0) break;
    const auto size = static_cast<std::size_t>(count);
    WriteAll(fd, piece.data(), size);
    last = piece[size - 1];
  }
  if (last != '\n') WriteAll(fd, "\n", 1);
}

// Makes the new queue of the old one's snapshot and its lines. Nobody writes to it yet, so what an
// earlier attempt has left is replaced.
void CopyQueue(const std::string& from, const std::string& to) {
  const std::string unfinished = to + ".moving";
  const UniqueFd fd(open(unfinished.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644));
  if (!fd.valid()) SystemFailure("Cannot make " + unfinished);
  AppendLines(fd.get(), from + kSnapshot);
  AppendLines(fd.get(), from);
  if (fsync(fd.get()) != 0) SystemFailure("Cannot write " + unfinished);
  RemoveFile(to + kSnapshot);
  if (rename(unfinished.c_str(), to.c_str()) != 0 || !SyncDirectory(ParentDirectory(to))) {
    SystemFailure("Cannot make " + to);
  }
}

std::string PathOfShare(const std::string& name) {
  for (const ShareRecord& share : ReadShares()) {
    if (share.name == name) return share.path;
  }
  throw Error(kErrorShareNotFound, "There is no share called \"" + name + "\".");
}

void CopyWatches(const MonitorMove& move) {
  if (!CopyRegistrations(move)) SystemFailure("Cannot register with the change monitor");
}

}  // namespace

void MoveShare(const std::string& name, const std::string& new_path) {
  const std::string old_path = PathOfShare(name);
  const std::string old_queue = QueueOf(old_path);
  {
    // Whoever waits for this queue meanwhile would else write to a file that has been copied.
    const LockFile lock(old_queue, true);
    ReplaceSharePath(name, new_path, [&] {
      const std::string new_queue = QueueOf(new_path);
      CopyQueue(old_queue, new_queue);
      CopyWatches({old_queue, new_queue, old_path, new_path});
    });
  }
  CleanUpShareMove(old_path);
}

// A line that came too late is no loss: the worker of a share that has moved compares all of it.
void CleanUpShareMove(const std::string& old_path) {
  // The monitor makes no queue anew that is not registered any more.
  if (!RemoveRegistrations(QueueOf(old_path))) SystemFailure("Cannot withdraw from the monitor");
  RemoveQueue(old_path);
}

void MoveWatches(const std::string& share_path, const std::string& old_path,
                 const std::string& new_path) {
  const std::string queue = QueueOf(share_path);
  CopyWatches({queue, queue, old_path, new_path});
}

void RemoveQueue(const std::string& share_path) {
  const std::string queue = QueueOf(share_path);
  RemoveFile(queue + kSnapshot);
  RemoveFile(queue);
}

}  // namespace quarry::platform
