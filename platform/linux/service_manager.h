// Who starts and stops the services of this system.

#ifndef QUARRY_PLATFORM_LINUX_SERVICE_MANAGER_H_
#define QUARRY_PLATFORM_LINUX_SERVICE_MANAGER_H_

#include <string>

namespace quarry::platform {

// Whether the machine's service manager is asked. A private system, and a machine without systemd,
// have the supervisor, `quarry run`.
bool UsesSystemd();

// Asks the supervisor to "start" or "stop" a service, with `force` without letting it finish. 0, or
// negative, with the platform's last error set, when it does not run, refuses, or does not answer
// within a minute.
int AskSupervisor(const std::string& command, const std::string& service, bool force = false);

// The service behind a job: "pkg-Quarry-fileindexd" is "fileindexd".
std::string ServiceOfJob(const std::string& job);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_SERVICE_MANAGER_H_
