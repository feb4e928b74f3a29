#include "cli/supervisor/supervisor.h"

#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <utility>

#include "cli/problem.h"
#include "common/json.h"
#include "daemons/common/client.h"
#include "daemons/common/log.h"
#include "daemons/common/reply.h"

namespace quarry::cli {
namespace {

using std::chrono::milliseconds;

constexpr milliseconds kFirstPause{200};
constexpr milliseconds kLongestPause{30'000};
// A service that ran this long is not in a loop of dying.
constexpr milliseconds kStableTime{10'000};
constexpr milliseconds kReadyTime{10'000};
constexpr int kStopMilliseconds = 10'000;

}  // namespace

Supervisor::Supervisor(std::vector<ServiceSpec> services, std::function<Clock::time_point()> now)
    : now_(std::move(now)) {
  for (ServiceSpec& spec : services) {
    const std::string name = spec.name;
    services_[name].spec = std::move(spec);
  }
}

void Supervisor::Step() {
  for (auto& [name, service] : services_) {
    Reap(service);
    if (!service.spec.wanted || service.child || now_() < service.due) continue;
    try {
      Spawn(service);
    } catch (const Problem& problem) {
      daemon::LogError(problem.what());
      service.last_end = problem.what();
      service.due = now_() + kLongestPause;
    }
  }
}

void Supervisor::Start(const std::string& name) {
  Service& service = Find(name);
  service.spec.wanted = true;
  Reap(service);
  if (!service.child) Spawn(service);
  WaitUntilListening(service);
}

void Supervisor::Stop(const std::string& name, bool force) {
  Service& service = Find(name);
  service.spec.wanted = false;
  if (service.child) {
    daemon::LogInfo("stopping " + name);
    service.child->Signal(force ? SIGKILL : SIGTERM);
    End(service, force);
  }
}

void Supervisor::StopAll() {
  for (auto& [name, service] : services_) {
    service.spec.wanted = false;
    if (service.child) service.child->Signal(SIGTERM);
  }
  for (auto& [name, service] : services_) {
    if (service.child) End(service, false);
  }
}

Json::Value Supervisor::Handle(const Json::Value& request) {
  try {
    return Serve(request);
  } catch (const Error& error) {
    return daemon::FailureReply(error.code(), error.reason());
  } catch (const Problem& problem) {
    return daemon::FailureReply(kErrorSystem, problem.what());
  }
}

Supervisor::Service& Supervisor::Find(const std::string& name) {
  const auto found = services_.find(name);
  if (found == services_.end()) throw Problem("There is no service named \"" + name + "\"");
  return found->second;
}

void Supervisor::Spawn(Service& service) {
  RemoveSocket(service);
  service.child.emplace(service.spec.program, service.spec.arguments);
  service.started = now_();
  daemon::LogInfo("started " + service.spec.name + ", pid " + std::to_string(service.child->Pid()));
}

void Supervisor::Reap(Service& service) {
  if (!service.child) return;
  const std::optional<std::string> end = service.child->Ended();
  if (!end) return;
  service.child.reset();
  service.last_end = *end;
  RemoveSocket(service);
  if (!service.spec.wanted) return;
  const bool stable = now_() - service.started >= kStableTime;
  service.pause = stable || service.pause.count() == 0 ? kFirstPause
                                                       : std::min(service.pause * 2, kLongestPause);
  service.due = now_() + service.pause;
  ++service.restarts;
  daemon::LogWarning(service.spec.name + " ended (" + *end + "), starting it again in " +
                     std::to_string(service.pause.count()) + " ms");
}

void Supervisor::WaitUntilListening(Service& service) {
  if (service.spec.socket_path.empty()) return;
  const auto deadline = Clock::now() + kReadyTime;
  while (!daemon::IsListening(service.spec.socket_path)) {
    if (service.child && service.child->WaitEnded(20)) {
      Reap(service);
      throw Problem(service.spec.name + " does not start (" + service.last_end +
                    "); its reason is in the log");
    }
    if (Clock::now() > deadline) throw Problem(service.spec.name + " is not ready after 10 s");
  }
}

void Supervisor::End(Service& service, bool force) {
  if (!service.child->WaitEnded(force ? 1000 : kStopMilliseconds)) {
    daemon::LogWarning(service.spec.name + " did not stop in time and is killed");
  }
  service.last_end = service.child->Ended().value_or("killed");
  service.child.reset();
  RemoveSocket(service);
}

// A socket file without a listener would make callers fail at once instead of waiting for the
// service to come back.
void Supervisor::RemoveSocket(const Service& service) {
  const std::string& path = service.spec.socket_path;
  if (!path.empty() && !daemon::IsListening(path)) unlink(path.c_str());
}

Json::Value Supervisor::Status() const {
  Json::Value list(Json::arrayValue);
  for (const auto& [name, service] : services_) {
    Json::Value entry;
    entry["name"] = name;
    entry["state"] = service.child ? "running" : service.spec.wanted ? "restarting" : "stopped";
    entry["pid"] = service.child ? service.child->Pid() : 0;
    entry["restarts"] = service.restarts;
    entry["last_end"] = service.last_end;
    list.append(entry);
  }
  return list;
}

Json::Value Supervisor::Serve(const Json::Value& request) {
  std::string command;
  GetJsonValue(command, request, "command", true);
  Json::Value data;
  GetJsonValue(data, request, "data", false);
  std::string service;
  bool force = false;
  GetJsonValue(service, data, "service", command != "status");
  GetJsonValue(force, data, "force", false);

  if (command == "start") {
    Start(service);
  } else if (command == "stop") {
    Stop(service, force);
  } else if (command != "status") {
    throw Problem("There is no command \"" + command + "\"");
  }
  Json::Value answer;
  answer["services"] = Status();
  return daemon::SuccessReply(std::move(answer));
}

}  // namespace quarry::cli
