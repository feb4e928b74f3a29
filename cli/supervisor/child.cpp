#include "cli/supervisor/child.h"

#include <fcntl.h>
#include <linux/close_range.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstring>
#include <utility>

#include "cli/problem.h"

namespace quarry::cli {
namespace {

using std::chrono::duration_cast;
using std::chrono::steady_clock;

// False, with errno set, when a file cannot be opened.
bool Redirect(const char* output) {
  const int in = open("/dev/null", O_RDONLY | O_CLOEXEC);
  const int out = open(output, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
  return in >= 0 && out >= 0 && dup2(in, STDIN_FILENO) >= 0 && dup2(out, STDOUT_FILENO) >= 0 &&
         dup2(out, STDERR_FILENO) >= 0;
}

// Runs in the child between fork and exec: nothing here may allocate or lock.
[[noreturn]] void Become(const char* program, char* const* arguments, const char* output,
                         pid_t parent, int report) {
  sigset_t none;
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &none, nullptr);
  signal(SIGPIPE, SIG_DFL);
  setpgid(0, 0);
  prctl(PR_SET_PDEATHSIG, SIGTERM);
  // A parent that died before the line above would never be noticed.
  if (getppid() != parent) _exit(1);
  syscall(SYS_close_range, 3U, ~0U, CLOSE_RANGE_CLOEXEC);
  if (output == nullptr || Redirect(output)) execv(program, arguments);
  const int error = errno;
  if (write(report, &error, sizeof(error)) < 0) _exit(126);
  _exit(127);
}

std::string Describe(int status) {
  if (WIFEXITED(status)) return "exit code " + std::to_string(WEXITSTATUS(status));
  return "signal " + std::to_string(WTERMSIG(status));
}

// What exec's failure was, or 0: the pipe closes by itself when exec succeeds.
int ReadExecError(int fd) {
  int error = 0;
  ssize_t got = 0;
  do {
    got = read(fd, &error, sizeof(error));
  } while (got < 0 && errno == EINTR);
  return got == static_cast<ssize_t>(sizeof(error)) ? error : 0;
}

}  // namespace

Child::Child(const std::string& program, const std::vector<std::string>& arguments,
             const std::string& output) {
  std::vector<char*> list{const_cast<char*>(program.c_str())};
  for (const std::string& argument : arguments) list.push_back(const_cast<char*>(argument.c_str()));
  list.push_back(nullptr);

  int report[2];
  if (pipe2(report, O_CLOEXEC) != 0) {
    throw Problem("Cannot start " + program + ": " + std::strerror(errno));
  }
  const pid_t parent = getpid();
  pid_ = fork();
  if (pid_ == 0) {
    Become(program.c_str(), list.data(), output.empty() ? nullptr : output.c_str(), parent,
           report[1]);
  }
  int error = pid_ < 0 ? errno : 0;
  close(report[1]);
  if (pid_ > 0) error = ReadExecError(report[0]);
  close(report[0]);
  if (error == 0) return;
  if (pid_ > 0) waitpid(pid_, nullptr, 0);
  pid_ = -1;
  throw Problem("Cannot start " + program + ": " + std::strerror(error));
}

Child::~Child() {
  if (pid_ < 0 || Ended()) return;
  Signal(SIGKILL);
  waitpid(pid_, nullptr, 0);
}

Child::Child(Child&& other) noexcept
    : pid_(std::exchange(other.pid_, -1)), end_(std::move(other.end_)) {}

Child& Child::operator=(Child&& other) noexcept {
  std::swap(pid_, other.pid_);
  std::swap(end_, other.end_);
  return *this;
}

std::optional<std::string> Child::Ended() {
  if (end_) return end_;
  int status = 0;
  if (waitpid(pid_, &status, WNOHANG) == pid_) end_ = Describe(status);
  return end_;
}

bool Child::WaitEnded(int milliseconds) {
  const auto deadline = steady_clock::now() + std::chrono::milliseconds(milliseconds);
  const int fd = Ended() ? -1 : static_cast<int>(syscall(SYS_pidfd_open, pid_, 0));
  while (!Ended()) {
    const auto left = duration_cast<std::chrono::milliseconds>(deadline - steady_clock::now());
    if (left.count() <= 0) break;
    pollfd poller{fd, POLLIN, 0};
    // A descriptor may report the end of a program whose other threads are still being taken down,
    // which waitpid then does not see yet.
    if (poll(&poller, 1, fd < 0 ? 1 : static_cast<int>(left.count())) > 0) poll(nullptr, 0, 1);
  }
  if (fd >= 0) close(fd);
  return end_.has_value();
}

void Child::Signal(int signal) const {
  if (pid_ > 0 && !end_) kill(pid_, signal);
}

}  // namespace quarry::cli
