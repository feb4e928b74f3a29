#include "platform/linux/service_manager.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>

#include "tests/platform/linux/fake_daemon.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::platform {
namespace {

TEST(ServiceManagerTest, SystemdIsForTheMachinesOwnSystemWhereItRuns) {
  test::TempDir dir;
  test::MakeDirs(dir / "systemd");
  test::WriteFile(dir / "file", "");
  ASSERT_EQ(symlink("systemd", (dir / "link").c_str()), 0);
  errno = 0;
  EXPECT_TRUE(MayUseSystemd("", dir / "systemd"));
  EXPECT_FALSE(MayUseSystemd("/private", dir / "systemd"));
  EXPECT_FALSE(MayUseSystemd("", dir / "missing"));
  EXPECT_FALSE(MayUseSystemd("", dir / "file"));
  EXPECT_FALSE(MayUseSystemd("", dir / "link"));
  EXPECT_EQ(errno, 0);
}

TEST(ServiceManagerTest, ASupervisorThatAnswersComesFirst) {
  test::TempDir dir;
  const std::string socket = dir / "quarry.sock";
  errno = 0;
  EXPECT_TRUE(SystemdRunsServices(true, socket)) << "nobody listens";
  EXPECT_FALSE(SystemdRunsServices(false, socket));
  {
    test::FakeDaemon supervisor(socket, [](const std::string&) { return std::string(); });
    EXPECT_FALSE(SystemdRunsServices(true, socket));
    EXPECT_FALSE(SystemdRunsServices(false, socket));
    EXPECT_TRUE(supervisor.Requests().empty()) << "it is not disturbed by the question";
  }
  test::WriteFile(socket, "");
  EXPECT_TRUE(SystemdRunsServices(true, socket)) << "a socket that was left behind";
  EXPECT_EQ(errno, 0);
}

TEST(ServiceManagerTest, APrivateSystemNeverUsesSystemd) {
  EXPECT_FALSE(MayUseSystemd());
  EXPECT_FALSE(SystemdRunsServices());
}

TEST(ServiceManagerTest, KnowsTheServiceBehindAJob) {
  EXPECT_EQ(ServiceOfJob("pkg-Quarry-fileindexd"), "fileindexd");
  EXPECT_EQ(ServiceOfJob("fileindexd"), "fileindexd");
  EXPECT_EQ(ServiceOfJob("x-pkg-Quarry-fileindexd"), "x-pkg-Quarry-fileindexd");
  EXPECT_EQ(ServiceOfJob(""), "");
}

}  // namespace
}  // namespace quarry::platform
