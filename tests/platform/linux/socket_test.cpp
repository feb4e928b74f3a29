#include "platform/include/socket.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <thread>

#include "tests/platform/linux/fake_daemon.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace tarndaemon {
namespace {

using quarry::test::FakeDaemon;
using quarry::test::TempDir;

// A connection whose other end is in the test's hands.
class PairConnection : public SockConnection {
 public:
  PairConnection() {
    int ends[2];
    EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
    fd_ = ends[0];
    other_ = ends[1];
  }
  ~PairConnection() override { CloseOther(); }

  int fd() const { return fd_; }
  int other() const { return other_; }
  void CloseOther() {
    if (other_ >= 0) close(other_);
    other_ = -1;
  }

 private:
  int other_;
};

TEST(SockConnectionTest, ExchangesWholeMessages) {
  TempDir dir;
  FakeDaemon daemon(
      dir / "s", [](const std::string& request) { return FakeDaemon::Frame(request + request); });
  DomainSockConnection connection(dir / "s");
  ASSERT_TRUE(connection.Connect());
  const std::string big(2'500'000, 'x');
  for (const std::string& message :
       {std::string("ab"), std::string(), std::string("\0\n", 2), big}) {
    std::string reply = "old";
    ASSERT_TRUE(connection.Send(message));
    ASSERT_TRUE(connection.Recv(reply));
    EXPECT_TRUE(reply == message + message);
  }
}

TEST(SockConnectionTest, SendsTheLengthInHostOrder) {
  PairConnection connection;
  ASSERT_TRUE(connection.Send("hello"));
  char bytes[9];
  ASSERT_EQ(recv(connection.other(), bytes, sizeof(bytes), MSG_WAITALL), 9);
  EXPECT_EQ(std::string(bytes, 9), FakeDaemon::Frame("hello"));
}

TEST(SockConnectionTest, ReceivesInPieces) {
  PairConnection connection;
  std::thread sender([&] {
    for (const char c : FakeDaemon::Frame("slowly")) {
      send(connection.other(), &c, 1, MSG_NOSIGNAL);
    }
  });
  std::string message;
  EXPECT_TRUE(connection.Recv(message));
  EXPECT_EQ(message, "slowly");
  sender.join();
}

TEST(SockConnectionTest, FailsWhenTheOtherEndCloses) {
  for (const std::string& sent :
       {std::string(), std::string("\1"), FakeDaemon::Frame("hello").substr(0, 6)}) {
    PairConnection connection;
    ASSERT_EQ(send(connection.other(), sent.data(), sent.size(), 0),
              static_cast<ssize_t>(sent.size()));
    connection.CloseOther();
    std::string message = "old";
    EXPECT_FALSE(connection.Recv(message));
    EXPECT_EQ(errno, ECONNRESET);
    EXPECT_EQ(message, "");
  }
}

TEST(SockConnectionTest, RefusesAMessageThatClaimsTooMuch) {
  PairConnection connection;
  const std::uint32_t size = (256u << 20) + 1;
  ASSERT_EQ(send(connection.other(), &size, sizeof(size), 0), 4);
  std::string message;
  EXPECT_FALSE(connection.Recv(message));
  EXPECT_EQ(errno, EMSGSIZE);
}

TEST(SockConnectionTest, RaisesNoSignalOnAClosedConnection) {
  PairConnection connection;
  connection.CloseOther();
  EXPECT_FALSE(connection.Send("x"));
  EXPECT_EQ(errno, EPIPE);
}

void Nothing(int) {}

TEST(SockConnectionTest, GoesOnWhenASignalInterrupts) {
  struct sigaction action {};
  struct sigaction old {};
  action.sa_handler = Nothing;  // without SA_RESTART
  ASSERT_EQ(sigaction(SIGUSR1, &action, &old), 0);
  PairConnection connection;
  const pthread_t receiver = pthread_self();
  std::thread sender([&] {
    for (const char c : FakeDaemon::Frame(std::string(500, 'x'))) {
      pthread_kill(receiver, SIGUSR1);
      send(connection.other(), &c, 1, MSG_NOSIGNAL);
    }
  });
  std::string message;
  EXPECT_TRUE(connection.Recv(message));
  EXPECT_EQ(message, std::string(500, 'x'));
  sender.join();
  sigaction(SIGUSR1, &old, nullptr);
}

TEST(SockConnectionTest, DisconnectMayBeRepeatedAndEndsTheConnection) {
  PairConnection connection;
  connection.Disconnect();
  connection.Disconnect();
  EXPECT_EQ(connection.fd(), -1);
  char byte;
  EXPECT_EQ(recv(connection.other(), &byte, 1, 0), 0);
  std::string message;
  EXPECT_FALSE(connection.Send("x"));
  EXPECT_FALSE(connection.Recv(message));
  EXPECT_EQ(errno, EBADF);
}

TEST(DomainSockConnectionTest, FailsWithTheReason) {
  TempDir dir;
  DomainSockConnection missing(dir / "s");
  EXPECT_FALSE(missing.Connect());
  EXPECT_EQ(errno, ENOENT);
  quarry::test::WriteFile(dir / "file", "");
  DomainSockConnection file(dir / "file");
  EXPECT_FALSE(file.Connect());
  EXPECT_EQ(errno, ECONNREFUSED);
  DomainSockConnection too_long("/" + std::string(107, 'a'));
  EXPECT_FALSE(too_long.Connect());
  EXPECT_EQ(errno, ENAMETOOLONG);
  DomainSockConnection empty("");
  EXPECT_FALSE(empty.Connect());
  EXPECT_EQ(errno, EINVAL);
  DomainSockConnection nul(std::string("/a\0b", 4));
  EXPECT_FALSE(nul.Connect());
  EXPECT_EQ(errno, EINVAL);
}

TEST(DomainSockConnectionTest, ConnectsAnewAndLeaksNoDescriptor) {
  TempDir dir;
  FakeDaemon daemon(dir / "s",
                    [](const std::string& request) { return FakeDaemon::Frame(request); });
  const std::size_t before = quarry::test::ListDir("/proc/self/fd").size();
  {
    DomainSockConnection connection(dir / "s");
    for (int i = 0; i < 5; ++i) {
      ASSERT_TRUE(connection.Connect());
      std::string reply;
      ASSERT_TRUE(connection.Send("x") && connection.Recv(reply));
    }
    DomainSockConnection missing(dir / "missing");
    EXPECT_FALSE(missing.Connect());
  }
  EXPECT_EQ(daemon.Connections(), 5);
  EXPECT_TRUE(quarry::test::WaitUntil(
      [&] { return quarry::test::ListDir("/proc/self/fd").size() == before; }));
}

}  // namespace
}  // namespace tarndaemon
