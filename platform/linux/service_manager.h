// Who starts and stops the services of this system.

#ifndef QUARRY_PLATFORM_LINUX_SERVICE_MANAGER_H_
#define QUARRY_PLATFORM_LINUX_SERVICE_MANAGER_H_

#include <string>

namespace quarry::platform {

// Whether the machine's systemd is for this system to use. Never so for a private system, which is
// one with a root.
bool MayUseSystemd(const std::string& root, const std::string& systemd_directory);
bool MayUseSystemd();

// Whether systemd runs this system's services. A supervisor that answers at its socket does so
// where there is one, because it was started on purpose.
bool SystemdRunsServices(bool may_use_systemd, const std::string& supervisor_socket);
bool SystemdRunsServices();

// The service behind a job: "pkg-Quarry-fileindexd" is "fileindexd".
std::string ServiceOfJob(const std::string& job);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_SERVICE_MANAGER_H_
