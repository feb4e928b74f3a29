#include "platform/include/service.h"

#include <string>

#include "platform/linux/last_error.h"
#include "platform/linux/service_manager.h"
#include "platform/linux/supervisor_client.h"
#include "platform/linux/systemd.h"

namespace quarry::platform {
namespace {

constexpr char kFileSharingService[] = "samba";
constexpr char kFileSharingUnit[] = "smbd";

// Names go into requests and command lines.
bool IsServiceName(const char* name) {
  if (name == nullptr || *name == '\0' || *name == '-') return false;
  const std::string allowed = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789_-.@";
  return std::string(name).find_first_not_of(allowed) == std::string::npos;
}

// The supervisor has no part in the machine's file sharing, and a private system none at all.
int RestartFileSharing() {
  return MayUseSystemd() ? RestartUnitIfRunning(kFileSharingUnit) : 0;
}

int RestartThroughSupervisor(const std::string& service) {
  const int stopped = AskSupervisor("stop", service);
  return stopped < 0 ? stopped : AskSupervisor("start", service);
}

}  // namespace
}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" {

int HLIBServiceStart(const char* name, int wait) {
  if (!IsServiceName(name)) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  return SystemdRunsServices() ? StartUnit(name, wait != 0) : AskSupervisor("start", name);
}

int HLIBServiceStop(const char* name, int force) {
  if (!IsServiceName(name)) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  return SystemdRunsServices() ? StopUnit(name, force != 0)
                               : AskSupervisor("stop", name, force != 0);
}

int HLIBServiceRestart(const char* name) {
  if (!IsServiceName(name)) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  if (std::string(name) == kFileSharingService) return RestartFileSharing();
  return SystemdRunsServices() ? RestartUnit(name) : RestartThroughSupervisor(name);
}

int HLIBServicectlStart(const char* job, int kind) {
  if (job == nullptr || kind != HLIB_SERVICECTL_UPSTART) {
    return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  }
  return HLIBServiceStart(ServiceOfJob(job).c_str(), 1);
}

int HLIBServicectlStop(const char* job, int kind) {
  if (job == nullptr || kind != HLIB_SERVICECTL_UPSTART) {
    return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  }
  return HLIBServiceStop(ServiceOfJob(job).c_str(), 0);
}

}  // extern "C"
