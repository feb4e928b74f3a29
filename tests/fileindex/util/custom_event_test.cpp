#include "fileindex/util/custom_event.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstring>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/paths.h"
#include "common/unique_fd.h"
#include "fileindex/config/status_mgr.h"
#include "fileindex/queue/event.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"
#include "tests/support/thrown.h"

namespace {

std::atomic<bool> fail_ftruncate{false};

}  // namespace

// Takes the C library's place in this program, so that its failure can be watched.
extern "C" int ftruncate(int fd, off_t size) noexcept {
  if (!fail_ftruncate) return static_cast<int>(syscall(SYS_ftruncate, fd, size));
  errno = EIO;
  return -1;
}

namespace quarry::fileindex {
namespace {

using test::Thrown;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;

constexpr int kRename = 0x100;
constexpr int kReindex = 0x10000;
constexpr int kUpdateCfg = 0x20000;

class CustomEventTest : public fake::FakePlatformTest {
 protected:
  CustomEventTest() {
    fake::AddShare("photo", "/volume1/photo");
    queue_ = fake::QueuePath("/volume1/photo");
  }
  ~CustomEventTest() override { fail_ftruncate = false; }

  std::string Queue() const { return test::ReadFile(queue_); }
  void SetQueue(const std::string& text) const { test::WriteFile(queue_, text); }

  static void AddModest() { AddCustomEvent(kUpdateCfg, "/volume1/photo/a", "", Json::Value()); }

  // The line that announces that `error` made the share doubtful.
  static std::string FailureLine(int code, const std::string& reason) {
    return fake::AnyLine(fake::LogHead("util", 1, "AddCustomEvent")) +
           "AddCustomEvent failed, code=" + std::to_string(code) + ", reason=" + reason +
           ". Set [photo] need reindex";
  }

  static int Status() { return StatusMgr().GetShareStatus("photo"); }

  std::string queue_;
};

constexpr char kModestLine[] =
    R"({"data":null,"event":131072,"path":"/volume1/photo/a","path_old":""})"
    "\n";

// ---- What is written

TEST_F(CustomEventTest, OneLinePerEvent) {
  Json::Value data;
  data["owner"] = "ü";
  AddCustomEvent(kRename, "/volume1/photo/new\n", "/volume1/old \"x\"", data);
  AddModest();
  EXPECT_EQ(Queue(), R"({"data":{"owner":"ü"},"event":256,"path":"/volume1/photo/new\n",)"
                     R"("path_old":"/volume1/old \"x\""})"
                     "\n" +
                         std::string(kModestLine));
  EXPECT_THAT(fake::Logs(), IsEmpty());
  EXPECT_EQ(Status(), 0);
}

TEST_F(CustomEventTest, TheLineReadsBackAsAnEvent) {
  Json::Value data(Json::arrayValue);
  data.append(true);
  AddCustomEvent(kReindex, "/volume1/photo/\xff", "/old", data);
  const std::string line = Queue();
  const Event event(line.substr(0, line.size() - 1));
  EXPECT_EQ(event.op, 0x10000u);
  EXPECT_FALSE(event.is_dir);
  EXPECT_EQ(event.path, "/volume1/photo/\xff");
  EXPECT_EQ(event.path_old, "/old");
  EXPECT_EQ(event.data, data);
}

TEST_F(CustomEventTest, TheQueueIsNeverTruncated) {
  SetQueue(R"({"event":2,"path":"/volume1/photo/b"})"
           "\n");
  AddModest();
  EXPECT_EQ(Queue(), R"({"event":2,"path":"/volume1/photo/b"})"
                     "\n" +
                         std::string(kModestLine));
}

TEST_F(CustomEventTest, ATornLastLineIsEndedFirst) {
  const std::string line = R"({"event":2,"path":"/volume1/photo/b"})";
  for (size_t cut = 1; cut <= line.size(); ++cut) {
    SetQueue(line.substr(0, cut));
    AddModest();
    EXPECT_EQ(Queue(), line.substr(0, cut) + "\n" + kModestLine);
  }
  EXPECT_THAT(fake::Logs(), IsEmpty());
  EXPECT_EQ(Status(), 0);
}

TEST_F(CustomEventTest, ATornReindexThatIsWholeCovers) {
  SetQueue(R"({"event":65536,"path":"/volume1/photo"})");
  AddModest();
  EXPECT_EQ(Queue(), R"({"event":65536,"path":"/volume1/photo"})");
}

// ---- What a waiting reindex covers

