#include "daemons/tarnotifyd/inotify_source.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <filesystem>

#include "tests/daemons/tarnotifyd/support/disk_model.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace {

// Watches that the system still has.
std::atomic<int> watches_left{1 << 30};

}  // namespace

extern "C" int inotify_add_watch(int fd, const char* name, std::uint32_t mask) noexcept {
  if (--watches_left >= 0) {
    return static_cast<int>(syscall(SYS_inotify_add_watch, fd, name, mask));
  }
  errno = ENOSPC;
  return -1;
}

namespace quarry::notify {
namespace {

namespace fs = std::filesystem;
using test::DiskModel;
using test::WriteFile;
using ::testing::AllOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::Pair;

class InotifySourceTest : public ::testing::Test {
 protected:
  InotifySourceTest() { fs::create_directory(top_); }
  ~InotifySourceTest() override { watches_left = 1 << 30; }

  void Start() {
    source_.SetDirectories({top_}, {"@eaDir"}, model_);
    Told();
  }
  // What is told by now, without what files are told of their content.
  std::vector<std::string> Told() {
    test::ReadAll(source_, model_);
    std::vector<std::string> told;
    for (const std::string& line : model_.Told()) {
      if (line.compare(0, 6, "modify") != 0) told.push_back(line);
    }
    model_.ForgetTold();
    return told;
  }
  bool IsLikeDisk() const { return model_.Paths() == test::ListTree(top_, {"@eaDir"}); }

