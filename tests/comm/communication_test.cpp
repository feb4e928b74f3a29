#include "comm/communication.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <pthread.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <csignal>
#include <cstdint>
#include <cstring>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "common/paths.h"
#include "common/unique_fd.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"
#include "tests/support/thrown.h"

namespace {

std::atomic<bool> fail_setsockopt{false};
std::atomic<int> receive_timeouts{0};
thread_local timeval send_timeout{};  // as this thread set it last

}  // namespace

// Takes the C library's place in this program, so that it can be watched and made to fail.
extern "C" int setsockopt(int fd, int level, int name, const void* value, socklen_t size) noexcept {
  if (fail_setsockopt) {
    errno = ENOPROTOOPT;
    return -1;
  }
  if (name == SO_RCVTIMEO) ++receive_timeouts;
  if (name == SO_SNDTIMEO) memcpy(&send_timeout, value, sizeof(send_timeout));
  return static_cast<int>(syscall(SYS_setsockopt, fd, level, name, value, size));
}

namespace quarry::fileindex {
namespace {

using std::chrono::seconds;
using test::Thrown;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

std::string Reason(const char* call, int error_number) {
  return std::string(call) + " failed, reason=" + strerror(error_number);
}

class CommunicationTest : public fake::FakePlatformTest {
 protected:
  ~CommunicationTest() override { fail_setsockopt = false; }
};

// ---- Buffers

class Pipe {
 public:
  Pipe() {
    int fds[2];
    EXPECT_EQ(pipe2(fds, O_CLOEXEC), 0);
    reader.Reset(fds[0]);
    writer.Reset(fds[1]);
  }
  UniqueFd reader;
  UniqueFd writer;
};

std::string Pattern(size_t size) {
  std::string text;
  for (size_t i = 0; i < size; ++i) text.push_back(static_cast<char>(i * 31 + i / 251));
  return text;
}

std::string Read(int fd, size_t size) {
  std::string text(size, '\0');
  BufferRead(fd, static_cast<unsigned int>(size), reinterpret_cast<unsigned char*>(text.data()));
  return text;
}

void Write(int fd, const std::string& text) {
  BufferWrite(fd, static_cast<unsigned int>(text.size()),
              reinterpret_cast<const unsigned char*>(text.data()));
}

TEST_F(CommunicationTest, WholeBuffersPassThroughAPipe) {
  for (const size_t size : {1u, 2u, 1023u, 1024u, 1025u, 5000u}) {
    const Pipe pipe;
    Write(pipe.writer.get(), Pattern(size));
    EXPECT_EQ(Read(pipe.reader.get(), size), Pattern(size)) << size;
  }
}

TEST_F(CommunicationTest, BuffersLargerThanThePipe) {
  const Pipe pipe;
  const std::string text = Pattern(1000000);
  std::thread writer([&] { Write(pipe.writer.get(), text); });
  EXPECT_EQ(Read(pipe.reader.get(), text.size()), text);
  writer.join();
}

TEST_F(CommunicationTest, PiecesOfAWriteAreAtMost1024Bytes) {
  const Pipe pipe;
  Write(pipe.writer.get(), Pattern(2049));
  EXPECT_EQ(fake::SystemCallCount("write"), 3);
}

TEST_F(CommunicationTest, PiecesOfAReadAreAtMost1024Bytes) {
  const Pipe pipe;
  Write(pipe.writer.get(), Pattern(2049));
  EXPECT_EQ(Read(pipe.reader.get(), 2049), Pattern(2049));
  EXPECT_EQ(fake::SystemCallCount("read"), 3);
}

TEST_F(CommunicationTest, NothingToDoTouchesNoDescriptor) {
  BufferRead(-1, 0, nullptr);
  BufferWrite(-1, 0, nullptr);
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(CommunicationTest, ReadAndWriteFailures) {
  unsigned char byte = 0;
  const Error read_error = Thrown([&] { BufferRead(-1, 1, &byte); });
  EXPECT_EQ(read_error.code(), 502);
  EXPECT_EQ(read_error.reason(), Reason("read", EBADF));
  const Error write_error = Thrown([&] { BufferWrite(-1, 1, &byte); });
  EXPECT_EQ(write_error.code(), 502);
  EXPECT_EQ(write_error.reason(), Reason("write", EBADF));
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(CommunicationTest, BuffersThatPassLeaveErrnoAlone) {
  const Pipe pipe;
  errno = EIO;
  Write(pipe.writer.get(), "ab");
  EXPECT_EQ(Read(pipe.reader.get(), 2), "ab");
  EXPECT_EQ(errno, EIO);
}

TEST_F(CommunicationTest, AWriteThatWritesNothingFails) {
  const Pipe pipe;
  fake::CutWrite(1, 0);
  const Error error = Thrown([&] { Write(pipe.writer.get(), "x"); });
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), Reason("write", 0));
}

TEST_F(CommunicationTest, ShortWritesAreContinued) {
  const Pipe pipe;
  fake::CutWrite(1, 3);
  fake::CutWrite(3, 1);
  Write(pipe.writer.get(), Pattern(2000));
  EXPECT_EQ(Read(pipe.reader.get(), 2000), Pattern(2000));
}

TEST_F(CommunicationTest, TenInterruptionsOfAReadAreBorne) {
  const Pipe pipe;
  Write(pipe.writer.get(), "ab");
  for (int i = 1; i <= 10; ++i) fake::FailSystemCall("read", i, EINTR);
  EXPECT_EQ(Read(pipe.reader.get(), 2), "ab");
}

TEST_F(CommunicationTest, TheEleventhInterruptionOfAReadFails) {
  const Pipe pipe;
  Write(pipe.writer.get(), "ab");
  fake::FailEverySystemCall("read", EINTR);
  const Error error = Thrown([&] { Read(pipe.reader.get(), 2); });
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), Reason("read", EINTR));
  EXPECT_EQ(fake::SystemCallCount("read"), 11);
}

