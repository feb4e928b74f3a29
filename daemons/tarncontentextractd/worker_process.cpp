#include "daemons/tarncontentextractd/worker_process.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "daemons/common/system_error.h"
#include "daemons/tarncontentextractd/sandbox.h"
#include "daemons/tarncontentextractd/worker.h"
#include "daemons/tarncontentextractd/worker_protocol.h"

namespace quarry::extract {
namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;

// An answer is stored in such steps, so that memory follows what arrives and not what is claimed.
constexpr std::size_t kReadStep = std::size_t{1} << 20;
// Room for many answers of the usual size, which is kept.
constexpr std::size_t kInboxBytes = std::size_t{128} << 10;

// How a child is to begin: alone in its group, without the daemon's signal mask, terminal or files.
class SpawnPlan {
 public:
  explicit SpawnPlan(int channel) {
    posix_spawn_file_actions_init(&actions_);
    posix_spawnattr_init(&attributes_);
    PlanFiles(channel);
    PlanSignals();
  }
  ~SpawnPlan() {
    posix_spawnattr_destroy(&attributes_);
    posix_spawn_file_actions_destroy(&actions_);
  }
  SpawnPlan(const SpawnPlan&) = delete;
  SpawnPlan& operator=(const SpawnPlan&) = delete;

  int Spawn(const std::vector<std::string>& command, pid_t* pid) const {
    std::vector<char*> arguments;
    for (const std::string& argument : command) {
      arguments.push_back(const_cast<char*>(argument.c_str()));
    }
    arguments.push_back(nullptr);
    return posix_spawn(pid, arguments[0], &actions_, &attributes_, arguments.data(), environ);
  }

 private:
  void PlanFiles(int channel) {
    posix_spawn_file_actions_adddup2(&actions_, channel, kWorkerChannel);
    // Opened for reading only, all three: a worker holds nothing that could be written to. A
    // sanitizer's report must be seen, however.
    const int last = kSandboxed ? STDERR_FILENO : STDOUT_FILENO;
    for (int fd = STDIN_FILENO; fd <= last; ++fd) {
      posix_spawn_file_actions_addopen(&actions_, fd, "/dev/null", O_RDONLY, 0);
    }
  }

  void PlanSignals() {
    sigset_t none;
    sigset_t all;
    sigemptyset(&none);
    sigfillset(&all);
    posix_spawnattr_setsigmask(&attributes_, &none);
    posix_spawnattr_setsigdefault(&attributes_, &all);
    posix_spawnattr_setpgroup(&attributes_, 0);
    posix_spawnattr_setflags(
        &attributes_, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETPGROUP);
  }

  posix_spawn_file_actions_t actions_;
  posix_spawnattr_t attributes_;
};

int MillisecondsUntil(Clock::time_point deadline) {
  const auto left = std::chrono::ceil<milliseconds>(deadline - Clock::now()).count();
  return static_cast<int>(std::clamp<decltype(left)>(left, 0, 1000000));
}

std::string DescribeEnd(int status) {
  if (WIFSIGNALED(status)) return "was ended by signal " + std::to_string(WTERMSIG(status));
  return "ended with code " + std::to_string(WEXITSTATUS(status));
}

std::string Describe(WorkerOutcome outcome, const std::string& ending) {
  if (outcome == WorkerOutcome::kDied) return "it " + ending;
  return outcome == WorkerOutcome::kTimedOut ? "it does not get ready" : "the daemon stops";
}

}  // namespace

WorkerProcess::WorkerProcess(const std::vector<std::string>& command, milliseconds timeout,
                             int stop_fd)
    : stop_fd_(stop_fd) {
  int ends[2] = {-1, -1};
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
    daemon::ThrowSystemError("Cannot make a worker's channel");
  }
  channel_.Reset(ends[0]);
  UniqueFd theirs(ends[1]);
  Spawn(command, theirs.get());
  // Else the end of the worker could not be told from its silence.
  theirs.Reset();
  std::string_view text;
  const WorkerOutcome outcome = ReadMessage(&text, Clock::now() + timeout);
  if (outcome == WorkerOutcome::kDone && text == kReady) return;
  const std::string ending = End();
  throw Error(kErrorSystem, outcome == WorkerOutcome::kDone
                                ? "Its sandbox did not close: " + std::string(text)
                                : "Worker not started: " + Describe(outcome, ending));
}

WorkerProcess::~WorkerProcess() {
  End();
}

void WorkerProcess::Spawn(const std::vector<std::string>& command, int channel) {
  const int error = SpawnPlan(channel).Spawn(command, &pid_);
  if (error == 0) return;
  pid_ = -1;
  errno = error;
  daemon::ThrowSystemError("Cannot start " + command[0]);
}

