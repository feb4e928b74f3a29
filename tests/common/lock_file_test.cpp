#include "common/lock_file.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"
#include "tests/support/thrown.h"

namespace quarry {
namespace {

using test::FailureOf;

class LockFileTest : public fake::FakePlatformTest {
 protected:
  std::string Take(bool exclusive) {
    return FailureOf([&] { LockFile lock(path_, exclusive); });
  }

  test::TempDir dir_;
  const std::string path_ = dir_ / "lock";
};

TEST_F(LockFileTest, MissingFileIsCreated) {
  const mode_t before = umask(022);
  { LockFile lock(path_, true); }
  umask(before);
  EXPECT_EQ(test::FileMode(path_), 0644u);
  EXPECT_EQ(test::ReadFile(path_), "");
}

TEST_F(LockFileTest, ContentOfTheFileIsKept) {
  test::WriteFile(path_, "text");
  EXPECT_EQ(Take(true), "");
  EXPECT_EQ(test::ReadFile(path_), "text");
}

TEST_F(LockFileTest, ReadOnlyFileCanBeLocked) {
  test::WriteFile(path_, "");
  ASSERT_EQ(chmod(path_.c_str(), 0444), 0);
  EXPECT_EQ(Take(true), "");
}

TEST_F(LockFileTest, MissingDirectoryIsAnErrorAtOnce) {
  const std::string path = dir_ / "none/lock";
  const std::string reason = "open failed, path=" + path + ", reason=No such file or directory";
  EXPECT_EQ(FailureOf([&] { LockFile lock(path, true); }), "506 " + reason);
  EXPECT_EQ(fake::Logs(),
            std::vector<std::string>(
                {fake::LogHead("lock_file", 15, "LockFile") +
                 "Failed [0 > (fd_ = open(path_.c_str(), O_RDONLY | O_CREAT, 0644))], reason: " +
                 reason + " [err: No such file or directory]"}));
  EXPECT_EQ(errno, 0);
  EXPECT_TRUE(fake::Sleeps().empty());
}

TEST_F(LockFileTest, OpenFailureDuringTheRetriesEndsThem) {
  LockFile holder(path_, true);
  fake::ResetSystemCalls();
  fake::FailSystemCall("open", 3, EMFILE);
  EXPECT_EQ(Take(true), "506 open failed, path=" + path_ + ", reason=Too many open files");
  EXPECT_EQ(fake::Sleeps().size(), 2u);
}

TEST_F(LockFileTest, PathWithNulByteIsRefused) {
  const std::string path = path_ + std::string("\0x", 2);
  EXPECT_EQ(FailureOf([&] { LockFile lock(path, true); }),
            "506 open failed, path=" + path + ", reason=Invalid argument");
  EXPECT_FALSE(std::filesystem::exists(path_));
}

TEST_F(LockFileTest, SharedHoldersDoNotExcludeEachOther) {
  LockFile first(path_, false);
  LockFile second(path_, false);
  EXPECT_TRUE(fake::Sleeps().empty());
}

TEST_F(LockFileTest, ConflictIsGivenUpAfter64Attempts) {
  for (const bool holder_exclusive : {true, false}) {
    LockFile holder(path_, holder_exclusive);
    fake::ResetSystemCalls();
    EXPECT_EQ(Take(true), "506 Exceed max retry, path=" + path_);
    EXPECT_EQ(fake::SystemCallCount("open"), 64);
    EXPECT_EQ(fake::SystemCallCount("flock"), 64);
    EXPECT_EQ(fake::Sleeps().size(), 64u);
    EXPECT_TRUE(fake::Logs().empty());
  }
}

TEST_F(LockFileTest, ExclusiveHolderExcludesSharedOnes) {
  LockFile holder(path_, true);
  EXPECT_EQ(Take(false), "506 Exceed max retry, path=" + path_);
}

TEST_F(LockFileTest, PausesAreTenthsOfASecondFromTheProcesssRandomNumbers) {
  LockFile holder(path_, true);
  std::vector<std::chrono::microseconds> expected;
  srand(42);
  for (int i = 0; i < 64; ++i) expected.emplace_back((rand() % 10) * 100000);
  srand(42);
  Take(true);
  EXPECT_EQ(fake::Sleeps(), expected);
}

TEST_F(LockFileTest, NoDescriptorIsOpenDuringAPause) {
  LockFile holder(path_, true);
  auto open_locks = [this] {
    int count = 0;
    std::error_code error;
    for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
      if (std::filesystem::read_symlink(entry.path(), error) == path_) ++count;
    }
    return count;
  };
  fake::OnSleep([&](std::chrono::microseconds) { EXPECT_EQ(open_locks(), 1); });
  Take(true);
  EXPECT_EQ(open_locks(), 1);
}

TEST_F(LockFileTest, LockIsTakenOnceItIsFree) {
  auto holder = std::make_unique<LockFile>(path_, true);
  fake::OnSleep([&](std::chrono::microseconds) {
    if (fake::Sleeps().size() == 64) holder.reset();
  });
  // Free only after the last attempt: too late.
  EXPECT_EQ(Take(true), "506 Exceed max retry, path=" + path_);

  fake::ResetSystemCalls();
  holder = std::make_unique<LockFile>(path_, true);
  fake::OnSleep([&](std::chrono::microseconds) {
    if (fake::Sleeps().size() == 63) holder.reset();
  });
  EXPECT_EQ(Take(true), "");
  EXPECT_EQ(fake::Sleeps().size(), 63u);
}

TEST_F(LockFileTest, InterruptedLockIsTriedAgain) {
  fake::FailSystemCall("flock", 1, EINTR);
  EXPECT_EQ(Take(true), "");
  EXPECT_EQ(fake::Sleeps().size(), 1u);
}

TEST_F(LockFileTest, OtherErrorOfTheLockIsThrownAtOnceWithoutALogLine) {
  fake::FailSystemCall("flock", 1, ENOLCK);
  EXPECT_EQ(Take(true), "506 No locks available");
  EXPECT_TRUE(fake::Sleeps().empty());
  EXPECT_TRUE(fake::Logs().empty());
  EXPECT_EQ(Take(true), "");
}

TEST_F(LockFileTest, DescriptorIsNotInheritedByPrograms) {
  LockFile lock(path_, true);
  bool found = false;
  std::error_code error;
  for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
    if (std::filesystem::read_symlink(entry.path(), error) != path_) continue;
    found = true;
    const int fd = std::stoi(entry.path().filename().string());
    EXPECT_EQ(fcntl(fd, F_GETFD), FD_CLOEXEC);
    EXPECT_EQ(fcntl(fd, F_GETFL) & O_ACCMODE, O_RDONLY);
  }
  EXPECT_TRUE(found);
}

