#include "daemons/common/socket_server.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cstring>
#include <future>
#include <random>
#include <thread>
#include <vector>

#include "common/error.h"
#include "daemons/common/frame.h"
#include "daemons/common/socket_address.h"
#include "tests/daemons/common/harness.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::daemon {
namespace {

using test::RawPeer;
using test::ServerThread;
using test::TempDir;
using test::WaitUntil;

std::string Echo(const std::string& request, const Peer&) {
  return "echo:" + request;
}

// The same behaviour is wanted inline and from workers.
class SocketServerTest : public ::testing::TestWithParam<std::size_t> {
 protected:
  SocketServerOptions Options() const {
    SocketServerOptions options;
    options.workers = GetParam();
    return options;
  }

  TempDir dir_;
  const std::string path_ = dir_ / "s";
};

INSTANTIATE_TEST_SUITE_P(InlineAndPool, SocketServerTest, ::testing::Values(0u, 3u));

TEST_P(SocketServerTest, AnswersSeveralRequestsOfOneConnectionInOrder) {
  ServerThread server(path_, Echo, Options());
  RawPeer peer(path_);
  std::string sent;
  for (int i = 0; i < 50; ++i) sent += MakeFrame(std::to_string(i));
  peer.Send(sent);
  for (int i = 0; i < 50; ++i) EXPECT_EQ(peer.RecvFrame(), "echo:" + std::to_string(i));
}

TEST_P(SocketServerTest, TakesOneNulByteOffTheEndOfARequest) {
  ServerThread server(path_, Echo, Options());
  RawPeer peer(path_);
  peer.Send(MakeFrame(std::string("a\0b\0\0", 5)));
  EXPECT_EQ(peer.RecvFrame(), std::string("echo:a\0b\0", 9));
}

TEST_P(SocketServerTest, HandsAnEmptyRequestToTheHandler) {
  ServerThread server(path_, Echo, Options());
  RawPeer peer(path_);
  peer.Send(MakeFrame(""));
  EXPECT_EQ(peer.RecvFrame(), "echo:");
}

TEST_P(SocketServerTest, TellsTheHandlerWhoAsks) {
  Peer seen;
  ServerThread server(
      path_,
      [&](const std::string&, const Peer& peer) {
        seen = peer;
        return std::string("ok");
      },
      Options());
  RawPeer peer(path_);
  peer.Send(MakeFrame("?"));
  ASSERT_EQ(peer.RecvFrame(), "ok");
  EXPECT_EQ(seen.pid, getpid());
  EXPECT_EQ(seen.uid, geteuid());
  EXPECT_EQ(seen.gid, getegid());
}

TEST_P(SocketServerTest, CarriesAnyBytesAndLargeFrames) {
  ServerThread server(path_, Echo, Options());
  RawPeer peer(path_);
  std::string big(9'000'001, '\0');
  std::mt19937 random(1);
  for (char& c : big) c = static_cast<char>(random());
  big.back() = 'x';
  std::thread sender([&] { peer.Send(MakeFrame(big)); });
  const std::string reply = peer.RecvFrame();
  sender.join();
  EXPECT_TRUE(reply == "echo:" + big);
}

TEST_P(SocketServerTest, AcceptsARequestThatArrivesByteByByte) {
  ServerThread server(path_, Echo, Options());
  RawPeer peer(path_);
  for (const char c : MakeFrame("slow")) peer.Send(std::string(1, c));
  EXPECT_EQ(peer.RecvFrame(), "echo:slow");
}

TEST_P(SocketServerTest, ClosesOnlyTheConnectionThatClaimsTooMuch) {
  SocketServerOptions options = Options();
  options.max_request_bytes = 100;
  ServerThread server(path_, Echo, options);
  RawPeer good(path_);
  RawPeer bad(path_);
  RawPeer edge(path_);
  const std::uint32_t huge = 0xffffffff;
  bad.Send(std::string(reinterpret_cast<const char*>(&huge), 4));
  EXPECT_TRUE(bad.IsClosed());
  RawPeer above(path_);
  above.Send(MakeFrame(std::string(101, 'x')));
  EXPECT_TRUE(above.IsClosed());
  edge.Send(MakeFrame(std::string(100, 'x')));
  EXPECT_EQ(edge.RecvFrame(), "echo:" + std::string(100, 'x'));
  good.Send(MakeFrame("still here"));
  EXPECT_EQ(good.RecvFrame(), "echo:still here");
}

TEST_P(SocketServerTest, BoundsWhatAllConnectionsHoldTogether) {
  SocketServerOptions options = Options();
  options.max_request_bytes = 1 << 20;
  options.max_buffered_bytes = 3 << 20;
  ServerThread server(path_, Echo, options);
  std::vector<std::unique_ptr<RawPeer>> peers;
  const std::string most = MakeFrame(std::string(1 << 20, 'x')).substr(0, (1 << 20) - 10);
  for (int i = 0; i < 8; ++i) {
    peers.push_back(std::make_unique<RawPeer>(path_));
    peers.back()->SendSome(most);
  }
  EXPECT_TRUE(WaitUntil([&] { return server.ConnectionCount() <= 3; }));
  RawPeer small(path_);
  peers.clear();
  small.Send(MakeFrame("x"));
  EXPECT_EQ(small.RecvFrame(), "echo:x");
}

TEST_P(SocketServerTest, AnEmptyAnswerClosesTheConnection) {
  ServerThread server(
      path_, [](const std::string&, const Peer&) { return std::string(); }, Options());
  RawPeer peer(path_);
  peer.Send(MakeFrame("x"));
  EXPECT_TRUE(peer.IsClosed());
}

TEST_P(SocketServerTest, AHandlerThatThrowsClosesTheConnection) {
  ServerThread server(
      path_,
      [](const std::string& request, const Peer&) -> std::string {
        if (request == "bad") throw std::runtime_error("no");
        return "ok";
      },
      Options());
  RawPeer bad(path_);
  bad.Send(MakeFrame("bad"));
  EXPECT_TRUE(bad.IsClosed());
  RawPeer good(path_);
  good.Send(MakeFrame("good"));
  EXPECT_EQ(good.RecvFrame(), "ok");
}

TEST_P(SocketServerTest, SilentHalfAndGarbagePeersHoldUpNobody) {
  SocketServerOptions options = Options();
  options.max_request_bytes = 1 << 16;
  ServerThread server(path_, Echo, options);
  std::mt19937 random(7);
  std::vector<std::unique_ptr<RawPeer>> peers;
  for (int i = 0; i < 60; ++i) {
    peers.push_back(std::make_unique<RawPeer>(path_));
    std::string junk(random() % 40, '\0');
    for (char& c : junk) c = static_cast<char>(random());
    peers.back()->SendSome(i % 3 == 0 ? MakeFrame("half").substr(0, 1 + random() % 7) : junk);
    if (i % 5 == 0) peers.back()->Close();
    RawPeer good(path_);
    good.Send(MakeFrame(std::to_string(i)));
    ASSERT_EQ(good.RecvFrame(), "echo:" + std::to_string(i));
  }
}

TEST_P(SocketServerTest, RandomBytesNeverDisturbOthers) {
  SocketServerOptions options = Options();
  options.max_request_bytes = 4096;
  ServerThread server(path_, Echo, options);
  std::mt19937 random(11);
  for (int i = 0; i < 200; ++i) {
    RawPeer peer(path_);
    std::string junk(random() % 300, '\0');
    for (char& c : junk) c = static_cast<char>(random() % (i % 2 == 0 ? 256 : 3));
    peer.SendSome(junk);
  }
  RawPeer good(path_);
  good.Send(MakeFrame("x"));
  EXPECT_EQ(good.RecvFrame(), "echo:x");
  EXPECT_TRUE(WaitUntil([&] { return server.ConnectionCount() == 1; }));
}

TEST_P(SocketServerTest, DropsTheAnswerOfAPeerThatLeavesInTheMiddle) {
  ServerThread server(
      path_,
      [](const std::string& request, const Peer&) {
        return request == "big" ? std::string(20 << 20, 'b') : request;
      },
      Options());
  for (int i = 0; i < 5; ++i) {
    RawPeer peer(path_);
    peer.Send(MakeFrame("big"));
    peer.RecvBytes(100);
  }
  RawPeer good(path_);
  good.Send(MakeFrame("x"));
  EXPECT_EQ(good.RecvFrame(), "x");
  EXPECT_TRUE(WaitUntil([&] { return server.ConnectionCount() == 1; }));
}

TEST_P(SocketServerTest, APeerThatDoesNotReadHoldsUpNobody) {
  ServerThread server(
      path_,
      [](const std::string& request, const Peer&) {
        return request == "big" ? std::string(20 << 20, 'b') : request;
      },
      Options());
  RawPeer deaf(path_);
  deaf.Send(MakeFrame("big"));
  RawPeer good(path_);
  good.Send(MakeFrame("x"));
  EXPECT_EQ(good.RecvFrame(), "x");
  EXPECT_EQ(deaf.RecvFrame(), std::string(20 << 20, 'b'));
}

TEST_P(SocketServerTest, AnswersAPeerThatHasShutItsSendingSide) {
  ServerThread server(path_, Echo, Options());
  RawPeer peer(path_);
  peer.Send(MakeFrame("last"));
  peer.ShutdownWrite();
  EXPECT_EQ(peer.RecvFrame(), "echo:last");
  EXPECT_TRUE(peer.IsClosed());
}

TEST_P(SocketServerTest, ClosesConnectionsThatStayIdle) {
  SocketServerOptions options = Options();
  options.idle_timeout = std::chrono::milliseconds(30);
  ServerThread server(path_, Echo, options);
  RawPeer peer(path_);
  EXPECT_TRUE(peer.IsClosed());
}

TEST_P(SocketServerTest, ClosesConnectionsThatDoNotEndTheirRequest) {
  SocketServerOptions options = Options();
  options.partial_timeout = std::chrono::milliseconds(30);
  ServerThread server(path_, Echo, options);
  RawPeer peer(path_);
  peer.Send(MakeFrame("half").substr(0, 6));
  EXPECT_TRUE(peer.IsClosed());
}

TEST_P(SocketServerTest, ClosesConnectionsThatDoNotTakeTheirAnswer) {
  SocketServerOptions options = Options();
  options.partial_timeout = std::chrono::milliseconds(30);
  ServerThread server(
      path_, [](const std::string&, const Peer&) { return std::string(20 << 20, 'b'); }, options);
  RawPeer peer(path_);
  peer.Send(MakeFrame("x"));
  EXPECT_TRUE(WaitUntil([&] { return server.Requests() == 1 && server.ConnectionCount() == 0; }));
}

TEST_P(SocketServerTest, ServesMorePeersThanItHasPlacesFor) {
  SocketServerOptions options = Options();
  options.max_connections = 4;
  options.evict_after = std::chrono::milliseconds(20);
  ServerThread server(path_, Echo, options);
  std::vector<std::unique_ptr<RawPeer>> silent;
  for (int i = 0; i < 4; ++i) silent.push_back(std::make_unique<RawPeer>(path_));
  ASSERT_TRUE(WaitUntil([&] { return server.ConnectionCount() == 4; }));
  // The silent ones give way one after another once they have been silent for a while.
  RawPeer late(path_);
  late.Send(MakeFrame("late"));
  EXPECT_EQ(late.RecvFrame(), "echo:late");
  EXPECT_LE(server.ConnectionCount(), 4u);
}

TEST_P(SocketServerTest, ManyConnectionsAtOnce) {
  SocketServerOptions options = Options();
  options.max_connections = 16;
  ServerThread server(path_, Echo, options);
  std::vector<std::future<bool>> results;
  for (int t = 0; t < 8; ++t) {
    results.push_back(std::async(std::launch::async, [&, t] {
      bool good = true;
      for (int i = 0; i < 100; ++i) {
        RawPeer peer(path_);
        const std::string text = std::to_string(t) + "/" + std::to_string(i);
        peer.Send(MakeFrame(text));
        good = good && peer.RecvFrame() == "echo:" + text;
      }
      return good;
    }));
  }
  for (auto& result : results) EXPECT_TRUE(result.get());
}

TEST_P(SocketServerTest, FinishAnswersWhatIsInWork) {
  SocketServer server(path_, Echo, Options());
  RawPeer idle(path_);
  RawPeer busy(path_);
  busy.Send(MakeFrame("x"));
  for (int taken = 0; taken == 0;) taken = server.Step(-1);
  EXPECT_TRUE(server.Finish(10000));
  EXPECT_EQ(busy.RecvFrame(), "echo:x");
  EXPECT_TRUE(busy.IsClosed());
  EXPECT_TRUE(idle.IsClosed());
  EXPECT_EQ(server.ConnectionCount(), 0u);
  EXPECT_NE(access(path_.c_str(), F_OK), 0);
}

TEST_P(SocketServerTest, FinishAnswersWhatWasSentBeforeAnybodyLooked) {
  SocketServer server(path_, Echo, Options());
  RawPeer peers[] = {RawPeer(path_), RawPeer(path_), RawPeer(path_)};
  for (RawPeer& peer : peers) peer.Send(MakeFrame("x"));
  EXPECT_TRUE(server.Finish(10000));
  for (RawPeer& peer : peers) {
    EXPECT_EQ(peer.RecvFrame(), "echo:x");
    EXPECT_TRUE(peer.IsClosed());
  }
}

// Whoever asks again and again cannot put off the end.
TEST_P(SocketServerTest, FinishIsNotHeldUpByAPeerThatGoesOn) {
  SocketServer server(path_, Echo, Options());
  std::atomic<bool> over{false};
  std::thread chatty([&] {
    RawPeer peer(path_);
    try {
      while (true) {
        peer.Send(MakeFrame("x"));
        peer.RecvFrame();
      }
    } catch (const std::runtime_error&) {
      over = true;
    }
  });
  for (int taken = 0; taken == 0;) taken = server.Step(-1);
  EXPECT_TRUE(server.Finish(10000));
  EXPECT_TRUE(WaitUntil([&] { return over.load(); }));
  chatty.join();
}

TEST(SocketServerPoolTest, FinishGivesUpOnWhatTakesTooLong) {
  TempDir dir;
  std::promise<void> go;
  std::shared_future<void> gate = go.get_future().share();
  SocketServerOptions options;
  options.workers = 1;
  SocketServer server(
      dir / "s",
      [gate](const std::string&, const Peer&) {
        gate.wait();
        return std::string("ok");
      },
      options);
  RawPeer peer(dir / "s");
  peer.Send(MakeFrame("x"));
  for (int taken = 0; taken == 0;) taken = server.Step(-1);
  EXPECT_FALSE(server.Finish(10));
  go.set_value();
  EXPECT_TRUE(server.Finish(10000));
  EXPECT_EQ(peer.RecvFrame(), "ok");
}

TEST(SocketServerPoolTest, SlowRequestsHoldUpNobodyAndRunSideBySide) {
  TempDir dir;
  std::promise<void> go;
  std::shared_future<void> gate = go.get_future().share();
  std::atomic<int> waiting{0};
  SocketServerOptions options;
  options.workers = 3;
  ServerThread server(
      dir / "s",
      [&](const std::string& request, const Peer&) {
        if (request == "slow") {
          ++waiting;
          gate.wait();
        }
        return request;
      },
      options);
  RawPeer slow1(dir / "s");
  RawPeer slow2(dir / "s");
  slow1.Send(MakeFrame("slow") + MakeFrame("after"));
  slow2.Send(MakeFrame("slow"));
  ASSERT_TRUE(WaitUntil([&] { return waiting == 2; }));
  RawPeer quick(dir / "s");
  quick.Send(MakeFrame("quick"));
  EXPECT_EQ(quick.RecvFrame(), "quick");
  go.set_value();
  EXPECT_EQ(slow1.RecvFrame(), "slow");
  EXPECT_EQ(slow1.RecvFrame(), "after");
  EXPECT_EQ(slow2.RecvFrame(), "slow");
}

TEST(SocketServerPoolTest, NoticesAPeerThatLeavesWhileItsRequestIsWorkedOn) {
  TempDir dir;
  std::promise<void> go;
  std::shared_future<void> gate = go.get_future().share();
  SocketServerOptions options;
  options.workers = 1;
  ServerThread server(
      dir / "s",
      [gate](const std::string&, const Peer&) {
        gate.wait();
        return std::string("ok");
      },
      options);
  {
    RawPeer peer(dir / "s");
    peer.Send(MakeFrame("x"));
    ASSERT_TRUE(WaitUntil([&] { return server.Requests() == 1; }));
  }
  EXPECT_TRUE(WaitUntil([&] { return server.ConnectionCount() == 0; }));
  go.set_value();
  RawPeer peer(dir / "s");
  peer.Send(MakeFrame("x"));
  EXPECT_EQ(peer.RecvFrame(), "ok");
}

TEST(SocketServerPlaceTest, SocketHasMode0660WhateverTheUmask) {
  TempDir dir;
  for (const mode_t mask : {mode_t{0}, mode_t{022}, mode_t{077}}) {
    const mode_t old = umask(mask);
    {
      SocketServer server(dir / "s", Echo);
      EXPECT_EQ(test::FileMode(dir / "s"), 0660u);
    }
    umask(old);
  }
}

// Who waits for the file to appear must not be turned away by it.
TEST(SocketServerPlaceTest, TheFileAppearsWhenSomebodyListens) {
  TempDir dir;
  const auto path = [&](int i) { return dir / std::to_string(i); };
  constexpr int kTimes = 300;
  std::atomic<int> connected{0};
  int refused = 0;
  std::thread client([&] {
    for (int i = 0; i < kTimes; i = connected) {
      const int result = ProbeSocket(path(i));
      if (result == 0) ++connected;
      if (result != 0 && result != ENOENT) ++refused;
    }
  });
  for (int i = 0; i < kTimes; ++i) {
    const SocketServer server(path(i), Echo);
    while (connected <= i) std::this_thread::yield();
  }
  client.join();
  EXPECT_EQ(refused, 0);
  EXPECT_EQ(test::ListDir(dir.path()).size(), 0u);
}

TEST(SocketServerPlaceTest, MakesMissingDirectoriesAndRemovesItsFile) {
  TempDir dir;
  {
    SocketServer server(dir / "var/run/s", Echo);
    EXPECT_EQ(access((dir / "var/run/s").c_str(), F_OK), 0);
  }
  EXPECT_NE(access((dir / "var/run/s").c_str(), F_OK), 0);
}

TEST(SocketServerPlaceTest, ReplacesTheSocketOfADeadProcess) {
  TempDir dir;
  const sockaddr_un address = SocketAddress(dir / "s");
  const int dead = socket(AF_UNIX, SOCK_STREAM, 0);
  ASSERT_EQ(bind(dead, reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
  close(dead);
  ASSERT_EQ(access((dir / "s").c_str(), F_OK), 0);
  ServerThread server(dir / "s", Echo);
  RawPeer peer(dir / "s");
  peer.Send(MakeFrame("x"));
  EXPECT_EQ(peer.RecvFrame(), "echo:x");
}

TEST(SocketServerPlaceTest, NeverReplacesALiveSocket) {
  TempDir dir;
  ServerThread server(dir / "s", Echo);
  try {
    SocketServer second(dir / "s", Echo);
    FAIL() << "a second server took the place";
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), kErrorSystem);
    EXPECT_EQ(error.reason(), "Another process listens at " + (dir / "s") + " already.");
  }
  RawPeer peer(dir / "s");
  peer.Send(MakeFrame("x"));
  EXPECT_EQ(peer.RecvFrame(), "echo:x");
}

TEST(SocketServerPlaceTest, NeverReplacesAnotherFile) {
  TempDir dir;
  test::WriteFile(dir / "s", "precious");
  try {
    SocketServer server(dir / "s", Echo);
    FAIL() << "a file was replaced";
  } catch (const Error& error) {
    EXPECT_EQ(error.reason(), (dir / "s") + " is in the way: it is no socket.");
  }
  EXPECT_EQ(test::ReadFile(dir / "s"), "precious");
}

TEST(SocketServerPlaceTest, LeavesTheSocketOfASuccessorAlone) {
  TempDir dir;
  auto first = std::make_unique<SocketServer>(dir / "s", Echo);
  ASSERT_EQ(unlink((dir / "s").c_str()), 0);
  SocketServer second(dir / "s", Echo);
  first.reset();
  EXPECT_EQ(access((dir / "s").c_str(), F_OK), 0);
}

TEST(SocketServerPlaceTest, RefusesAPathThatDoesNotFitAnAddress) {
  const std::string path = "/" + std::string(107, 'a');
  try {
    SocketServer server(path, Echo);
    FAIL() << "the path was accepted";
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), kErrorSystem);
    EXPECT_EQ(error.reason(), "The socket path " + path +
                                  " has 108 bytes, but a socket address holds at most 107. Set "
                                  "QUARRY_ROOT to a shorter directory.");
  }
  EXPECT_NO_THROW(CheckSocketPath("/" + std::string(106, 'a')));
  EXPECT_THROW(CheckSocketPath(""), Error);
  EXPECT_THROW(CheckSocketPath(std::string("/a\0b", 4)), Error);
}

