#include "cli/supervisor/supervisor.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <thread>

#include "cli/problem.h"
#include "daemons/common/socket_server.h"
#include "tests/support/temp_dir.h"

namespace quarry::cli {
namespace {

using std::chrono::milliseconds;

// Services are small shell scripts; the test itself listens for those that have to be ready.
class SupervisorTest : public testing::Test {
 protected:
  ServiceSpec Spec(const std::string& name, const std::string& script, bool wanted = false) {
    const std::string path = dir_.path() + "/" + name;
    std::ofstream(path) << "#!/bin/sh\n" << script << '\n';
    std::filesystem::permissions(path, std::filesystem::perms::owner_all);
    return {name, path, dir_.path() + "/" + name + ".sock", wanted};
  }

  std::unique_ptr<daemon::SocketServer> Listen(const std::string& name) {
    return std::make_unique<daemon::SocketServer>(
        dir_.path() + "/" + name + ".sock",
        [](const std::string&, const daemon::Peer&) { return std::string(); });
  }

  // Steps until the condition holds; fails the test after ten seconds.
  template <typename Condition>
  void StepUntil(Supervisor& supervisor, Condition condition) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    while (!condition()) {
      ASSERT_LT(std::chrono::steady_clock::now(), deadline);
      supervisor.Step();
      std::this_thread::yield();
    }
  }

  static Json::Value Service(Supervisor& supervisor, unsigned int index = 0) {
    Json::Value request;
    request["command"] = "status";
    return supervisor.Handle(request)["data"]["services"][index];
  }

  std::function<Supervisor::Clock::time_point()> Clock() {
    return [this] { return now_; };
  }

