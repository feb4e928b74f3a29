// Starting and stopping the units of systemd, through its command as PATH has it.
//
// Each returns 0, or negative with the platform's last error set.

#ifndef QUARRY_PLATFORM_LINUX_SYSTEMD_H_
#define QUARRY_PLATFORM_LINUX_SYSTEMD_H_

#include <string>

namespace quarry::platform {

// Starts the service's unit, now and whenever the machine starts; `wait` false does not wait until
// it runs.
int StartUnit(const std::string& service, bool wait);

// Stops it for good, also when the machine starts again; with `force` without letting it finish.
int StopUnit(const std::string& service, bool force);

int RestartUnit(const std::string& service);

// Restarts it if it runs. Success also without such a unit: then there is nobody to tell anything.
int RestartUnitIfRunning(const std::string& service);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_SYSTEMD_H_
