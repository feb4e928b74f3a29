// Addresses of Unix-domain sockets.

#ifndef QUARRY_DAEMONS_COMMON_SOCKET_ADDRESS_H_
#define QUARRY_DAEMONS_COMMON_SOCKET_ADDRESS_H_

#include <sys/un.h>

#include <string>

namespace quarry::daemon {

// The address of the socket at `path`. Throws Error 502 when the path is empty, contains a NUL byte
// or is longer than an address can hold (107 bytes), saying what to do about QUARRY_ROOT.
sockaddr_un SocketAddress(const std::string& path);

// Fails as SocketAddress does, for callers that want to know before they begin.
inline void CheckSocketPath(const std::string& path) {
  SocketAddress(path);
}

// What connecting to the socket at `path` gives: 0, or the errno. ECONNREFUSED means that nobody
// listens there, EAGAIN that somebody does who has no room at present. Does not block.
int ProbeSocket(const std::string& path);

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_SOCKET_ADDRESS_H_
