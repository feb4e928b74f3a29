// Whatever is killed, and whenever: in the end every file is in the index, once.

#include <gtest/gtest.h>

#include <csignal>
#include <filesystem>
#include <random>

#include "cli/system.h"
#include "common/error.h"
#include "daemons/common/client.h"
#include "tests/support/files.h"
#include "tests/system/running_system.h"

namespace quarry::test {
namespace {

constexpr const char* kServices[] = {"tarnelasticd", "tarncontentextractd", "fileindexd"};

class CrashTest : public testing::Test {
 protected:
  void SetUp() override {
    for (int i = 0; i < 600; ++i) {
      WriteFile(docs_ + "/d" + std::to_string(i % 20) + "/f" + std::to_string(i) + ".txt",
                "file number " + std::to_string(i));
    }
    system_.Start();
    ASSERT_EQ(system_.Quarry({"share", "add", docs_}).end, "exit code 0");
    ASSERT_EQ(system_.Quarry({"folder", "add", "/docs"}).end, "exit code 0");
  }

  void ExpectWhole() {
    ASSERT_TRUE(system_.WaitUntilIdle());
    EXPECT_EQ(system_.Documents(docs_), Listing(docs_));
  }

  RunningSystem system_;
  std::string docs_ = system_.Files() + "/docs";
};

TEST_F(CrashTest, DaemonsKilledAtRandomMoments) {
  std::mt19937 random(1);
  for (int round = 0; round < 6; ++round) {
    const std::string service = kServices[random() % 3];
    pid_t pid = 0;
    ASSERT_TRUE(WaitUntil([&] { return (pid = system_.Pid(service)) > 0; }));
    kill(pid, SIGKILL);
    ASSERT_TRUE(WaitUntil([&] {
      const pid_t next = system_.Pid(service);
      return next > 0 && next != pid;
    }));
  }
  ExpectWhole();
  system_.Stop();
}

TEST_F(CrashTest, TheSupervisorKilledAndStartedAgain) {
  system_.Kill();
  // Its services are asked to stop when it is gone; only then is there room for the next ones.
  ASSERT_TRUE(WaitUntil([] {
    return !daemon::IsListening(cli::EngineSocket()) &&
           !daemon::IsListening(cli::IndexDaemonSocket()) &&
           !daemon::IsListening(cli::ExtractorSocket());
  }));
  system_.Start();
  ExpectWhole();
  system_.Stop();
}

TEST_F(CrashTest, GarbageOnEverySocketHurtsNobody) {
  for (const std::string& socket : {cli::EngineSocket(), cli::IndexDaemonSocket(),
                                    cli::ExtractorSocket(), cli::SupervisorSocket()}) {
    ASSERT_TRUE(WaitUntil([&] { return daemon::IsListening(socket); })) << socket;
    for (const char* text : {"[]", "null", "{\"command\":7}", "{\"type\":[]}"}) {
      Json::Value request(text);
      try {
        daemon::Request("daemon", socket, request);
      } catch (const Error&) {
        continue;  // hanging up is an answer too
      }
    }
  }
  ExpectWhole();
  for (const char* service : kServices) EXPECT_GT(system_.Pid(service), 0) << service;
  system_.Stop();
}

}  // namespace
}  // namespace quarry::test