TEST_F(CommunicationTest, InterruptionsOfAReadAreCountedOverTheWholeCall) {
  Pipe pipe;
  Write(pipe.writer.get(), "a");
  pipe.writer.Reset();
  // Six before the byte that is there, and more once the end of the stream was met.
  for (int i = 1; i <= 6; ++i) fake::FailSystemCall("read", i, EINTR);
  fake::OnSleep([](std::chrono::microseconds) { fake::FailEverySystemCall("read", EINTR); });
  const Error error = Thrown([&] { Read(pipe.reader.get(), 2); });
  EXPECT_EQ(error.reason(), Reason("read", EINTR));
  EXPECT_EQ(fake::SystemCallCount("read"), 6 + 2 + 5);
  EXPECT_THAT(fake::Sleeps(), SizeIs(1));
}

TEST_F(CommunicationTest, TenInterruptionsOfAWriteAreBorne) {
  const Pipe pipe;
  for (int i = 1; i <= 10; ++i) fake::FailSystemCall("write", i, EINTR);
  Write(pipe.writer.get(), Pattern(3000));
  EXPECT_EQ(Read(pipe.reader.get(), 3000), Pattern(3000));
}

TEST_F(CommunicationTest, TheEleventhInterruptionOfAWriteFails) {
  const Pipe pipe;
  fake::FailEverySystemCall("write", EINTR);
  const Error error = Thrown([&] { Write(pipe.writer.get(), "x"); });
  EXPECT_EQ(error.reason(), Reason("write", EINTR));
  EXPECT_EQ(fake::SystemCallCount("write"), 11);
}

