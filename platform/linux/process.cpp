// Running programs.

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <string>
#include <vector>

#include "common/paths.h"
#include "platform/include/service.h"
#include "platform/linux/last_error.h"

namespace quarry::platform {
namespace {

constexpr char kApplianceTools[] = "/usr/tarn/";
constexpr std::size_t kMaxArguments = 4096;

// The appliance's own tools belong to the system that asks, so a private one looks for its own.
std::string ResolveProgram(const std::string& program) {
  const bool appliance_tool = program.compare(0, sizeof(kApplianceTools) - 1, kApplianceTools) == 0;
  return appliance_tool ? RootedPath(program) : program;
}

// How a child begins: no signal blocked or ignored, nothing on its input or output that is ours.
class SpawnSetup {
 public:
  SpawnSetup() {
    posix_spawnattr_init(&attributes_);
    posix_spawn_file_actions_init(&actions_);
    sigset_t none;
    sigemptyset(&none);
    sigset_t all;
    sigfillset(&all);
    posix_spawnattr_setsigmask(&attributes_, &none);
    posix_spawnattr_setsigdefault(&attributes_, &all);
    posix_spawnattr_setflags(&attributes_, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
    posix_spawn_file_actions_addopen(&actions_, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_addopen(&actions_, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
    posix_spawn_file_actions_addclosefrom_np(&actions_, STDERR_FILENO + 1);
  }
  ~SpawnSetup() {
    posix_spawn_file_actions_destroy(&actions_);
    posix_spawnattr_destroy(&attributes_);
  }
  SpawnSetup(const SpawnSetup&) = delete;
  SpawnSetup& operator=(const SpawnSetup&) = delete;

  const posix_spawnattr_t* attributes() const { return &attributes_; }
  const posix_spawn_file_actions_t* actions() const { return &actions_; }

 private:
  posix_spawnattr_t attributes_;
  posix_spawn_file_actions_t actions_;
};

// The exit status, or -1 when it did not exit by itself.
int Wait(pid_t child) {
  int status = 0;
  pid_t result;
  do {
    result = waitpid(child, &status, 0);
  } while (result < 0 && errno == EINTR);
  if (result != child || !WIFEXITED(status)) return QUARRY_PLATFORM_FAIL(kErrService);
  return WEXITSTATUS(status);
}

// `arguments` holds the program's own name and its arguments, without the null at the end.
int Run(const char* program, std::vector<char*> arguments) {
  arguments.push_back(nullptr);
  const SpawnSetup setup;
  pid_t child = -1;
  const int before = errno;
  const int error = posix_spawnp(&child, ResolveProgram(program).c_str(), setup.actions(),
                                 setup.attributes(), arguments.data(), environ);
  if (error != 0) {
    errno = error;
    return QUARRY_PLATFORM_FAIL(kErrService);
  }
  errno = before;  // spawning leaves its own, also when it succeeds
  return Wait(child);
}

// Appends the arguments up to the null pointer. False when there is none within reason.
bool TakeArguments(va_list args, std::vector<char*>* arguments) {
  while (arguments->size() < kMaxArguments) {
    char* argument = va_arg(args, char*);
    if (argument == nullptr) return true;
    arguments->push_back(argument);
  }
  errno = E2BIG;
  return false;
}

}  // namespace

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" {

int HLIBCExecl(const char* program, [[maybe_unused]] unsigned int flags, ...) {
  if (program == nullptr) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  std::vector<char*> arguments;
  va_list args;
  va_start(args, flags);
  const bool taken = TakeArguments(args, &arguments);
  va_end(args);
  if (!taken || arguments.empty()) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  return Run(program, std::move(arguments));
}

int HLIBCExec(const char* program, ...) {
  if (program == nullptr) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  std::vector<char*> arguments = {const_cast<char*>(program)};
  va_list args;
  va_start(args, program);
  const bool taken = TakeArguments(args, &arguments);
  va_end(args);
  return taken ? Run(program, std::move(arguments)) : QUARRY_PLATFORM_FAIL(kErrBadParameter);
}

}  // extern "C"
