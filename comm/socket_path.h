// Whether a path can be the address of a socket at all.

#ifndef QUARRY_COMM_SOCKET_PATH_H_
#define QUARRY_COMM_SOCKET_PATH_H_

#include <string>

#include "common/error.h"
#include "common/log.h"

namespace quarry::fileindex {

// Logs at `site` and throws Error(code) with a sentence that says what to do when `path` does not
// fit a Unix-domain address, which only a very long QUARRY_ROOT brings about.
void RequireSocketPath(const LogSite& site, ErrorCode code, const std::string& path);

}  // namespace quarry::fileindex

#endif  // QUARRY_COMM_SOCKET_PATH_H_
