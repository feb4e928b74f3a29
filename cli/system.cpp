#include "cli/system.h"

#include <unistd.h>

#include <cerrno>

#include "cli/problem.h"
#include "common/error.h"
#include "common/json.h"
#include "common/paths.h"
#include "daemons/common/client.h"

namespace quarry::cli {
namespace {

constexpr const char* kSupervisor = "quarry run";
constexpr const char* kHowToStart = "Start the system with \"quarry run\" and leave it running.";

using Patience = std::chrono::seconds;

bool SystemdIsInCharge() {
  return Root().empty() && access("/run/systemd/system", F_OK) == 0;
}

// One of the daemons, as it is called in sentences.
struct Peer {
  const char* title;
  const char* name;
  std::string socket;
  Patience patience;
};

Peer TheSupervisor() {
  return {"The supervisor", kSupervisor, SupervisorSocket(), Patience(30)};
}

std::string Who(const Peer& peer) {
  return std::string(peer.title) + " (" + peer.name + ")";
}

// What the supervisor says of a service, null when it knows none of that name or says nothing.
Json::Value ReportOn(const std::string& service) {
  const Json::Value status = AskSupervisor("status", Json::Value(Json::objectValue));
  for (const Json::Value& report : status["services"]) {
    if (report["name"] == service) return report;
  }
  return {};
}

bool IsForbidden(const std::string& socket) {
  return access(socket.c_str(), W_OK) != 0 && errno == EACCES;
}

// Why nobody listens, and what to do about it.
std::string Absence(const Peer& peer) {
  const std::string name = peer.name;
  if (IsForbidden(peer.socket)) {
    return "You may not talk to " + name + " (" + peer.socket +
           "). Run as the user who started the system, or as root.";
  }
  if (name == kSupervisor) return Who(peer) + " is not running. " + kHowToStart;
  if (!daemon::IsListening(SupervisorSocket())) {
    return Who(peer) + " is not running. " +
           (SystemdIsInCharge() ? "Start it with: systemctl start " + name : kHowToStart);
  }
  const Json::Value report = ReportOn(name);
  if (report["state"] != "restarting") {
    return Who(peer) + " does not answer. Try again; if that does not help: quarry doctor";
  }
  return Who(peer) + " does not start (" + report["last_end"].asString() +
         "). Its reason is in the log of \"quarry run\"; mend what is damaged with: quarry doctor";
}

Json::Value Exchange(const Peer& peer, const Json::Value& request) {
  if (!daemon::IsListening(peer.socket)) throw Problem(Absence(peer));
  daemon::ClientOptions options;
  options.timeout = peer.patience;
  Json::Value reply;
  try {
    reply = daemon::Request(Who(peer), peer.socket, request, options);
  } catch (const Error& error) {
    throw Problem(error.reason());
  }
  bool success = false;
  GetJsonValue(success, reply, "success", true);
  if (success) return reply["data"];
  int code = 0;
  std::string message;
  GetJsonValue(code, reply["error"], "code", false);
  GetJsonValue(message, reply["error"], "msg", false);
  throw Error(code, message);
}

Json::Value Envelope(const char* key, const std::string& command, const Json::Value& data) {
  Json::Value request;
  request[key] = command;
  request["data"] = data;
  return request;
}

}  // namespace

std::string SupervisorSocket() {
  return RootedPath("/var/run/quarry.sock");
}
std::string EngineSocket() {
  return RootedPath("/var/run/tarnelasticd.sock");
}
std::string IndexDaemonSocket() {
  return RootedPath("/var/run/fileindexd.sock");
}
std::string ExtractorSocket() {
  return RootedPath("/var/run/tarncontentextractd.sock");
}

Json::Value AskSupervisor(const std::string& command, const Json::Value& data) {
  return Exchange(TheSupervisor(), Envelope("command", command, data));
}

Json::Value AskEngine(const std::string& command, const Json::Value& data) {
  return Exchange({"The search engine", "tarnelasticd", EngineSocket(), Patience(60)},
                  Envelope("command", command, data));
}

Json::Value AskIndexDaemon(const std::string& command, const Json::Value& data) {
  return Exchange({"The index daemon", "fileindexd", IndexDaemonSocket(), Patience(10)},
                  Envelope("type", command, data));
}

bool SupervisorAnswers() {
  if (!daemon::IsListening(SupervisorSocket())) return false;
  try {
    AskSupervisor("status", Json::Value(Json::objectValue));
    return true;
  } catch (const Problem&) {
    return false;
  }
}

bool ServicesAreManaged() {
  return daemon::IsListening(SupervisorSocket()) || SystemdIsInCharge();
}

std::string WhyNotManaged() {
  return ServicesAreManaged() ? "" : Absence(TheSupervisor());
}

void RequireRunningSystem() {
  const std::string why = WhyNotManaged();
  if (!why.empty()) throw Problem(why);
  AskEngine("engine_status", Json::Value(Json::objectValue));
}

}  // namespace quarry::cli
