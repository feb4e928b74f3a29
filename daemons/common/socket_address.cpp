#include "daemons/common/socket_address.h"

#include <sys/socket.h>

#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/unique_fd.h"

namespace quarry::daemon {

sockaddr_un SocketAddress(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  constexpr std::size_t kMax = sizeof(address.sun_path) - 1;
  if (path.empty() || path.find('\0') != std::string::npos) {
    throw Error(kErrorSystem, "A socket needs a path that is not empty and has no NUL byte.");
  }
  if (path.size() > kMax) {
    throw Error(kErrorSystem, "The socket path " + path + " has " + std::to_string(path.size()) +
                                  " bytes, but a socket address holds at most " +
                                  std::to_string(kMax) +
                                  ". Set QUARRY_ROOT to a shorter directory.");
  }
  std::memcpy(address.sun_path, path.data(), path.size());
  return address;
}

int ProbeSocket(const std::string& path) {
  const sockaddr_un address = SocketAddress(path);
  const UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
  if (!fd.valid()) return errno;
  while (connect(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0) {
    if (errno != EINTR) return errno;
  }
  return 0;
}

}  // namespace quarry::daemon
