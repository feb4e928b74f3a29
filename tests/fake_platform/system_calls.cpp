#include "tests/fake_platform/system_calls.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <grp.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <map>
#include <mutex>
#include <stdexcept>

namespace quarry::fake {
namespace {

constexpr std::array<const char*, 18> kCallNames = {
    "open",  "rename", "read",   "pread", "write",  "fsync",  "fstat",   "readlink", "flock",
    "close", "chmod",  "fchmod", "chown", "fchown", "unlink", "seteuid", "setegid",  "setgroups"};

size_t CallIndex(const char* name) {
  for (size_t i = 0; i < kCallNames.size(); ++i) {
    if (std::strcmp(kCallNames[i], name) == 0) return i;
  }
  throw std::runtime_error(std::string("no such system call to watch: ") + name);
}

struct CallRules {
  std::map<int, int> errors;     // errno by the ordinal of the call
  std::map<int, size_t> limits;  // bytes by the ordinal of the call
  int every = 0;
  std::function<void()> hook;
};

struct State {
  std::mutex mutex;
  std::vector<LogRecord> logs;
  std::vector<std::chrono::microseconds> sleeps;
  std::function<void(std::chrono::microseconds)> sleep_hook;
  std::array<CallRules, kCallNames.size()> rules;
  std::array<std::atomic<int>, kCallNames.size()> counts{};
  // Lets calls pass without taking the mutex, so that a child of fork never waits for it.
  std::atomic<bool> armed{false};
  std::atomic<bool> time_set{false};
  std::atomic<bool> sync_skipped{false};
  std::atomic<std::time_t> now{0};
  std::atomic<bool> ids_faked{false};
  std::atomic<uid_t> uid{0};
  std::atomic<gid_t> gid{0};
};

// Never destroyed: static objects of others may still log while the program ends.
State& TheState() {
  static State* const state = new State;
  return *state;
}

thread_local bool inside_hook = false;

void RunHook(const std::function<void()>& hook) {
  if (!hook || inside_hook) return;
  inside_hook = true;
  const int saved = errno;
  hook();
  errno = saved;
  inside_hook = false;
}

// What is to become of one call.
struct Verdict {
  bool fails = false;
  size_t limit = static_cast<size_t>(-1);
};

Verdict Enter(const char* name) {
  State& state = TheState();
  const size_t index = CallIndex(name);
  const int ordinal = ++state.counts[index];
  if (!state.armed) return {};
  std::function<void()> hook;
  Verdict verdict;
  int error = 0;
  {
    std::lock_guard<std::mutex> lock(state.mutex);
    const CallRules& rules = state.rules[index];
    hook = rules.hook;
    error = rules.every;
    if (auto found = rules.errors.find(ordinal); found != rules.errors.end()) error = found->second;
    if (auto found = rules.limits.find(ordinal); found != rules.limits.end()) {
      verdict.limit = found->second;
    }
  }
  RunHook(hook);
  if (error == 0) return verdict;
  errno = error;
  verdict.fails = true;
  return verdict;
}

template <typename Function>
Function Real(const char* name) {
  return reinterpret_cast<Function>(dlsym(RTLD_NEXT, name));
}

void Slept(std::chrono::microseconds length) {
  State& state = TheState();
  std::function<void(std::chrono::microseconds)> hook;
  {
    std::lock_guard<std::mutex> lock(state.mutex);
    state.sleeps.push_back(length);
    hook = state.sleep_hook;
  }
  const int saved = errno;
  if (hook) hook(length);
  errno = saved;
}

void Logged(int priority, const char* format, va_list arguments) {
  const int saved = errno;
  va_list again;
  va_copy(again, arguments);
  const int length = std::vsnprintf(nullptr, 0, format, arguments);
  std::string text(static_cast<size_t>(length < 0 ? 0 : length) + 1, '\0');
  errno = saved;
  std::vsnprintf(text.data(), text.size(), format, again);
  va_end(again);
  text.pop_back();
  State& state = TheState();
  std::lock_guard<std::mutex> lock(state.mutex);
  state.logs.push_back({priority, text});
  errno = saved;
}

}  // namespace

void ResetSystemCalls() {
  State& state = TheState();
  std::lock_guard<std::mutex> lock(state.mutex);
  state.logs.clear();
  state.sleeps.clear();
  state.sleep_hook = nullptr;
  for (CallRules& rules : state.rules) rules = CallRules();
  for (auto& count : state.counts) count = 0;
  state.armed = false;
  state.time_set = false;
  state.sync_skipped = false;
  state.ids_faked = false;
}

std::vector<LogRecord> LogRecords() {
  State& state = TheState();
  std::lock_guard<std::mutex> lock(state.mutex);
  return state.logs;
}

std::vector<std::string> Logs() {
  return LogsWith("");
}

std::vector<std::string> LogsWith(const std::string& part) {
  std::vector<std::string> texts;
  for (const LogRecord& record : LogRecords()) {
    if (record.text.find(part) != std::string::npos) texts.push_back(record.text);
  }
  return texts;
}

void ClearLogs() {
  State& state = TheState();
  std::lock_guard<std::mutex> lock(state.mutex);
  state.logs.clear();
}

std::string LogHead(const std::string& unit, int line, const std::string& function) {
  return unit + ".cpp:" + std::to_string(line) + " (" + std::to_string(getpid()) + ", " +
         std::to_string(geteuid()) + ") (" + function + ") ";
}

std::string AnyLine(const std::string& text) {
  const size_t begin = text.find(".cpp:");
  if (begin == std::string::npos) return text;
  const size_t end = text.find_first_not_of("0123456789", begin + 5);
  return text.substr(0, begin + 5) + "N" + (end == std::string::npos ? "" : text.substr(end));
}

std::vector<std::chrono::microseconds> Sleeps() {
  State& state = TheState();
  std::lock_guard<std::mutex> lock(state.mutex);
  return state.sleeps;
}

void OnSleep(std::function<void(std::chrono::microseconds)> hook) {
  State& state = TheState();
  std::lock_guard<std::mutex> lock(state.mutex);
  state.sleep_hook = std::move(hook);
}

void SetTime(std::time_t now) {
  TheState().now = now;
  TheState().time_set = true;
}

void FailSystemCall(const std::string& name, int nth, int error_number) {
  State& state = TheState();
  const size_t index = CallIndex(name.c_str());
  std::lock_guard<std::mutex> lock(state.mutex);
  state.rules[index].errors[state.counts[index] + nth] = error_number;
  state.armed = true;
}

void FailEverySystemCall(const std::string& name, int error_number) {
  State& state = TheState();
  const size_t index = CallIndex(name.c_str());
  std::lock_guard<std::mutex> lock(state.mutex);
  state.rules[index].every = error_number;
  state.armed = true;
}

void CutWrite(int nth, size_t bytes) {
  State& state = TheState();
  const size_t index = CallIndex("write");
  std::lock_guard<std::mutex> lock(state.mutex);
  state.rules[index].limits[state.counts[index] + nth] = bytes;
  state.armed = true;
}

void OnSystemCall(const std::string& name, std::function<void()> hook) {
  State& state = TheState();
  const size_t index = CallIndex(name.c_str());
  std::lock_guard<std::mutex> lock(state.mutex);
  state.rules[index].hook = std::move(hook);
  state.armed = true;
}

void SkipSync() {
  TheState().sync_skipped = true;
}

int SystemCallCount(const std::string& name) {
  return TheState().counts[CallIndex(name.c_str())];
}

void SetEffectiveIds(uid_t uid, gid_t gid) {
  State& state = TheState();
  state.uid = uid;
  state.gid = gid;
  state.ids_faked = true;
}

bool EffectiveIdsAreFaked() {
  return TheState().ids_faked;
}

}  // namespace quarry::fake