TEST_F(LockFileTest, LockIsGivenUpThoughAProcessKeepsACopyOfTheDescriptor) {
  auto lock = std::make_unique<LockFile>(path_, true);
  int finish[2];
  ASSERT_EQ(pipe(finish), 0);
  const pid_t child = fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    ::close(finish[1]);
    char byte = 0;
    _exit(read(finish[0], &byte, 1) == 0 ? 0 : 1);
  }
  ::close(finish[0]);
  lock.reset();
  EXPECT_EQ(Take(true), "");
  ::close(finish[1]);
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
}

TEST_F(LockFileTest, FileRemovedBeforeTheLockIsTakenAnew) {
  int removed = 0;
  fake::OnSystemCall("flock", [&] {
    if (removed++ == 0) std::filesystem::remove(path_);
  });
  LockFile lock(path_, true);
  EXPECT_TRUE(std::filesystem::exists(path_));
  EXPECT_TRUE(fake::Sleeps().empty());
  EXPECT_EQ(fake::SystemCallCount("open"), 2);
  // The lock is on the file that others find.
  EXPECT_EQ(Take(true), "506 Exceed max retry, path=" + path_);
}

TEST_F(LockFileTest, FileReplacedBeforeTheLockIsTakenAnew) {
  int replaced = 0;
  fake::OnSystemCall("flock", [&] {
    if (replaced++ != 0) return;
    test::WriteFile(dir_ / "other", "");
    std::filesystem::rename(dir_ / "other", path_);
  });
  LockFile lock(path_, true);
  EXPECT_EQ(Take(false), "506 Exceed max retry, path=" + path_);
}

