#include "platform/include/service.h"

#include <json/json.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/time.h>

#include <cerrno>
#include <string>

#include "common/json.h"
#include "common/paths.h"
#include "platform/include/socket.h"
#include "platform/linux/last_error.h"
#include "platform/linux/service_manager.h"

namespace quarry::platform {
namespace {

constexpr char kJobPrefix[] = "pkg-Quarry-";
constexpr char kSystemctl[] = "systemctl";
constexpr char kFileSharingService[] = "samba";
constexpr char kFileSharingUnit[] = "smbd.service";
constexpr int kSystemctlNoSuchUnit = 5;
constexpr time_t kSupervisorTimeoutSeconds = 60;

const std::string& SupervisorSocketPath() {
  static const std::string path = RootedPath("/var/run/quarry.sock");
  return path;
}

// A supervisor that hangs must not hang whoever changes a folder.
class SupervisorConnection : public tarndaemon::DomainSockConnection {
 public:
  SupervisorConnection() : DomainSockConnection(SupervisorSocketPath()) {}

  bool ConnectWithTimeout() {
    if (!Connect()) return false;
    const timeval timeout{kSupervisorTimeoutSeconds, 0};
    return setsockopt(fd_, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof(timeout)) == 0 &&
           setsockopt(fd_, SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof(timeout)) == 0;
  }
};

bool IsSuccess(const std::string& text) {
  Json::Value reply;
  return fromString(reply, text) && reply.isObject() && reply["success"].isBool() &&
         reply["success"].asBool();
}

int Systemctl(const char* command, const std::string& unit) {
  const int status = HLIBCExec(kSystemctl, "--quiet", command, unit.c_str(), nullptr);
  return status == 0 ? 0 : QUARRY_PLATFORM_FAIL(kErrService);
}

std::string UnitOf(const std::string& service) {
  return service + ".service";
}

// Names go into requests and command lines.
bool IsServiceName(const char* name) {
  if (name == nullptr || *name == '\0' || *name == '-') return false;
  const std::string allowed = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789_-.@";
  return std::string(name).find_first_not_of(allowed) == std::string::npos;
}

int RestartFileSharing() {
  // The machine's file sharing is no part of a private system.
  if (!UsesSystemd()) return 0;
  const int status = HLIBCExec(kSystemctl, "--quiet", "try-restart", kFileSharingUnit, nullptr);
  // Without the unit there is nothing that would have to learn of the change.
  return status == 0 || status == kSystemctlNoSuchUnit ? 0 : QUARRY_PLATFORM_FAIL(kErrService);
}

}  // namespace

bool UsesSystemd() {
  struct stat info {};
  return Root().empty() && lstat("/run/systemd/system", &info) == 0 && S_ISDIR(info.st_mode);
}

int AskSupervisor(const std::string& command, const std::string& service, bool force) {
  Json::Value request;
  request["command"] = command;
  request["data"]["service"] = service;
  if (force) request["data"]["force"] = true;
  SupervisorConnection connection;
  std::string reply;
  if (!connection.ConnectWithTimeout() || !connection.Send(toString(request)) ||
      !connection.Recv(reply)) {
    return QUARRY_PLATFORM_FAIL(kErrService);
  }
  if (IsSuccess(reply)) return 0;
  errno = EREMOTEIO;
  return QUARRY_PLATFORM_FAIL(kErrService);
}

std::string ServiceOfJob(const std::string& job) {
  constexpr std::size_t kPrefixSize = sizeof(kJobPrefix) - 1;
  return job.compare(0, kPrefixSize, kJobPrefix) == 0 ? job.substr(kPrefixSize) : job;
}

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" {

int HLIBServiceStart(const char* name, int wait) {
  if (!IsServiceName(name)) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  if (!UsesSystemd()) return AskSupervisor("start", name);
  if (wait != 0) return Systemctl("start", UnitOf(name));
  const int status =
      HLIBCExec(kSystemctl, "--quiet", "--no-block", "start", UnitOf(name).c_str(), nullptr);
  return status == 0 ? 0 : QUARRY_PLATFORM_FAIL(kErrService);
}

int HLIBServiceStop(const char* name, int force) {
  if (!IsServiceName(name)) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  if (!UsesSystemd()) return AskSupervisor("stop", name, force != 0);
  if (force != 0) {
    HLIBCExec(kSystemctl, "--quiet", "kill", "--signal=SIGKILL", UnitOf(name).c_str(), nullptr);
  }
  return Systemctl("stop", UnitOf(name));
}

int HLIBServiceRestart(const char* name) {
  if (!IsServiceName(name)) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  if (std::string(name) == kFileSharingService) return RestartFileSharing();
  if (UsesSystemd()) return Systemctl("restart", UnitOf(name));
  const int stopped = AskSupervisor("stop", name);
  return stopped < 0 ? stopped : AskSupervisor("start", name);
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
