#include "common/log.h"

#include <gtest/gtest.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <string>

#include "tests/fake_platform/fixture.h"

namespace quarry {
namespace {

class LogTest : public fake::FakePlatformTest {
 protected:
  ~LogTest() override { fileindex::log_level = 7; }

  std::string OnlyLine() {
    const auto records = fake::LogRecords();
    EXPECT_EQ(records.size(), 1u);
    if (records.empty()) return "";
    EXPECT_EQ(records[0].priority, LOG_ERR);
    return records[0].text;
  }
};

TEST_F(LogTest, FailureWithErrnoTellsItAndClearsIt) {
  errno = ENOENT;
  LogFailure({"optree.cpp", 31, "GetNode"}, "!node", "path=/a");
  EXPECT_EQ(errno, 0);
  EXPECT_EQ(OnlyLine(), fake::LogHead("optree", 31, "GetNode") +
                            "Failed [!node], reason: path=/a [err: No such file or directory]");
}

TEST_F(LogTest, FailureWithoutErrnoHasNoTail) {
  LogFailure({"comm.cpp", 2, "F"}, "!ok", "");
  EXPECT_EQ(errno, 0);
  EXPECT_EQ(OnlyLine(), fake::LogHead("comm", 2, "F") + "Failed [!ok], reason: ");
}

TEST_F(LogTest, FailLogsAndThrows) {
  errno = EIO;
  try {
    Fail({"queue_mgr.cpp", 8, "Snapshot"}, "0 > rename(a, b)", kErrorSystem, "rename failed");
    FAIL() << "nothing was thrown";
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), 502);
    EXPECT_EQ(error.reason(), "rename failed");
  }
  EXPECT_EQ(errno, 0);
  EXPECT_EQ(OnlyLine(),
            fake::LogHead("queue_mgr", 8, "Snapshot") +
                "Failed [0 > rename(a, b)], reason: rename failed [err: Input/output error]");
}

TEST_F(LogTest, PercentSignsOfAMessageAreText) {
  LogLine({"a.cpp", 1, "F"}, "100%s %n");
  EXPECT_EQ(OnlyLine(), "a.cpp:1 100%s %n");
}

TEST_F(LogTest, LineHasUnitAndNumberOnly) {
  errno = EIO;
  LogLine({"queue_mgr.cpp", 12, "F"}, "Queue crashed: x");
  EXPECT_EQ(OnlyLine(), "queue_mgr.cpp:12 Queue crashed: x");
  EXPECT_EQ(errno, EIO);
  errno = 0;
}

TEST_F(LogTest, DebugLinesAreWrittenAtLevel7Only) {
  for (const int level : {6, 8, 0, -7, 3}) {
    fileindex::log_level = level;
    LogDebug({"a.cpp", 1, "F"}, "Got event: x");
    EXPECT_TRUE(fake::Logs().empty()) << level;
  }
  fileindex::log_level = 7;
  LogDebug({"a.cpp", 1, "F"}, "Got event: x");
  EXPECT_EQ(OnlyLine(), "a.cpp:1 Got event: x");
}

TEST_F(LogTest, SiteNamesUnitLineAndFunction) {
  const LogSite here = QUARRY_SITE("optree");
  EXPECT_STREQ(here.unit, "optree.cpp");
  EXPECT_EQ(here.line, __LINE__ - 2);
  EXPECT_STREQ(here.function, "TestBody");
  const LogSite fixed = QUARRY_SITE_AT("util", 73);
  EXPECT_STREQ(fixed.unit, "util.cpp");
  EXPECT_EQ(fixed.line, 73);
}

TEST_F(LogTest, HeadNamesProcessAndEffectiveUser) {
  fake::SetEffectiveIds(1234, 5);
  LogError({"a.cpp", 9, "F"}, "m");
  EXPECT_EQ(OnlyLine(), "a.cpp:9 (" + std::to_string(getpid()) + ", 1234) (F) m");
}

TEST_F(LogTest, LongMessagesAreKeptWhole) {
  const std::string message(100000, 'x');
  LogLine({"a.cpp", 1, "F"}, message);
  EXPECT_EQ(OnlyLine(), "a.cpp:1 " + message);
}

}  // namespace
}  // namespace quarry
