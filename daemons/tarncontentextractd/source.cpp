#include "daemons/tarncontentextractd/source.h"

#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <utility>

namespace quarry::extract {
namespace {

// Grown in such steps, so that memory follows what the file really holds.
constexpr std::size_t kReadStep = std::size_t{1} << 20;

// To see the end of what was read, or what has come since.
constexpr std::size_t kLeastRoom = std::size_t{4} << 10;

// What the file says it has. By the system's own call: the C library's asks in a way that could
// ask about paths too, and a worker may not.
std::size_t SizeOf(int fd) {
  struct stat status {};
  if (syscall(SYS_fstat, fd, &status) != 0 || status.st_size < 0) return 0;
  return static_cast<std::size_t>(status.st_size);
}

// How much to make room for behind what there is: for no more than is to be expected, since room is
// cleared, which takes time even where nothing comes.
std::size_t RoomFor(std::size_t got, std::size_t expected) {
  const std::size_t room = got < expected ? expected - got + 1 : got / 8;
  return std::clamp(room, kLeastRoom, kReadStep);
}

}  // namespace

Source Source::OfBytes(std::string bytes, std::string extension) {
  Source source(-1, std::move(extension));
  source.bytes_ = std::move(bytes);
  source.at_end_ = true;
  return source;
}

std::size_t Source::Expected() {
  if (!expected_) expected_ = fd_ < 0 ? bytes_.size() : SizeOf(fd_);
  return *expected_;
}

void Source::ReadUpTo(std::size_t size) {
  const std::size_t expected = at_end_ ? 0 : Expected();
  while (!at_end_ && bytes_.size() < size) {
    const std::size_t got = bytes_.size();
    bytes_.resize(std::min(size, got + RoomFor(got, expected)));
    const std::size_t asked = bytes_.size() - got;
    ssize_t count = 0;
    do {
      count = pread(fd_, bytes_.data() + got, asked, static_cast<off_t>(got));
    } while (count < 0 && errno == EINTR);
    bytes_.resize(got + static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
    // Where the file has given what it said, a read that falls short has met its end.
    at_end_ =
        count <= 0 || (bytes_.size() < got + asked && expected > 0 && bytes_.size() >= expected);
  }
}

std::string_view Source::Head() {
  ReadUpTo(kHeadBytes);
  return std::string_view(bytes_).substr(0, kHeadBytes);
}

std::string_view Source::Bytes() {
  ReadUpTo(kMaxFileBytes);
  return std::string_view(bytes_).substr(0, kMaxFileBytes);
}

}  // namespace quarry::extract
