#include "tests/daemons/tarncontentextractd/support/running_extractor.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <stdexcept>

#include "daemons/common/client.h"
#include "tests/daemons/tarncontentextractd/support/extract_support.h"
#include "tests/support/files.h"
#include "tests/support/root.h"

namespace quarry::extract {
namespace {

constexpr std::chrono::minutes kPatience{1};

std::string Words(int status) {
  return WIFSIGNALED(status) ? "signal " + std::to_string(WTERMSIG(status))
                             : "exit code " + std::to_string(WEXITSTATUS(status));
}

}  // namespace

RunningExtractor::RunningExtractor(const std::vector<std::string>& arguments) {
  std::vector<char*> words{const_cast<char*>(QUARRY_EXTRACTOR)};
  for (const std::string& each : arguments) words.push_back(const_cast<char*>(each.c_str()));
  words.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, (dir_ / "output").c_str(),
                                   O_CREAT | O_WRONLY | O_APPEND, 0600);
  posix_spawn_file_actions_adddup2(&actions, STDOUT_FILENO, STDERR_FILENO);
  const int error = posix_spawn(&pid_, words[0], &actions, nullptr, words.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  if (error != 0) throw std::runtime_error("cannot start the extractor");
}

RunningExtractor::~RunningExtractor() {
  if (pid_ < 0) return;
  kill(pid_, SIGKILL);
  waitpid(pid_, nullptr, 0);
}

bool RunningExtractor::IsReady() const {
  return test::WaitUntil([] { return daemon::IsListening(SocketPath()); }, kPatience);
}

void RunningExtractor::Signal(int signal) const {
  kill(pid_, signal);
}

std::string RunningExtractor::End() {
  int status = 0;
  if (!test::WaitUntil([&] { return waitpid(pid_, &status, WNOHANG) == pid_; }, kPatience)) {
    return "none";
  }
  pid_ = -1;
  return Words(status);
}

std::string RunningExtractor::Output() const {
  return test::ReadFile(dir_ / "output");
}

std::string RunningExtractor::SocketPath() {
  return test::TestRoot() + "/var/run/tarncontentextractd.sock";
}

Json::Value RunningExtractor::Ask(const std::string& path, bool need_meta) {
  Json::Value request;
  request["command"] = "parse";
  request["data"]["path"] = path;
  request["data"]["options"]["need_meta"] = need_meta;
  daemon::ClientOptions options;
  options.timeout = kPatience;
  return daemon::Request("tarncontentextractd", SocketPath(), request, options);
}

std::vector<pid_t> RunningExtractor::Workers() const {
  std::vector<pid_t> workers;
  for (const auto& entry : std::filesystem::directory_iterator("/proc")) {
    const pid_t pid = std::atoi(entry.path().filename().c_str());
    if (pid > 0 && ProcessStatus(pid, "PPid") == std::to_string(pid_)) workers.push_back(pid);
  }
  return workers;
}

}  // namespace quarry::extract
