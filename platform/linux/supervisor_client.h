// Asking the supervisor, `quarry run`, which runs the services where systemd does not.

#ifndef QUARRY_PLATFORM_LINUX_SUPERVISOR_CLIENT_H_
#define QUARRY_PLATFORM_LINUX_SUPERVISOR_CLIENT_H_

#include <string>

namespace quarry::platform {

// Where the supervisor of this system listens.
const std::string& SupervisorSocketPath();

// Asks it to "start" or "stop" a service, with `force` without letting it finish. 0, or negative,
// with errno and the platform's last error set, when it does not run, refuses, or does not answer
// within a minute.
int AskSupervisor(const std::string& command, const std::string& service, bool force = false);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_SUPERVISOR_CLIENT_H_