  test::TempDir scratch_;
  const std::string top_ = scratch_ / "top";
  const std::string out_ = scratch_ / "out";
  DiskModel model_{top_, {"@eaDir"}};
  InotifySource source_;
};

TEST_F(InotifySourceTest, BeginsInDoubtAfterWatchingAll) {
  test::MakeDirs(top_ + "/a/b");
  source_.SetDirectories({top_}, {}, model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + top_));
  WriteFile(top_ + "/a/b/f", "x");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/a/b/f"));
}

TEST_F(InotifySourceTest, TellsEachKind) {
  Start();
  WriteFile(top_ + "/f", "x");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/f"));
  chmod((top_ + "/f").c_str(), 0600);
  EXPECT_THAT(Told(), ElementsAre("attr file " + top_ + "/f"));
  fs::rename(top_ + "/f", top_ + "/g");
  EXPECT_THAT(Told(), ElementsAre("rename file " + top_ + "/f -> " + top_ + "/g"));
  fs::remove(top_ + "/g");
  EXPECT_THAT(Told(), ElementsAre("delete file " + top_ + "/g"));
  fs::create_directory(top_ + "/d");
  EXPECT_THAT(Told(), ElementsAre("create dir " + top_ + "/d"));
  fs::remove(top_ + "/d");
  EXPECT_THAT(Told(), ElementsAre("delete dir " + top_ + "/d"));
  chmod(top_.c_str(), 0750);
  EXPECT_THAT(Told(), ElementsAre("attr dir " + top_));
}

TEST_F(InotifySourceTest, SaysWhetherTheWriterIsDone) {
  struct Sink : ChangeSink {
    void OnChange(const Change& change) override { changes.push_back(change); }
    void OnDoubt(const std::string&) override {}
    std::vector<Change> changes;
  } sink;
  WriteFile(top_ + "/f", "x");
  Start();
  const int fd = open((top_ + "/f").c_str(), O_WRONLY | O_CLOEXEC);
  ASSERT_EQ(write(fd, "yy", 2), 2);
  test::ReadAll(source_, sink);
  ASSERT_EQ(sink.changes.size(), 1U);
  EXPECT_TRUE(sink.changes[0].in_progress);
  close(fd);
  test::ReadAll(source_, sink);
  ASSERT_EQ(sink.changes.size(), 2U);
  EXPECT_FALSE(sink.changes[1].in_progress);
}

TEST_F(InotifySourceTest, ANewTreeIsOneCreation) {
  Start();
  test::MakeDirs(out_ + "/b/c");
  WriteFile(out_ + "/b/c/f", "x");
  fs::rename(out_, top_ + "/a");
  EXPECT_THAT(Told(), ElementsAre("create dir " + top_ + "/a"));
  WriteFile(top_ + "/a/b/c/g", "x");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/a/b/c/g"));
  EXPECT_TRUE(IsLikeDisk());
}

TEST_F(InotifySourceTest, ARenamedDirectoryKeepsItsWatches) {
  test::MakeDirs(top_ + "/a/b/c");
  Start();
  fs::rename(top_ + "/a", top_ + "/z");
  EXPECT_THAT(Told(), ElementsAre("rename dir " + top_ + "/a -> " + top_ + "/z"));
  WriteFile(top_ + "/z/b/c/f", "x");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/z/b/c/f"));
}

TEST_F(InotifySourceTest, DirectoriesThatChangePlacesAreBothWatched) {
  for (const std::string& other : {top_ + "/b", top_ + "/@eaDir", out_}) {
    test::MakeDirs(top_ + "/a/of_a");
    test::MakeDirs(other + "/of_other");
    Start();
    ASSERT_EQ(renameat2(AT_FDCWD, (top_ + "/a").c_str(), AT_FDCWD, other.c_str(), RENAME_EXCHANGE),
              0);
    Told();
    WriteFile(top_ + "/a/of_other/f", "x");
    EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/a/of_other/f"));
    EXPECT_TRUE(IsLikeDisk());
    fs::remove_all(top_ + "/a");
    Told();
  }
  WriteFile(top_ + "/b/of_a/f", "x");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/b/of_a/f"));
}

TEST_F(InotifySourceTest, WhatMovesOutIsWatchedNoMore) {
  test::MakeDirs(top_ + "/a/b");
  Start();
  fs::rename(top_ + "/a", out_);
  EXPECT_THAT(Told(), ElementsAre("delete dir " + top_ + "/a"));
  EXPECT_EQ(source_.Directories(), 1U);
  WriteFile(out_ + "/b/f", "x");
  EXPECT_THAT(Told(), IsEmpty());
}

TEST_F(InotifySourceTest, IgnoredNamesAreOutside) {
  test::MakeDirs(top_ + "/@eaDir");
  Start();
  test::MakeDirs(top_ + "/a/@eaDir");
  WriteFile(top_ + "/@eaDir/f", "x");
  EXPECT_THAT(Told(), ElementsAre("create dir " + top_ + "/a"));
  fs::rename(top_ + "/a", top_ + "/@eaDir/a");
  EXPECT_THAT(Told(), ElementsAre("delete dir " + top_ + "/a"));
  fs::rename(top_ + "/@eaDir/f", top_ + "/f");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/f"));
}

TEST_F(InotifySourceTest, LinksAreNotFollowed) {
  fs::create_directory(out_);
  Start();
  fs::create_directory_symlink(out_, top_ + "/link");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/link"));
  WriteFile(out_ + "/f", "x");
  EXPECT_THAT(Told(), IsEmpty());
}

TEST_F(InotifySourceTest, NamesMayBeAnyBytes) {
  Start();
  const std::string name = top_ + "/\xff \n\"\x01";
  test::MakeDirs(name);
  EXPECT_THAT(Told(), ElementsAre("create dir " + name));
}

TEST_F(InotifySourceTest, PathsMayBeLongerThanTheSystemTakes) {
  Start();
  const int start = open(".", O_PATH | O_CLOEXEC);
  ASSERT_EQ(chdir(top_.c_str()), 0);
  std::string path = top_;
  for (int i = 0; i < 40; ++i) {
    const std::string name(200, static_cast<char>('a' + i % 26));
    ASSERT_EQ(mkdir(name.c_str(), 0700), 0);
    ASSERT_EQ(chdir(name.c_str()), 0);
    path += "/" + name;
  }
  const auto created = Told();
  EXPECT_THAT(created, Contains("create dir " + path.substr(0, top_.size() + 201)));
  close(open("file", O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
  EXPECT_THAT(Told(), ElementsAre("create file " + path + "/file"));
  ASSERT_EQ(fchdir(start), 0);
  close(start);
}

TEST_F(InotifySourceTest, ARootThatGoesAndComesIsDoubtful) {
  Start();
  fs::remove(top_);
  EXPECT_THAT(Told(), ElementsAre("delete dir " + top_));
  source_.Refresh(model_);
  EXPECT_THAT(Told(), IsEmpty());
  test::MakeDirs(top_ + "/a");
  source_.Refresh(model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + top_));
  WriteFile(top_ + "/a/f", "x");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/a/f"));
}

TEST_F(InotifySourceTest, AnotherDirectoryInTheRootsPlaceIsWatched) {
  Start();
  test::MakeDirs(out_ + "/new");
  fs::rename(top_, scratch_ / "old");
  fs::rename(out_, top_);
  EXPECT_THAT(Told(), ElementsAre("delete dir " + top_));
  source_.Refresh(model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + top_));
  WriteFile(top_ + "/new/f", "x");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/new/f"));
}

TEST_F(InotifySourceTest, ADirectoryAboveTheRootTakesItAlong) {
  const std::string root = top_ + "/in/root";
  test::MakeDirs(root);
  source_.SetDirectories({root}, {}, model_);
  Told();
  fs::rename(top_ + "/in", out_);
  source_.Refresh(model_);
  EXPECT_THAT(Told(), ElementsAre("delete dir " + root));
  fs::rename(out_, top_ + "/in");
  source_.Refresh(model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + root));
}

