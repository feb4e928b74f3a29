#include "common/log.h"

#include <syslog.h>
#include <unistd.h>

#include <cerrno>

namespace quarry {

// %m is the C library's own.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat"

void LogError(const LogSite& site, const std::string& message) {
  if (errno != 0) {
    syslog(LOG_ERR, "%s:%d (%d, %u) (%s) %s [err: %m]", site.unit, site.line, getpid(), geteuid(),
           site.function, message.c_str());
    errno = 0;
  } else {
    syslog(LOG_ERR, "%s:%d (%d, %u) (%s) %s", site.unit, site.line, getpid(), geteuid(),
           site.function, message.c_str());
  }
}

#pragma GCC diagnostic pop

void LogLine(const LogSite& site, const std::string& message) {
  syslog(LOG_ERR, "%s:%d %s", site.unit, site.line, message.c_str());
}

void LogDebug(const LogSite& site, const std::string& message) {
  if (fileindex::log_level == 7) LogLine(site, message);
}

void LogFailure(const LogSite& site, const char* condition, const std::string& reason) {
  LogError(site, std::string("Failed [") + condition + "], reason: " + reason);
}

void Fail(const LogSite& site, const char* condition, ErrorCode code, const std::string& reason) {
  LogFailure(site, condition, reason);
  throw Error(code, reason);
}

}  // namespace quarry
