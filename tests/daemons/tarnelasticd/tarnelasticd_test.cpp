// The program itself, over its socket: starting, stopping, being killed.

#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <random>

#include "common/json.h"
#include "daemons/common/client.h"
#include "daemons/common/frame.h"
#include "tests/daemons/common/harness.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"
#include "tests/support/files.h"

namespace quarry::engine {
namespace {

class ProgramTest : public testing::Test {
 protected:
  ~ProgramTest() override {
    if (pid_ > 0) Kill(SIGKILL);
  }

  pid_t Spawn(const char* option = "--quiet") {
    const pid_t pid = fork();
    if (pid == 0) {
      setenv("QUARRY_ROOT", dir_.path().c_str(), 1);
      execl(TARNELASTICD_PROGRAM, TARNELASTICD_PROGRAM, option, nullptr);
      _exit(127);
    }
    return pid;
  }
  void Start() {
    pid_ = Spawn();
    ASSERT_TRUE(test::WaitUntil([this] { return daemon::IsListening(Socket()); }));
    client_ = std::make_unique<daemon::Client>("tarnelasticd", Socket());
  }
  // The status with which the program ended.
  int Kill(int signal) {
    kill(pid_, signal);
    return Wait(std::exchange(pid_, -1));
  }
  static int Wait(pid_t pid) {
    int status = 0;
    EXPECT_EQ(waitpid(pid, &status, 0), pid);
    return status;
  }
  std::string Socket() const { return dir_ / "var/run/tarnelasticd.sock"; }

  Json::Value Ask(const Json::Value& request) {
    const Json::Value answer = client_->Request(request);
    EXPECT_TRUE(answer["success"].asBool()) << toString(answer);
    return answer["data"];
  }
  void Create() { Ask(CreateRequest("a", dir_ / "index/a")); }
  void Upsert(const std::string& path, const std::string& text) {
    Ask(UpsertRequest("a", FileDocument(path, text)));
  }
  void Commit() { Ask(Parse(R"({"command":"commit","data":{"id":"a"}})")); }
  int Total(const std::string& query) {
    Json::Value data;
    data["query"] = query;
    return Ask(MakeRequest("search", data))["total"].asInt();
  }

  test::TempDir dir_;
  pid_t pid_ = -1;
  std::unique_ptr<daemon::Client> client_;
};

TEST_F(ProgramTest, StopsCleanlyAndCommitsWhatIsOpen) {
  Start();
  Create();
  Upsert("/s/1", "alpha");
  EXPECT_EQ(test::FileMode(Socket()), 0660U);
  const int status = Kill(SIGTERM);
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
  EXPECT_FALSE(daemon::IsListening(Socket()));
  Start();
  EXPECT_EQ(Total("alpha"), 1);
}

TEST_F(ProgramTest, RefusesToRunTwice) {
  Start();
  const int status = Wait(Spawn());
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == EXIT_FAILURE);
  Create();
}

TEST_F(ProgramTest, BeingKilledLosesNothingThatWasCommitted) {
  Start();
  Create();
  std::mt19937 random(5);
  int committed = 0;
  std::string epoch;
  for (int round = 0; round < 6; ++round) {
    const int more = static_cast<int>(random() % 40);
    for (int i = 0; i < more; ++i) {
      Upsert("/s/" + std::to_string(committed + i), "alpha word" + std::to_string(committed + i));
    }
    const bool is_committed = round % 2 == 0;
    if (is_committed) Commit();
    Kill(SIGKILL);
    Start();
    const int left = Total("alpha");
    EXPECT_EQ(Total("in:/s"), left);
    // On a slow machine a transaction may have ended of itself.
    EXPECT_GE(left, is_committed ? committed + more : committed);
    EXPECT_LE(left, committed + more);
    committed = left;
    const std::string now = Ask(Parse(R"({"command":"engine_status"})"))["epoch"].asString();
    EXPECT_NE(now, epoch);
    epoch = now;
  }
}

// Whatever the moment, what is found afterwards is a beginning of what was sent, whole.
TEST_F(ProgramTest, BeingKilledAtWorkLeavesWholeTransactions) {
  Start();
  Create();
  int acknowledged = 0;
  for (int round = 0; round < 5; ++round) {
    const pid_t killer = fork();
    if (killer == 0) {
      usleep(static_cast<useconds_t>(20000 + 17000 * round));
      kill(pid_, SIGKILL);
      _exit(0);
    }
    try {
      for (int i = acknowledged;; ++i) {
        Upsert("/s/" + std::to_string(i), "alpha");
        if (i % 5 == 4) {
          Commit();
          acknowledged = i + 1;
        }
      }
    } catch (const Error&) {
      // That was the kill.
    }
    Wait(killer);
    Kill(SIGKILL);
    Start();
    EXPECT_GE(Total("alpha"), acknowledged);
    EXPECT_EQ(Total("alpha"), Total("in:/s"));
    acknowledged = Total("alpha");
  }
}

TEST_F(ProgramTest, TakesFramesWithAndWithoutTheClosingNul) {
  Start();
  test::RawPeer peer(Socket());
  const std::string request = R"({"command":"engine_status"})";
  peer.Send(daemon::MakeFrame(request + '\0') + daemon::MakeFrame(request));
  const Json::Value first = Parse(peer.RecvFrame());
  EXPECT_TRUE(first["success"].asBool());
  EXPECT_EQ(Parse(peer.RecvFrame()), first);
  peer.Send(daemon::MakeFrame("no json"));
  EXPECT_EQ(Parse(peer.RecvFrame())["error"]["code"].asInt(), kMalformedRequest);
}

TEST_F(ProgramTest, ClosesAConnectionThatClaimsTooMuch) {
  Start();
  test::RawPeer peer(Socket());
  const std::uint32_t size = (std::uint32_t{64} << 20) + 1;
  std::string header(sizeof(size), '\0');
  std::memcpy(header.data(), &size, sizeof(size));
  peer.Send(header);
  EXPECT_THROW(peer.RecvFrame(), std::runtime_error);
  EXPECT_TRUE(Ask(Parse(R"({"command":"engine_status"})"))["indexes"].empty());
}

TEST_F(ProgramTest, SaysWhyItCannotStart) {
  test::WriteFile(dir_ / "var/lib/quarry/engine/indexes.json", "{");
  const int status = Wait(Spawn());
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == EXIT_FAILURE);
}

TEST_F(ProgramTest, HelpsAndRefusesWhatItDoesNotKnow) {
  const int helped = Wait(Spawn("--help"));
  EXPECT_TRUE(WIFEXITED(helped) && WEXITSTATUS(helped) == 0);
  for (const char* option : {"--unknown", "--threads", "--memory=1", "x"}) {
    const int status = Wait(Spawn(option));
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 2) << option;
  }
}

}  // namespace
}  // namespace quarry::engine
