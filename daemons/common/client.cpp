#include "daemons/common/client.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <limits>
#include <system_error>
#include <thread>
#include <utility>

#include "common/error.h"
#include "common/json.h"
#include "daemons/common/frame.h"
#include "daemons/common/socket_address.h"

namespace quarry::daemon {
namespace {

using Clock = std::chrono::steady_clock;

constexpr std::size_t kPieceBytes = std::size_t{1} << 20;

std::string ErrnoText() {
  return std::generic_category().message(errno);
}

UniqueFd NewSocket() {
  return UniqueFd(socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
}

bool ConnectNow(int fd, const sockaddr_un& address) {
  int result;
  do {
    result = connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address));
  } while (result != 0 && errno == EINTR);
  return result == 0;
}

}  // namespace

class Client::Deadline {
 public:
  explicit Deadline(std::chrono::milliseconds timeout) : end_(Clock::now() + timeout) {}

  // What is left, for poll(); 0 when it is over.
  int LeftMs() const {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(end_ - Clock::now()).count();
    return static_cast<int>(std::clamp<long long>(left, 0, std::numeric_limits<int>::max()));
  }

 private:
  Clock::time_point end_;
};

Client::Client(const std::string& daemon, const std::string& socket_path, ClientOptions options)
    : daemon_(daemon), path_(socket_path), options_(options) {
  CheckSocketPath(path_);
}

void Client::Broken(const std::string& what) {
  fd_.Reset();
  throw Error(kErrorSystem, daemon_ + " " + what + " (socket " + path_ + ").");
}

void Client::Connect() {
  const sockaddr_un address = SocketAddress(path_);
  const Deadline deadline(options_.connect_timeout);
  UniqueFd fd = NewSocket();
  if (!fd.valid()) Broken("cannot be asked: " + ErrnoText());
  // A full queue of connections cannot be waited for otherwise than by trying again.
  while (!ConnectNow(fd.get(), address)) {
    if (errno != EAGAIN) Broken("does not run: " + ErrnoText());
    if (deadline.LeftMs() == 0) Broken("is too busy to accept a connection");
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
  fd_ = std::move(fd);
}

// Whether the peer has ended the kept connection, or has sent what nobody asked for.
bool Client::IsStale() const {
  pollfd poll_fd{fd_.get(), POLLIN | POLLRDHUP, 0};
  return poll(&poll_fd, 1, 0) != 0;
}

void Client::Wait(short events, const Deadline& deadline) {
  pollfd poll_fd{fd_.get(), events, 0};
  const int ready = poll(&poll_fd, 1, deadline.LeftMs());
  if (ready == 0) {
    Broken("did not answer within " + std::to_string(options_.timeout.count()) + " ms");
  }
  if (ready < 0 && errno != EINTR) Broken("cannot be waited for: " + ErrnoText());
}

void Client::SendFrame(std::string text, const Deadline& deadline) {
  FrameWriter writer;
  writer.Set(std::move(text));
  for (;;) {
    errno = 0;
    const FrameStatus status = writer.Write(fd_.get());
    if (status == FrameStatus::kDone) return;
    if (status == FrameStatus::kEnd) Broken("hung up while the request was sent: " + ErrnoText());
    if (status == FrameStatus::kAgain) Wait(POLLOUT, deadline);
  }
}

void Client::RecvAll(char* buffer, std::size_t size, const Deadline& deadline) {
  std::size_t done = 0;
  while (done < size) {
    const ssize_t got = recv(fd_.get(), buffer + done, size - done, MSG_DONTWAIT);
    if (got > 0) {
      done += static_cast<std::size_t>(got);
    } else if (got == 0) {
      Broken("hung up without a full answer");
    } else if (errno == EAGAIN) {
      Wait(POLLIN, deadline);
    } else if (errno != EINTR) {
      Broken("hung up without a full answer: " + ErrnoText());
    }
  }
}

std::string Client::RecvFrame(const Deadline& deadline) {
  std::uint32_t size = 0;
  RecvAll(reinterpret_cast<char*>(&size), sizeof(size), deadline);
  if (size > options_.max_reply_bytes) {
    Broken("answered with " + std::to_string(size) + " bytes, more than is accepted");
  }
  // Room is made as the answer arrives, not as it is announced.
  std::string text;
  while (text.size() < size) {
    const std::size_t begin = text.size();
    text.resize(std::min<std::size_t>(size, begin + std::max(begin, kPieceBytes)));
    RecvAll(text.data() + begin, text.size() - begin, deadline);
  }
  return text;
}

std::string Client::RequestText(std::string request) {
  if (request.size() > std::numeric_limits<std::uint32_t>::max()) {
    throw Error(kErrorSystem, "A request of 4 GiB or more cannot be sent to " + daemon_ + ".");
  }
  if (fd_.valid() && IsStale()) fd_.Reset();
  if (!fd_.valid()) Connect();
  const Deadline deadline(options_.timeout);
  try {
    SendFrame(std::move(request), deadline);
    std::string reply = RecvFrame(deadline);
    if (!reply.empty() && reply.back() == '\0') reply.pop_back();
    return reply;
  } catch (...) {
    // Nothing that is left of this answer may be taken for the next one.
    fd_.Reset();
    throw;
  }
}

Json::Value Client::Request(const Json::Value& request) {
  Json::Value value;
  if (!fromString(value, RequestText(toString(request)))) {
    Broken("answered with something that is no JSON");
  }
  return value;
}

Json::Value Request(const std::string& daemon, const std::string& socket_path,
                    const Json::Value& request, ClientOptions options) {
  return Client(daemon, socket_path, options).Request(request);
}

bool IsListening(const std::string& socket_path) {
  try {
    const int result = ProbeSocket(socket_path);
    return result == 0 || result == EAGAIN;
  } catch (const Error&) {
    return false;
  }
}

}  // namespace quarry::daemon
