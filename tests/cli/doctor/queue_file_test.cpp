#include "cli/doctor/queue_file.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <thread>

#include "cli/problem.h"
#include "common/file_util.h"
#include "common/named_file.h"
#include "common/unique_fd.h"
#include "fileindex/queue/queue_mgr.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

// Power is never lost here, and a busy disk would be waited for again and again.
extern "C" __attribute__((visibility("default"))) int fsync(int) {
  return 0;
}

namespace quarry::test {
namespace {

using cli::CountBadLines;
using cli::RemoveBadLines;

const std::string kReindex = "{\"event\":65536,\"path\":\"/v/docs\"}\n";

std::string Line(const std::string& path) {
  return "{\"event\":64,\"path\":\"" + path + "\"}\n";
}

// Waits for the lock in the kernel's line: who only asks now and then, like LockFile, may never
// find free what another takes again at once.
void AppendUnderLock(const std::string& queue, const std::string& text) {
  for (;;) {
    const UniqueFd fd(open(queue.c_str(), O_WRONLY | O_APPEND | O_CLOEXEC));
    ASSERT_EQ(flock(fd.get(), LOCK_EX), 0);
    if (!IsStillNamed(queue, fd.get())) continue;
    ASSERT_EQ(write(fd.get(), text.data(), text.size()), static_cast<ssize_t>(text.size()));
    return;
  }
}

class QueueFileTest : public testing::Test {
 protected:
  std::uint64_t Remove() { return RemoveBadLines(queue_, "/v/docs"); }