TEST_F(CommunicationTest, TheEndOfAStreamIsWaitedOutWithPauses) {
  const test::TempDir dir;
  test::WriteFile(dir / "growing", "ab");
  const UniqueFd fd(open((dir / "growing").c_str(), O_RDONLY | O_CLOEXEC));
  fake::OnSleep([&](std::chrono::microseconds length) {
    EXPECT_GT(length.count(), 0);
    EXPECT_LE(length, seconds(1));
    if (fake::Sleeps().size() == 5) test::WriteFile(dir / "growing", "abcd");
  });
  EXPECT_EQ(Read(fd.get(), 4), "abcd");
  EXPECT_THAT(fake::Sleeps(), SizeIs(5));
}

// ---- SIGPIPE

bool IsSigpipePending() {
  sigset_t pending;
  sigpending(&pending);
  return sigismember(&pending, SIGPIPE) == 1;
}

class Sigpipe : public CommunicationTest {
 protected:
  // A signal that gets through ends this program.
  Sigpipe() { saved_ = signal(SIGPIPE, SIG_DFL); }
  ~Sigpipe() override { signal(SIGPIPE, saved_); }

 private:
  sighandler_t saved_;
};

TEST_F(Sigpipe, IsNotRaisedByAPipe) {
  Pipe pipe;
  pipe.reader.Reset();
  EXPECT_EQ(Thrown([&] { Write(pipe.writer.get(), "x"); }).reason(), Reason("write", EPIPE));
  EXPECT_FALSE(IsSigpipePending());
}

TEST_F(Sigpipe, IsNotRaisedByASocket) {
  int fds[2];
  ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds), 0);
  const UniqueFd ours(fds[0]);
  close(fds[1]);
  EXPECT_EQ(Thrown([&] { Write(ours.get(), "x"); }).reason(), Reason("write", EPIPE));
  EXPECT_FALSE(IsSigpipePending());
}

TEST_F(Sigpipe, OfSomebodyElseStaysPending) {
  sigset_t sigpipe;
  sigset_t saved;
  sigemptyset(&sigpipe);
  sigaddset(&sigpipe, SIGPIPE);
  pthread_sigmask(SIG_BLOCK, &sigpipe, &saved);
  pthread_kill(pthread_self(), SIGPIPE);
  Pipe pipe;
  Write(pipe.writer.get(), "x");
  EXPECT_TRUE(IsSigpipePending());
  int taken = 0;
  EXPECT_EQ(sigwait(&sigpipe, &taken), 0);
  pthread_sigmask(SIG_SETMASK, &saved, nullptr);
}

TEST_F(Sigpipe, StaysBlockedForACallerThatBlocksIt) {
  sigset_t sigpipe;
  sigset_t saved;
  sigset_t now;
  sigemptyset(&sigpipe);
  sigaddset(&sigpipe, SIGPIPE);
  pthread_sigmask(SIG_BLOCK, &sigpipe, &saved);
  Pipe pipe;
  Write(pipe.writer.get(), "x");
  pthread_sigmask(SIG_SETMASK, &saved, &now);
  EXPECT_EQ(sigismember(&now, SIGPIPE), 1);
}

// ---- Commands

std::string SocketPath() {
  return RootedPath("/var/run/fileindexd.sock");
}

UniqueFd Listen() {
  UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  SocketPath().copy(address.sun_path, sizeof(address.sun_path) - 1);
  EXPECT_EQ(bind(fd.get(), reinterpret_cast<sockaddr*>(&address), sizeof(address)), 0);
  EXPECT_EQ(listen(fd.get(), 8), 0);
  return fd;
}

std::string LengthOf(std::uint32_t length) {
  return std::string(reinterpret_cast<const char*>(&length), sizeof(length));
}

std::string ReadFrame(int fd) {
  std::uint32_t length = 0;
  const std::string head = Read(fd, sizeof(length));
  memcpy(&length, head.data(), sizeof(length));
  return Read(fd, length);
}

