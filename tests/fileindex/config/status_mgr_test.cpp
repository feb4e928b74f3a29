#include "fileindex/config/status_mgr.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdint>
#include <functional>
#include <string>

#include "common/error.h"
#include "common/json.h"
#include "common/paths.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/index_daemon.h"
#include "tests/support/files.h"

namespace quarry::fileindex {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

const std::string kLock = RootedPath("/tmp/quarry_cfg_fi_status.lock");

class StatusMgrTest : public fake::FakePlatformTest {
 protected:
  static void Store(const std::string& text) { test::WriteFile(kFileIndexStatusCfgPath, text); }
  static std::string Stored() { return test::ReadFile(kFileIndexStatusCfgPath); }

  // The failure of `action`: its code, or 0 when it does not fail; its reason through `reason`.
  static int CodeOf(const std::function<void()>& action, std::string* reason = nullptr) {
    try {
      action();
    } catch (const Error& error) {
      if (reason != nullptr) *reason = error.reason();
      return error.code();
    }
    return 0;
  }
};

TEST_F(StatusMgrTest, TheFileHasItsFixedPlace) {
  EXPECT_EQ(kFileIndexStatusCfgPath, RootedPath("/var/packages/Quarry/etc/fileindex.status"));
}

TEST_F(StatusMgrTest, NoFileIsNotPausedAndHasNoBits) {
  const StatusMgr status;
  EXPECT_EQ(status.GetPauseInfo(), -1);
  EXPECT_EQ(status.GetShareStatus("a"), 0);
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(StatusMgrTest, NullIsAnObjectWithoutMembers) {
  Store("null");
  StatusMgr status;
  EXPECT_EQ(status.GetPauseInfo(), -1);
  EXPECT_EQ(status.GetShareStatus("a"), 0);
  status.Save();
  EXPECT_EQ(Stored(), "null");
  status.SetShareStatus("a", 1);
  EXPECT_EQ(Stored(), R"({"share":{"a":1}})");
}

TEST_F(StatusMgrTest, AFileThatIsNotJsonIsRefused) {
  for (const std::string& text : {std::string(), std::string("{"), std::string("{}x")}) {
    Store(text);
    errno = 0;
    fake::ClearLogs();
    std::string reason;
    EXPECT_EQ(CodeOf([] { StatusMgr(); }, &reason), 504) << text;
    EXPECT_EQ(reason, "Cannot load json: " + kFileIndexStatusCfgPath);
    ASSERT_EQ(fake::Logs().size(), 1U);
    EXPECT_EQ(fake::Logs()[0].substr(0, fake::Logs()[0].find(" [err: ")),
              fake::LogHead("status_mgr", 20, "StatusMgr") +
                  "Failed [IsFileExist(kFileIndexStatusCfgPath) && "
                  "!data_.fromFile(kFileIndexStatusCfgPath)], reason: " +
                  reason);
    EXPECT_EQ(Stored(), text);
  }
}

TEST_F(StatusMgrTest, AFileNestedBeyondReasonIsRefused) {
  std::string text;
  for (int i = 0; i < 100000; ++i) text += "{\"a\":";
  Store(text + "1" + std::string(100000, '}'));
  EXPECT_EQ(CodeOf([] { StatusMgr(); }), 504);
}

TEST_F(StatusMgrTest, SomethingThatIsNoRegularFileIsRefused) {
  test::MakeDirs(kFileIndexStatusCfgPath);
  EXPECT_EQ(CodeOf([] { StatusMgr(); }), 504);
  ASSERT_EQ(rmdir(kFileIndexStatusCfgPath.c_str()), 0);
  ASSERT_EQ(symlink("/nowhere/at/all", kFileIndexStatusCfgPath.c_str()), 0);
  EXPECT_EQ(CodeOf([] { StatusMgr(); }), 504);
  ASSERT_EQ(unlink(kFileIndexStatusCfgPath.c_str()), 0);
  ASSERT_EQ(mkfifo(kFileIndexStatusCfgPath.c_str(), 0600), 0);
  EXPECT_EQ(CodeOf([] { StatusMgr(); }), 504);
}

TEST_F(StatusMgrTest, ARootThatIsNoObjectIsRefused) {
  for (const char* text : {"[]", "[1]", "\"x\"", "7", "true"}) {
    Store(text);
    std::string reason;
    EXPECT_EQ(CodeOf([] { StatusMgr(); }, &reason), 120) << text;
    EXPECT_EQ(reason, std::string("Not an object, data=") + text);
    EXPECT_EQ(Stored(), text);
  }
}

TEST_F(StatusMgrTest, PauseWithoutEndIsStoredAndTold) {
  test::IndexDaemon daemon;
  StatusMgr().Pause(0);
  EXPECT_EQ(Stored(), R"({"resume_time":0})");
  EXPECT_EQ(StatusMgr().GetPauseInfo(), 0);
  EXPECT_THAT(daemon.Commands(), ElementsAre(R"({"data":{"resume_time":0},"type":"pause"})"));
}

TEST_F(StatusMgrTest, PauseForHoursEndsSoLater) {
  test::IndexDaemon daemon;
  fake::SetTime(1700000000);
  StatusMgr().Pause(2);
  EXPECT_EQ(Stored(), R"({"resume_time":1700007200})");
  EXPECT_EQ(StatusMgr().GetPauseInfo(), 1700007200);
  EXPECT_THAT(daemon.Commands(),
              ElementsAre(R"({"data":{"resume_time":1700007200},"type":"pause"})"));
}

TEST_F(StatusMgrTest, ThePauseEndWrapsRoundIn32Bits) {
  struct Row {
    std::time_t now;
    int hours;
    long long end;
  };
  const Row rows[] = {
      {1700000000, 124301, 1700000000LL + 124301LL * 3600},  // the last that fits
      {1700000000, 124302, 1700000000LL + 124302LL * 3600 - (1LL << 32)},
      {0, 596523, 596523LL * 3600},
      {0, 596524, 596524LL * 3600 - (1LL << 32)},
      {0, INT_MAX, static_cast<std::int32_t>(0x7fffffffU * 3600U)},  // -3600
      {5000000000, 1, static_cast<std::int32_t>(static_cast<std::uint32_t>(5000000000ULL) + 3600U)},
  };
  test::IndexDaemon daemon;
  for (const Row& row : rows) {
    fake::SetTime(row.now);
    StatusMgr().Pause(row.hours);
    EXPECT_EQ(StatusMgr().GetPauseInfo(), row.end) << row.hours;
    EXPECT_EQ(daemon.Commands().back(),
              "{\"data\":{\"resume_time\":" + std::to_string(row.end) + "},\"type\":\"pause\"}");
  }
}

TEST_F(StatusMgrTest, ANegativePauseChangesNothing) {
  test::IndexDaemon daemon;
  Store(R"({"resume_time":5})");
  for (int hours : {-1, INT_MIN}) {
    std::string reason;
    EXPECT_EQ(CodeOf([&] { StatusMgr().Pause(hours); }, &reason), 120);
    EXPECT_EQ(reason, "Pause length should NOT be negative");
  }
  EXPECT_THAT(fake::Logs(), IsEmpty());
  EXPECT_EQ(Stored(), R"({"resume_time":5})");
  EXPECT_THAT(daemon.Commands(), IsEmpty());
  StatusMgr().Pause(0);  // the lock is free again
  EXPECT_EQ(Stored(), R"({"resume_time":0})");
}

TEST_F(StatusMgrTest, ResumeIsStoredAndTold) {
  test::IndexDaemon daemon;
  Store(R"({"resume_time":0,"share":{"a":1}})");
  StatusMgr().Resume();
  EXPECT_EQ(Stored(), R"({"resume_time":-1,"share":{"a":1}})");
  EXPECT_THAT(daemon.Commands(), ElementsAre(R"({"data":null,"type":"resume"})"));
}

TEST_F(StatusMgrTest, TheDaemonIsToldUnderTheLockAfterTheSave) {
  std::string seen;
  bool locked = false;
  test::IndexDaemon daemon([&](const Json::Value&) {
    seen = Stored();
    const int fd = open(kLock.c_str(), O_RDONLY | O_CLOEXEC);
    locked = fd >= 0 && flock(fd, LOCK_SH | LOCK_NB) != 0;
    close(fd);
  });
  StatusMgr().Pause(0);
  EXPECT_EQ(seen, R"({"resume_time":0})");
  EXPECT_TRUE(locked);
  locked = false;
  StatusMgr().Resume();
  EXPECT_EQ(seen, R"({"resume_time":-1})");
  EXPECT_TRUE(locked);
}

TEST_F(StatusMgrTest, AStoredPauseOfAnotherKindIsNone) {
  for (const char* text :
       {R"({"resume_time":"5"})", R"({"resume_time":1.0})", R"({"resume_time":true})",
        R"({"resume_time":null})", R"({"resume_time":[5]})", R"({"resume_time":{}})"}) {
    Store(text);
    EXPECT_EQ(StatusMgr().GetPauseInfo(), -1) << text;
  }
  Store(R"({"resume_time":18446744073709551615})");
  EXPECT_EQ(CodeOf([] { StatusMgr().GetPauseInfo(); }), 120);
}

TEST_F(StatusMgrTest, BitsAreAddedTakenAwayAndForgotten) {
  StatusMgr().SetShareStatus("a", 1);
  EXPECT_EQ(StatusMgr().GetShareStatus("a"), 1);
  StatusMgr().SetShareStatus("a", 2);
  EXPECT_EQ(StatusMgr().GetShareStatus("a"), 3);
  StatusMgr().UnsetShareStatus("a", 1);
  EXPECT_EQ(StatusMgr().GetShareStatus("a"), 2);
  StatusMgr().UnsetShareStatus("a", 2);
  EXPECT_EQ(Stored(), R"({"share":{"a":0}})");
  StatusMgr().SetShareStatus("b", 4);
  StatusMgr().ClearShareStatus("a");
  EXPECT_EQ(Stored(), R"({"share":{"b":4}})");
  EXPECT_EQ(StatusMgr().GetShareStatus("a"), 0);
}

TEST_F(StatusMgrTest, TakingAwayFromAShareWithoutBitsStoresNone) {
  StatusMgr().UnsetShareStatus("a", 3);
  EXPECT_EQ(Stored(), R"({"share":{"a":0}})");
}

TEST_F(StatusMgrTest, ForgettingAnUnknownShareIsNoError) {
  StatusMgr().ClearShareStatus("a");
  EXPECT_EQ(Stored(), R"({"share":null})");
  EXPECT_EQ(StatusMgr().GetShareStatus("a"), 0);
  StatusMgr().SetShareStatus("b", 2);
  StatusMgr().ClearShareStatus("a");
  EXPECT_EQ(Stored(), R"({"share":{"b":2}})");
  Store(R"({"resume_time":7,"share":null})");
  StatusMgr().ClearShareStatus("a");
  EXPECT_EQ(Stored(), R"({"resume_time":7,"share":null})");
}

TEST_F(StatusMgrTest, BitsAreSignedNumbers) {
  StatusMgr().SetShareStatus("a", INT_MIN);
  EXPECT_EQ(Stored(), R"({"share":{"a":-2147483648}})");
  StatusMgr().SetShareStatus("a", 1);
  EXPECT_EQ(StatusMgr().GetShareStatus("a"), INT_MIN + 1);
  StatusMgr().UnsetShareStatus("a", INT_MIN);
  EXPECT_EQ(Stored(), R"({"share":{"a":1}})");
  StatusMgr().SetShareStatus("a", -1);
  EXPECT_EQ(Stored(), R"({"share":{"a":-1}})");

  Store(R"({"share":{"a":4294967294}})");  // as a writer of unsigned numbers leaves it
  StatusMgr().SetShareStatus("a", 1);
  EXPECT_EQ(Stored(), R"({"share":{"a":-1}})");
}

TEST_F(StatusMgrTest, BitsOfAnotherKindCountAsNone) {
  Store(R"({"share":{"a":"5","b":[1],"c":{},"d":1e20}})");
  for (const char* share : {"a", "b", "c", "d"}) {
    EXPECT_EQ(StatusMgr().GetShareStatus(share), 0) << share;
  }
  StatusMgr().SetShareStatus("a", 4);
  EXPECT_EQ(StatusMgr().GetShareStatus("a"), 4);
}

TEST_F(StatusMgrTest, SharesThatAreNoObjectAreRefusedAndKept) {
  for (const char* shares : {"\"x\"", "[]", "[1]", "5", "true"}) {
    const std::string text = std::string("{\"share\":") + shares + "}";
    Store(text);
    const auto code_and_reason = [&](const std::function<void(StatusMgr&)>& action) {
      std::string reason;
      const int code = CodeOf(
          [&] {
            StatusMgr status;
            action(status);
          },
          &reason);
      return std::to_string(code) + " " + reason;
    };
    const std::string refused = std::string("120 Not an object, data=") + shares;
    EXPECT_EQ(code_and_reason([](StatusMgr& s) { s.GetShareStatus("a"); }), refused);
    EXPECT_EQ(code_and_reason([](StatusMgr& s) { s.SetShareStatus("a", 1); }), refused);
    EXPECT_EQ(code_and_reason([](StatusMgr& s) { s.UnsetShareStatus("a", 1); }), refused);
    EXPECT_EQ(code_and_reason([](StatusMgr& s) { s.ClearShareStatus("a"); }), refused);
    EXPECT_EQ(Stored(), text);
  }
}

TEST_F(StatusMgrTest, ShareNamesAreAnyBytes) {
  const std::string name = "caf\xc3\xa9 \"x\" \xff";
  StatusMgr().SetShareStatus(name, 1);
  StatusMgr().SetShareStatus("", 2);
  EXPECT_EQ(StatusMgr().GetShareStatus(name), 1);
  EXPECT_EQ(StatusMgr().GetShareStatus(""), 2);
}

TEST_F(StatusMgrTest, AnObjectWritesBackWhatItLoaded) {
  StatusMgr old;
  StatusMgr().SetShareStatus("a", 1);
  old.SetShareStatus("b", 2);
  EXPECT_EQ(Stored(), R"({"share":{"b":2}})");
}

TEST_F(StatusMgrTest, TheFileIsWrittenAsRootAndReadableByAll) {
  StatusMgr().SetShareStatus("a", 1);
  EXPECT_EQ(test::FileMode(kFileIndexStatusCfgPath), 0644U);
  EXPECT_EQ(fake::CallsOf("ResetCredentialsByName").front(), "ResetCredentialsByName(root, true)");
}

TEST_F(StatusMgrTest, NothingIsWrittenWhereRootCannotBeBecome) {
  fake::FailCall("ResetCredentialsByName");
  EXPECT_EQ(CodeOf([] { StatusMgr().SetShareStatus("a", 1); }), 503);
  EXPECT_EQ(access(kFileIndexStatusCfgPath.c_str(), F_OK), -1);
}

TEST_F(StatusMgrTest, ALockThatCannotBeHadChangesNothing) {
  test::IndexDaemon daemon;
  test::MakeDirs(kLock);  // a directory is no lock file
  StatusMgr status;
  EXPECT_EQ(CodeOf([&] { status.Pause(0); }), 506);
  EXPECT_EQ(CodeOf([&] { status.Pause(-1); }), 506);
  EXPECT_EQ(CodeOf([&] { status.Resume(); }), 506);
  EXPECT_EQ(CodeOf([&] { status.SetShareStatus("a", 1); }), 506);
  EXPECT_EQ(CodeOf([&] { status.UnsetShareStatus("a", 1); }), 506);
  EXPECT_EQ(CodeOf([&] { status.ClearShareStatus("a"); }), 506);
  EXPECT_EQ(status.GetPauseInfo(), -1);
  EXPECT_EQ(status.GetShareStatus("a"), 0);
  EXPECT_EQ(access(kFileIndexStatusCfgPath.c_str(), F_OK), -1);
  EXPECT_THAT(daemon.Commands(), IsEmpty());
}

TEST_F(StatusMgrTest, AFailedWriteIsReportedAndTheDaemonNotTold) {
  test::IndexDaemon daemon;
  Store(R"({"resume_time":5})");
  StatusMgr status;
  fake::FailEverySystemCall("rename", EIO);
  std::string reason;
  EXPECT_EQ(CodeOf([&] { status.Pause(1); }, &reason), 505);
  EXPECT_EQ(reason, "Failed to save json: " + kFileIndexStatusCfgPath);
  EXPECT_THAT(fake::Logs(),
              ElementsAre(fake::LogHead("status_mgr", 121, "Save") +
                          "Failed [!data_.toFile(kFileIndexStatusCfgPath)], reason: " + reason +
                          " [err: Input/output error]"));
  EXPECT_EQ(Stored(), R"({"resume_time":5})");
  EXPECT_THAT(daemon.Commands(), IsEmpty());
}

TEST_F(StatusMgrTest, AFailedChangeOfModeIsReportedAndTheDaemonNotTold) {
  test::IndexDaemon daemon;
  StatusMgr status;
  fake::FailEverySystemCall("chmod", EPERM);
  std::string reason;
  EXPECT_EQ(CodeOf([&] { status.Resume(); }, &reason), 502);
  EXPECT_EQ(reason, "chmod failed, reason=Operation not permitted");
  EXPECT_THAT(fake::Logs(),
              ElementsAre(fake::LogHead("status_mgr", 123, "Save") +
                          "Failed [-1 == chmod(kFileIndexStatusCfgPath, 0644)], reason: " + reason +
                          " [err: Operation not permitted]"));
  EXPECT_EQ(Stored(), R"({"resume_time":-1})");
  EXPECT_THAT(daemon.Commands(), IsEmpty());
}

TEST_F(StatusMgrTest, TheStateStaysSavedWhenTheDaemonCannotBeTold) {
  std::string reason;
  EXPECT_EQ(CodeOf([] { StatusMgr().Pause(0); }, &reason), 502);
  EXPECT_THAT(reason, HasSubstr("write failed, reason="));
  EXPECT_EQ(Stored(), R"({"resume_time":0})");
  EXPECT_EQ(CodeOf([] { StatusMgr().Resume(); }), 502);
  EXPECT_EQ(Stored(), R"({"resume_time":-1})");
}

}  // namespace
}  // namespace quarry::fileindex