  TempDir dir_;
  std::string queue_ = dir_ / "queue";
};

TEST_F(QueueFileTest, NoFileAndGoodLinesAreLeftAlone) {
  EXPECT_EQ(CountBadLines(queue_), 0U);
  EXPECT_EQ(Remove(), 0U);
  EXPECT_TRUE(ListDir(dir_.path()).empty());
  // Blanks and keys that nobody knows are nobody's business.
  const std::string text = Line("/a") + " { \"event\" : 64 ,\"path\":\"/b\",\"x\":1}\n" +
                           R"({"event":64,"path":"/last, without an end"})";
  WriteFile(queue_, text);
  EXPECT_EQ(CountBadLines(queue_), 0U);
  EXPECT_EQ(Remove(), 0U);
  EXPECT_EQ(ReadFile(queue_), text);
}

TEST_F(QueueFileTest, EveryKindOfGarbageGoesAndGoodLinesStay) {
  const std::string bad[] = {"\n",
                             "garbage\n",
                             "{\n",
                             "[]\n",
                             "7\n",
                             std::string(100, '\0') + "\n",
                             "\xff\xfe\n",
                             "{\"event\":64}\n",
                             "{\"path\":\"/a\"}\n",
                             "{\"event\":\"x\",\"path\":\"/a\"}\n",
                             "{\"event\":64,\"path\":[]}\n",
                             "{\"event\":64,\"path\":\"/a\\u0000b\"}\n",
                             "{\"event\":256,\"path\":\"/a\",\"path_old\":\"/\\u0000\"}\n",
                             std::string(70'000, 'x') + "\n",
                             std::string(100'000, '[') + "\n",
                             std::string((std::size_t{16} << 20) + 10, ' ') + Line("/a")};
  for (const std::string& line : bad) {
    WriteFile(queue_, Line("/1") + line + Line("/2") + line);
    EXPECT_EQ(CountBadLines(queue_), 2U) << line.substr(0, 80);
    EXPECT_EQ(Remove(), 2U) << line.substr(0, 80);
    EXPECT_TRUE(ReadFile(queue_) == Line("/1") + Line("/2") + kReindex) << line.substr(0, 80);
    EXPECT_EQ(CountBadLines(queue_), 0U);
    EXPECT_EQ(ListDir(dir_.path()).size(), 1U);
  }
}

// A file that begins in the middle of a piece is read like any other.
TEST_F(QueueFileTest, LinesOfEveryLengthAroundThePieces) {
  for (std::size_t length = 65'500; length < 65'560; ++length) {
    const std::string good = Line("/" + std::string(length, 'a'));
    WriteFile(queue_, good + "x\n" + good);
    EXPECT_EQ(Remove(), 1U);
    EXPECT_TRUE(ReadFile(queue_) == good + good + kReindex) << length;
  }
}

TEST_F(QueueFileTest, CutAtEveryByteOnlyTheLastLineGoes) {
  const std::string whole = Line("/1") + Line("/2") + Line("/3");
  for (std::size_t length = 0; length <= whole.size(); ++length) {
    const std::string text = whole.substr(0, length);
    const std::size_t complete = text.rfind('\n') == std::string::npos ? 0 : text.rfind('\n') + 1;
    const std::string rest = text.substr(complete);
    WriteFile(queue_, text);
    // It may just be being written.
    EXPECT_EQ(CountBadLines(queue_), 0U);
    const bool good = rest.empty() || rest + "\n" == Line("/1") || rest + "\n" == Line("/2") ||
                      rest + "\n" == Line("/3");
    EXPECT_EQ(Remove(), good ? 0U : 1U);
    EXPECT_EQ(ReadFile(queue_), good ? text : text.substr(0, complete) + kReindex);
  }
}

TEST_F(QueueFileTest, GoodLinesThatLackTheirEndGetItWhenOthersGo) {
  WriteFile(queue_, "x\n" + Line("/1").substr(0, Line("/1").size() - 1));
  EXPECT_EQ(Remove(), 1U);
  EXPECT_EQ(ReadFile(queue_), Line("/1") + kReindex);
}

TEST_F(QueueFileTest, WhoeverIsOnTheQueueIsWaitedForAndLosesNothing) {
  WriteFile(queue_, "x\n");
  std::atomic<int> appended{0};
  std::thread writer([&] {
    for (; appended < 200; ++appended) {
      const int i = appended;
      AppendUnderLock(queue_, Line("/" + std::to_string(i)) + (i % 10 == 0 ? "x\n" : ""));
    }
  });
  while (appended < 200) Remove();
  writer.join();
  Remove();
  const std::string text = ReadFile(queue_);
  for (int i = 0; i < 200; ++i) {
    EXPECT_NE(text.find(Line("/" + std::to_string(i))), std::string::npos) << i;
  }
  EXPECT_EQ(text.find("x\n"), std::string::npos);
}

TEST_F(QueueFileTest, TheModeStays) {
  WriteFile(queue_, "x\n");
  ASSERT_EQ(chmod(queue_.c_str(), 0640), 0);
  EXPECT_EQ(Remove(), 1U);
  EXPECT_EQ(FileMode(queue_), 0640U);
}

TEST_F(QueueFileTest, WhatIsNoFileIsRefused) {
  MakeDirs(queue_);
  EXPECT_THROW(CountBadLines(queue_), cli::Problem);
  RemoveTree(queue_);
  ASSERT_EQ(mkfifo(queue_.c_str(), 0600), 0);
  EXPECT_THROW(CountBadLines(queue_), cli::Problem);
  EXPECT_THROW(Remove(), cli::Problem);
}

TEST_F(QueueFileTest, ASnapshotThatIsReplacedIsWorkedOffOnceMore) {
  WriteFile(queue_ + ".tmp", Line("/1") + "x\n");
  fileindex::QueueMgr worker(queue_);
  worker.ProcessOP([](const auto&) {}, true);
  EXPECT_EQ(RemoveBadLines(queue_ + ".tmp", "/v/docs"), 1U);
  EXPECT_EQ(worker.DeleteTmp(), -1);
  EXPECT_EQ(ReadFile(queue_ + ".tmp"), Line("/1") + kReindex);
}

}  // namespace
}  // namespace quarry::test
