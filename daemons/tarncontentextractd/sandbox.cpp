#include "daemons/tarncontentextractd/sandbox.h"

#include <fcntl.h>
#include <grp.h>
#include <linux/capability.h>
#include <seccomp.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <cstring>

namespace quarry::extract {
namespace {

// The account that owns nothing.
constexpr uid_t kNobody = 65534;
constexpr gid_t kNogroup = 65534;

// Room for the standard three, the channel and one file.
constexpr rlim_t kMaxDescriptors = 8;

bool Limit(__rlimit_resource resource, rlim_t value) {
  const rlimit limit{value, value};
  return setrlimit(resource, &limit) == 0;
}

bool LimitResources() {
  return Limit(RLIMIT_CORE, 0) && Limit(RLIMIT_FSIZE, 0) && Limit(RLIMIT_NPROC, 0) &&
         Limit(RLIMIT_MEMLOCK, 0) && Limit(RLIMIT_MSGQUEUE, 0) &&
         Limit(RLIMIT_NOFILE, kMaxDescriptors) && Limit(RLIMIT_CPU, kWorkerCpuSeconds) &&
         Limit(RLIMIT_AS, kWorkerMemoryBytes);
}

bool DropCapabilities() {
  __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
  std::array<__user_cap_data_struct, 2> none{};
  return syscall(SYS_capset, &header, none.data()) == 0;
}

bool DropAccount() {
  if (geteuid() == 0) {
    for (unsigned long capability = 0; prctl(PR_CAPBSET_DROP, capability, 0, 0, 0) == 0;) {
      ++capability;
    }
    if (setgroups(0, nullptr) != 0 || setresgid(kNogroup, kNogroup, kNogroup) != 0 ||
        setresuid(kNobody, kNobody, kNobody) != 0) {
      return false;
    }
  }
  return DropCapabilities() && prctl(PR_SET_DUMPABLE, 0, 0, 0, 0) == 0 &&
         prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0;
}

// A list of system calls under construction.
class Filter {
 public:
  // All that is not allowed fails with EPERM, so that a library which merely tries does go on.
  Filter() : context_(seccomp_init(SCMP_ACT_ERRNO(EPERM))), good_(context_ != nullptr) {}
  ~Filter() {
    if (context_ != nullptr) seccomp_release(context_);
  }
  Filter(const Filter&) = delete;
  Filter& operator=(const Filter&) = delete;

  void Allow(int call) {
    good_ = good_ && seccomp_rule_add(context_, SCMP_ACT_ALLOW, call, 0) == 0;
  }
  // Only where argument `index` is `value`.
  void AllowWith(int call, unsigned index, std::uint64_t value) {
    AllowIf(call, scmp_arg_cmp{index, SCMP_CMP_EQ, value, 0});
  }
  // Only where argument `index` has none of the `bits`.
  void AllowWithout(int call, unsigned index, std::uint64_t bits) {
    AllowIf(call, scmp_arg_cmp{index, SCMP_CMP_MASKED_EQ, bits, 0});
  }
  bool Load() { return good_ && seccomp_load(context_) == 0; }

 private:
  void AllowIf(int call, const scmp_arg_cmp& condition) {
    good_ = good_ && seccomp_rule_add(context_, SCMP_ACT_ALLOW, call, 1, condition) == 0;
  }

  scmp_filter_ctx context_;
  bool good_;
};

bool FilterCalls(int channel) {
  Filter filter;
  for (const int call : {SCMP_SYS(read),
                         SCMP_SYS(pread64),
                         SCMP_SYS(close),
                         SCMP_SYS(fstat),
                         SCMP_SYS(lseek),
                         SCMP_SYS(munmap),
                         SCMP_SYS(mremap),
                         SCMP_SYS(brk),
                         SCMP_SYS(madvise),
                         SCMP_SYS(futex),
                         SCMP_SYS(exit),
                         SCMP_SYS(exit_group),
                         SCMP_SYS(rt_sigreturn),
                         SCMP_SYS(rt_sigprocmask),
                         SCMP_SYS(restart_syscall),
                         SCMP_SYS(getpid),
                         SCMP_SYS(gettid),
                         SCMP_SYS(clock_gettime),
                         SCMP_SYS(gettimeofday),
                         SCMP_SYS(getrandom),
                         SCMP_SYS(setitimer),
                         SCMP_SYS(sched_yield)}) {
    filter.Allow(call);
  }
  filter.AllowWith(SCMP_SYS(write), 0, static_cast<std::uint64_t>(channel));
  filter.AllowWith(SCMP_SYS(recvmsg), 0, static_cast<std::uint64_t>(channel));
  // abort() ends the process by a signal to itself.
  filter.AllowWith(SCMP_SYS(tgkill), 0, static_cast<std::uint64_t>(getpid()));
  filter.AllowWithout(SCMP_SYS(mmap), 2, PROT_EXEC);
  filter.AllowWithout(SCMP_SYS(mprotect), 2, PROT_EXEC);
  return filter.Load();
}

// Whether a call was refused, as everything beyond the list is. What came of one that was not is
// given back.
bool Refused(long result, long (*undo)(long)) {
  if (result < 0) return errno == EPERM;
  undo(result);
  return false;
}

long CloseFd(long fd) {
  return close(static_cast<int>(fd));
}

long EndChild(long pid) {
  if (pid == 0) _exit(0);
  return 0;
}

long Nothing(long) {
  return 0;
}

bool CannotMapCode() {
  void* code = mmap(nullptr, 4096, PROT_READ | PROT_EXEC, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (code != MAP_FAILED) munmap(code, 4096);
  return code == MAP_FAILED;
}

}  // namespace

std::string CloseSandbox(int channel) {
  if (!kSandboxed) return std::string();
  if (!LimitResources()) return "resource limits: " + std::string(std::strerror(errno));
  if (!DropAccount()) return "dropping the account: " + std::string(std::strerror(errno));
  if (!FilterCalls(channel)) return "the filter of system calls";
  return std::string();
}

std::string FindGap() {
  if (!kSandboxed) return std::string();
  char* const no_arguments[] = {nullptr};
  if (!Refused(socket(AF_INET, SOCK_STREAM, 0), CloseFd)) return "a network socket was possible";
  if (!Refused(socket(AF_UNIX, SOCK_STREAM, 0), CloseFd)) return "a local socket was possible";
  if (!Refused(open("/dev/null", O_WRONLY | O_CLOEXEC), CloseFd)) return "writing was possible";
  if (!Refused(open("/", O_RDONLY | O_CLOEXEC), CloseFd)) return "opening files was possible";
  if (!Refused(unlink("/nonexistent/name"), Nothing)) return "removing files was possible";
  if (!Refused(execve("/nonexistent/name", no_arguments, no_arguments), Nothing)) {
    return "starting programs was possible";
  }
  if (!Refused(syscall(SYS_clone, SIGCHLD, 0, 0, 0, 0), EndChild)) return "a child was possible";
  if (!Refused(kill(getppid(), 0), Nothing)) return "signals were possible";
  if (!CannotMapCode()) return "new code was possible";
  return std::string();
}

}  // namespace quarry::extract
