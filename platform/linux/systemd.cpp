#include "platform/linux/systemd.h"

#include "platform/include/service.h"
#include "platform/linux/last_error.h"

namespace quarry::platform {
namespace {

constexpr char kSystemctl[] = "systemctl";
constexpr int kNoSuchUnit = 5;

std::string UnitOf(const std::string& service) {
  return service + ".service";
}

int Result(int exit_status) {
  return exit_status == 0 ? 0 : QUARRY_PLATFORM_FAIL(kErrService);
}

}  // namespace

int StartUnit(const std::string& service, bool wait) {
  const std::string unit = UnitOf(service);
  return Result(wait ? HLIBCExec(kSystemctl, "--quiet", "--now", "enable", unit.c_str(), nullptr)
                     : HLIBCExec(kSystemctl, "--quiet", "--no-block", "--now", "enable",
                                 unit.c_str(), nullptr));
}

int StopUnit(const std::string& service, bool force) {
  const std::string unit = UnitOf(service);
  // What is killed before it is stopped may be started again in between; that one is stopped.
  if (force) {
    HLIBCExec(kSystemctl, "--quiet", "--signal=SIGKILL", "kill", unit.c_str(), nullptr);
  }
  return Result(HLIBCExec(kSystemctl, "--quiet", "--now", "disable", unit.c_str(), nullptr));
}

int RestartUnit(const std::string& service) {
  return Result(HLIBCExec(kSystemctl, "--quiet", "restart", UnitOf(service).c_str(), nullptr));
}

int RestartUnitIfRunning(const std::string& service) {
  const int status =
      HLIBCExec(kSystemctl, "--quiet", "try-restart", UnitOf(service).c_str(), nullptr);
  return Result(status == kNoSuchUnit ? 0 : status);
}

}  // namespace quarry::platform
