// The program itself.

#include <gtest/gtest.h>

#include <chrono>
#include <csignal>
#include <filesystem>

#include "cli/supervisor/child.h"
#include "common/file_util.h"
#include "common/json.h"
#include "daemons/common/single_instance.h"
#include "daemons/common/status_file.h"
#include "platform/include/monitor.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace quarry::notify {
namespace {

using TARN::TARNOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION;
using TARN::TARNOTIFYD::MonitorQueue;

class DaemonTest : public ::testing::TestWithParam<const char*> {
 protected:
  DaemonTest() { test::ResetTestRoot(); }

  cli::Child Start() const {
    const std::string program = Dirname(Dirname(RealPath("/proc/self/exe"))) + "/bin/tarnotifyd";
    return cli::Child(program, {"--source", GetParam()}, scratch_ / "log");
  }
  static bool IsRunning() { return daemon::RunningPid(daemon::PidFilePath("tarnotifyd")) > 0; }
  void Register() const {
    Json::Value config;
    config["queue"] = queue_;
    config["config"][0]["path"] = top_;
    config["config"][0]["mask"] = 0xFFC6;
    ASSERT_TRUE(
        MonitorQueue::Upsert(MonitorQueue(config), "fileindex", MONITOR_QUEUE_TYPE_APPLICATION));
  }
  bool QueueHas(const std::string& text) const {
    return std::filesystem::exists(queue_) &&
           test::ReadFile(queue_).find(text) != std::string::npos;
  }
  bool QueueGets(const std::string& text) const {
    return test::WaitUntil([&] { return QueueHas(text); });
  }

  test::TempDir files_;
  test::TempDir scratch_;
  const std::string top_ = files_.path();
  const std::string queue_ = test::TestRoot() + "/var/lib/quarry/queue/q";
};

TEST_P(DaemonTest, FollowsWhatIsRegisteredAndStops) {
  cli::Child daemon = Start();
  ASSERT_TRUE(test::WaitUntil(IsRunning)) << test::ReadFile(scratch_ / "log");
  Register();
  EXPECT_TRUE(QueueGets("\"event\":512"));
  EXPECT_TRUE(test::WaitUntil(
      [&] { return daemon::ReadStatusFile("tarnotifyd")["queues"][0]["queue"] == queue_; }));
  EXPECT_EQ(daemon::ReadStatusFile("tarnotifyd")["pid"], daemon.Pid());
  std::filesystem::remove(queue_);
  test::WriteFile(top_ + "/file", "x");
  EXPECT_TRUE(QueueGets("{\"event\":64,\"is_dir\":false,\"path\":\"" + top_ + "/file\""));
  daemon.Signal(SIGTERM);
  EXPECT_TRUE(daemon.WaitEnded(10'000));
  EXPECT_EQ(*daemon.Ended(), "exit code 0");
  EXPECT_TRUE(daemon::ReadStatusFile("tarnotifyd").isNull());
}

TEST_P(DaemonTest, RunsOnce) {
  cli::Child daemon = Start();
  ASSERT_TRUE(test::WaitUntil(IsRunning)) << test::ReadFile(scratch_ / "log");
  cli::Child second = Start();
  EXPECT_TRUE(second.WaitEnded(10'000));
  EXPECT_EQ(*second.Ended(), "exit code 1");
  EXPECT_NE(test::ReadFile(scratch_ / "log").find("already running"), std::string::npos);
  daemon.Signal(SIGTERM);
  EXPECT_TRUE(daemon.WaitEnded(10'000));
}

TEST_P(DaemonTest, AfterBeingKilledItBeginsInDoubt) {
  Register();
  {
    cli::Child daemon = Start();
    EXPECT_TRUE(QueueGets("\"event\":512"));
    daemon.Signal(SIGKILL);
    EXPECT_TRUE(daemon.WaitEnded(10'000));
  }
  std::filesystem::remove(queue_);
  cli::Child daemon = Start();
  EXPECT_TRUE(QueueGets("\"event\":512"));
  daemon.Signal(SIGTERM);
  EXPECT_TRUE(daemon.WaitEnded(10'000));
}

INSTANTIATE_TEST_SUITE_P(Sources, DaemonTest, ::testing::Values("auto", "inotify"),
                         [](const auto& source) { return std::string(source.param); });

}  // namespace
}  // namespace quarry::notify