// Answers one connection with `answer`, on a thread of its own.
class Daemon {
 public:
  explicit Daemon(std::function<void(int peer)> answer)
      : listener_(Listen()), thread_([this, answer] {
          const UniqueFd peer(accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
          answer(peer.get());
        }) {}
  ~Daemon() { Join(); }
  void Join() {
    if (thread_.joinable()) thread_.join();
  }

 private:
  UniqueFd listener_;
  std::thread thread_;
};

// Sends one command to a daemon that answers `reply`, and returns what it got.
std::string SentTo(const std::string& command, const Json::Value& data, const std::string& reply) {
  std::string frame;
  Daemon daemon([&](int peer) {
    frame = ReadFrame(peer);
    Write(peer, reply);
  });
  SendCommandToDaemon(command, data);
  daemon.Join();
  return frame;
}

TEST_F(CommunicationTest, ACommandIsFramedWithItsNul) {
  Json::Value data;
  data["share_name"] = "phötö";
  const std::string text = R"({"data":{"share_name":"phötö"},"type":"notify_setting_changed"})";
  EXPECT_EQ(SentTo("notify_setting_changed", data, LengthOf(2) + "ok"), text + '\0');
  EXPECT_THAT(fake::Logs(), IsEmpty());
  EXPECT_THAT(fake::Sleeps(), IsEmpty());
}

TEST_F(CommunicationTest, NullDataIsSentAsNull) {
  EXPECT_EQ(SentTo("resume", Json::Value(), LengthOf(0)),
            std::string(R"({"data":null,"type":"resume"})") + '\0');
}

TEST_F(CommunicationTest, ALargeCommandArrivesWhole) {
  const Json::Value data(std::string(300000, 'x'));
  const std::string frame = SentTo("c", data, LengthOf(0));
  EXPECT_EQ(frame.size(), 300000 + strlen(R"({"data":"","type":"c"})") + 1);
}

TEST_F(CommunicationTest, TheReplyIsReadToItsEnd) {
  std::atomic<bool> all_taken{false};
  Daemon daemon([&](int peer) {
    ReadFrame(peer);
    Write(peer, LengthOf(3000000) + std::string(3000000, 'r'));
    all_taken = true;
  });
  SendCommandToDaemon("c", Json::Value());
  daemon.Join();
  EXPECT_TRUE(all_taken);
}

long PeakMemoryKiB() {
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  return usage.ru_maxrss;
}

TEST_F(CommunicationTest, AClaimedLengthTakesNoMemory) {
  const long before = PeakMemoryKiB();
  Daemon daemon([&](int peer) {
    ReadFrame(peer);
    Write(peer, LengthOf(0xffffffffu) + "a little");
  });
  // The daemon is gone and the caller reads on; this ends it.
  fake::OnSleep([](std::chrono::microseconds) { fake::FailEverySystemCall("read", EINTR); });
  const Error error = Thrown([] { SendCommandToDaemon("c", Json::Value()); });
  EXPECT_EQ(error.reason(), Reason("read", EINTR));
  EXPECT_THAT(fake::Sleeps(), SizeIs(1));
  EXPECT_LT(PeakMemoryKiB() - before, 100 * 1024);
}

TEST_F(CommunicationTest, WithoutASocketFiveAttemptsAreMade) {
  const Error error = Thrown([] { SendCommandToDaemon("c", Json::Value()); });
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), Reason("write", ENOTCONN));
  EXPECT_THAT(fake::Sleeps(), ElementsAre(seconds(1), seconds(1), seconds(1), seconds(1)));
  EXPECT_THAT(fake::Logs(), IsEmpty());
  EXPECT_EQ(fake::SystemCallCount("close"), 1);
}

