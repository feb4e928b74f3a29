// Documents in files.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include "common/json.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry {
namespace {

using test::FileMode;
using test::ListDir;
using test::ReadFile;
using test::WriteFile;

class JsonFileTest : public fake::FakePlatformTest {
 protected:
  JsonFileTest() {
    old_["k"] = "old";
    new_["k"] = "new";
  }

  // What a failed call leaves behind: the old file, nothing beside it, and the reason.
  void ExpectFailure(const std::string& call, int nth, int error_number) {
    WriteFile(path_, toString(old_));
    fake::ResetSystemCalls();
    fake::FailSystemCall(call, nth, error_number);
    EXPECT_FALSE(toFile(new_, path_)) << call << nth;
    EXPECT_EQ(errno, error_number) << call << nth;
    EXPECT_EQ(ReadFile(path_), toString(old_)) << call << nth;
    EXPECT_EQ(ListDir(dir_.path()), std::vector<std::string>({"state"})) << call << nth;
  }

  test::TempDir dir_;
  const std::string path_ = dir_ / "state";
  Json::Value old_;
  Json::Value new_;
};

// ---- Reading

TEST_F(JsonFileTest, WhatWasWrittenIsRead) {
  Json::Value value;
  value["path"] = "/share/\xff";
  ASSERT_TRUE(toFile(value, path_));
  EXPECT_EQ(ReadFile(path_), "{\"path\":\"/share/\xff\"}");
  Json::Value read;
  ASSERT_TRUE(fromFile(read, path_));
  EXPECT_EQ(read, value);
}

TEST_F(JsonFileTest, MissingFileIsNullAndENOENT) {
  Json::Value read(1);
  EXPECT_FALSE(fromFile(read, path_));
  EXPECT_EQ(errno, ENOENT);
  EXPECT_TRUE(read.isNull());
}

TEST_F(JsonFileTest, MalformedTextIsNull) {
  for (const std::string text : {"", "{", "{}x", "[1,]"}) {
    WriteFile(path_, text);
    Json::Value read(1);
    errno = 0;
    EXPECT_FALSE(fromFile(read, path_));
    EXPECT_EQ(errno, 0);
    EXPECT_TRUE(read.isNull());
  }
}

TEST_F(JsonFileTest, EveryCutOfAFileIsRefusedOrWhole) {
  const std::string text = "{\"a\":[1,{\"b\":\"x\\u00e4\"}],\"c\":null}";
  for (size_t length = 0; length <= text.size(); ++length) {
    WriteFile(path_, text.substr(0, length));
    Json::Value read(1);
    EXPECT_EQ(fromFile(read, path_), length == text.size()) << length;
    EXPECT_EQ(read.isNull(), length != text.size()) << length;
  }
}

TEST_F(JsonFileTest, WhatIsNoRegularFileIsRefused) {
  Json::Value read(1);
  EXPECT_FALSE(fromFile(read, dir_.path()));
  EXPECT_EQ(errno, EISDIR);
  EXPECT_TRUE(read.isNull());
  ASSERT_EQ(mkfifo(path_.c_str(), 0600), 0);
  EXPECT_FALSE(fromFile(read, path_));
  EXPECT_EQ(errno, EINVAL);
  EXPECT_FALSE(fromFile(read, "/dev/null"));
}

TEST_F(JsonFileTest, LinkToAFileIsRead) {
  WriteFile(dir_ / "real", "5");
  std::filesystem::create_symlink(dir_ / "real", path_);
  Json::Value read;
  EXPECT_TRUE(fromFile(read, path_));
  EXPECT_EQ(read, Json::Value(5));
}

TEST_F(JsonFileTest, HugeFileIsRefusedWithoutReadingIt) {
  WriteFile(path_, "1");
  ASSERT_EQ(truncate(path_.c_str(), off_t{1} << 40), 0);
  Json::Value read(1);
  EXPECT_FALSE(fromFile(read, path_));
  EXPECT_EQ(errno, EFBIG);
  EXPECT_TRUE(read.isNull());
}

TEST_F(JsonFileTest, FileThatGrowsBeyondTheBoundWhileItIsReadIsRefused) {
  WriteFile(path_, "1");
  fake::OnSystemCall("read", [&] { EXPECT_EQ(truncate(path_.c_str(), (64LL << 20) + 65536), 0); });
  Json::Value read(1);
  EXPECT_FALSE(fromFile(read, path_));
  EXPECT_EQ(errno, EFBIG);
  EXPECT_TRUE(read.isNull());
}

TEST_F(JsonFileTest, FailedReadIsNull) {
  WriteFile(path_, "1");
  fake::FailSystemCall("read", 2, EIO);
  Json::Value read(1);
  EXPECT_FALSE(fromFile(read, path_));
  EXPECT_EQ(errno, EIO);
  EXPECT_TRUE(read.isNull());
  fake::FailSystemCall("open", 1, EACCES);
  EXPECT_FALSE(fromFile(read, path_));
  EXPECT_EQ(errno, EACCES);
}

TEST_F(JsonFileTest, FileThatCannotBeAskedForItsKindIsNull) {
  WriteFile(path_, "1");
  fake::FailSystemCall("fstat", 1, EIO);
  Json::Value read(1);
  EXPECT_FALSE(fromFile(read, path_));
  EXPECT_EQ(errno, EIO);
  EXPECT_TRUE(read.isNull());
  EXPECT_EQ(fake::SystemCallCount("read"), 0);
}

TEST_F(JsonFileTest, InterruptedReadGoesOn) {
  WriteFile(path_, "[1,2]");
  fake::FailSystemCall("read", 1, EINTR);
  fake::FailSystemCall("read", 3, EINTR);
  Json::Value read;
  EXPECT_TRUE(fromFile(read, path_));
  EXPECT_EQ(read.size(), 2u);
}

TEST_F(JsonFileTest, ErrnoOfAnInterruptedReadIsNoPartOfTheAnswer) {
  for (const std::string text : {"[1,2]", "[1,"}) {
    WriteFile(path_, text);
    fake::FailSystemCall("read", 1, EINTR);
    Json::Value read;
    errno = EAGAIN;
    EXPECT_EQ(fromFile(read, path_), text == "[1,2]");
    EXPECT_EQ(errno, EAGAIN) << text;
  }
}

TEST_F(JsonFileTest, FileLongerThanOneReadIsWhole) {
  Json::Value value;
  for (int i = 0; i < 50000; ++i) value.append(i);
  ASSERT_TRUE(toFile(value, path_));
  Json::Value read;
  ASSERT_TRUE(fromFile(read, path_));
  EXPECT_EQ(read, value);
}

TEST_F(JsonFileTest, PathsWithNulBytesAreRefused) {
  WriteFile(path_, "1");
  const std::string path = path_ + std::string("\0x", 2);
  Json::Value read(1);
  EXPECT_FALSE(fromFile(read, path));
  EXPECT_EQ(errno, EINVAL);
  EXPECT_TRUE(read.isNull());
  errno = 0;
  EXPECT_FALSE(toFile(new_, path));
  EXPECT_EQ(errno, EINVAL);
  EXPECT_EQ(ReadFile(path_), "1");
}

// ---- Writing

TEST_F(JsonFileTest, FileIsReplacedNotRewritten) {
  WriteFile(path_, toString(old_));
  std::filesystem::create_hard_link(path_, dir_ / "reader");
  ASSERT_TRUE(toFile(new_, path_));
  EXPECT_EQ(ReadFile(dir_ / "reader"), toString(old_));
  EXPECT_EQ(ReadFile(path_), toString(new_));
  EXPECT_EQ(ListDir(dir_.path()), std::vector<std::string>({"reader", "state"}));
}

TEST_F(JsonFileTest, FileAndDirectoryAreSynced) {
  std::vector<std::string> order;
  for (const std::string call : {"write", "fsync", "rename"}) {
    fake::OnSystemCall(call, [&order, call] { order.push_back(call); });
  }
  ASSERT_TRUE(toFile(new_, path_));
  EXPECT_EQ(order, std::vector<std::string>({"write", "fsync", "rename", "fsync"}));
}

TEST_F(JsonFileTest, SuccessLeavesErrnoAlone) {
  errno = EAGAIN;
  EXPECT_TRUE(toFile(new_, path_));
  EXPECT_EQ(errno, EAGAIN);
}

TEST_F(JsonFileTest, EveryFailureKeepsTheOldFileAndErrno) {
  ExpectFailure("open", 1, EACCES);
  ExpectFailure("open", 2, EMFILE);
  ExpectFailure("fstat", 1, EIO);
  ExpectFailure("fchmod", 1, EPERM);
  ExpectFailure("write", 1, ENOSPC);
  ExpectFailure("fsync", 1, EIO);
  ExpectFailure("rename", 1, EROFS);
}

TEST_F(JsonFileTest, FailureAfterAShortWriteLeavesNothingBehind) {
  fake::CutWrite(1, 3);
  fake::FailSystemCall("write", 2, ENOSPC);
  EXPECT_FALSE(toFile(new_, path_));
  EXPECT_EQ(errno, ENOSPC);
  EXPECT_TRUE(ListDir(dir_.path()).empty());
}

TEST_F(JsonFileTest, ErrnoOfTheFailureSurvivesTheCleaningUp) {
  fake::FailSystemCall("fsync", 1, EIO);
  fake::FailSystemCall("unlink", 1, EBUSY);
  fake::FailEverySystemCall("close", EINTR);
  EXPECT_FALSE(toFile(new_, path_));
  EXPECT_EQ(errno, EIO);
}

TEST_F(JsonFileTest, UnsyncedDirectoryIsAFailureWithTheNewFileInPlace) {
  WriteFile(path_, toString(old_));
  fake::FailSystemCall("fsync", 2, EIO);
  EXPECT_FALSE(toFile(new_, path_));
  EXPECT_EQ(errno, EIO);
  EXPECT_EQ(ReadFile(path_), toString(new_));
  EXPECT_EQ(ListDir(dir_.path()), std::vector<std::string>({"state"}));
}

TEST_F(JsonFileTest, DirectoryThatCannotBeSyncedAtAllIsNoFailure) {
  fake::FailSystemCall("fsync", 2, EINVAL);
  EXPECT_TRUE(toFile(new_, path_));
}

TEST_F(JsonFileTest, InterruptedAndShortWritesGoOn) {
  fake::FailSystemCall("write", 1, EINTR);
  fake::CutWrite(2, 1);
  fake::CutWrite(3, 4);
  EXPECT_TRUE(toFile(new_, path_));
  EXPECT_EQ(ReadFile(path_), toString(new_));
}

TEST_F(JsonFileTest, WriteThatMakesNoProgressEnds) {
  fake::CutWrite(1, 0);
  EXPECT_FALSE(toFile(new_, path_));
  EXPECT_EQ(errno, ENOSPC);
}

TEST_F(JsonFileTest, MissingDirectoryIsAFailure) {
  EXPECT_FALSE(toFile(new_, dir_ / "none/state"));
  EXPECT_EQ(errno, ENOENT);
  EXPECT_FALSE(toFile(new_, ""));
  WriteFile(path_, "1");
  EXPECT_FALSE(toFile(new_, path_ + "/below"));
  EXPECT_EQ(errno, ENOTDIR);
}

TEST_F(JsonFileTest, WhatIsNoRegularFileIsNotReplaced) {
  EXPECT_FALSE(toFile(new_, dir_.path()));
  EXPECT_EQ(errno, EISDIR);
  ASSERT_EQ(mkfifo(path_.c_str(), 0600), 0);
  EXPECT_FALSE(toFile(new_, path_));
  EXPECT_EQ(errno, EINVAL);
  EXPECT_TRUE(std::filesystem::is_fifo(path_));
}

TEST_F(JsonFileTest, PermissionsAreKept) {
  WriteFile(path_, "1");
  for (const mode_t mode : {0600u, 0644u, 0664u}) {
    ASSERT_EQ(chmod(path_.c_str(), mode), 0);
    ASSERT_TRUE(toFile(new_, path_));
    EXPECT_EQ(FileMode(path_), mode);
  }
}

TEST_F(JsonFileTest, NewFileFollowsTheUmask) {
  const mode_t before = umask(027);
  const bool written = toFile(new_, path_);
  umask(before);
  ASSERT_TRUE(written);
  EXPECT_EQ(FileMode(path_), 0640u);
}

TEST_F(JsonFileTest, OwnerIsKeptWhereTheProcessMay) {
  if (geteuid() != 0) {
    // An ordinary user cannot make a file of somebody else's to begin with; that the attempt is
    // not made for a file of one's own is what can be seen.
    ASSERT_TRUE(toFile(new_, path_));
    ASSERT_TRUE(toFile(new_, path_));
    EXPECT_EQ(fake::SystemCallCount("fchown"), 0);
    return;
  }
  WriteFile(path_, "1");
  ASSERT_EQ(chown(path_.c_str(), 1234, 4321), 0);
  ASSERT_TRUE(toFile(new_, path_));
  struct stat info {};
  ASSERT_EQ(stat(path_.c_str(), &info), 0);
  EXPECT_EQ(info.st_uid, 1234u);
  EXPECT_EQ(info.st_gid, 4321u);
  ASSERT_EQ(chown(path_.c_str(), geteuid(), 4321), 0);
  ASSERT_TRUE(toFile(new_, path_));
  ASSERT_EQ(stat(path_.c_str(), &info), 0);
  EXPECT_EQ(info.st_uid, geteuid());
  EXPECT_EQ(info.st_gid, 4321u);
  fake::FailSystemCall("fchown", 1, EPERM);
  EXPECT_TRUE(toFile(old_, path_));
  ASSERT_EQ(chown(path_.c_str(), 1234, 4321), 0);
  fake::FailSystemCall("fchown", 1, EIO);
  EXPECT_FALSE(toFile(new_, path_));
  EXPECT_EQ(ReadFile(path_), toString(old_));
}

TEST_F(JsonFileTest, LinkIsKeptAndItsTargetReplaced) {
  WriteFile(dir_ / "target/real", toString(old_));
  std::filesystem::create_symlink("target/real", path_);
  ASSERT_TRUE(toFile(new_, path_));
  EXPECT_TRUE(std::filesystem::is_symlink(path_));
  EXPECT_EQ(ReadFile(dir_ / "target/real"), toString(new_));
  EXPECT_EQ(ListDir(dir_ / "target"), std::vector<std::string>({"real"}));
}

TEST_F(JsonFileTest, LinkThatLeadsToNothingIsReplaced) {
  std::filesystem::create_symlink(dir_ / "none", path_);
  ASSERT_TRUE(toFile(new_, path_));
  EXPECT_FALSE(std::filesystem::is_symlink(path_));
  EXPECT_EQ(ReadFile(path_), toString(new_));
  EXPECT_EQ(ListDir(dir_.path()), std::vector<std::string>({"state"}));
}

TEST_F(JsonFileTest, LongestNameCanBeReplaced) {
  const std::string path = dir_ / std::string(255, 'n');
  ASSERT_TRUE(toFile(old_, path));
  ASSERT_TRUE(toFile(new_, path));
  EXPECT_EQ(ReadFile(path), toString(new_));
}

TEST_F(JsonFileTest, RelativePathIsTakenFromTheWorkingDirectory) {
  const auto before = std::filesystem::current_path();
  std::filesystem::current_path(dir_.path());
  const bool written = toFile(new_, "state");
  std::filesystem::current_path(before);
  EXPECT_TRUE(written);
  EXPECT_EQ(ListDir(dir_.path()), std::vector<std::string>({"state"}));
}

TEST_F(JsonFileTest, WritersAndReadersAtOnceSeeWholeDocuments) {
  Json::Value value;
  for (int i = 0; i < 200; ++i) value.append(i);
  ASSERT_TRUE(toFile(value, path_));
  std::atomic<int> failures{0};
  std::atomic<bool> done{false};
  std::vector<std::thread> writers;
  for (int w = 0; w < 3; ++w) {
    writers.emplace_back([&] {
      for (int i = 0; i < 20; ++i) failures += toFile(value, path_) ? 0 : 1;
    });
  }
  std::thread reader([&] {
    while (!done) {
      Json::Value read;
      failures += fromFile(read, path_) && read == value ? 0 : 1;
    }
  });
  for (std::thread& writer : writers) writer.join();
  done = true;
  reader.join();
  EXPECT_EQ(failures, 0);
  EXPECT_EQ(ListDir(dir_.path()), std::vector<std::string>({"state"}));
}

}  // namespace
}  // namespace quarry
