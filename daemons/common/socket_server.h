// Serving framed requests on a Unix-domain socket.
//
// A frame is a 4-byte length in the host's byte order and as many bytes of text. A peer sends any
// number of request frames; each is answered by one frame, in order. One NUL byte at the end of a
// request, which some clients count as part of the text, is taken off before the handler sees it.

#ifndef QUARRY_DAEMONS_COMMON_SOCKET_SERVER_H_
#define QUARRY_DAEMONS_COMMON_SOCKET_SERVER_H_

#include <sys/types.h>

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <string>

namespace quarry::daemon {

// Who is at the other end, as the kernel says.
struct Peer {
  pid_t pid = -1;
  uid_t uid = static_cast<uid_t>(-1);
  gid_t gid = static_cast<gid_t>(-1);
};

// Makes the answer to one request, which is the handler's to let go of as soon as it may. An empty
// answer, or an exception, closes the connection without a frame. With workers it runs on several
// threads at once, but never twice at a time for one connection.
using RequestHandler = std::function<std::string(std::string request, const Peer& peer)>;

struct SocketServerOptions {
  // Threads that run the handler; with 0 it runs inside Step().
  std::size_t workers = 0;
  // A frame that claims more closes its connection before anything is stored.
  std::size_t max_request_bytes = std::size_t{64} << 20;
  // What all connections together may hold in requests and answers; the one that would exceed it is
  // closed.
  std::size_t max_buffered_bytes = std::size_t{512} << 20;
  // Connections beyond this number wait in the kernel until another one ends, or has neither sent
  // nor taken anything for `evict_after`: then it gives its place up.
  std::size_t max_connections = 256;
  std::chrono::milliseconds evict_after = std::chrono::seconds(1);
  // How long a peer may take from the first byte of a request to its last, and for taking an answer
  // without accepting a single byte.
  std::chrono::milliseconds partial_timeout = std::chrono::seconds(30);
  // How long a connection may stay open without a request.
  std::chrono::milliseconds idle_timeout = std::chrono::minutes(10);
};

// Listens as long as the object lives. Step(), Finish(), WakeOn() and the destructor belong to one
// thread; Wake() may be called from any thread. Neither slow nor silent nor hostile peers hold up
// others. Never raises SIGPIPE.
class SocketServer {
 public:
  // Listens at `path` with mode 0660, creating missing directories above it. A socket file at which
  // nobody listens is replaced. Throws Error 502 when somebody listens there, when something else
  // is at that place, when the path does not fit a socket address, or on a system failure.
  SocketServer(const std::string& path, RequestHandler handler, SocketServerOptions options = {});
  // Waits for handlers that are running, closes all connections and removes the socket file if it
  // is still this server's.
  ~SocketServer();
  SocketServer(const SocketServer&) = delete;
  SocketServer& operator=(const SocketServer&) = delete;

  // Waits up to `timeout_ms` milliseconds (negative: without limit) for something to happen, and
  // deals with all that is ready. Returns the number of requests taken from connections.
  int Step(int timeout_ms);

  // Makes the Step() that is waiting, or the next one, return at once. Async-signal-safe.
  void Wake();

  // Makes Step() return as soon as `fd` is readable, as a stop signal's descriptor is. Nothing is
  // read from it. The descriptor stays the caller's and must stay open.
  void WakeOn(int fd);

  // Removes the socket file, takes what was sent before, and then no more connections or requests;
  // gives the requests in work up to `timeout_ms` milliseconds to be answered and their answers to
  // be taken. Returns whether all were. Called again it only waits on.
  bool Finish(int timeout_ms);

  // Open connections, for reports and tests.
  std::size_t ConnectionCount() const;

 private:
  class Impl;
  std::unique_ptr<Impl> impl_;
};

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_SOCKET_SERVER_H_
