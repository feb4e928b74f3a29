// A server that runs in a thread, and a peer that may misbehave.

#ifndef QUARRY_TESTS_DAEMONS_COMMON_HARNESS_H_
#define QUARRY_TESTS_DAEMONS_COMMON_HARNESS_H_

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>

#include "daemons/common/socket_address.h"
#include "daemons/common/socket_server.h"

namespace quarry::test {

class ServerThread {
 public:
  ServerThread(const std::string& path, daemon::RequestHandler handler,
               const daemon::SocketServerOptions& options = {})
      : server_(path, std::move(handler), options), thread_([this] { Run(); }) {}
  ~ServerThread() {
    stop_ = true;
    server_.Wake();
    thread_.join();
  }
  ServerThread(const ServerThread&) = delete;
  ServerThread& operator=(const ServerThread&) = delete;

  std::size_t ConnectionCount() const { return connections_; }
  int Requests() const { return requests_; }

 private:
  void Run() {
    while (!stop_) {
      requests_ += server_.Step(-1);
      connections_ = server_.ConnectionCount();
    }
  }

  daemon::SocketServer server_;
  std::atomic<bool> stop_{false};
  std::atomic<int> requests_{0};
  std::atomic<std::size_t> connections_{0};
  std::thread thread_;
};

// One end of a connection, with calls that fail the test by throwing.
class RawPeer {
 public:
  explicit RawPeer(const std::string& path) : fd_(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    const sockaddr_un address = daemon::SocketAddress(path);
    if (connect(fd_, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0) {
      throw std::runtime_error(std::string("connect: ") + std::strerror(errno));
    }
  }
  ~RawPeer() { Close(); }
  RawPeer(const RawPeer&) = delete;
  RawPeer& operator=(const RawPeer&) = delete;

  void Close() {
    if (fd_ >= 0) close(fd_);
    fd_ = -1;
  }
  void ShutdownWrite() { shutdown(fd_, SHUT_WR); }

  void Send(const std::string& bytes) {
    if (!SendSome(bytes)) throw std::runtime_error(std::string("send: ") + std::strerror(errno));
  }
  // Whether the other end took everything.
  bool SendSome(const std::string& bytes) {
    for (std::size_t done = 0; done < bytes.size();) {
      const ssize_t sent = send(fd_, bytes.data() + done, bytes.size() - done, MSG_NOSIGNAL);
      if (sent <= 0) return false;
      done += static_cast<std::size_t>(sent);
    }
    return true;
  }

  std::string RecvBytes(std::size_t size) {
    std::string bytes(size, '\0');
    for (std::size_t done = 0; done < size;) {
      WaitReadable();
      const ssize_t got = recv(fd_, bytes.data() + done, size - done, 0);
      if (got <= 0) throw std::runtime_error("the connection ended");
      done += static_cast<std::size_t>(got);
    }
    return bytes;
  }
  std::string RecvFrame() {
    std::uint32_t size = 0;
    std::memcpy(&size, RecvBytes(sizeof(size)).data(), sizeof(size));
    return RecvBytes(size);
  }
  // Waits for the other end to close; false when it sends something or does nothing.
  bool IsClosed() {
    WaitReadable();
    char byte;
    return recv(fd_, &byte, 1, 0) <= 0;
  }

 private:
  void WaitReadable() {
    pollfd poll_fd{fd_, POLLIN, 0};
    if (poll(&poll_fd, 1, 20000) != 1) throw std::runtime_error("nothing came");
  }

  int fd_;
};

}  // namespace quarry::test

#endif  // QUARRY_TESTS_DAEMONS_COMMON_HARNESS_H_