TEST_F(CustomEventTest, AReindexAboveCoversEveryKind) {
  AddCustomEvent(kReindex, "/volume1/photo/dir", "", Json::Value());
  const std::string queue = Queue();
  for (const int kind : {kRename, kReindex, kUpdateCfg}) {
    AddCustomEvent(kind, "/volume1/photo/dir", "", Json::Value());
    AddCustomEvent(kind, "/volume1/photo/dir/below/it", "/volume1/photo/x", Json::Value());
  }
  EXPECT_EQ(Queue(), queue);
}

TEST_F(CustomEventTest, AReindexElsewhereCoversNothing) {
  AddCustomEvent(kReindex, "/volume1/photo/dir/below", "", Json::Value());
  const size_t size = Queue().size();
  AddCustomEvent(kUpdateCfg, "/volume1/photo/dir", "", Json::Value());
  const size_t above = Queue().size();
  EXPECT_GT(above, size);
  AddCustomEvent(kUpdateCfg, "/volume1/photo/dir/below2", "", Json::Value());
  EXPECT_GT(Queue().size(), above);
}

TEST_F(CustomEventTest, AReindexInTheSnapshotCoversToo) {
  AddCustomEvent(kReindex, "/volume1/photo", "", Json::Value());
  ASSERT_EQ(rename(queue_.c_str(), (queue_ + ".tmp").c_str()), 0);
  AddModest();
  EXPECT_NE(access(queue_.c_str(), F_OK), 0);
}

// ---- Locking

TEST_F(CustomEventTest, AppendsUnderTheQueuesLock) {
  auto lock = std::make_unique<LockFile>(queue_, true);
  fake::OnSleep([&](std::chrono::microseconds) {
    EXPECT_EQ(Queue(), "");
    lock.reset();
  });
  AddModest();
  EXPECT_EQ(lock, nullptr);
  EXPECT_EQ(Queue(), kModestLine);
}

TEST_F(CustomEventTest, AWaitingReindexIsSeenWithoutTheLock) {
  AddCustomEvent(kReindex, "/volume1/photo", "", Json::Value());
  const std::string queue = Queue();
  const LockFile lock(queue_, true);
  AddModest();
  EXPECT_THAT(fake::Sleeps(), IsEmpty());
  EXPECT_EQ(Queue(), queue);
}

TEST_F(CustomEventTest, WritersDoNotMixTheirLines) {
  // A pause that takes no time would not outlast another writer's turn.
  fake::OnSleep([this](std::chrono::microseconds) {
    const UniqueFd queue(open(queue_.c_str(), O_RDONLY | O_CLOEXEC));
    EXPECT_EQ(flock(queue.get(), LOCK_EX), 0);
  });
  std::vector<std::thread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([i] {
      for (int k = 0; k < 5; ++k) {
        const std::string path = "/volume1/photo/" + std::to_string(i) + std::string(3000, 'x');
        AddCustomEvent(kUpdateCfg, path, "", Json::Value(k));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  const std::string queue = Queue();
  int lines = 0;
  for (size_t begin = 0; begin < queue.size(); ++lines) {
    const size_t end = queue.find('\n', begin);
    ASSERT_NE(end, std::string::npos);
    EXPECT_NO_THROW(Event(queue.substr(begin, end - begin)));
    begin = end + 1;
  }
  EXPECT_EQ(lines, 20);
}

// ---- Failures

TEST_F(CustomEventTest, AnUnknownPlaceIsThrownAsItIs) {
  const Error error = Thrown([] { AddCustomEvent(kReindex, "/elsewhere", "", Json::Value()); });
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), "TARNShareNamePathGet failed, full_path=/elsewhere");
  EXPECT_THAT(fake::LogsWith("AddCustomEvent"), IsEmpty());
  EXPECT_NE(access(kFileIndexStatusCfgPath.c_str(), F_OK), 0);
}

TEST_F(CustomEventTest, AShareThatCannotBeOpenedIsMarked) {
  fake::FailCall("TARNShareGet");
  EXPECT_EQ(Thrown(AddModest).code(), 800);
  ASSERT_THAT(fake::LogsWith("AddCustomEvent failed"), SizeIs(1));
  EXPECT_EQ(Status(), 1);
}

TEST_F(CustomEventTest, AQueueThatHasNoPathMarksTheShare) {
  fake::FailCall("FILEIDXQueuePathCompose");
  const Error error = Thrown(AddModest);
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), "FILEIDXQueuePathCompose failed, share=photo");
  EXPECT_EQ(fake::AnyLine(fake::LogsWith("AddCustomEvent failed").front()),
            FailureLine(502, "FILEIDXQueuePathCompose failed, share=photo"));
  EXPECT_EQ(Status(), 1);
}

