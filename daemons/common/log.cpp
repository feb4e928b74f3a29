#include "daemons/common/log.h"

#include <syslog.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdio>

namespace quarry::daemon {
namespace {

constexpr std::size_t kMaxLineBytes = 8192;

// The system log keeps a pointer to the name for good.
std::string& ProgramName() {
  static std::string name;
  return name;
}

std::atomic<bool> foreground_log{false};

void AppendEscaped(std::string* out, unsigned char byte) {
  char hex[8];
  switch (byte) {
    case '\n':
      *out += "\\n";
      break;
    case '\r':
      *out += "\\r";
      break;
    case '\t':
      *out += "\\t";
      break;
    case '\\':
      *out += "\\\\";
      break;
    default:
      if (byte >= 0x20 && byte != 0x7f) {
        out->push_back(static_cast<char>(byte));
      } else {
        std::snprintf(hex, sizeof(hex), "\\x%02X", static_cast<unsigned>(byte));
        *out += hex;
      }
  }
}

void Write(int priority, const char* level, const std::string& text) {
  const int saved = errno;
  std::string line = EscapeForLog(text.substr(0, kMaxLineBytes));
  if (line.size() > kMaxLineBytes) line.resize(kMaxLineBytes);
  syslog(LOG_DAEMON | priority, "%s", line.c_str());
  if (foreground_log) {
    // One write, so that lines of several threads and daemons do not mix.
    line = ProgramName() + ": " + level + ": " + line + "\n";
    if (write(STDERR_FILENO, line.data(), line.size()) < 0) errno = 0;
  }
  errno = saved;
}

}  // namespace

void OpenLog(const std::string& name, bool foreground) {
  ProgramName() = name;
  foreground_log = foreground;
  if (foreground) std::signal(SIGPIPE, SIG_IGN);
  openlog(ProgramName().c_str(), LOG_PID, LOG_DAEMON);
}

void LogInfo(const std::string& text) {
  Write(LOG_INFO, "info", text);
}

void LogWarning(const std::string& text) {
  Write(LOG_WARNING, "warning", text);
}

void LogError(const std::string& text) {
  Write(LOG_ERR, "error", text);
}

std::string EscapeForLog(const std::string& text) {
  std::string out;
  out.reserve(text.size());
  for (const char c : text) AppendEscaped(&out, static_cast<unsigned char>(c));
  return out;
}

}  // namespace quarry::daemon
