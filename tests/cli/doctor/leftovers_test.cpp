// What dead processes leave is removed; what living ones use, and what is nobody's, stays.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <ctime>

#include "cli/doctor/checks.h"
#include "common/file_util.h"
#include "common/unique_fd.h"
#include "daemons/common/listener.h"
#include "daemons/common/single_instance.h"
#include "tests/support/files.h"
#include "tests/support/root.h"

namespace quarry::test {
namespace {

using cli::Examination;
using cli::Outcome;

class LeftoversTest : public testing::Test {
 protected:
  void SetUp() override { ResetTestRoot(); }

  static std::vector<cli::Finding> Look(bool mend) {
    Examination examination(mend);
    cli::CheckLeftovers(examination);
    return examination.findings();
  }
  static void ExpectMended(std::size_t count) {
    EXPECT_EQ(Look(false).size(), count);
    const auto findings = Look(true);
    EXPECT_EQ(findings.size(), count);
    for (const auto& finding : findings) {
      EXPECT_EQ(finding.outcome, Outcome::kMended) << finding.trouble << finding.remedy;
    }
    EXPECT_TRUE(Look(true).empty());
  }
  static bool Exists(const std::string& path) {
    struct stat info {};
    return lstat(path.c_str(), &info) == 0;
  }
  static void MakeOld(const std::string& path, std::time_t seconds, mode_t mode = 0600) {
    WriteFile(path, "half");
    ASSERT_EQ(chmod(path.c_str(), mode), 0);
    const timespec then{std::time(nullptr) - seconds, 0};
    const timespec times[] = {then, then};
    ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
  }

  const std::string run_ = TestRoot() + "/var/run/";
};

TEST_F(LeftoversTest, AFreshSystemHasNone) {
  EXPECT_TRUE(Look(true).empty());
}

TEST_F(LeftoversTest, ADeadSocketAndAPidFileGo) {
  {
    const UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, (run_ + "fileindexd.sock").c_str(),
                 sizeof(address.sun_path) - 1);
    ASSERT_EQ(bind(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
  }
  WriteFile(run_ + "fileindexd.pid", "12345\n");
  WriteFile(run_ + "tarnelasticd.pid", "12346\n");
  ExpectMended(2);
  EXPECT_FALSE(Exists(run_ + "fileindexd.sock"));
  EXPECT_EQ(ReadFile(run_ + "fileindexd.pid"), "");
  EXPECT_EQ(ReadFile(run_ + "tarnelasticd.pid"), "");
}

TEST_F(LeftoversTest, WhatALivingDaemonUsesStays) {
  const daemon::SingleInstance instance("fileindexd");
  EXPECT_TRUE(Look(true).empty());
  const daemon::Listener listener(run_ + "fileindexd.sock");
  EXPECT_TRUE(Look(true).empty());
  EXPECT_TRUE(Exists(run_ + "fileindexd.sock"));
  EXPECT_EQ(ReadFile(run_ + "fileindexd.pid"), std::to_string(getpid()) + "\n");
}

TEST_F(LeftoversTest, ASocketThatSomebodyElseListensAtStays) {
  const daemon::Listener listener(run_ + "fileindexd.sock");
  EXPECT_TRUE(Look(true).empty());
  EXPECT_TRUE(Exists(run_ + "fileindexd.sock"));
}

TEST_F(LeftoversTest, WhatIsInTheWayOfASocketIsSetAside) {
  WriteFile(run_ + "quarry.sock", "a text");
  MakeDirs(run_ + "tarnelasticd.sock");
  ExpectMended(2);
  std::string aside;
  for (const std::string& name : ListDir(run_)) {
    if (StringStartWith(name, "quarry.sock.damaged-")) aside = run_ + name;
  }
  EXPECT_EQ(ReadFile(aside), "a text");
  EXPECT_FALSE(Exists(run_ + "quarry.sock"));
  EXPECT_FALSE(Exists(run_ + "tarnelasticd.sock"));
}

TEST_F(LeftoversTest, OldTemporaryFilesGoAndNothingElse) {
  const std::string root = TestRoot();
  const std::string temporary[] = {"/var/packages/Quarry/etc/.quarry-1-2-3.tmp",
                                   "/var/lib/quarry/engine/.quarry-1-2-3.tmp",
                                   "/var/lib/quarry/queue/.quarry-queue-aB3xYz.tmp",
                                   "/etc/quarry/shares.json.aB3xYz",
                                   "/etc/quarry/samba-spotlight.conf.aB3xYz",
                                   "/var/lib/quarry/monitor/fileindex-q.json.aB3xYz"};
  const std::string others[] = {
      "/var/packages/Quarry/etc/fileindex.folders",
      "/var/packages/Quarry/etc/.quarry-notes",
      "/var/packages/Quarry/etc/fileindex.folders.damaged-20260101-000000",
      "/var/lib/quarry/queue/volume1+a.json.backup",
      "/var/lib/quarry/queue/fileindex-a.Backup",
      "/etc/quarry/shares.json.backup",
      "/var/lib/quarry/queue/volume1+a.tmp",
      "/etc/quarry/shares.json",
      "/etc/quarry/shares.json.lock",
      "/etc/quarry/shares.json.bak"};
  for (const std::string& name : temporary) MakeOld(root + name, 1000);
  for (const std::string& name : others) MakeOld(root + name, 1000);
  ExpectMended(std::size(temporary));
  for (const std::string& name : temporary) EXPECT_FALSE(Exists(root + name)) << name;
  for (const std::string& name : others) EXPECT_TRUE(Exists(root + name)) << name;
  // A copy that everybody may read is none.
  MakeOld(root + "/etc/quarry/shares.json.Friday", 1000, 0644);
  EXPECT_TRUE(Look(true).empty());
  // A young one may be about to get its name.
  for (const std::string& name : temporary) MakeOld(root + name, 100);
  EXPECT_TRUE(Look(true).empty());
}

}  // namespace
}  // namespace quarry::test
