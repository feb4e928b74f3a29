#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>

#include "platform/include/service.h"
#include "tests/platform/linux/child.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace quarry::platform {
namespace {

constexpr unsigned kFlags = 187;

// A program that writes its arguments, one a line, to a file and exits with `status`.
void WriteScript(const std::string& path, const std::string& output, int status) {
  test::WriteFile(path, "#!/bin/sh\nprintf '%s\\n' \"$0\" \"$@\" > '" + output + "'\nexit " +
                            std::to_string(status) + "\n");
  chmod(path.c_str(), 0755);
}

TEST(ExecTest, ReturnsTheExitStatus) {
  EXPECT_EQ(HLIBCExec("/bin/sh", "-c", "exit 0", nullptr), 0);
  EXPECT_EQ(HLIBCExec("/bin/sh", "-c", "exit 42", nullptr), 42);
  EXPECT_EQ(HLIBCExecl("/bin/sh", kFlags, "sh", "-c", "exit 7", nullptr), 7);
}

TEST(ExecTest, PassesArgumentsAsTheyAre) {
  test::TempDir dir;
  WriteScript(dir / "tool", dir / "out", 3);
  EXPECT_EQ(HLIBCExec((dir / "tool").c_str(), "a b", "", "$x;'\"", nullptr), 3);
  EXPECT_EQ(test::ReadFile(dir / "out"), (dir / "tool") + "\na b\n\n$x;'\"\n");
  EXPECT_EQ(HLIBCExecl((dir / "tool").c_str(), kFlags, "name", "one", nullptr), 3);
  EXPECT_EQ(test::ReadFile(dir / "out"), (dir / "tool") + "\none\n");
}

TEST(ExecTest, LooksForTheAppliancesToolsUnderTheRoot) {
  test::ResetTestRoot();
  test::TempDir dir;
  constexpr char kTool[] = "/usr/tarn/bin/tarnhelmnotify";
  errno = 0;
  EXPECT_LT(HLIBCExecl(kTool, kFlags, kTool, "-c", "x", nullptr), 0);
  EXPECT_EQ(errno, ENOENT);
  test::MakeDirs(test::TestRoot() + "/usr/tarn/bin");
  WriteScript(test::TestRoot() + kTool, dir / "out", 0);
  EXPECT_EQ(HLIBCExecl(kTool, kFlags, kTool, "-c", "x", nullptr), 0);
  EXPECT_EQ(test::ReadFile(dir / "out"), test::TestRoot() + kTool + "\n-c\nx\n");
}

TEST(ExecTest, FailsForWhatCannotBeRun) {
  test::TempDir dir;
  test::WriteFile(dir / "plain", "");
  EXPECT_LT(HLIBCExec((dir / "missing").c_str(), nullptr), 0);
  EXPECT_LT(HLIBCExec((dir / "plain").c_str(), nullptr), 0);
  EXPECT_LT(HLIBCExec(nullptr, nullptr), 0);
  EXPECT_LT(HLIBCExecl(nullptr, kFlags, "x", nullptr), 0);
  EXPECT_LT(HLIBCExecl("/bin/true", kFlags, nullptr), 0);
  EXPECT_LT(HLIBCExec("/bin/sh", "-c", "kill -9 $$", nullptr), 0) << "did not exit by itself";
}

TEST(ExecTest, TheProgramDoesNotIgnoreWhatWeIgnore) {
  EXPECT_EQ(test::RunInChild([] {
              std::signal(SIGPIPE, SIG_IGN);
              return HLIBCExec("/bin/sh", "-c", "kill -PIPE $$", nullptr) < 0 ? 0 : 1;
            }),
            0);
}

TEST(ExecTest, TheProgramStartsWithoutOurBlockedSignalsAndDescriptors) {
  test::TempDir dir;
  EXPECT_EQ(test::RunInChild([&] {
              sigset_t all;
              sigfillset(&all);
              pthread_sigmask(SIG_SETMASK, &all, nullptr);
              int ends[2];
              if (pipe(ends) != 0) return 1;
              const std::string script = "grep ^SigBlk /proc/self/status > '" + (dir / "signals") +
                                         "'; ls /proc/$$/fd > '" + (dir / "fds") + "'";
              return HLIBCExec("/bin/sh", "-c", script.c_str(), nullptr);
            }),
            0);
  EXPECT_EQ(test::ReadFile(dir / "signals"), "SigBlk:\t0000000000000000\n");
  const std::string fds = test::ReadFile(dir / "fds");
  EXPECT_EQ(fds.find("3\n"), std::string::npos) << fds;
}

}  // namespace
}  // namespace quarry::platform