TEST_F(CustomEventTest, AMalformedQueueMarksTheShare) {
  SetQueue("rubbish\n");
  const Error error = Thrown(AddModest);
  EXPECT_EQ(error.code(), 906);
  EXPECT_EQ(error.reason(), "Malformed event_raw: rubbish");
  EXPECT_EQ(Queue(), "rubbish\n");
  EXPECT_EQ(fake::AnyLine(fake::Logs().back()), FailureLine(906, "Malformed event_raw: rubbish"));
  EXPECT_EQ(fake::LogRecords().back().priority, 3);
  EXPECT_EQ(Status(), 1);
}

TEST_F(CustomEventTest, TheMarkIsAddedToOtherBits) {
  StatusMgr().SetShareStatus("photo", 2);
  SetQueue("rubbish\n");
  Thrown(AddModest);
  EXPECT_EQ(Status(), 3);
}

TEST_F(CustomEventTest, AQueueThatCannotBeLockedMarksTheShare) {
  const std::string queue = RootedPath("/missing/queue");
  fake::SetQueuePath("/volume1/photo", queue);
  const Error error = Thrown(AddModest);
  EXPECT_EQ(error.code(), 506);
  const std::string reason = "open failed, path=" + queue + ", reason=" + strerror(ENOENT);
  EXPECT_EQ(error.reason(), reason);
  EXPECT_EQ(fake::AnyLine(fake::Logs().back()), FailureLine(506, reason));
  EXPECT_EQ(Status(), 1);
}

TEST_F(CustomEventTest, AQueueThatCannotBeReadMarksTheShare) {
  SetQueue(kModestLine);
  fake::FailSystemCall("open", 1, EACCES);
  const Error error = Thrown(AddModest);
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), std::string("Failed to open queue, reason=") + strerror(EACCES));
  EXPECT_EQ(Queue(), kModestLine);
  EXPECT_EQ(Status(), 1);
}

TEST_F(CustomEventTest, AnOldPathWithANulByteMarksTheShare) {
  const std::string old_path = std::string("/volume1/photo/a\0b", 18);
  const Error error =
      Thrown([&] { AddCustomEvent(kRename, "/volume1/photo/new", old_path, Json::Value()); });
  EXPECT_EQ(error.code(), 120);
  EXPECT_EQ(error.reason(), "NUL byte in path: " + old_path);
  EXPECT_NE(access(queue_.c_str(), F_OK), 0);
  EXPECT_EQ(Status(), 1);
}

TEST_F(CustomEventTest, APathWithANulByteIsOfNoShare) {
  const std::string path = std::string("/volume1/photo/a\0b", 18);
  EXPECT_EQ(Thrown([&] { AddCustomEvent(kReindex, path, "", Json::Value()); }).code(), 502);
  EXPECT_NE(access(queue_.c_str(), F_OK), 0);
}

TEST_F(CustomEventTest, AQueueThatCannotBeOpenedLosesTheEventSilently) {
  SetQueue("");
  // The first opening is the lock's.
  fake::OnSystemCall("flock", [] { fake::FailSystemCall("open", 1, EACCES); });
  AddModest();
  fake::OnSystemCall("flock", nullptr);
  EXPECT_EQ(Queue(), "");
  EXPECT_THAT(fake::Logs(), IsEmpty());
  EXPECT_EQ(Status(), 0);
}

TEST_F(CustomEventTest, AQueueThatCannotBeAskedForItsSizeIsAFailureToAppend) {
  SetQueue("");
  // The lock asks first.
  fake::FailSystemCall("fstat", 2, EIO);
  EXPECT_EQ(Thrown(AddModest).code(), 502);
  EXPECT_EQ(Queue(), "");
  const std::string reason = std::string("write failed, reason=") + strerror(EIO);
  EXPECT_EQ(fake::AnyLine(fake::Logs().at(0)),
            FailureLine(502, reason) + " [err: " + strerror(EIO) + "]");
}

TEST_F(CustomEventTest, AnEndThatCannotBeReadCountsAsTheEndOfALine) {
  SetQueue(R"({"event":2,"path":"/volume1/photo/b"})"
           "\n");
  fake::FailSystemCall("pread", 1, EIO);
  AddModest();
  EXPECT_EQ(Queue(), R"({"event":2,"path":"/volume1/photo/b"})"
                     "\n" +
                         std::string(kModestLine));
  EXPECT_EQ(Status(), 0);
}

