#include "platform/linux/service_manager.h"

#include <sys/stat.h>

#include "common/paths.h"
#include "platform/include/socket.h"
#include "platform/linux/keep_errno.h"
#include "platform/linux/supervisor_client.h"

namespace quarry::platform {

bool MayUseSystemd(const std::string& root, const std::string& systemd_directory) {
  const KeepErrno keep;
  struct stat info {};
  return root.empty() && lstat(systemd_directory.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

bool MayUseSystemd() {
  // The directory is there exactly where systemd is the machine's first process.
  return MayUseSystemd(Root(), "/run/systemd/system");
}

bool SystemdRunsServices(bool may_use_systemd, const std::string& supervisor_socket) {
  const KeepErrno keep;
  return may_use_systemd && !tarndaemon::DomainSockConnection(supervisor_socket).Connect();
}

bool SystemdRunsServices() {
  return SystemdRunsServices(MayUseSystemd(), SupervisorSocketPath());
}

std::string ServiceOfJob(const std::string& job) {
  const std::string prefix = "pkg-Quarry-";
  return job.compare(0, prefix.size(), prefix) == 0 ? job.substr(prefix.size()) : job;
}

}  // namespace quarry::platform