TEST_F(LockFileTest, FileThatAlwaysVanishesIsGivenUp) {
  fake::OnSystemCall("flock", [&] { std::filesystem::remove(path_); });
  EXPECT_EQ(Take(true), "506 Exceed max retry, path=" + path_);
  EXPECT_EQ(fake::SystemCallCount("open"), 64);
}

TEST_F(LockFileTest, LockFileMayBeALink) {
  std::filesystem::create_symlink(dir_ / "real", path_);
  LockFile lock(path_, true);
  EXPECT_EQ(FailureOf([&] { LockFile other(dir_ / "real", true); }),
            "506 Exceed max retry, path=" + (dir_ / "real"));
}

TEST_F(LockFileTest, ErrnoSurvivesALockThatWasTakenAndReleased) {
  fake::FailSystemCall("flock", 1, EAGAIN);
  fake::FailSystemCall("flock", 3, EIO);
  fake::FailSystemCall("close", 2, EIO);
  errno = ENOENT;
  {
    LockFile lock(path_, true);
    EXPECT_EQ(errno, ENOENT);
  }
  EXPECT_EQ(errno, ENOENT);
}

TEST_F(LockFileTest, LockOfAnotherProcessExcludes) {
  int ready[2];
  int finish[2];
  ASSERT_EQ(pipe(ready), 0);
  ASSERT_EQ(pipe(finish), 0);
  const pid_t child = fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    ::close(finish[1]);
    LockFile lock(path_, false);
    char byte = 'x';
    const bool told = write(ready[1], &byte, 1) == 1;
    const bool asked = read(finish[0], &byte, 1) == 0;
    _exit(told && asked ? 0 : 1);
  }
  ::close(ready[1]);
  ::close(finish[0]);
  char byte = 0;
  ASSERT_EQ(read(ready[0], &byte, 1), 1);
  EXPECT_EQ(Take(false), "");
  EXPECT_EQ(Take(true), "506 Exceed max retry, path=" + path_);
  ::close(finish[1]);
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
  EXPECT_EQ(Take(true), "");
  ::close(ready[0]);
}

bool TryLockElsewhere(Mutex& mutex) {
  bool locked = false;
  std::thread([&] {
    locked = mutex.TryLock();
    if (locked) mutex.Unlock();
  }).join();
  return locked;
}

TEST(MutexTest, ExcludesOtherThreads) {
  Mutex mutex;
  EXPECT_TRUE(mutex.Lock());
  EXPECT_FALSE(TryLockElsewhere(mutex));
  EXPECT_TRUE(mutex.Unlock());
  EXPECT_TRUE(TryLockElsewhere(mutex));
}

TEST(MutexTest, IsNotRecursive) {
  Mutex mutex;
  EXPECT_TRUE(mutex.TryLock());
  EXPECT_FALSE(mutex.TryLock());
  EXPECT_TRUE(mutex.Unlock());
}

TEST(LockMutexTest, HoldsTheMutexAsLongAsItLives) {
  Mutex mutex;
  {
    LockMutex lock(mutex);
    EXPECT_FALSE(TryLockElsewhere(mutex));
  }
  EXPECT_TRUE(TryLockElsewhere(mutex));
}

TEST(LockMutexTest, CountsRightUnderContention) {
  Mutex mutex;
  int count = 0;
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&] {
      for (int i = 0; i < 5000; ++i) {
        LockMutex lock(mutex);
        ++count;
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(count, 20000);
}

}  // namespace
}  // namespace quarry
