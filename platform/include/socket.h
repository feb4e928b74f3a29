// Connections to daemons on this machine, one whole message at a time.
//
// A message is a 4-byte length in the host's byte order and as many bytes of text. None of the
// calls raises SIGPIPE.

#ifndef QUARRY_PLATFORM_INCLUDE_SOCKET_H_
#define QUARRY_PLATFORM_INCLUDE_SOCKET_H_

#include <string>

#include "common/export.h"

namespace tarndaemon {

// A stream socket. Owns its descriptor. One thread at a time.
class QUARRY_EXPORT SockConnection {
 public:
  SockConnection() = default;
  virtual ~SockConnection();
  SockConnection(const SockConnection&) = delete;
  SockConnection& operator=(const SockConnection&) = delete;

  // Each blocks until the whole message is through, and returns false, with errno set, on failure.
  bool Send(const std::string& message);
  bool Recv(std::string& message);

  // Closes the descriptor if it is open. May be repeated.
  void Disconnect();

 protected:
  int fd_ = -1;
};

// A connection to the Unix-domain socket at `path`.
class QUARRY_EXPORT DomainSockConnection : public SockConnection {
 public:
  explicit DomainSockConnection(const std::string& path) : path_(path) {}

  // Returns false, with errno set, when nobody listens there or the path does not fit an address.
  bool Connect();

 private:
  std::string path_;
};

}  // namespace tarndaemon

#endif  // QUARRY_PLATFORM_INCLUDE_SOCKET_H_
