// How the library writes to the system log, and the one way in which a failed check is logged and
// thrown. Every line has priority LOG_ERR. May be used from any thread.

#ifndef QUARRY_COMMON_LOG_H_
#define QUARRY_COMMON_LOG_H_

#include <string>

#include "common/error.h"

namespace quarry {

// Where a line comes from. Some lines carry a unit and a number that readers of the log match on,
// so a site may name them itself instead of taking the compiler's.
struct LogSite {
  const char* unit;
  int line;
  const char* function;
};

// The site of the current line in `unit`, which is given without its extension:
// QUARRY_SITE("util").
#define QUARRY_SITE(unit)           \
  ::quarry::LogSite {               \
    unit ".cpp", __LINE__, __func__ \
  }
// The same with a line number of its own.
#define QUARRY_SITE_AT(unit, line) \
  ::quarry::LogSite {              \
    unit ".cpp", line, __func__    \
  }

// Writes "unit:line (pid, euid) (function) message", with " [err: ...]" at the end when errno is
// set, and leaves errno 0.
void LogError(const LogSite& site, const std::string& message);

// Writes "unit:line message".
void LogLine(const LogSite& site, const std::string& message);

// Writes "unit:line message" only while debug lines are on.
void LogDebug(const LogSite& site, const std::string& message);

// Logs "Failed [condition], reason: reason" as LogError does. For failures that must not be thrown.
void LogFailure(const LogSite& site, const char* condition, const std::string& reason);

// Logs the failure of `condition` and throws Error(code, reason).
[[noreturn]] void Fail(const LogSite& site, const char* condition, ErrorCode code,
                       const std::string& reason = std::string());

}  // namespace quarry

#endif  // QUARRY_COMMON_LOG_H_
