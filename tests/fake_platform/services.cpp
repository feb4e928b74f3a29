// Services, programs, content extraction and the monitor.

#include <cstdarg>
#include <stdexcept>
#include <string>
#include <vector>

#include "platform/include/content_extract.h"
#include "platform/include/monitor.h"
#include "platform/include/service.h"
#include "tests/fake_platform/fake_platform.h"
#include "tests/fake_platform/world.h"

using quarry::fake::Called;
using quarry::fake::CompactText;
using quarry::fake::TheWorld;
using quarry::fake::WorldLock;

namespace {

std::vector<std::string> TakeArguments(const char* program, va_list arguments) {
  std::vector<std::string> command = {program};
  while (const char* argument = va_arg(arguments, const char*)) command.emplace_back(argument);
  return command;
}

int Run(const std::string& function, const std::string& flags,
        const std::vector<std::string>& command) {
  std::string text = command[0] + flags;
  for (size_t i = 1; i < command.size(); ++i) text += ", " + command[i];
  if (const auto failure = Called(function, text)) return failure->result;
  std::function<int(const std::vector<std::string>&)> exec;
  {
    WorldLock lock(TheWorld().mutex);
    exec = TheWorld().exec;
  }
  return exec ? exec(command) : 0;
}

}  // namespace

extern "C" {

int HLIBServiceStart(const char* name, int wait) {
  const auto failure = Called("HLIBServiceStart", name, wait);
  return failure ? failure->result : 0;
}

int HLIBServiceStop(const char* name, int force) {
  const auto failure = Called("HLIBServiceStop", name, force);
  return failure ? failure->result : 0;
}

int HLIBServiceRestart(const char* name) {
  const auto failure = Called("HLIBServiceRestart", name);
  return failure ? failure->result : 0;
}

int HLIBServicectlStart(const char* job, int kind) {
  const auto failure = Called("HLIBServicectlStart", job, kind);
  return failure ? failure->result : 0;
}

int HLIBServicectlStop(const char* job, int kind) {
  const auto failure = Called("HLIBServicectlStop", job, kind);
  return failure ? failure->result : 0;
}

int TARNSMBIsEnableSpotlight() {
  if (const auto failure = Called("TARNSMBIsEnableSpotlight")) return failure->result;
  return quarry::fake::SpotlightEnabled() ? 1 : 0;
}

int TARNSMBSetSpotlight(int enable) {
  if (const auto failure = Called("TARNSMBSetSpotlight", enable)) return failure->result;
  quarry::fake::SetSpotlight(enable != 0);
  return 0;
}

int HLIBCExecl(const char* program, unsigned int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const std::vector<std::string> command = TakeArguments(program, arguments);
  va_end(arguments);
  return Run("HLIBCExecl", ", " + std::to_string(flags), command);
}

int HLIBCExec(const char* program, ...) {
  va_list arguments;
  va_start(arguments, program);
  const std::vector<std::string> command = TakeArguments(program, arguments);
  va_end(arguments);
  return Run("HLIBCExec", "", command);
}

}  // extern "C"

void TARN_CONTENT_EXTRACT_ParseFile(const std::string& path, const Json::Value& options,
                                    Json::Value& document) {
  if (Called("TARN_CONTENT_EXTRACT_ParseFile", path, CompactText(options))) {
    throw std::runtime_error("cannot parse " + path);
  }
  std::function<Json::Value(const std::string&, const Json::Value&)> parse;
  {
    WorldLock lock(TheWorld().mutex);
    parse = TheWorld().parse_file;
  }
  if (parse) {
    document = parse(path, options);
    return;
  }
  document = Json::Value(Json::objectValue);
  document["TARNMDPath"] = path;
}

namespace TARN::TARNOTIFYD {

bool MonitorQueue::Upsert(const MonitorQueue& queue, const std::string& application,
                          MonitorQueueType type) {
  if (Called("MonitorQueue::Upsert", CompactText(queue.Config()), application,
             static_cast<int>(type))) {
    return false;
  }
  WorldLock lock(TheWorld().mutex);
  TheWorld().monitor_queues[{application, queue.Config()["queue"].asString()}] = queue.Config();
  return true;
}

bool MonitorQueue::Delete(const std::string& queue_path, const std::string& application,
                          MonitorQueueType type) {
  if (Called("MonitorQueue::Delete", queue_path, application, static_cast<int>(type))) {
    return false;
  }
  WorldLock lock(TheWorld().mutex);
  TheWorld().monitor_queues.erase({application, queue_path});
  return true;
}

}  // namespace TARN::TARNOTIFYD
