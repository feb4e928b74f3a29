// What "quarry run" does.

#include <unistd.h>

#include <optional>

#include "cli/doctor/checks.h"
#include "cli/layout.h"
#include "cli/problem.h"
#include "cli/supervisor/supervisor.h"
#include "cli/system.h"
#include "common/file_util.h"
#include "common/json.h"
#include "daemons/common/log.h"
#include "daemons/common/single_instance.h"
#include "daemons/common/socket_server.h"
#include "daemons/common/stop_signal.h"

namespace quarry::cli {
namespace {

constexpr int kStepMilliseconds = 50;

std::string OwnProgram() {
  const std::string path = RealPath("/proc/self/exe");
  if (path.empty()) throw Problem("Cannot tell where this program lies; is /proc mounted?");
  return path;
}

// The daemons lie beside this program, in a build tree as after an installation.
std::vector<ServiceSpec> Services(bool full_speed) {
  const std::string directory = Dirname(OwnProgram()) + "/";
  std::vector<std::string> speed;
  if (full_speed) speed.emplace_back("--full-speed");
  return {{"tarnelasticd", directory + "tarnelasticd", EngineSocket(), true},
          {"tarncontentextractd", directory + "tarncontentextractd", ExtractorSocket(), false},
          {"fileindexd", directory + "fileindexd", IndexDaemonSocket(), false, speed},
          {"tarnotifyd", directory + "tarnotifyd", "", true}};
}

std::string Answer(Supervisor& supervisor, const std::string& text) {
  Json::Value request;
  if (!fromString(request, text)) return {};
  return toString(supervisor.Handle(request));
}

}  // namespace

void RunSystem(bool full_speed) {
  EnsureLayout();
  daemon::OpenLog("quarry", true);
  const daemon::SingleInstance instance("quarry");
  Examination(true).Part("what is left of dead processes", CheckLeftovers);
  daemon::StopSignal stop;
  Supervisor supervisor(Services(full_speed));
  std::optional<daemon::SocketServer> server;
  server.emplace(SupervisorSocket(), [&](const std::string& request, const daemon::Peer&) {
    return Answer(supervisor, request);
  });
  server->WakeOn(stop.Fd());
  supervisor.Step();
  // Whether the other services are needed is for the folder list to say, and bringing them up means
  // asking this very supervisor; so another process does it.
  std::optional<Child> prepare(Child(OwnProgram(), {"prepare-services"}));
  while (!stop.Requested()) {
    server->Step(kStepMilliseconds);
    supervisor.Step();
    if (!prepare) continue;
    if (const auto end = prepare->Ended()) {
      if (*end != "exit code 0") daemon::LogError("preparing the services failed: " + *end);
      prepare.reset();
    }
  }
  daemon::LogInfo("stopping");
  prepare.reset();
  // Nobody is to wait for answers of a system that is going.
  server.reset();
  supervisor.StopAll();
}

}  // namespace quarry::cli
