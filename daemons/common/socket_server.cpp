#include "daemons/common/socket_server.h"

#include <poll.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <exception>
#include <limits>
#include <map>
#include <mutex>
#include <utility>
#include <vector>

#include "daemons/common/connection.h"
#include "daemons/common/listener.h"
#include "daemons/common/log.h"
#include "daemons/common/system_error.h"
#include "daemons/common/worker_pool.h"

namespace quarry::daemon {
namespace {

using Clock = Connection::Clock;
using State = Connection::State;

// How long no connection is accepted after the system has run out of descriptors or memory.
constexpr auto kAcceptPause = std::chrono::milliseconds(100);
// A server that ends takes requests until nobody has sent anything for that long, but not for
// longer than that altogether. On a machine that is busy all of that may pass before anybody is
// looked at, so it looks a few times whatever the time, and however long answering takes.
constexpr auto kSilence = std::chrono::milliseconds(20);
constexpr auto kLastRequestsTime = std::chrono::milliseconds(100);
constexpr int kLeastLooks = 8;
constexpr std::size_t kMaxReplyBytes = std::numeric_limits<std::uint32_t>::max();

UniqueFd NewEventFd() {
  UniqueFd fd(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC));
  if (!fd.valid()) ThrowSystemError("Cannot make an event descriptor");
  return fd;
}

void Signal(int event_fd) {
  const int saved = errno;
  const std::uint64_t one = 1;
  // A counter that is full is readable already.
  if (write(event_fd, &one, sizeof(one)) < 0) errno = 0;
  errno = saved;
}

void Drain(int event_fd) {
  std::uint64_t count;
  if (read(event_fd, &count, sizeof(count)) < 0) errno = 0;
}

int PollTimeout(Clock::time_point until, Clock::time_point now, int limit_ms) {
  if (until == Clock::time_point::max()) return limit_ms;
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(until - now).count();
  const auto clamped = std::clamp<long long>(left, 0, std::numeric_limits<int>::max());
  return limit_ms < 0 ? static_cast<int>(clamped)
                      : static_cast<int>(std::min<long long>(clamped, limit_ms));
}

// The handler's answer; empty when it failed.
std::string RunHandler(const RequestHandler& handler, std::string request, const Peer& peer) {
  std::string reply;
  try {
    reply = handler(std::move(request), peer);
  } catch (const std::exception& error) {
    LogError(std::string("A request failed: ") + error.what());
    return std::string();
  }
  if (reply.size() <= kMaxReplyBytes) return reply;
  LogError("An answer of " + std::to_string(reply.size()) + " bytes is too long to be sent");
  return std::string();
}

// Answers that workers have made and the loop has not yet taken over.
class Outbox {
 public:
  Outbox() : event_(NewEventFd()) {}

  int fd() const { return event_.get(); }

  void Put(std::uint64_t id, std::string reply) {
    {
      const std::lock_guard<std::mutex> lock(mutex_);
      replies_.emplace_back(id, std::move(reply));
    }
    Signal(event_.get());
  }

  std::vector<std::pair<std::uint64_t, std::string>> TakeAll() {
    Drain(event_.get());
    const std::lock_guard<std::mutex> lock(mutex_);
    return std::exchange(replies_, {});
  }

 private:
  UniqueFd event_;
  std::mutex mutex_;
  std::vector<std::pair<std::uint64_t, std::string>> replies_;
};

}  // namespace

class SocketServer::Impl {
 public:
  Impl(const std::string& path, RequestHandler handler, const SocketServerOptions& options)
      : options_(options),
        handler_(std::move(handler)),
        listener_(std::make_unique<Listener>(path)),
        wake_(NewEventFd()),
        pool_(std::make_unique<WorkerPool>(options.workers)) {}

  int Step(int timeout_ms);
  void Wake() { Signal(wake_.get()); }
  void WakeOn(int fd) { wake_fds_.push_back(fd); }
  bool Finish(int timeout_ms);
  std::size_t ConnectionCount() const { return connections_.size(); }

 private:
  using Connections = std::map<std::uint64_t, Connection>;

  void FillPoll(Clock::time_point now);
  bool WantsAccept(Clock::time_point now);
  Clock::time_point NextDeadline(Clock::time_point now) const;
  Clock::time_point NextEviction() const;

  void ServeConnections();
  bool Serve(std::uint64_t id, Connection& connection, short events);
  bool ServeInput(std::uint64_t id, Connection& connection);
  bool Dispatch(std::uint64_t id, Connection& connection, std::string request);
  bool Reply(Connection& connection, std::string reply);
  void TakeReplies();
  void Account(Connection& connection, std::size_t before);
  void Close(Connections::iterator it);
  void CloseOverdue();
  void AcceptAll();
  bool MakeRoom();
  void TakeLastRequests(Clock::time_point end);
  void CloseIdle();
  bool HasWorkLeft() const;