TEST(SocketServerWakeTest, WakeEndsAStepFromAnotherThread) {
  TempDir dir;
  SocketServer server(dir / "s", Echo);
  std::thread waker([&] { server.Wake(); });
  EXPECT_EQ(server.Step(-1), 0);
  waker.join();
}

TEST(SocketServerWakeTest, ADescriptorEndsAStepAndIsLeftUnread) {
  TempDir dir;
  SocketServer server(dir / "s", Echo);
  int pipe_fds[2];
  ASSERT_EQ(pipe(pipe_fds), 0);
  server.WakeOn(pipe_fds[0]);
  ASSERT_EQ(write(pipe_fds[1], "x", 1), 1);
  EXPECT_EQ(server.Step(-1), 0);
  EXPECT_EQ(server.Step(-1), 0);
  char c;
  EXPECT_EQ(read(pipe_fds[0], &c, 1), 1);
  EXPECT_EQ(server.Step(0), 0);
  close(pipe_fds[0]);
  close(pipe_fds[1]);
}

TEST(SocketServerWakeTest, StepReturnsWhenItsTimeIsOver) {
  TempDir dir;
  SocketServer server(dir / "s", Echo);
  EXPECT_EQ(server.Step(1), 0);
  EXPECT_EQ(server.Step(0), 0);
}

TEST(SocketServerFdTest, ClosesEveryDescriptorOfItsOwn) {
  const std::size_t before = test::ListDir("/proc/self/fd").size();
  {
    TempDir dir;
    SocketServerOptions options;
    options.workers = 2;
    ServerThread server(dir / "s", Echo, options);
    std::vector<std::unique_ptr<RawPeer>> peers;
    for (int i = 0; i < 10; ++i) peers.push_back(std::make_unique<RawPeer>(dir / "s"));
    peers[3]->Send(MakeFrame("x"));
    EXPECT_EQ(peers[3]->RecvFrame(), "echo:x");
  }
  EXPECT_EQ(test::ListDir("/proc/self/fd").size(), before);
}

}  // namespace
}  // namespace quarry::daemon
