// A worker whose formats do what a parser must never be able to do. The file's extension says what
// it tries; what came of it is reported as the file's title. The first argument says how it starts.

#include <fcntl.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/ptrace.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "daemons/tarncontentextractd/markup.h"
#include "daemons/tarncontentextractd/sandbox.h"
#include "daemons/tarncontentextractd/worker.h"
#include "daemons/tarncontentextractd/worker_protocol.h"

namespace quarry::extract {
namespace {

std::string Result(long result) {
  return result < 0 ? std::string("refused: ") + strerrorname_np(errno) : "possible";
}

long RaiseLimit() {
  const rlimit none{RLIM_INFINITY, RLIM_INFINITY};
  return setrlimit(RLIMIT_AS, &none);
}

long MapCode() {
  return mmap(nullptr, 4096, PROT_READ | PROT_EXEC, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0) ==
                 MAP_FAILED
             ? -1
             : 0;
}

long Connect() {
  const sockaddr_un address{AF_UNIX, "/dev/log"};
  return connect(kWorkerChannel, reinterpret_cast<const sockaddr*>(&address), sizeof(address));
}

long Stat() {
  struct stat status {};
  return stat("/etc/passwd", &status);
}

// All that this process holds open.
std::string Descriptors() {
  std::string held;
  for (int fd = 0; fd < 1024; ++fd) {
    if (lseek(fd, 0, SEEK_CUR) >= 0 || errno != EBADF) held += std::to_string(fd) + " ";
  }
  return held;
}

std::string Try(const std::string& what, Source& source) {
  char* const none[] = {nullptr};
  if (what == "socket") return Result(socket(AF_INET, SOCK_STREAM, 0));
  if (what == "localsocket") return Result(socket(AF_UNIX, SOCK_DGRAM, 0));
  if (what == "create") return Result(open("/tmp/planted", O_CREAT | O_WRONLY, 0600));
  if (what == "read") return Result(open("/etc/passwd", O_RDONLY));
  if (what == "write") return Result(write(source.fd(), "x", 1));
  if (what == "truncate") return Result(ftruncate(source.fd(), 0));
  if (what == "chmod") return Result(fchmod(source.fd(), 0777));
  if (what == "exec") return Result(execve("/bin/true", none, none));
  if (what == "fork") return Result(fork());
  if (what == "kill") return Result(kill(getppid(), SIGTERM));
  if (what == "trace") return Result(ptrace(PTRACE_ATTACH, getppid(), nullptr, nullptr));
  if (what == "root") return Result(setuid(0));
  if (what == "nice") return Result(nice(-1));
  if (what == "limit") return Result(RaiseLimit());
  if (what == "code") return Result(MapCode());
  if (what == "remove") return Result(unlink("/tmp/planted"));
  if (what == "move") return Result(rename("/tmp/planted", "/tmp/elsewhere"));
  if (what == "directory") return Result(mkdir("/tmp/planted", 0700));
  if (what == "talk") return Result(write(STDERR_FILENO, "x", 1));
  if (what == "connect") return Result(Connect());
  if (what == "send") return Result(send(kWorkerChannel, "x", 1, MSG_NOSIGNAL));
  if (what == "stat") return Result(Stat());
  if (what == "list") return Result(syscall(SYS_getdents64, source.fd(), nullptr, 0));
  if (what == "descriptors") return Descriptors();
  if (what == "pid") return std::to_string(getpid());
  return "unknown";
}

[[noreturn]] void Stall() {
  for (;;) pause();
}

// All the memory there is, touched.
void Devour() {
  std::vector<std::unique_ptr<char[]>> held;
  for (;;) {
    held.push_back(std::make_unique<char[]>(std::size_t{16} << 20));
    std::memset(held.back().get(), 1, std::size_t{16} << 20);
  }
}

int files_seen = 0;

class HostileExtractor : public Extractor {
 public:
  const char* Name() const override { return "hostile"; }
  bool Recognizes(std::string_view) const override { return false; }
  bool Claims(std::string_view) const override { return true; }

  void Extract(Source& source, Extraction& out) const override {
    const std::string& what = source.extension();
    // A worker first tries its formats on bytes of its own.
    if (source.fd() >= 0) ++files_seen;
    if (what == "crash") raise(SIGSEGV);
    if (what == "abort") std::abort();
    if (what == "leave") _exit(0);
    if (what == "stall") Stall();
    if (what == "spin") Spin();
    if (what == "memory") Devour();
    if (what == "throw") Throw(out);
    if (what == "garbage") SendMessage(kWorkerChannel, MakeMessage("no fields at all"));
    if (what == "other") AnswerFor(files_seen + 5);
    if (what == "endless") ClaimMuch();
    if (what == "ahead") AnswerTwice();
    if (what == "usedcrash" && files_seen > 1) raise(SIGKILL);
    if (what == "slow") TakeTime();
    if (what == "overrule") Overrule(out);
    if (what == "much") out.text().Append(std::string(std::size_t{6} << 20, 'w'));
    if (what == "good" || what == "usedcrash") out.text().Append(source.Bytes());
    out.Set(kTitleField, Try(what, source));
  }

 private:
  [[noreturn]] static void Spin() {
    for (volatile unsigned counter = 0;;) counter = counter + 1;
  }
  // Longer than an answer may be held back.
  static void TakeTime() {
    const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(50);
    while (std::chrono::steady_clock::now() < end) continue;
  }
  // Fields that are not a parser's to say.
  static void Overrule(Extraction& out) {
    out.Set("TARNMDPath", "/etc/passwd");
    out.Set("TARNMDFSSize", "much");
  }
  static void Throw(Extraction& out) {
    out.text().Append("what was found before");
    throw std::runtime_error("broken file");
  }
  // So that what comes next is one answer late.
  static void AnswerTwice() {
    AnswerFor(files_seen - 1);
    AnswerFor(files_seen - 1);
  }
  // Requests are counted from 0.
  static void AnswerFor(int number) {
    const std::string answer =
        MakeAnswer(static_cast<std::uint32_t>(number), {{kTitleField, std::string("early")}});
    if (!SendMessage(kWorkerChannel, answer)) _exit(1);
  }
  // Claims an answer of 4 GiB.
  [[noreturn]] static void ClaimMuch() {
    const std::uint32_t size = 0xFFFFFFFF;
    if (write(kWorkerChannel, &size, sizeof(size)) < 0) _exit(1);
    Stall();
  }
};

int Main(const std::string& mode) {
  const int channel = kWorkerChannel;
  if (mode == "dies") return 7;
  if (mode == "silent") Stall();
  if (mode == "talks") return SendMessage(channel, MakeMessage("nonsense")) ? 0 : 1;
  if (mode == "open") return Announce(channel, FindGap()) ? 0 : kExitNotClosed;
  Registry registry;
  registry.Add(std::make_unique<HostileExtractor>());
  return RunWorker(registry, channel);
}

}  // namespace
}  // namespace quarry::extract

int main(int argc, char** argv) {
  return quarry::extract::Main(argc > 1 ? argv[1] : "");
}
