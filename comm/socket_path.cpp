#include "comm/socket_path.h"

#include <sys/un.h>

#include <cerrno>

namespace quarry::fileindex {

void RequireSocketPath(const LogSite& site, ErrorCode code, const std::string& path) {
  if (path.size() < sizeof(sockaddr_un::sun_path)) return;
  errno = 0;
  Fail(site, "path.size() >= sizeof(sockaddr_un::sun_path)", code,
       "The socket's path is too long, choose a shorter QUARRY_ROOT: " + path);
}

}  // namespace quarry::fileindex
