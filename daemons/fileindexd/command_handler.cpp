#include "daemons/fileindexd/command_handler.h"

#include <unistd.h>

#include <exception>
#include <map>

#include "common/error.h"
#include "common/json.h"
#include "daemons/common/reply.h"

namespace quarry::fileindexd {
namespace {

constexpr int kProtocolVersion = 1;

std::string ShareName(const Json::Value& data) {
  std::string share;
  GetJsonValue<std::string>(share, data, "share_name", true);
  if (share.empty()) throw Error(kErrorBadParameter, "Missing share_name");
  return share;
}

Json::Value SettingChanged(CommandTarget& target, const Json::Value& data, pid_t) {
  bool is_upsert = false;
  GetJsonValue<bool>(is_upsert, data, "is_upsert", true);
  target.SettingChanged(ShareName(data), is_upsert);
  return Json::Value();
}

Json::Value Pause(CommandTarget& target, const Json::Value& data, pid_t) {
  long long resume_time = 0;
  GetJsonValue<long long>(resume_time, data, "resume_time", true);
  target.Pause(resume_time);
  return Json::Value();
}

Json::Value Resume(CommandTarget& target, const Json::Value&, pid_t) {
  target.Resume();
  return Json::Value();
}

Json::Value CreateWorker(CommandTarget& target, const Json::Value& data, pid_t) {
  target.CreateWorker(ShareName(data));
  return Json::Value();
}

Json::Value DeleteWorker(CommandTarget& target, const Json::Value& data, pid_t peer) {
  bool while_running = false;
  GetJsonValue<bool>(while_running, data, "while_running", false);
  target.DeleteWorker(ShareName(data), while_running ? peer : 0);
  return Json::Value();
}

Json::Value Status(CommandTarget& target, const Json::Value&, pid_t) {
  Json::Value status = target.Status();
  status["version"] = kProtocolVersion;
  return status;
}

Json::Value Ping(CommandTarget&, const Json::Value&, pid_t) {
  Json::Value pong;
  pong["version"] = kProtocolVersion;
  pong["pid"] = getpid();
  return pong;
}

using Command = Json::Value (*)(CommandTarget& target, const Json::Value& data, pid_t peer);

const std::map<std::string, Command>& Commands() {
  static const std::map<std::string, Command> commands = {
      {"notify_setting_changed", SettingChanged},
      {"pause", Pause},
      {"resume", Resume},
      {"worker_create", CreateWorker},
      {"worker_delete", DeleteWorker},
      {"status", Status},
      {"ping", Ping},
  };
  return commands;
}

Json::Value Run(CommandTarget& target, const std::string& text, pid_t peer) {
  Json::Value request;
  if (!fromString(request, text)) throw Error(kErrorBadParameter, "The request is not JSON");
  std::string type;
  GetJsonValue<std::string>(type, request, "type", true);
  const auto command = Commands().find(type);
  if (command == Commands().end()) throw Error(kErrorBadParameter, "Unknown type: " + type);
  return command->second(target, request.isMember("data") ? request["data"] : Json::Value(), peer);
}

}  // namespace

std::string HandleCommand(CommandTarget& target, const std::string& request, pid_t peer) {
  try {
    return toString(daemon::SuccessReply(Run(target, request, peer)));
  } catch (const Error& error) {
    return toString(daemon::FailureReply(error.code(), error.reason()));
  } catch (const std::exception& error) {
    // The library's callers wait for an answer as long as there is none.
    return toString(daemon::FailureReply(kErrorSystem, error.what()));
  }
}

}  // namespace quarry::fileindexd
