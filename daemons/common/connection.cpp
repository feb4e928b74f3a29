#include "daemons/common/connection.h"

#include <poll.h>
#include <sys/socket.h>

#include <utility>

namespace quarry::daemon {
namespace {

Peer PeerOf(int fd) {
  Peer peer;
  ucred credentials{};
  socklen_t size = sizeof(credentials);
  if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &credentials, &size) == 0) {
    peer = {credentials.pid, credentials.uid, credentials.gid};
  }
  return peer;
}

}  // namespace

Connection::Connection(UniqueFd fd, const SocketServerOptions& options, Clock::time_point now)
    : fd_(std::move(fd)),
      options_(options),
      peer_(PeerOf(fd_.get())),
      reader_(options.max_request_bytes),
      last_active_(now),
      frame_start_(now) {}

short Connection::Events() const {
  switch (state_) {
    case State::kReading:
      return POLLIN;
    case State::kWriting:
      return POLLOUT;
    case State::kWorking:
      break;
  }
  return 0;
}

std::size_t Connection::Buffered() const {
  return reader_.Buffered() + writer_.Buffered() + working_bytes_;
}

Connection::Clock::time_point Connection::Deadline() const {
  switch (state_) {
    case State::kReading:
      return reader_.Begun() ? frame_start_ + options_.partial_timeout
                             : last_active_ + options_.idle_timeout;
    case State::kWriting:
      return last_active_ + options_.partial_timeout;
    case State::kWorking:
      break;
  }
  return Clock::time_point::max();
}

FrameStatus Connection::Read(std::string* request, Clock::time_point now) {
  if (!reader_.Begun()) frame_start_ = now;
  last_active_ = now;
  const FrameStatus status = reader_.Read(fd_.get());
  if (status == FrameStatus::kDone) {
    *request = reader_.Take();
    working_bytes_ = request->size();
    if (!request->empty() && request->back() == '\0') request->pop_back();
    state_ = State::kWorking;
  }
  return status;
}

void Connection::Answer(std::string reply, Clock::time_point now) {
  working_bytes_ = 0;
  last_active_ = now;
  writer_.Set(std::move(reply));
  state_ = State::kWriting;
}

FrameStatus Connection::Write(Clock::time_point now) {
  const std::size_t before = writer_.Sent();
  const FrameStatus status = writer_.Write(fd_.get());
  if (writer_.Sent() > before) last_active_ = now;
  if (status == FrameStatus::kDone) state_ = State::kReading;
  return status;
}

}  // namespace quarry::daemon