  test::TempDir dir_;
  Supervisor::Clock::time_point now_ = Supervisor::Clock::now();
};

TEST_F(SupervisorTest, StartsWhatIsWanted) {
  Supervisor supervisor({Spec("a", "exec sleep 60", true), Spec("b", "exec sleep 60")});
  supervisor.Step();
  EXPECT_EQ(Service(supervisor, 0)["state"].asString(), "running");
  EXPECT_GT(Service(supervisor, 0)["pid"].asInt(), 0);
  EXPECT_EQ(Service(supervisor, 1)["state"].asString(), "stopped");
  supervisor.StopAll();
  EXPECT_EQ(Service(supervisor, 0)["state"].asString(), "stopped");
}

TEST_F(SupervisorTest, GivesItsServicesTheirArguments) {
  ServiceSpec spec = Spec("a", "[ \"$*\" = \"--full-speed x\" ] && exit 4", true);
  spec.arguments = {"--full-speed", "x"};
  Supervisor supervisor({spec}, Clock());
  supervisor.Step();
  StepUntil(supervisor, [&] { return Service(supervisor)["state"] == "restarting"; });
  EXPECT_EQ(Service(supervisor)["last_end"].asString(), "exit code 4");
}

TEST_F(SupervisorTest, RestartsWhatDiesAfterAGrowingPause) {
  Supervisor supervisor({Spec("a", "exit 3", true)}, Clock());
  supervisor.Step();
  StepUntil(supervisor, [&] { return Service(supervisor)["state"] == "restarting"; });
  EXPECT_EQ(Service(supervisor)["last_end"].asString(), "exit code 3");
  EXPECT_EQ(Service(supervisor)["restarts"].asInt(), 1);

  now_ += milliseconds(199);
  supervisor.Step();
  EXPECT_EQ(Service(supervisor)["state"].asString(), "restarting");
  now_ += milliseconds(1);
  StepUntil(supervisor, [&] { return Service(supervisor)["restarts"].asInt() == 2; });

  now_ += milliseconds(399);
  supervisor.Step();
  EXPECT_EQ(Service(supervisor)["state"].asString(), "restarting");
  now_ += milliseconds(1);
  StepUntil(supervisor, [&] { return Service(supervisor)["restarts"].asInt() == 3; });
}

TEST_F(SupervisorTest, ForgetsThePauseOfAServiceThatRanLong) {
  Supervisor supervisor({Spec("a", "exec sleep 60", true)}, Clock());
  supervisor.Step();
  for (int death = 1; death <= 3; ++death) {
    now_ += milliseconds(10'000);
    kill(Service(supervisor)["pid"].asInt(), SIGKILL);
    StepUntil(supervisor, [&] { return Service(supervisor)["restarts"].asInt() == death; });
    EXPECT_EQ(Service(supervisor)["last_end"].asString(), "signal 9");
    now_ += milliseconds(200);
    StepUntil(supervisor, [&] { return Service(supervisor)["state"] == "running"; });
  }
}

TEST_F(SupervisorTest, DoesNotRestartWhatWasStopped) {
  Supervisor supervisor({Spec("a", "exec sleep 60", true)}, Clock());
  supervisor.Step();
  supervisor.Stop("a", false);
  now_ += std::chrono::hours(1);
  supervisor.Step();
  EXPECT_EQ(Service(supervisor)["state"].asString(), "stopped");
  EXPECT_EQ(Service(supervisor)["last_end"].asString(), "signal 15");
}

TEST_F(SupervisorTest, KillsByForceWhatDoesNotListen) {
  Supervisor supervisor({Spec("a", "trap '' TERM; while :; do sleep 1; done", true)});
  supervisor.Step();
  supervisor.Stop("a", true);
  EXPECT_EQ(Service(supervisor)["last_end"].asString(), "signal 9");
}

TEST_F(SupervisorTest, StartWaitsUntilTheServiceListens) {
  // The socket appears while the supervisor waits for it.
  Supervisor supervisor({Spec("a", ": > " + dir_.path() + "/go; exec sleep 60")});
  std::unique_ptr<daemon::SocketServer> server;
  std::thread listener([&] {
    while (!std::filesystem::exists(dir_.path() + "/go")) std::this_thread::yield();
    server = Listen("a");
  });
  supervisor.Start("a");
  listener.join();
  EXPECT_EQ(Service(supervisor)["state"].asString(), "running");
}

TEST_F(SupervisorTest, StartReportsAServiceThatDies) {
  Supervisor supervisor({Spec("a", "exit 1")});
  try {
    supervisor.Start("a");
    FAIL() << "no problem reported";
  } catch (const Problem& problem) {
    EXPECT_STREQ(problem.what(), "a does not start (exit code 1); its reason is in the log");
  }
}

TEST_F(SupervisorTest, RemovesTheSocketThatADeadServiceLeaves) {
  const ServiceSpec spec = Spec("a", "exec sleep 60", true);
  Supervisor supervisor({spec}, Clock());
  supervisor.Step();
  std::ofstream(spec.socket_path) << "";
  kill(Service(supervisor)["pid"].asInt(), SIGKILL);
  StepUntil(supervisor, [&] { return Service(supervisor)["restarts"].asInt() == 1; });
  EXPECT_FALSE(std::filesystem::exists(spec.socket_path));
}

TEST_F(SupervisorTest, NamesAProgramThatCannotBeStarted) {
  Supervisor supervisor({{"a", dir_.path() + "/missing", dir_.path() + "/a.sock", true}});
  supervisor.Step();
  EXPECT_EQ(Service(supervisor)["last_end"].asString(),
            "Cannot start " + dir_.path() + "/missing: No such file or directory");
}

TEST_F(SupervisorTest, ServesRequests) {
  Supervisor supervisor({Spec("a", "exec sleep 60")});
  const auto server = Listen("a");
  Json::Value request;
  request["command"] = "start";
  request["data"]["service"] = "a";
  EXPECT_TRUE(supervisor.Handle(request)["success"].asBool());
  EXPECT_EQ(Service(supervisor)["state"].asString(), "running");
  request["command"] = "stop";
  EXPECT_TRUE(supervisor.Handle(request)["success"].asBool());
  EXPECT_EQ(Service(supervisor)["state"].asString(), "stopped");
}

TEST_F(SupervisorTest, RefusesWhatItDoesNotUnderstand) {
  Supervisor supervisor({Spec("a", "exec sleep 60")});
  const auto message = [&](const Json::Value& request) {
    const Json::Value reply = supervisor.Handle(request);
    EXPECT_FALSE(reply["success"].asBool());
    return reply["error"]["msg"].asString();
  };
  Json::Value request;
  EXPECT_EQ(message(request), "Missing property: command, data=null");
  request["command"] = "dance";
  request["data"]["service"] = "a";
  EXPECT_EQ(message(request), "There is no command \"dance\"");
  request["command"] = "start";
  request["data"]["service"] = "b";
  EXPECT_EQ(message(request), "There is no service named \"b\"");
  EXPECT_EQ(message(Json::Value(Json::arrayValue)), "Not an object, data=[]");
}

}  // namespace
}  // namespace quarry::cli