TEST_F(InotifySourceTest, NestedDirectoriesAreWatchedOnce) {
  test::MakeDirs(top_ + "/a/b");
  source_.SetDirectories({top_, top_ + "/a"}, {}, model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + top_));
  WriteFile(top_ + "/a/f", "x");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/a/f"));
  // What is new, but watched already, is told at once.
  source_.SetDirectories({top_, top_ + "/a", top_ + "/a/b"}, {}, model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + top_ + "/a/b"));
  source_.SetDirectories({top_ + "/a/b"}, {}, model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + top_ + "/a/b"));
  WriteFile(top_ + "/a/g", "x");
  WriteFile(top_ + "/a/b/g", "x");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/a/b/g"));
}

TEST_F(InotifySourceTest, WatchedDirectoriesStayWatchedWhenOthersChange) {
  fs::create_directory(out_);
  Start();
  source_.SetDirectories({top_, out_}, {"@eaDir"}, model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + out_));
  source_.SetDirectories({top_}, {"@eaDir"}, model_);
  EXPECT_THAT(Told(), IsEmpty());
  WriteFile(top_ + "/f", "x");
  WriteFile(out_ + "/f", "x");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/f"));
}

TEST_F(InotifySourceTest, ADirectoryThatCannotBeReadIsWatchedOnceItCan) {
  if (geteuid() == 0) {
    // Nothing is hidden from root, who has the other way of watching.
    SUCCEED();
    return;
  }
  test::MakeDirs(top_ + "/a/b");
  chmod((top_ + "/a").c_str(), 0);
  Start();
  chmod((top_ + "/a").c_str(), 0700);
  EXPECT_THAT(Told(), ElementsAre("attr dir " + top_ + "/a", "create dir " + top_ + "/a"));
  WriteFile(top_ + "/a/b/f", "x");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/a/b/f"));
}

TEST_F(InotifySourceTest, WithoutWatchesItIsInDoubtUntilThereAreSome) {
  test::MakeDirs(top_ + "/a/b");
  test::MakeDirs(top_ + "/c");
  watches_left = 2;
  source_.SetDirectories({top_}, {}, model_);
  EXPECT_THAT(Told(), Contains("doubt " + top_));
  source_.Refresh(model_);
  EXPECT_THAT(Told(), IsEmpty());
  // A new directory is told as ever, though it cannot be watched.
  fs::create_directory(top_ + "/d");
  EXPECT_THAT(Told(), ElementsAre("create dir " + top_ + "/d"));
  watches_left = 1 << 30;
  ASSERT_TRUE(test::WaitUntil([&] {
    source_.Refresh(model_);
    return !Told().empty();
  }));
  WriteFile(top_ + "/a/b/f", "x");
  WriteFile(top_ + "/c/f", "x");
  WriteFile(top_ + "/d/f", "x");
  EXPECT_EQ(Told().size(), 3U);
  EXPECT_TRUE(IsLikeDisk());
}