TEST_F(CommunicationTest, ADaemonThatStartsMeanwhileIsReached) {
  std::unique_ptr<Daemon> daemon;
  std::string frame;
  fake::OnSleep([&](std::chrono::microseconds) {
    if (fake::Sleeps().size() != 4) return;
    daemon = std::make_unique<Daemon>([&](int peer) {
      frame = ReadFrame(peer);
      Write(peer, LengthOf(0));
    });
  });
  SendCommandToDaemon("c", Json::Value());
  ASSERT_NE(daemon, nullptr);
  daemon->Join();
  EXPECT_EQ(frame, std::string(R"({"data":null,"type":"c"})") + '\0');
}

TEST_F(CommunicationTest, ThreadsDoNotDisturbEachOther) {
  constexpr int kThreads = 4;
  constexpr int kCommands = 20;
  const UniqueFd listener = Listen();
  std::thread daemon([&] {
    for (int i = 0; i < kThreads * kCommands; ++i) {
      const UniqueFd peer(accept4(listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
      EXPECT_EQ(ReadFrame(peer.get()), std::string(R"({"data":null,"type":"c"})") + '\0');
      Write(peer.get(), LengthOf(1) + "k");
    }
  });
  std::vector<std::thread> callers;
  for (int i = 0; i < kThreads; ++i) {
    callers.emplace_back([] {
      for (int k = 0; k < kCommands; ++k) SendCommandToDaemon("c", Json::Value());
    });
  }
  for (std::thread& caller : callers) caller.join();
  daemon.join();
}

TEST_F(CommunicationTest, ASocketThatNobodyServesIsNotWaitedFor) {
  Listen();  // closed again at once; the file stays
  const Error error = Thrown([] { SendCommandToDaemon("c", Json::Value()); });
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), Reason("write", ENOTCONN));
  EXPECT_THAT(fake::Sleeps(), IsEmpty());
}

TEST_F(CommunicationTest, NoSocketLeft) {
  rlimit saved{};
  ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &saved), 0);
  rlimit none = saved;
  none.rlim_cur = 0;
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &none), 0);
  const Error error = Thrown([] { SendCommandToDaemon("c", Json::Value()); });
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &saved), 0);
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), Reason("socket", EMFILE));
  ASSERT_THAT(fake::Logs(), SizeIs(1));
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("communication", 1, "SendCommandToDaemon")) +
                "Failed [0 > (fd_socket = socket(PF_UNIX, SOCK_STREAM, 0))], reason: " +
                Reason("socket", EMFILE) + " [err: " + strerror(EMFILE) + "]");
}

TEST_F(CommunicationTest, NoSendTimeout) {
  fail_setsockopt = true;
  const UniqueFd listener = Listen();
  const Error error = Thrown([] { SendCommandToDaemon("c", Json::Value()); });
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), Reason("setsockopt", ENOPROTOOPT));
  ASSERT_THAT(fake::Logs(), SizeIs(1));
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("communication", 1, "SendCommandToDaemon")) +
                "Failed [0 > setsockopt(fd_socket, SOL_SOCKET, SO_SNDTIMEO, (char *)&timeout, "
                "sizeof(timeout))], reason: " +
                Reason("setsockopt", ENOPROTOOPT) + " [err: " + strerror(ENOPROTOOPT) + "]");
  EXPECT_EQ(fake::SystemCallCount("close"), 1);
}

TEST_F(CommunicationTest, OnlySendingIsLimitedToASecond) {
  send_timeout = {};
  SentTo("c", Json::Value(), LengthOf(0));
  EXPECT_EQ(send_timeout.tv_sec, 1);
  EXPECT_EQ(send_timeout.tv_usec, 0);
  EXPECT_EQ(receive_timeouts, 0);
}

TEST_F(CommunicationTest, ADaemonThatStopsReadingFailsTheWrite) {
  const UniqueFd listener = Listen();
  const Error error =
      Thrown([] { SendCommandToDaemon("c", Json::Value(std::string(4000000, 'x'))); });
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), Reason("write", EAGAIN));
  EXPECT_EQ(fake::SystemCallCount("close"), 1);
}

}  // namespace
}  // namespace quarry::fileindex
