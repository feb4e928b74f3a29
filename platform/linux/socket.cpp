#include "platform/include/socket.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <limits>

namespace tarndaemon {
namespace {

// A longer message is refused: no daemon of ours sends one.
constexpr std::size_t kMaxMessageBytes = std::size_t{256} << 20;
constexpr std::size_t kPieceBytes = std::size_t{1} << 20;

bool SendAll(int fd, const char* bytes, std::size_t size) {
  while (size > 0) {
    const ssize_t sent = send(fd, bytes, size, MSG_NOSIGNAL);
    if (sent < 0 && errno == EINTR) continue;
    if (sent < 0) return false;
    bytes += sent;
    size -= static_cast<std::size_t>(sent);
  }
  return true;
}

bool RecvAll(int fd, char* bytes, std::size_t size) {
  while (size > 0) {
    const ssize_t got = recv(fd, bytes, size, 0);
    if (got < 0 && errno == EINTR) continue;
    if (got == 0) errno = ECONNRESET;
    if (got <= 0) return false;
    bytes += got;
    size -= static_cast<std::size_t>(got);
  }
  return true;
}

}  // namespace

SockConnection::~SockConnection() {
  Disconnect();
}

void SockConnection::Disconnect() {
  const int saved = errno;
  if (fd_ != -1) close(fd_);
  fd_ = -1;
  errno = saved;
}

bool SockConnection::Send(const std::string& message) {
  if (message.size() > std::numeric_limits<std::uint32_t>::max()) {
    errno = EMSGSIZE;
    return false;
  }
  const auto size = static_cast<std::uint32_t>(message.size());
  return SendAll(fd_, reinterpret_cast<const char*>(&size), sizeof(size)) &&
         SendAll(fd_, message.data(), message.size());
}

bool SockConnection::Recv(std::string& message) {
  message.clear();
  std::uint32_t size = 0;
  if (!RecvAll(fd_, reinterpret_cast<char*>(&size), sizeof(size))) return false;
  if (size > kMaxMessageBytes) {
    errno = EMSGSIZE;
    return false;
  }
  // Room is made as the message arrives, not as it is announced.
  while (message.size() < size) {
    const std::size_t begin = message.size();
    message.resize(std::min<std::size_t>(size, begin + std::max(begin, kPieceBytes)));
    if (RecvAll(fd_, message.data() + begin, message.size() - begin)) continue;
    message.clear();
    return false;
  }
  return true;
}

bool DomainSockConnection::Connect() {
  Disconnect();
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path_.empty() || path_.find('\0') != std::string::npos) {
    errno = EINVAL;
    return false;
  }
  if (path_.size() >= sizeof(address.sun_path)) {
    errno = ENAMETOOLONG;
    return false;
  }
  std::memcpy(address.sun_path, path_.data(), path_.size());
  fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd_ < 0) return false;
  int result;
  do {
    result = connect(fd_, reinterpret_cast<const sockaddr*>(&address), sizeof(address));
  } while (result != 0 && errno == EINTR);
  if (result != 0) Disconnect();
  return result == 0;
}

}  // namespace tarndaemon