TEST_F(InotifySourceTest, WhatCannotBeWatchedIsDoubtAndIsReported) {
  test::MakeDirs(top_ + "/a/b");
  test::MakeDirs(out_);
  watches_left = 1;
  const auto report = [&] {
    SourceReport now;
    source_.Report(&now);
    return now;
  };
  // Each of those concerned, but no other.
  source_.SetDirectories({out_}, {}, model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + out_));
  source_.SetDirectories({out_, top_}, {}, model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + top_));
  EXPECT_EQ(report().kind, "inotify");
  EXPECT_EQ(report().directories, 1U);
  EXPECT_THAT(report().unwatched,
              ElementsAre(Pair(top_, "the limit fs.inotify.max_user_watches is reached")));
  watches_left = 1 << 30;
  ASSERT_TRUE(test::WaitUntil([&] {
    source_.Refresh(model_);
    test::ReadAll(source_, model_);
    return report().unwatched.empty();
  }));
  EXPECT_THAT(Told(), Contains("doubt " + top_));
  EXPECT_EQ(report().directories, 4U);
  // What is not to be watched is not missed either.
  watches_left = 0;
  fs::create_directory(top_ + "/c");
  EXPECT_THAT(Told(), Contains("doubt " + top_));
  EXPECT_EQ(report().unwatched.size(), 1U);
  source_.SetDirectories({out_}, {}, model_);
  EXPECT_THAT(report().unwatched, IsEmpty());
}

TEST_F(InotifySourceTest, ARootThatGoesUnseenIsDoubtfulAtOnce) {
  test::MakeDirs(out_);
  source_.SetDirectories({top_, out_}, {}, model_);
  Told();
  WriteFile(top_ + "/a", "x");
  WriteFile(top_ + "/b", "x");
  for (int i = 0; i < 40'000; ++i) {
    chmod((top_ + (i % 2 == 0 ? "/a" : "/b")).c_str(), 0600);
  }
  fs::remove(out_);
  EXPECT_THAT(Told(), AllOf(Contains("doubt " + out_), Contains("doubt " + top_)));
}

TEST_F(InotifySourceTest, EventsThatTheKernelLosesAreDoubt) {
  WriteFile(top_ + "/a", "x");
  WriteFile(top_ + "/b", "x");
  Start();
  for (int i = 0; i < 40'000; ++i) {
    chmod((top_ + (i % 2 == 0 ? "/a" : "/b")).c_str(), 0600);
  }
  test::MakeDirs(top_ + "/missed/directory");
  EXPECT_THAT(Told(), Contains("doubt " + top_));
  WriteFile(top_ + "/missed/directory/f", "x");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/missed/directory/f"));
}

TEST_F(InotifySourceTest, MovingManyDirectoriesOutLosesNothing) {
  const int many = 3'000;
  for (int i = 0; i < many; ++i) fs::create_directories(top_ + "/a/" + std::to_string(i));
  Start();
  EXPECT_EQ(source_.Directories(), many + 2U);
  fs::rename(top_ + "/a", out_);
  EXPECT_THAT(Told(), ElementsAre("delete dir " + top_ + "/a"));
  EXPECT_EQ(source_.Directories(), 1U);
  // And back again while the watches are still being ended.
  fs::rename(out_, top_ + "/a");
  source_.Read(model_);
  fs::rename(top_ + "/a", out_);
  source_.Read(model_);
  fs::rename(out_, top_ + "/b");
  EXPECT_THAT(Told(), Not(Contains("doubt " + top_)));
  WriteFile(top_ + "/b/1234/f", "x");
  EXPECT_THAT(Told(), ElementsAre("create file " + top_ + "/b/1234/f"));
  EXPECT_EQ(source_.Directories(), many + 2U);
}

}  // namespace
}  // namespace quarry::notify