TEST_F(CustomEventTest, AShortWriteIsContinued) {
  fake::CutWrite(1, 7);
  AddModest();
  EXPECT_EQ(Queue(), kModestLine);
}

TEST_F(CustomEventTest, AnInterruptedWriteIsRepeated) {
  fake::FailSystemCall("write", 1, EINTR);
  AddModest();
  EXPECT_EQ(Queue(), kModestLine);
}

TEST_F(CustomEventTest, AShortWriteIsCutBackAndMarksTheShare) {
  SetQueue(R"({"event":2,"path":"/volume1/photo/b"})");
  fake::CutWrite(1, 7);
  fake::FailSystemCall("write", 2, ENOSPC);
  const Error error = Thrown(AddModest);
  EXPECT_EQ(error.code(), 502);
  const std::string reason = std::string("write failed, reason=") + strerror(ENOSPC);
  EXPECT_EQ(error.reason(), reason);
  EXPECT_EQ(Queue(), R"({"event":2,"path":"/volume1/photo/b"})");
  ASSERT_THAT(fake::Logs(), SizeIs(1));
  EXPECT_EQ(fake::AnyLine(fake::Logs().front()),
            FailureLine(502, reason) + " [err: " + strerror(ENOSPC) + "]");
  EXPECT_EQ(Status(), 1);
}

TEST_F(CustomEventTest, AShortWriteThatCannotBeCutBackIsLogged) {
  SetQueue("");
  fake::CutWrite(1, 7);
  fake::FailSystemCall("write", 2, ENOSPC);
  fail_ftruncate = true;
  const Error error = Thrown(AddModest);
  const std::string reason = std::string("write failed, reason=") + strerror(ENOSPC);
  EXPECT_EQ(error.reason(), reason);
  ASSERT_THAT(fake::Logs(), SizeIs(2));
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]), fake::AnyLine(fake::LogHead("util", 1, "AppendLine")) +
                                                "Failed [0 > ftruncate(fd, size)], reason: " +
                                                queue_ + " [err: " + strerror(EIO) + "]");
  EXPECT_EQ(fake::AnyLine(fake::Logs()[1]), FailureLine(502, reason));
  EXPECT_EQ(Status(), 1);
}

TEST_F(CustomEventTest, AWriteThatWritesNothingMarksTheShare) {
  fake::CutWrite(1, 0);
  EXPECT_EQ(Thrown(AddModest).code(), 502);
  EXPECT_EQ(Queue(), "");
  EXPECT_EQ(Status(), 1);
}

TEST_F(CustomEventTest, AStatusThatCannotBeKeptHidesNothing) {
  test::WriteFile(kFileIndexStatusCfgPath, "not JSON");
  SetQueue("rubbish\n");
  EXPECT_EQ(Thrown(AddModest).code(), 906);
  EXPECT_EQ(
      fake::AnyLine(fake::Logs().back()),
      fake::AnyLine(fake::LogHead("util", 1, "AddCustomEvent")) +
          "SetShareStatus failed, code=504, reason=Cannot load json: " + kFileIndexStatusCfgPath);
}

// ---- Notifications

std::string Tool() {
  return RootedPath("/usr/tarn/bin/tarnhelmnotify");
}

TEST_F(CustomEventTest, NotifyOfMissingSpace) {
  fake::OnExec([](const std::vector<std::string>&) { return 42; });
  EXPECT_EQ(SendHelmNotify(), 42);
  EXPECT_THAT(
      fake::Calls(),
      ElementsAre("HLIBCExecl(" + Tool() + ", 187, " + Tool() +
                  ", -c, TARN.Quarry.Application, -b, true, -e, false, @administrators, "
                  "app:displayname, error:index_no_space, <a "
                  "data-tarn-app=\"TARN.Quarry.Application\" data-tarn-fn=\"preference\">, </a>)"));
}

TEST_F(CustomEventTest, NotifyOfMissingMemory) {
  fake::FailCall("HLIBCExecl", 1, {-5, 0, 0});
  EXPECT_EQ(NotifyLackOfMemory(), -5);
  EXPECT_THAT(fake::Calls(),
              ElementsAre("HLIBCExecl(" + Tool() + ", 187, " + Tool() +
                          ", -c, TARN.Quarry.Application, @administrators, app:displayname, "
                          "error:lack_of_memory)"));
}

}  // namespace
}  // namespace quarry::fileindex
