// A daemon that answers as a test tells it to.

#ifndef QUARRY_TESTS_PLATFORM_LINUX_FAKE_DAEMON_H_
#define QUARRY_TESTS_PLATFORM_LINUX_FAKE_DAEMON_H_

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cstdint>
#include <cstring>
#include <functional>
#include <mutex>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

namespace quarry::test {

// Serves one connection after another at `path`, in a thread. Each whole request is answered with
// the bytes that the function returns, as they are; an empty answer hangs up.
class FakeDaemon {
 public:
  using Answer = std::function<std::string(const std::string& request)>;

  FakeDaemon(const std::string& path, Answer answer)
      : path_(path), answer_(std::move(answer)), listener_(Listen(path)) {
    if (pipe(stop_) != 0) throw std::runtime_error("pipe");
    thread_ = std::thread([this] { Run(); });
  }
  ~FakeDaemon() {
    close(stop_[1]);
    thread_.join();
    close(stop_[0]);
    close(listener_);
    unlink(path_.c_str());
  }
  FakeDaemon(const FakeDaemon&) = delete;
  FakeDaemon& operator=(const FakeDaemon&) = delete;

  // `text` behind its length.
  static std::string Frame(const std::string& text) {
    const auto size = static_cast<std::uint32_t>(text.size());
    return std::string(reinterpret_cast<const char*>(&size), sizeof(size)) + text;
  }

  int Connections() const { return connections_; }
  std::vector<std::string> Requests() const {
    const std::lock_guard<std::mutex> lock(mutex_);
    return requests_;
  }

 private:
  static int Listen(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof(address.sun_path)) throw std::runtime_error("path too long");
    std::memcpy(address.sun_path, path.data(), path.size());
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0 ||
        listen(fd, 16) != 0) {
      throw std::runtime_error("cannot listen");
    }
    return fd;
  }

  // Whether `fd` can be read before the daemon is to stop.
  bool WaitReadable(int fd) const {
    pollfd fds[2] = {{fd, POLLIN, 0}, {stop_[0], POLLIN, 0}};
    return poll(fds, 2, -1) > 0 && fds[1].revents == 0;
  }

  bool RecvAll(int fd, char* bytes, std::size_t size) const {
    while (size > 0) {
      if (!WaitReadable(fd)) return false;
      const ssize_t got = recv(fd, bytes, size, 0);
      if (got <= 0) return false;
      bytes += got;
      size -= static_cast<std::size_t>(got);
    }
    return true;
  }

  bool ServeOne(int fd) {
    std::uint32_t size = 0;
    if (!RecvAll(fd, reinterpret_cast<char*>(&size), sizeof(size))) return false;
    std::string request(size, '\0');
    if (!RecvAll(fd, request.data(), size)) return false;
    {
      const std::lock_guard<std::mutex> lock(mutex_);
      requests_.push_back(request);
    }
    const std::string reply = answer_(request);
    return !reply.empty() &&
           send(fd, reply.data(), reply.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(reply.size());
  }

  void Run() {
    while (WaitReadable(listener_)) {
      const int fd = accept4(listener_, nullptr, nullptr, SOCK_CLOEXEC);
      ++connections_;
      while (ServeOne(fd)) {
      }
      close(fd);
    }
  }

  std::string path_;
  Answer answer_;
  int listener_;
  int stop_[2] = {-1, -1};
  std::atomic<int> connections_{0};
  mutable std::mutex mutex_;
  std::vector<std::string> requests_;
  std::thread thread_;
};

}  // namespace quarry::test

#endif  // QUARRY_TESTS_PLATFORM_LINUX_FAKE_DAEMON_H_
