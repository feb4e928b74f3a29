#include "daemons/common/frame.h"

#include <sys/socket.h>
#include <sys/uio.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

namespace quarry::daemon {
namespace {

constexpr std::size_t kTurnBytes = std::size_t{1} << 20;
constexpr std::size_t kFirstBytes = std::size_t{64} << 10;

// recv() that is repeated when a signal interrupts it; the rest is as recv() says.
ssize_t Receive(int fd, char* buffer, std::size_t size) {
  ssize_t got;
  do {
    got = recv(fd, buffer, size, MSG_DONTWAIT);
  } while (got < 0 && errno == EINTR);
  return got;
}

FrameStatus StatusOf(ssize_t result) {
  if (result < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) return FrameStatus::kAgain;
  return FrameStatus::kEnd;
}

}  // namespace

std::string MakeFrame(const std::string& text) {
  const auto size = static_cast<std::uint32_t>(text.size());
  std::string frame(reinterpret_cast<const char*>(&size), sizeof(size));
  return frame += text;
}

FrameStatus FrameReader::Read(int fd) {
  if (header_got_ < kFrameHeaderBytes) {
    const FrameStatus status = ReadHeader(fd);
    if (status != FrameStatus::kDone) return status;
  }
  return ReadBody(fd);
}

FrameStatus FrameReader::ReadHeader(int fd) {
  while (header_got_ < kFrameHeaderBytes) {
    const ssize_t got = Receive(fd, header_ + header_got_, kFrameHeaderBytes - header_got_);
    if (got <= 0) return StatusOf(got);
    header_got_ += static_cast<std::size_t>(got);
  }
  std::uint32_t size;
  std::memcpy(&size, header_, sizeof(size));
  body_size_ = size;
  return body_size_ > max_bytes_ ? FrameStatus::kEnd : FrameStatus::kDone;
}

FrameStatus FrameReader::ReadBody(int fd) {
  const std::size_t turn_end = body_got_ + kTurnBytes;
  while (body_got_ < body_size_) {
    if (body_got_ >= turn_end) return FrameStatus::kMore;
    if (body_got_ == body_.size()) {
      body_.resize(std::min(body_size_, std::max(kFirstBytes, 2 * body_got_)));
    }
    const std::size_t room = std::min(body_.size() - body_got_, kTurnBytes);
    const ssize_t got = Receive(fd, body_.data() + body_got_, room);
    if (got <= 0) return StatusOf(got);
    body_got_ += static_cast<std::size_t>(got);
  }
  return FrameStatus::kDone;
}

std::string FrameReader::Take() {
  header_got_ = 0;
  body_size_ = 0;
  body_got_ = 0;
  return std::exchange(body_, std::string());
}

void FrameWriter::Set(std::string text) {
  const auto size = static_cast<std::uint32_t>(text.size());
  std::memcpy(header_, &size, sizeof(size));
  body_ = std::move(text);
  sent_ = 0;
}

FrameStatus FrameWriter::Write(int fd) {
  const std::size_t total = kFrameHeaderBytes + body_.size();
  const std::size_t turn_end = sent_ + kTurnBytes;
  while (sent_ < total) {
    if (sent_ >= turn_end) return FrameStatus::kMore;
    const std::size_t in_header = std::min(sent_, kFrameHeaderBytes);
    const std::size_t in_body = sent_ - in_header;
    iovec parts[2] = {{header_ + in_header, kFrameHeaderBytes - in_header},
                      {body_.data() + in_body, std::min(body_.size() - in_body, kTurnBytes)}};
    msghdr message{};
    message.msg_iov = parts;
    message.msg_iovlen = 2;
    const ssize_t sent = sendmsg(fd, &message, MSG_DONTWAIT | MSG_NOSIGNAL);
    if (sent < 0 && errno == EINTR) continue;
    if (sent < 0) return StatusOf(sent);
    sent_ += static_cast<std::size_t>(sent);
  }
  body_ = std::string();
  return FrameStatus::kDone;
}

}  // namespace quarry::daemon
