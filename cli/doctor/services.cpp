// Daemons that do not run, or do not answer.

#include <chrono>
#include <functional>
#include <map>
#include <thread>

#include "cli/doctor/checks.h"
#include "cli/folder_lock.h"
#include "cli/problem.h"
#include "cli/system.h"
#include "daemons/common/client.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/index_mgr.h"

namespace quarry::cli {
namespace {

using Clock = std::chrono::steady_clock;

// A service that has just been started is given some time; one that is started here, more.
constexpr std::chrono::seconds kGrace{3};
constexpr std::chrono::seconds kStartTime{10};
constexpr std::chrono::milliseconds kLook{50};

const std::map<std::string, std::string>& Sockets() {
  static const std::map<std::string, std::string> sockets{
      {"tarnelasticd", EngineSocket()},
      {"tarncontentextractd", ExtractorSocket()},
      {"fileindexd", IndexDaemonSocket()}};
  return sockets;
}

// Whether somebody listens there, or does so soon.
bool Listens(const std::string& service, std::chrono::seconds patience) {
  const auto end = Clock::now() + patience;
  while (!daemon::IsListening(Sockets().at(service))) {
    if (Clock::now() > end) return false;
    std::this_thread::sleep_for(kLook);
  }
  return true;
}

std::string Order(const std::string& command, const std::string& service) {
  Json::Value data;
  data["service"] = service;
  AskSupervisor(command, data);
  return "";
}

bool IsWanted(const std::string& service) {
  return service == "tarnelasticd" || !fileindex::FolderMgr().GetFolders().empty();
}

void CheckSupervised(Examination& examination, const Json::Value& report) {
  const std::string name = report["name"].asString();
  if (Sockets().count(name) == 0 || !IsWanted(name)) return;
  const std::string state = report["state"].asString();
  if (state == "stopped") {
    examination.Mend(name + " is needed, but stopped", "started",
                     [&] { return Order("start", name); });
  } else if (state == "restarting") {
    examination.Mend(name + " does not stay (" + report["last_end"].asString() + ")",
                     "started again", [&] { return Order("start", name); });
  } else if (!Listens(name, kGrace)) {
    examination.Mend(name + " runs, but nobody can reach it", "stopped and started again", [&] {
      Order("stop", name);
      return Order("start", name);
    });
  }
}

// Services of systemd: the library starts those that the folders need.
void CheckUnits(Examination& examination) {
  for (const auto& [name, socket] : Sockets()) {
    if (!IsWanted(name) || daemon::IsListening(socket)) continue;
    examination.Mend(name + " does not run", "started", [service = name] {
      const FolderLock lock;
      fileindex::PrepareServices();
      if (!Listens(service, kStartTime)) throw Problem("Start it with: systemctl start " + service);
      return "";
    });
  }
}

void CheckAnswers(Examination& examination, const std::string& name,
                  const std::function<void()>& ask) {
  if (!daemon::IsListening(Sockets().at(name))) return;
  try {
    ask();
  } catch (const Problem& problem) {
    examination.Leave(problem.what(), "Wait if the machine is busy; else end " + name +
                                          ", and it is started again");
  }
}

}  // namespace

void CheckServices(Examination& examination) {
  if (daemon::IsListening(SupervisorSocket())) {
    const Json::Value status = AskSupervisor("status", Json::Value(Json::objectValue));
    for (const Json::Value& service : status["services"]) {
      CheckSupervised(examination, service);
    }
  } else if (ServicesAreManaged()) {
    CheckUnits(examination);
  } else if (fileindex::FolderMgr().GetFolders().empty()) {
    examination.Note("The system does not run", "Start it with: quarry run");
    return;
  } else {
    examination.Leave("The system does not run", "Start it with: quarry run");
    return;
  }
  CheckAnswers(examination, "tarnelasticd",
               [] { AskEngine("engine_status", Json::Value(Json::objectValue)); });
  CheckAnswers(examination, "fileindexd", [] { AskIndexDaemon("ping", Json::Value()); });
}

}  // namespace quarry::cli