  const SocketServerOptions options_;
  const RequestHandler handler_;
  std::unique_ptr<Listener> listener_;
  UniqueFd wake_;
  std::vector<int> wake_fds_;
  Outbox outbox_;
  Connections connections_;
  std::uint64_t next_id_ = 0;
  std::size_t buffered_ = 0;
  int taken_ = 0;
  int ready_ = 0;  // descriptors with which the last Step() had to do
  bool finishing_ = false;
  Clock::time_point accept_from_ = Clock::time_point::min();

  // What poll() is asked: the fixed descriptors, then polled_ids_' connections in order.
  std::vector<pollfd> poll_fds_;
  std::vector<std::uint64_t> polled_ids_;

  // Last, so that its threads end before what they use.
  std::unique_ptr<WorkerPool> pool_;
};

int SocketServer::Impl::Step(int timeout_ms) {
  taken_ = 0;
  const Clock::time_point now = Clock::now();
  FillPoll(now);
  const int timeout = PollTimeout(NextDeadline(now), now, timeout_ms);
  ready_ = poll(poll_fds_.data(), poll_fds_.size(), timeout);
  if (ready_ < 0 && errno != EINTR) ThrowSystemError("Cannot wait for connections");
  if (ready_ > 0) {
    if (poll_fds_[0].revents != 0) Drain(wake_.get());
    if (poll_fds_[1].revents != 0) TakeReplies();
    ServeConnections();
    if (poll_fds_[2].revents != 0) AcceptAll();
  }
  CloseOverdue();
  return taken_;
}

// The order of the first three is what Step() relies on. A negative descriptor is passed over.
void SocketServer::Impl::FillPoll(Clock::time_point now) {
  poll_fds_.clear();
  polled_ids_.clear();
  poll_fds_.push_back({wake_.get(), POLLIN, 0});
  poll_fds_.push_back({outbox_.fd(), POLLIN, 0});
  poll_fds_.push_back({WantsAccept(now) ? listener_->fd() : -1, POLLIN, 0});
  for (const auto& [id, connection] : connections_) {
    poll_fds_.push_back({connection.fd(), connection.Events(), 0});
    polled_ids_.push_back(id);
  }
  for (const int fd : wake_fds_) poll_fds_.push_back({fd, POLLIN, 0});
}

bool SocketServer::Impl::WantsAccept(Clock::time_point now) {
  if (finishing_ || now < accept_from_) return false;
  return connections_.size() < options_.max_connections || NextEviction() <= now;
}

Clock::time_point SocketServer::Impl::NextDeadline(Clock::time_point now) const {
  Clock::time_point next = Clock::time_point::max();
  for (const auto& [id, connection] : connections_) next = std::min(next, connection.Deadline());
  if (accept_from_ > now) next = std::min(next, accept_from_);
  if (!finishing_ && connections_.size() >= options_.max_connections) {
    const Clock::time_point eviction = NextEviction();
    if (eviction > now) next = std::min(next, eviction);
  }
  return next;
}

// When the most silent connection may be given up for another.
Clock::time_point SocketServer::Impl::NextEviction() const {
  Clock::time_point next = Clock::time_point::max();
  for (const auto& [id, connection] : connections_) {
    if (connection.state() == State::kWorking) continue;
    next = std::min(next, connection.LastActive() + options_.evict_after);
  }
  return next;
}

void SocketServer::Impl::ServeConnections() {
  constexpr std::size_t kFixed = 3;
  for (std::size_t i = 0; i < polled_ids_.size(); ++i) {
    const short events = poll_fds_[kFixed + i].revents;
    if (events == 0) continue;
    const auto it = connections_.find(polled_ids_[i]);
    if (it == connections_.end()) continue;
    const std::size_t before = it->second.Buffered();
    const bool keep = Serve(it->first, it->second, events);
    Account(it->second, before);
    if (!keep || buffered_ > options_.max_buffered_bytes) Close(it);
  }
}

// Whether the connection is kept.
bool SocketServer::Impl::Serve(std::uint64_t id, Connection& connection, short events) {
  switch (connection.state()) {
    case State::kReading:
      return ServeInput(id, connection);
    case State::kWriting:
      return connection.Write(Clock::now()) != FrameStatus::kEnd;
    // Only a peer that is gone is reported here. Its request goes on, its answer is dropped.
    case State::kWorking:
      return (events & (POLLHUP | POLLERR | POLLNVAL)) == 0;
  }
  return false;
}

bool SocketServer::Impl::ServeInput(std::uint64_t id, Connection& connection) {
  std::string request;
  const FrameStatus status = connection.Read(&request, Clock::now());
  if (status == FrameStatus::kEnd) return false;
  if (status != FrameStatus::kDone) return true;
  ++taken_;
  return Dispatch(id, connection, std::move(request));
}

