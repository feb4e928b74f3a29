// The whole daemon, as it is started in earnest.

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>

#include <random>
#include <thread>

#include "daemons/tarncontentextractd/sandbox.h"
#include "tests/daemons/common/harness.h"
#include "tests/daemons/tarncontentextractd/support/extract_support.h"
#include "tests/daemons/tarncontentextractd/support/running_extractor.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace quarry::extract {
namespace {

std::string Frame(const std::string& text) {
  const auto size = static_cast<std::uint32_t>(text.size());
  return std::string(reinterpret_cast<const char*>(&size), sizeof(size)) + text;
}

class DaemonTest : public ::testing::Test {
 protected:
  DaemonTest() {
    test::ResetTestRoot();
    test::WriteFile(dir_ / "file.txt", "some words");
  }

  // The text that the running daemon finds in the file.
  std::string Text() {
    return RunningExtractor::Document(dir_ / "file.txt")["TARNMDTextContent"].asString();
  }

  static bool Exists(pid_t pid) {
    const std::string state = ProcessStatus(pid, "State");
    return !state.empty() && state[0] != 'Z';
  }

  test::TempDir dir_;
};

TEST_F(DaemonTest, AnswersRequestAfterRequest) {
  RunningExtractor daemon;
  ASSERT_TRUE(daemon.IsReady());
  test::RawPeer peer(RunningExtractor::SocketPath());
  const std::string request =
      "{\"command\":\"parse\",\"data\":{\"path\":\"" + (dir_ / "file.txt") + "\"}}";
  // A NUL at the end is not part of the text.
  for (const std::string& text : {request, request + std::string(1, '\0'), request}) {
    peer.Send(Frame(text));
    EXPECT_NE(peer.RecvFrame().find("\"success\":true"), std::string::npos);
  }
  EXPECT_EQ(Text(), "some words");
  EXPECT_EQ(RunningExtractor::Ask(dir_ / "none")["error"]["code"].asInt(), 914);
}

TEST_F(DaemonTest, ItsSocketBelongsToItsAccount) {
  RunningExtractor daemon;
  ASSERT_TRUE(daemon.IsReady());
  EXPECT_EQ(test::FileMode(RunningExtractor::SocketPath()), 0660u);
}

TEST_F(DaemonTest, StopsCleanlyWhenAsked) {
  for (const int signal : {SIGTERM, SIGINT}) {
    RunningExtractor daemon;
    ASSERT_TRUE(daemon.IsReady());
    EXPECT_EQ(Text(), "some words");
    const std::vector<pid_t> workers = daemon.Workers();
    EXPECT_EQ(workers.size(), 1u);
    daemon.Signal(signal);
    EXPECT_EQ(daemon.End(), "exit code 0") << daemon.Output();
    for (const pid_t worker : workers) EXPECT_FALSE(Exists(worker));
    struct stat status {};
    EXPECT_EQ(lstat(RunningExtractor::SocketPath().c_str(), &status), -1);
    EXPECT_NE(daemon.Output().find("Stopped"), std::string::npos) << daemon.Output();
  }
}

TEST_F(DaemonTest, StopsAlthoughAWorkerIsStuck) {
  RunningExtractor daemon({"--workers", "1"});
  ASSERT_TRUE(daemon.IsReady());
  EXPECT_EQ(Text(), "some words");
  kill(daemon.Workers().at(0), SIGSTOP);
  test::RawPeer peer(RunningExtractor::SocketPath());
  peer.Send(Frame("{\"command\":\"parse\",\"data\":{\"path\":\"" + (dir_ / "file.txt") +
                  "\",\"options\":{\"need_meta\":true}}}"));
  // Attributes are still to be had, which shows that the request before has been taken.
  EXPECT_TRUE(RunningExtractor::Ask(dir_ / "file.txt", false)["success"].asBool());
  daemon.Signal(SIGTERM);
  EXPECT_EQ(daemon.End(), "exit code 0");
}

TEST_F(DaemonTest, RefusesToStartTwice) {
  RunningExtractor daemon;
  ASSERT_TRUE(daemon.IsReady());
  RunningExtractor second;
  EXPECT_EQ(second.End(), "exit code 1");
  EXPECT_NE(second.Output().find("tarncontentextractd is already running as process"),
            std::string::npos)
      << second.Output();
  EXPECT_EQ(Text(), "some words");
}

TEST_F(DaemonTest, StartsAgainAfterItWasKilledAndItsWorkersEnd) {
  std::vector<pid_t> workers;
  {
    RunningExtractor daemon;
    ASSERT_TRUE(daemon.IsReady());
    EXPECT_EQ(Text(), "some words");
    workers = daemon.Workers();
    ASSERT_EQ(workers.size(), 1u);
    daemon.Signal(SIGKILL);
    EXPECT_EQ(daemon.End(), "signal 9");
  }
  EXPECT_TRUE(test::WaitUntil([&] { return !Exists(workers[0]); }));
  RunningExtractor daemon;
  ASSERT_TRUE(daemon.IsReady());
  EXPECT_EQ(Text(), "some words");
}

TEST_F(DaemonTest, ReplacesAWorkerThatIsKilled) {
  RunningExtractor daemon({"--workers", "1"});
  ASSERT_TRUE(daemon.IsReady());
  EXPECT_EQ(Text(), "some words");
  const pid_t worker = daemon.Workers().at(0);
  kill(worker, SIGKILL);
  EXPECT_EQ(Text(), "some words");
  EXPECT_NE(daemon.Workers().at(0), worker);
}

TEST_F(DaemonTest, ItsWorkersAreClosedOff) {
  RunningExtractor daemon;
  ASSERT_TRUE(daemon.IsReady());
  EXPECT_EQ(Text(), "some words");
  for (const pid_t worker : daemon.Workers()) {
    EXPECT_EQ(ProcessStatus(worker, "Seccomp"), kSandboxed ? "2" : "0");
    EXPECT_EQ(ProcessStatus(worker, "NoNewPrivs"), kSandboxed ? "1" : "0");
  }
  const bool warned = daemon.Output().find("workers keep their rights") != std::string::npos;
  EXPECT_NE(warned, kSandboxed) << "a build for tests says so";
}

TEST_F(DaemonTest, SurvivesGarbageOnItsSocket) {
  RunningExtractor daemon;
  ASSERT_TRUE(daemon.IsReady());
  std::mt19937 random(11);
  for (int round = 0; round < 200; ++round) {
    test::RawPeer peer(RunningExtractor::SocketPath());
    std::string bytes(random() % 100, '\0');
    for (char& c : bytes) c = static_cast<char>(random());
    // Sometimes a whole frame of it, sometimes whatever that is.
    if (peer.SendSome(round % 2 == 0 ? Frame(bytes) : bytes) && round % 2 == 0) {
      EXPECT_NE(peer.RecvFrame().find("\"success\":false"), std::string::npos);
    }
  }
  EXPECT_EQ(Text(), "some words");
}

TEST_F(DaemonTest, ClosesAConnectionThatClaimsTooMuch) {
  RunningExtractor daemon;
  ASSERT_TRUE(daemon.IsReady());
  test::RawPeer peer(RunningExtractor::SocketPath());
  const std::uint32_t size = (4u << 20) + 1;
  peer.Send(std::string(reinterpret_cast<const char*>(&size), sizeof(size)));
  EXPECT_TRUE(peer.IsClosed());
  EXPECT_EQ(Text(), "some words");
}

TEST_F(DaemonTest, ServesManyAtOnce) {
  RunningExtractor daemon({"--workers", "2"});
  ASSERT_TRUE(daemon.IsReady());
  std::vector<std::thread> threads;
  for (int t = 0; t < 12; ++t) {
    threads.emplace_back([this, t] {
      const std::string words = "words of " + std::to_string(t);
      const std::string path = dir_ / std::to_string(t);
      test::WriteFile(path, words);
      for (int i = 0; i < 10; ++i) {
        EXPECT_EQ(RunningExtractor::Document(path)["TARNMDTextContent"].asString(), words);
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_LE(daemon.Workers().size(), 2u);
}

TEST_F(DaemonTest, HelpsAndRefusesWhatItDoesNotKnow) {
  RunningExtractor help({"--help"});
  EXPECT_EQ(help.End(), "exit code 0");
  EXPECT_NE(help.Output().find("Examples:"), std::string::npos);
  for (const std::vector<std::string>& arguments :
       {std::vector<std::string>{"--unknown"}, {"--workers", "0"}, {"--workers", "many"}, {"x"}}) {
    RunningExtractor daemon(arguments);
    EXPECT_EQ(daemon.End(), "exit code 2");
  }
}

}  // namespace
}  // namespace quarry::extract
