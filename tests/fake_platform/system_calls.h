// Link-time replacements of the system calls whose effect a test wants to see, choose or skip:
// syslog is kept, sleep and usleep return at once, time may be set; others do the real thing unless
// a test makes them fail.
//
// All functions may be called from any thread.

#ifndef QUARRY_TESTS_FAKE_PLATFORM_SYSTEM_CALLS_H_
#define QUARRY_TESTS_FAKE_PLATFORM_SYSTEM_CALLS_H_

#include <sys/types.h>

#include <chrono>
#include <ctime>
#include <functional>
#include <string>
#include <vector>

namespace quarry::fake {

// Forgets log lines, sleeps, hooks and failures; time and ids are the real ones again.
void ResetSystemCalls();

// ---- The system log

struct LogRecord {
  int priority;
  std::string text;  // with %m replaced as the C library does
};
std::vector<LogRecord> LogRecords();
// The texts alone, in order.
std::vector<std::string> Logs();
// Those that contain `part`.
std::vector<std::string> LogsWith(const std::string& part);
void ClearLogs();

// The beginning of an error line of this process: "unit:line (pid, euid) (function) ".
std::string LogHead(const std::string& unit, int line, const std::string& function);
// `text` with the number of the first "unit.cpp:123" replaced by "N", for lines whose number is
// nobody's business.
std::string AnyLine(const std::string& text);

// ---- Time

// The lengths that sleep and usleep were called with, in order.
std::vector<std::chrono::microseconds> Sleeps();
// Runs inside each sleep, with no lock held.
void OnSleep(std::function<void(std::chrono::microseconds length)> hook);
// time() answers `now` until reset.
void SetTime(std::time_t now);

// ---- Failures of system calls

// The calls that can be made to fail or be watched: "open", "rename", "read", "pread", "write",
// "fsync", "fstat", "readlink", "flock", "close", "chmod", "fchmod", "chown", "fchown", "unlink",
// "seteuid", "setegid", "setgroups".
// Makes the nth call from now on, counted from 1, fail with `error_number` and without effect but
// for close, which closes.
void FailSystemCall(const std::string& name, int nth, int error_number);
void FailEverySystemCall(const std::string& name, int error_number);
// Makes the nth write from now on write no more than `bytes` bytes.
void CutWrite(int nth, size_t bytes);
// Runs before each such call, failing ones included, with no lock held; its own calls do not run
// it.
void OnSystemCall(const std::string& name, std::function<void()> hook);
// Makes fsync succeed without effect, for tests in which many write and no power is lost: a disk
// that is busy with others' work would hold them up for minutes.
void SkipSync();
// How many times a call was made since the reset.
int SystemCallCount(const std::string& name);

// ---- Identity

// Makes geteuid and getegid answer these ids, and seteuid, setegid and setgroups change nothing but
// the answers, so that switching users can be watched without the right to switch.
void SetEffectiveIds(uid_t uid, gid_t gid);
bool EffectiveIdsAreFaked();

}  // namespace quarry::fake

#endif  // QUARRY_TESTS_FAKE_PLATFORM_SYSTEM_CALLS_H_