bool SocketServer::Impl::Dispatch(std::uint64_t id, Connection& connection, std::string request) {
  if (options_.workers == 0) {
    return Reply(connection, RunHandler(handler_, std::move(request), connection.peer()));
  }
  pool_->Add([this, id, peer = connection.peer(), request = std::move(request)]() mutable {
    outbox_.Put(id, RunHandler(handler_, std::move(request), peer));
  });
  return true;
}

// Begins to send at once: most answers fit the socket's buffer.
bool SocketServer::Impl::Reply(Connection& connection, std::string reply) {
  if (reply.empty()) return false;
  const Clock::time_point now = Clock::now();
  connection.Answer(std::move(reply), now);
  return connection.Write(now) != FrameStatus::kEnd;
}

void SocketServer::Impl::TakeReplies() {
  for (auto& [id, reply] : outbox_.TakeAll()) {
    const auto it = connections_.find(id);
    if (it == connections_.end()) continue;
    const std::size_t before = it->second.Buffered();
    const bool keep = Reply(it->second, std::move(reply));
    Account(it->second, before);
    if (!keep || buffered_ > options_.max_buffered_bytes) Close(it);
  }
}

void SocketServer::Impl::Account(Connection& connection, std::size_t before) {
  buffered_ += connection.Buffered();
  buffered_ -= before;
}

void SocketServer::Impl::Close(Connections::iterator it) {
  buffered_ -= it->second.Buffered();
  connections_.erase(it);
}

void SocketServer::Impl::CloseOverdue() {
  const Clock::time_point now = Clock::now();
  for (auto it = connections_.begin(); it != connections_.end();) {
    const auto next = std::next(it);
    if (it->second.Deadline() <= now) Close(it);
    it = next;
  }
}

// Called when somebody waits for certain; only then is another one given up for it.
void SocketServer::Impl::AcceptAll() {
  const Clock::time_point now = Clock::now();
  if (connections_.size() >= options_.max_connections && !MakeRoom()) return;
  while (connections_.size() < options_.max_connections) {
    UniqueFd fd = listener_->Accept();
    if (!fd.valid()) {
      if (errno != EAGAIN) accept_from_ = now + kAcceptPause;
      return;
    }
    connections_.try_emplace(next_id_++, std::move(fd), options_, now);
  }
}

// Gives up the connection that has been silent the longest, if that is long enough.
bool SocketServer::Impl::MakeRoom() {
  auto oldest = connections_.end();
  for (auto it = connections_.begin(); it != connections_.end(); ++it) {
    if (it->second.state() == State::kWorking) continue;
    if (oldest == connections_.end() || it->second.LastActive() < oldest->second.LastActive()) {
      oldest = it;
    }
  }
  if (oldest == connections_.end()) return false;
  if (oldest->second.LastActive() + options_.evict_after > Clock::now()) return false;
  Close(oldest);
  return true;
}

bool SocketServer::Impl::HasWorkLeft() const {
  return std::any_of(connections_.begin(), connections_.end(),
                     [](const auto& entry) { return entry.second.state() != State::kReading; });
}

// Who has connected already may wait for an answer without end, however the connection ends.
void SocketServer::Impl::TakeLastRequests(Clock::time_point end) {
  wake_fds_.clear();
  listener_->Unlink();
  end = std::min(end, Clock::now() + kLastRequestsTime);
  for (int looks = 0; looks < kLeastLooks || Clock::now() < end; ++looks) {
    Step(PollTimeout(end, Clock::now(), kSilence.count()));
    if (ready_ == 0) return;
  }
}

void SocketServer::Impl::CloseIdle() {
  for (auto it = connections_.begin(); it != connections_.end();) {
    const auto next = std::next(it);
    if (it->second.state() == State::kReading) Close(it);
    it = next;
  }
}

bool SocketServer::Impl::Finish(int timeout_ms) {
  const Clock::time_point end = Clock::now() + std::chrono::milliseconds(timeout_ms);
  if (!finishing_) TakeLastRequests(end);
  finishing_ = true;
  listener_.reset();
  while (true) {
    CloseIdle();
    if (!HasWorkLeft()) return true;
    const Clock::time_point now = Clock::now();
    if (now >= end) return false;
    Step(PollTimeout(end, now, -1));
  }
}

SocketServer::SocketServer(const std::string& path, RequestHandler handler,
                           SocketServerOptions options)
    : impl_(std::make_unique<Impl>(path, std::move(handler), options)) {}

SocketServer::~SocketServer() = default;

int SocketServer::Step(int timeout_ms) {
  return impl_->Step(timeout_ms);
}

void SocketServer::Wake() {
  impl_->Wake();
}

void SocketServer::WakeOn(int fd) {
  impl_->WakeOn(fd);
}

bool SocketServer::Finish(int timeout_ms) {
  return impl_->Finish(timeout_ms);
}

std::size_t SocketServer::ConnectionCount() const {
  return impl_->ConnectionCount();
}

}  // namespace quarry::daemon
