#include "daemons/common/stop_signal.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <unistd.h>

#include <csignal>

#include "daemons/common/socket_server.h"
#include "tests/support/temp_dir.h"

namespace quarry::daemon {
namespace {

bool IsReadable(int fd) {
  pollfd poll_fd{fd, POLLIN, 0};
  return poll(&poll_fd, 1, 0) == 1;
}

bool IsBlocked(int signal) {
  sigset_t mask;
  pthread_sigmask(SIG_BLOCK, nullptr, &mask);
  return sigismember(&mask, signal) == 1;
}

TEST(StopSignalTest, IsQuietUntilASignalComes) {
  StopSignal stop;
  EXPECT_FALSE(IsReadable(stop.Fd()));
  EXPECT_FALSE(stop.Requested());
}

TEST(StopSignalTest, HearsBothSignals) {
  for (const int signal : {SIGTERM, SIGINT}) {
    StopSignal stop;
    kill(getpid(), signal);
    EXPECT_TRUE(IsReadable(stop.Fd()));
    EXPECT_TRUE(stop.Requested());
    EXPECT_FALSE(IsReadable(stop.Fd()));
    EXPECT_TRUE(stop.Requested()) << "a request does not go away";
  }
}

TEST(StopSignalTest, EndsTheStepOfAServer) {
  quarry::test::TempDir dir;
  StopSignal stop;
  SocketServer server(dir / "s", [](const std::string&, const Peer&) { return std::string(); });
  server.WakeOn(stop.Fd());
  kill(getpid(), SIGTERM);
  EXPECT_EQ(server.Step(-1), 0);
  EXPECT_TRUE(stop.Requested());
}

TEST(StopSignalTest, RestoresTheMaskAndDropsWhatWasLeft) {
  ASSERT_FALSE(IsBlocked(SIGTERM));
  {
    StopSignal stop;
    EXPECT_TRUE(IsBlocked(SIGTERM));
    EXPECT_TRUE(IsBlocked(SIGINT));
    // Not asked for before the end: it must not end this process now.
    kill(getpid(), SIGTERM);
  }
  EXPECT_FALSE(IsBlocked(SIGTERM));
  EXPECT_FALSE(IsBlocked(SIGINT));
}

}  // namespace
}  // namespace quarry::daemon
