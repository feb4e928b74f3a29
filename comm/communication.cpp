#include "comm/communication.h"

#include <pthread.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdint>
#include <cstring>
#include <ctime>

#include "comm/socket_path.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "common/paths.h"
#include "common/unique_fd.h"

namespace quarry::fileindex {
namespace {

constexpr int kConnectAttempts = 5;
constexpr unsigned int kPieceBytes = 1024;
constexpr int kInterruptionsAllowed = 10;
constexpr useconds_t kEndOfStreamPause = 100 * 1000;  // microseconds

const std::string kSocketPath = RootedPath("/var/run/fileindexd.sock");

// Keeps SIGPIPE from this thread: a reader that is gone is reported by the write itself, and the
// library must not end its host program. A signal that was pending before stays pending.
class SigpipeGuard {
 public:
  SigpipeGuard() {
    sigemptyset(&sigpipe_);
    sigaddset(&sigpipe_, SIGPIPE);
    sigset_t pending;
    sigpending(&pending);
    was_pending_ = sigismember(&pending, SIGPIPE) == 1;
    pthread_sigmask(SIG_BLOCK, &sigpipe_, &saved_);
  }
  ~SigpipeGuard() {
    const int saved_errno = errno;
    const timespec no_wait{};
    if (!was_pending_) sigtimedwait(&sigpipe_, nullptr, &no_wait);
    pthread_sigmask(SIG_SETMASK, &saved_, nullptr);
    errno = saved_errno;
  }
  SigpipeGuard(const SigpipeGuard&) = delete;
  SigpipeGuard& operator=(const SigpipeGuard&) = delete;

 private:
  sigset_t sigpipe_;
  sigset_t saved_;
  bool was_pending_;
};

// Counts the interruptions of one transfer.
class InterruptionBudget {
 public:
  // Whether the call that has just failed may be repeated.
  bool MayRepeat() { return errno == EINTR && left_-- > 0; }

 private:
  int left_ = kInterruptionsAllowed;
};

// Reads at most one piece, and returns how much it was: 0 at the end of the stream.
unsigned int ReadPiece(int fd, unsigned int len, unsigned char* buf, InterruptionBudget& budget) {
  while (true) {
    const ssize_t count = read(fd, buf, std::min(len, kPieceBytes));
    if (count >= 0) return static_cast<unsigned int>(count);
    if (!budget.MayRepeat()) {
      throw Error(kErrorSystem, std::string("read failed, reason=") + strerror(errno));
    }
  }
}

// Reads `len` bytes; `place(done)` says where the piece goes that begins at byte `done`. The daemon
// always answers in full, so the end of the stream only means that there is nothing yet.
template <typename Place>
void ReadFully(int fd, unsigned int len, Place place) {
  InterruptionBudget budget;
  for (unsigned int done = 0; done < len;) {
    const unsigned int count = ReadPiece(fd, len - done, place(done), budget);
    if (count == 0) usleep(kEndOfStreamPause);
    done += count;
  }
}

// A command's answer is only waited for. Its length is the peer's claim, so no memory is taken for
// it.
void DiscardReply(int fd) {
  std::uint32_t len = 0;
  BufferRead(fd, sizeof(len), reinterpret_cast<unsigned char*>(&len));
  unsigned char piece[kPieceBytes];
  ReadFully(fd, len, [&](unsigned int) { return piece; });
}

// A daemon that was just started may not have made its socket yet. Any other failure is left to be
// reported by the write that follows.
void Connect(int fd) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  kSocketPath.copy(address.sun_path, sizeof(address.sun_path) - 1);
  for (int attempt = 1;; ++attempt) {
    if (connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0) return;
    if (errno != ENOENT || attempt == kConnectAttempts) return;
    sleep(1);
  }
}

std::string Envelope(const std::string& command, const Json::Value& data) {
  Json::Value envelope(Json::objectValue);
  envelope["type"] = command;
  envelope["data"] = data;
  return toString(envelope);
}

// The text goes out with its terminating NUL, which the length counts.
void SendText(int fd, const std::string& text) {
  const auto len = static_cast<std::uint32_t>(text.size() + 1);
  BufferWrite(fd, sizeof(len), reinterpret_cast<const unsigned char*>(&len));
  BufferWrite(fd, len, reinterpret_cast<const unsigned char*>(text.c_str()));
}

}  // namespace

void SendCommandToDaemon(const std::string& command, const Json::Value& data) {
  RequireSocketPath(QUARRY_SITE("communication"), kErrorSystem, kSocketPath);
  const UniqueFd fd(socket(PF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (!fd.valid()) {
    Fail(QUARRY_SITE("communication"), "0 > (fd_socket = socket(PF_UNIX, SOCK_STREAM, 0))",
         kErrorSystem, std::string("socket failed, reason=") + strerror(errno));
  }
  Connect(fd.get());
  const timeval timeout{1, 0};
  if (setsockopt(fd.get(), SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof(timeout)) < 0) {
    Fail(QUARRY_SITE("communication"),
         "0 > setsockopt(fd_socket, SOL_SOCKET, SO_SNDTIMEO, (char *)&timeout, sizeof(timeout))",
         kErrorSystem, std::string("setsockopt failed, reason=") + strerror(errno));
  }
  SendText(fd.get(), Envelope(command, data));
  DiscardReply(fd.get());
}

void BufferRead(int fd, unsigned int len, unsigned char* buf) {
  ReadFully(fd, len, [buf](unsigned int done) { return buf + done; });
}

void BufferWrite(int fd, unsigned int len, const unsigned char* buf) {
  const SigpipeGuard guard;
  InterruptionBudget budget;
  for (unsigned int done = 0; done < len;) {
    const ssize_t count = write(fd, buf + done, std::min(len - done, kPieceBytes));
    if (count > 0) {
      done += static_cast<unsigned int>(count);
    } else if (count == 0 || !budget.MayRepeat()) {
      throw Error(kErrorSystem, std::string("write failed, reason=") + strerror(errno));
    }
  }
}

}  // namespace quarry::fileindex
