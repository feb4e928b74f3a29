#include "daemons/common/log.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <utility>
#include <vector>

#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace {

std::vector<std::pair<int, std::string>> system_log;
std::string log_ident;
int log_facility = 0;

void Keep(int priority, const char* format, va_list args) {
  char text[16384];
  std::vsnprintf(text, sizeof(text), format, args);
  system_log.emplace_back(priority, text);
}

}  // namespace

// The system log, replaced so that the lines can be looked at.
extern "C" void syslog(int priority, const char* format, ...) {
  va_list args;
  va_start(args, format);
  Keep(priority, format, args);
  va_end(args);
}

// What a build with fortified functions calls instead.
extern "C" void __syslog_chk(int priority, int, const char* format, ...) {
  va_list args;
  va_start(args, format);
  Keep(priority, format, args);
  va_end(args);
}

extern "C" void openlog(const char* ident, int, int facility) {
  log_ident = ident;
  log_facility = facility;
}

namespace quarry::daemon {
namespace {

// Sends stderr to a file for the length of a test.
class LogTest : public ::testing::Test {
 protected:
  LogTest() : file_(dir_ / "stderr"), old_(dup(STDERR_FILENO)) {
    system_log.clear();
    const int fd = open(file_.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600);
    dup2(fd, STDERR_FILENO);
    close(fd);
  }
  ~LogTest() override {
    dup2(old_, STDERR_FILENO);
    close(old_);
    OpenLog("test", false);
  }
  std::string Stderr() const { return test::ReadFile(file_); }

  test::TempDir dir_;
  std::string file_;
  int old_;
};

TEST_F(LogTest, WritesEachLevelToTheSystemLogAndStderr) {
  OpenLog("quarryd", true);
  LogInfo("one");
  LogWarning("two");
  LogError("three");
  const std::vector<std::pair<int, std::string>> wanted = {{LOG_DAEMON | LOG_INFO, "one"},
                                                           {LOG_DAEMON | LOG_WARNING, "two"},
                                                           {LOG_DAEMON | LOG_ERR, "three"}};
  EXPECT_EQ(system_log, wanted);
  EXPECT_EQ(log_ident, "quarryd");
  EXPECT_EQ(log_facility, LOG_DAEMON);
  EXPECT_EQ(Stderr(), "quarryd: info: one\nquarryd: warning: two\nquarryd: error: three\n");
}

TEST_F(LogTest, SaysNothingOnStderrInTheBackground) {
  OpenLog("quarryd", false);
  LogError("quiet");
  EXPECT_EQ(system_log.size(), 1u);
  EXPECT_EQ(Stderr(), "");
}

TEST_F(LogTest, KeepsForeignTextOnOneLine) {
  OpenLog("quarryd", true);
  LogInfo("a\nb\x1b[31m%s");
  EXPECT_EQ(system_log[0].second, "a\\nb\\x1B[31m%s");
  EXPECT_EQ(Stderr(), "quarryd: info: a\\nb\\x1B[31m%s\n");
}

TEST_F(LogTest, CutsLongLines) {
  OpenLog("quarryd", false);
  LogInfo(std::string(100000, '\n'));
  EXPECT_EQ(system_log[0].second.size(), 8192u);
}

TEST_F(LogTest, KeepsErrnoAndOutlivesItsTerminal) {
  OpenLog("quarryd", true);
  int ends[2];
  ASSERT_EQ(pipe(ends), 0);
  close(ends[0]);
  dup2(ends[1], STDERR_FILENO);
  close(ends[1]);
  errno = ENOTTY;
  LogInfo("to nobody");
  EXPECT_EQ(errno, ENOTTY);
  EXPECT_EQ(system_log.size(), 1u);
}

TEST(EscapeForLogTest, EscapesControlCharactersOnly) {
  EXPECT_EQ(EscapeForLog(""), "");
  EXPECT_EQ(EscapeForLog("plain text, \xc3\xa4 \xff"), "plain text, \xc3\xa4 \xff");
  EXPECT_EQ(EscapeForLog(std::string("\0\x01\x1f\x7f", 4)), "\\x00\\x01\\x1F\\x7F");
  EXPECT_EQ(EscapeForLog("\n\r\t\\"), "\\n\\r\\t\\\\");
}

}  // namespace
}  // namespace quarry::daemon
