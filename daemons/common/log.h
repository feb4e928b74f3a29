// What daemons tell the administrator. (The library's own failures are logged by common/log.h.)

#ifndef QUARRY_DAEMONS_COMMON_LOG_H_
#define QUARRY_DAEMONS_COMMON_LOG_H_

#include <string>

namespace quarry::daemon {

// Names the program in the system log (facility LOG_DAEMON) and, with `foreground`, sends every
// line to stderr as well. Call it once, before threads are started; without it lines go to the
// system log under the program's own name. With `foreground` SIGPIPE is ignored from then on: a
// daemon outlives the terminal that it talks to.
void OpenLog(const std::string& name, bool foreground);

// Each writes one line. Control characters and backslashes are escaped, so that text from outside
// can neither break a line nor drive a terminal; lines are cut at 8 KiB. Any thread; errno is kept.
void LogInfo(const std::string& text);
void LogWarning(const std::string& text);
void LogError(const std::string& text);

// `text` with backslashes and control characters escaped (\n, \t, \\, \xHH). Other bytes are kept.
std::string EscapeForLog(const std::string& text);

}  // namespace quarry::daemon

#endif  // QUARRY_DAEMONS_COMMON_LOG_H_
