// The index daemon's end of its socket: takes one command per connection and acknowledges it.

#ifndef QUARRY_TESTS_FILEINDEX_INDEX_DAEMON_H_
#define QUARRY_TESTS_FILEINDEX_INDEX_DAEMON_H_

#include <json/json.h>
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

#include "common/json.h"
#include "common/paths.h"

namespace quarry::test {

class IndexDaemon {
 public:
  // `on_command` runs on the daemon's thread before the sender gets its answer, so it sees the
  // world as it is while the sender waits.
  explicit IndexDaemon(std::function<void(const Json::Value&)> on_command = nullptr)
      : on_command_(std::move(on_command)), listener_(Listen()), thread_([this] { Serve(); }) {}

  ~IndexDaemon() {
    stop_ = true;
    shutdown(listener_, SHUT_RDWR);
    thread_.join();
    close(listener_);
    unlink(Path().c_str());
  }
  IndexDaemon(const IndexDaemon&) = delete;
  IndexDaemon& operator=(const IndexDaemon&) = delete;

  // The commands so far, as compact text.
  std::vector<std::string> Commands() const {
    const std::lock_guard<std::mutex> guard(mutex_);
    return commands_;
  }

  static std::string Path() { return RootedPath("/var/run/fileindexd.sock"); }

 private:
  static int Listen() {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (Path().size() >= sizeof(address.sun_path)) throw std::runtime_error("root too long");
    std::memcpy(address.sun_path, Path().data(), Path().size());
    unlink(Path().c_str());
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0 || bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)) != 0 ||
        listen(fd, 8) != 0) {
      throw std::runtime_error("cannot listen at " + Path());
    }
    return fd;
  }

  static bool Read(int fd, char* out, size_t size) {
    while (size > 0) {
      const ssize_t got = read(fd, out, size);
      if (got <= 0) return false;
      out += got;
      size -= static_cast<size_t>(got);
    }
    return true;
  }

  void Serve() {
    while (!stop_) {
      const int fd = accept4(listener_, nullptr, nullptr, SOCK_CLOEXEC);
      if (fd < 0) continue;
      ServeOne(fd);
      close(fd);
    }
  }

  void ServeOne(int fd) {
    std::uint32_t length = 0;
    if (!Read(fd, reinterpret_cast<char*>(&length), sizeof(length)) || length == 0) return;
    std::string text(length, '\0');
    if (!Read(fd, text.data(), length)) return;
    text.pop_back();  // the NUL byte at the end
    Json::Value command;
    if (!fromString(command, text)) return;
    {
      const std::lock_guard<std::mutex> guard(mutex_);
      commands_.push_back(text);
    }
    if (on_command_) on_command_(command);
    const char reply[] = {2, 0, 0, 0, '{', '}'};
    (void)!send(fd, reply, sizeof(reply), MSG_NOSIGNAL);
  }

  std::function<void(const Json::Value&)> on_command_;
  mutable std::mutex mutex_;
  std::vector<std::string> commands_;
  std::atomic<bool> stop_{false};
  int listener_;
  std::thread thread_;
};

}  // namespace quarry::test

#endif  // QUARRY_TESTS_FILEINDEX_INDEX_DAEMON_H_