std::string WorkerProcess::End() {
  if (pid_ < 0) return ending_;
  // The group first: its leader cannot be taken for another process before it has been waited for.
  kill(-pid_, SIGKILL);
  kill(pid_, SIGKILL);
  int status = 0;
  pid_t ended = -1;
  do {
    ended = waitpid(pid_, &status, 0);
  } while (ended < 0 && errno == EINTR);
  ending_ = DescribeEnd(status);
  pid_ = -1;
  channel_.Reset();
  return ending_;
}

WorkerOutcome WorkerProcess::WaitReadable(Deadline deadline) const {
  std::array<pollfd, 2> watched{{{channel_.get(), POLLIN, 0}, {stop_fd_, POLLIN, 0}}};
  int ready = 0;
  do {
    ready = poll(watched.data(), watched.size(), MillisecondsUntil(deadline));
  } while (ready < 0 && errno == EINTR);
  if (watched[0].revents != 0) return WorkerOutcome::kDone;
  if (watched[1].revents != 0) return WorkerOutcome::kStopped;
  return ready == 0 ? WorkerOutcome::kTimedOut : WorkerOutcome::kDied;
}

bool WorkerProcess::HasSpoken() const {
  if (begin_ < end_) return true;
  char byte = 0;
  return recv(channel_.get(), &byte, sizeof(byte), MSG_PEEK | MSG_DONTWAIT) >= 0;
}

// Reads until there are `wanted` bytes to look at, and whatever else has come by then.
WorkerOutcome WorkerProcess::ReadMore(std::size_t wanted, Deadline deadline) {
  if (begin_ == end_) begin_ = end_ = 0;
  while (end_ - begin_ < wanted) {
    if (begin_ + std::min(wanted, end_ - begin_ + kReadStep) > inbox_.size()) {
      inbox_.erase(0, begin_);
      end_ -= begin_;
      begin_ = 0;
      inbox_.resize(std::max(kInboxBytes, std::min(wanted, end_ + kReadStep)));
    }
    const ssize_t count =
        recv(channel_.get(), inbox_.data() + end_, inbox_.size() - end_, MSG_DONTWAIT);
    if (count > 0) {
      end_ += static_cast<std::size_t>(count);
    } else if (count == 0 || (errno != EINTR && errno != EAGAIN)) {
      return WorkerOutcome::kDied;
    } else {
      const WorkerOutcome outcome = WaitReadable(deadline);
      if (outcome != WorkerOutcome::kDone) return outcome;
    }
  }
  return WorkerOutcome::kDone;
}

// The text is good until more is read.
WorkerOutcome WorkerProcess::ReadMessage(std::string_view* text, Deadline deadline) {
  std::uint32_t size = 0;
  WorkerOutcome outcome = ReadMore(sizeof(size), deadline);
  if (outcome != WorkerOutcome::kDone) return outcome;
  std::memcpy(&size, inbox_.data() + begin_, sizeof(size));
  if (size > kMaxAnswerBytes) return WorkerOutcome::kDied;
  outcome = ReadMore(sizeof(size) + size, deadline);
  if (outcome != WorkerOutcome::kDone) return outcome;
  *text = std::string_view(inbox_).substr(begin_ + sizeof(size), size);
  begin_ += sizeof(size) + size;
  return outcome;
}

// Returns how many it takes.
std::size_t WorkerProcess::Send(const std::vector<WorkerFile>& files) {
  std::size_t sent = 0;
  while (sent < files.size() &&
         SendRequest(channel_.get(), next_ + static_cast<std::uint32_t>(sent),
                     files[sent].extension, files[sent].fd)) {
    ++sent;
  }
  return sent;
}

WorkerOutcome WorkerProcess::Parse(const std::vector<WorkerFile>& files, milliseconds timeout,
                                   std::vector<std::vector<Field>>* out) {
  out->clear();
  // What comes before it is asked for, or where nothing is taken, comes from no worker of ours.
  if (HasSpoken()) return WorkerOutcome::kDied;
  const std::size_t sent = Send(files);
  if (sent == 0) return WorkerOutcome::kDied;
  std::size_t bytes = 0;
  while (out->size() < sent) {
    std::string_view answer;
    const WorkerOutcome outcome = ReadMessage(&answer, Clock::now() + timeout);
    if (outcome != WorkerOutcome::kDone) return outcome;
    bytes += answer.size();
    std::vector<Field> fields;
    // All together take no more room than one may.
    if (bytes > kMaxAnswerBytes || !ReadAnswer(answer, next_, &fields)) return WorkerOutcome::kDied;
    out->push_back(std::move(fields));
    ++next_;
    ++files_done_;
  }
  if (begin_ == end_ && inbox_.size() > kInboxBytes) inbox_ = std::string();
  return WorkerOutcome::kDone;
}

}  // namespace quarry::extract
