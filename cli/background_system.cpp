#include "cli/background_system.h"

#include <chrono>
#include <csignal>
#include <thread>

#include "cli/layout.h"
#include "cli/problem.h"
#include "cli/system.h"
#include "common/file_util.h"
#include "common/paths.h"
#include "daemons/common/client.h"
#include "daemons/common/single_instance.h"

namespace quarry::cli {
namespace {

constexpr std::chrono::seconds kStartTime{30};
constexpr int kStopMilliseconds = 30'000;

// A system may be about to end, as when the command before this one was interrupted, or to start.
void WaitUntilUpOrDown(std::chrono::steady_clock::time_point deadline) {
  const std::string pid_file = daemon::PidFilePath("quarry");
  while (daemon::RunningPid(pid_file) > 0 && !SupervisorAnswers() &&
         std::chrono::steady_clock::now() < deadline) {
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
  }
}

}  // namespace

BackgroundSystem::BackgroundSystem() {
  EnsureLayout();
  const auto deadline = std::chrono::steady_clock::now() + kStartTime;
  WaitUntilUpOrDown(deadline);
  if (ServicesAreManaged()) return;
  const std::string log = RootedPath("/var/log/quarry.log");
  supervisor_.emplace(RealPath("/proc/self/exe"), std::vector<std::string>{"run"}, log);
  while (!daemon::IsListening(SupervisorSocket()) || !daemon::IsListening(EngineSocket())) {
    if (supervisor_->WaitEnded(20)) {
      throw Problem("The system does not start (" + *supervisor_->Ended() + "); see " + log);
    }
    if (std::chrono::steady_clock::now() > deadline) {
      throw Problem("The system is not ready after 30 s; see " + log);
    }
  }
}

BackgroundSystem::~BackgroundSystem() {
  if (!supervisor_) return;
  supervisor_->Signal(SIGTERM);
  supervisor_->WaitEnded(kStopMilliseconds);
}

}  // namespace quarry::cli
