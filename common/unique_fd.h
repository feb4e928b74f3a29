// Owning a descriptor.

#ifndef QUARRY_COMMON_UNIQUE_FD_H_
#define QUARRY_COMMON_UNIQUE_FD_H_

#include <unistd.h>

#include <cerrno>
#include <utility>

namespace quarry {

// Closes its descriptor at the end of its life. Closing leaves errno as it was.
class UniqueFd {
 public:
  UniqueFd() = default;
  explicit UniqueFd(int fd) : fd_(fd) {}
  UniqueFd(UniqueFd&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
  UniqueFd& operator=(UniqueFd&& other) noexcept {
    if (this != &other) Reset(std::exchange(other.fd_, -1));
    return *this;
  }
  ~UniqueFd() { Reset(); }

  int get() const { return fd_; }
  bool valid() const { return fd_ >= 0; }
  // Gives the descriptor up to the caller.
  int Release() { return std::exchange(fd_, -1); }
  void Reset(int fd = -1) {
    const int saved = errno;
    if (fd_ >= 0) close(fd_);
    fd_ = fd;
    errno = saved;
  }

 private:
  int fd_ = -1;
};

}  // namespace quarry

#endif  // QUARRY_COMMON_UNIQUE_FD_H_
