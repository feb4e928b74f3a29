// One peer of a SocketServer: what it has sent so far, and what it is owed.

#ifndef QUARRY_DAEMONS_COMMON_CONNECTION_H_
#define QUARRY_DAEMONS_COMMON_CONNECTION_H_

#include <chrono>
#include <cstddef>
#include <string>

#include "common/unique_fd.h"
#include "daemons/common/frame.h"
#include "daemons/common/socket_server.h"

namespace quarry::daemon {

// A connection is always in one of three states, and each request leads through all of them, so
// that requests are answered in order and a peer that sends ahead waits in the kernel.
class Connection {
 public:
  using Clock = std::chrono::steady_clock;
  enum class State { kReading, kWorking, kWriting };

  // `fd` is a connected, non-blocking stream socket.
  Connection(UniqueFd fd, const SocketServerOptions& options, Clock::time_point now);

  int fd() const { return fd_.get(); }
  State state() const { return state_; }
  const Peer& peer() const { return peer_; }
  // The poll events to wait for in this state; 0 while the request is worked on.
  short Events() const;
  // The bytes held for this connection.
  std::size_t Buffered() const;
  // When the peer has been given enough time; the end of time while the request is worked on.
  Clock::time_point Deadline() const;
  // When something last came from or went to the peer.
  Clock::time_point LastActive() const { return last_active_; }

  // Reads. kDone: a request is whole, is in *request, and the state is kWorking.
  FrameStatus Read(std::string* request, Clock::time_point now);
  // Begins to send an answer; the state is kWriting.
  void Answer(std::string reply, Clock::time_point now);
  // Sends. kDone: the state is kReading again.
  FrameStatus Write(Clock::time_point now);

 private:
  UniqueFd fd_;
  SocketServerOptions options_;
  Peer peer_;
  State state_ = State::kReading;
  FrameReader reader_;
  FrameWriter writer_;
  std::size_t working_bytes_ = 0;
  Clock::time_point last_active_;
  Clock::time_point frame_start_;
};

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_CONNECTION_H_
