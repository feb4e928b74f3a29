// Moving frames through non-blocking sockets, a piece at a time.

#ifndef QUARRY_DAEMONS_COMMON_FRAME_H_
#define QUARRY_DAEMONS_COMMON_FRAME_H_

#include <cstddef>
#include <cstdint>
#include <string>

namespace quarry::daemon {

constexpr std::size_t kFrameHeaderBytes = sizeof(std::uint32_t);

// `text` behind its length, ready to be sent. `text` is shorter than 4 GiB.
std::string MakeFrame(const std::string& text);

enum class FrameStatus {
  kAgain,  // nothing more for now
  kMore,   // enough for one turn; there may be more at once
  kDone,   // the frame is whole
  kEnd,    // the connection is of no more use: it ended, failed, or claims too long a frame
};

// Puts one frame after another together. Memory grows with what arrives, not with what is claimed.
class FrameReader {
 public:
  explicit FrameReader(std::size_t max_bytes) : max_bytes_(max_bytes) {}

  // Reads from the socket, at most about 1 MiB a turn and never past the end of the frame.
  FrameStatus Read(int fd);
  // The frame's text, once Read() has returned kDone; the next frame begins.
  std::string Take();

  // Whether a frame has begun, and the bytes held for it.
  bool Begun() const { return header_got_ > 0; }
  std::size_t Buffered() const { return body_.size(); }

 private:
  FrameStatus ReadHeader(int fd);
  FrameStatus ReadBody(int fd);

  std::size_t max_bytes_;
  char header_[kFrameHeaderBytes] = {};
  std::size_t header_got_ = 0;
  std::size_t body_size_ = 0;
  std::size_t body_got_ = 0;
  std::string body_;
};

// Sends one frame after another.
class FrameWriter {
 public:
  // Begins a frame; the one before must have been sent.
  void Set(std::string text);
  // Sends what the socket takes, at most about 1 MiB a turn. No SIGPIPE.
  FrameStatus Write(int fd);

  // The bytes of this frame that the socket has taken, header included, and the bytes held for it.
  std::size_t Sent() const { return sent_; }
  std::size_t Buffered() const { return body_.size(); }

 private:
  char header_[kFrameHeaderBytes] = {};
  std::string body_;
  std::size_t sent_ = 0;
};

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_FRAME_H_
