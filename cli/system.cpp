#include "cli/system.h"

#include <unistd.h>

#include "cli/problem.h"
#include "common/error.h"
#include "common/json.h"
#include "common/paths.h"
#include "daemons/common/client.h"

namespace quarry::cli {
namespace {

constexpr const char* kHowToStart = "Start the system with \"quarry run\" and leave it running.";

daemon::ClientOptions Patience(int seconds) {
  daemon::ClientOptions options;
  options.timeout = std::chrono::seconds(seconds);
  return options;
}

Json::Value Exchange(const std::string& who, const std::string& socket, const Json::Value& request,
                     const daemon::ClientOptions& options) {
  if (!daemon::IsListening(socket)) throw Problem(who + " is not running. " + kHowToStart);
  Json::Value reply;
  try {
    reply = daemon::Request(who, socket, request, options);
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
  return Exchange("The supervisor (quarry run)", SupervisorSocket(),
                  Envelope("command", command, data), Patience(30));
}

Json::Value AskEngine(const std::string& command, const Json::Value& data) {
  return Exchange("The search engine (tarnelasticd)", EngineSocket(),
                  Envelope("command", command, data), Patience(60));
}

Json::Value AskIndexDaemon(const std::string& command, const Json::Value& data) {
  return Exchange("The index daemon (fileindexd)", IndexDaemonSocket(),
                  Envelope("type", command, data), Patience(10));
}

bool ServicesAreManaged() {
  if (daemon::IsListening(SupervisorSocket())) return true;
  return Root().empty() && access("/run/systemd/system", F_OK) == 0;
}

void RequireRunningSystem() {
  if (!ServicesAreManaged()) {
    throw Problem(std::string("The supervisor is not running. ") + kHowToStart);
  }
  AskEngine("engine_status", Json::Value(Json::objectValue));
}

}  // namespace quarry::cli