// The replacements. They are declared here again rather than taken from <syslog.h>, whose inline
// definitions would stand in the way.
using quarry::fake::Enter;
using quarry::fake::Real;
using quarry::fake::TheState;

extern "C" {

void syslog(int priority, const char* format, ...);
void vsyslog(int priority, const char* format, va_list arguments);
void __syslog_chk(int priority, int flag, const char* format, ...);
void __vsyslog_chk(int priority, int flag, const char* format, va_list arguments);

void vsyslog(int priority, const char* format, va_list arguments) {
  quarry::fake::Logged(priority, format, arguments);
}

void syslog(int priority, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  quarry::fake::Logged(priority, format, arguments);
  va_end(arguments);
}

void __vsyslog_chk(int priority, int, const char* format, va_list arguments) {
  quarry::fake::Logged(priority, format, arguments);
}

void __syslog_chk(int priority, int, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  quarry::fake::Logged(priority, format, arguments);
  va_end(arguments);
}

unsigned int sleep(unsigned int seconds) {
  quarry::fake::Slept(std::chrono::seconds(seconds));
  return 0;
}

int usleep(useconds_t length) {
  quarry::fake::Slept(std::chrono::microseconds(length));
  return 0;
}

time_t time(time_t* result) noexcept {
  time_t now = TheState().now;
  if (!TheState().time_set) {
    timespec exact{};
    clock_gettime(CLOCK_REALTIME, &exact);
    now = exact.tv_sec;
  }
  if (result != nullptr) *result = now;
  return now;
}

static int OpenReal(const char* path, int flags, mode_t mode) {
  static const auto real = Real<int (*)(const char*, int, ...)>("open");
  return Enter("open").fails ? -1 : real(path, flags, mode);
}

int open(const char* path, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const mode_t mode = (flags & (O_CREAT | __O_TMPFILE)) != 0 ? va_arg(arguments, mode_t) : 0;
  va_end(arguments);
  return OpenReal(path, flags, mode);
}

int open64(const char* path, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const mode_t mode = (flags & (O_CREAT | __O_TMPFILE)) != 0 ? va_arg(arguments, mode_t) : 0;
  va_end(arguments);
  return OpenReal(path, flags, mode);
}

int rename(const char* from, const char* to) noexcept {
  static const auto real = Real<int (*)(const char*, const char*)>("rename");
  return Enter("rename").fails ? -1 : real(from, to);
}

ssize_t read(int fd, void* data, size_t size) {
  static const auto real = Real<ssize_t (*)(int, void*, size_t)>("read");
  return Enter("read").fails ? -1 : real(fd, data, size);
}

ssize_t pread(int fd, void* data, size_t size, off_t offset) {
  static const auto real = Real<ssize_t (*)(int, void*, size_t, off_t)>("pread");
  return Enter("pread").fails ? -1 : real(fd, data, size, offset);
}

ssize_t write(int fd, const void* data, size_t size) {
  static const auto real = Real<ssize_t (*)(int, const void*, size_t)>("write");
  const quarry::fake::Verdict verdict = Enter("write");
  if (verdict.fails) return -1;
  return real(fd, data, size < verdict.limit ? size : verdict.limit);
}

int fsync(int fd) {
  static const auto real = Real<int (*)(int)>("fsync");
  if (Enter("fsync").fails) return -1;
  return TheState().sync_skipped ? 0 : real(fd);
}

int fstat(int fd, struct stat* info) noexcept {
  static const auto real = Real<int (*)(int, struct stat*)>("fstat");
  return Enter("fstat").fails ? -1 : real(fd, info);
}

ssize_t readlink(const char* path, char* text, size_t size) noexcept {
  static const auto real = Real<ssize_t (*)(const char*, char*, size_t)>("readlink");
  return Enter("readlink").fails ? -1 : real(path, text, size);
}

int flock(int fd, int operation) noexcept {
  static const auto real = Real<int (*)(int, int)>("flock");
  return Enter("flock").fails ? -1 : real(fd, operation);
}

int close(int fd) {
  static const auto real = Real<int (*)(int)>("close");
  const bool fails = Enter("close").fails;
  const int error = errno;
  const int result = real(fd);
  if (!fails) return result;
  errno = error;
  return -1;
}

int chmod(const char* path, mode_t mode) noexcept {
  static const auto real = Real<int (*)(const char*, mode_t)>("chmod");
  return Enter("chmod").fails ? -1 : real(path, mode);
}

int fchmod(int fd, mode_t mode) noexcept {
  static const auto real = Real<int (*)(int, mode_t)>("fchmod");
  return Enter("fchmod").fails ? -1 : real(fd, mode);
}

int chown(const char* path, uid_t uid, gid_t gid) noexcept {
  static const auto real = Real<int (*)(const char*, uid_t, gid_t)>("chown");
  return Enter("chown").fails ? -1 : real(path, uid, gid);
}

int fchown(int fd, uid_t uid, gid_t gid) noexcept {
  static const auto real = Real<int (*)(int, uid_t, gid_t)>("fchown");
  return Enter("fchown").fails ? -1 : real(fd, uid, gid);
}

int unlink(const char* path) noexcept {
  static const auto real = Real<int (*)(const char*)>("unlink");
  return Enter("unlink").fails ? -1 : real(path);
}

uid_t geteuid() noexcept {
  static const auto real = Real<uid_t (*)()>("geteuid");
  return TheState().ids_faked ? TheState().uid.load() : real();
}

gid_t getegid() noexcept {
  static const auto real = Real<gid_t (*)()>("getegid");
  return TheState().ids_faked ? TheState().gid.load() : real();
}

int seteuid(uid_t uid) noexcept {
  static const auto real = Real<int (*)(uid_t)>("seteuid");
  if (Enter("seteuid").fails) return -1;
  if (!TheState().ids_faked) return real(uid);
  TheState().uid = uid;
  return 0;
}

int setegid(gid_t gid) noexcept {
  static const auto real = Real<int (*)(gid_t)>("setegid");
  if (Enter("setegid").fails) return -1;
  if (!TheState().ids_faked) return real(gid);
  TheState().gid = gid;
  return 0;
}

int setgroups(size_t count, const gid_t* groups) noexcept {
  static const auto real = Real<int (*)(size_t, const gid_t*)>("setgroups");
  if (Enter("setgroups").fails) return -1;
  return TheState().ids_faked ? 0 : real(count, groups);
}

}  // extern "C"
