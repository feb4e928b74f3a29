// File systems that come and go below what inotify watches. Everything is mounted in a mount
// namespace of this process alone.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>

#include <cerrno>
#include <filesystem>
#include <map>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "daemons/tarnotifyd/inotify_source.h"
#include "tests/daemons/tarnotifyd/support/disk_model.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace quarry::notify {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Pair;

class InotifyMountTest : public ::testing::Test {
 protected:
  InotifyMountTest() { test::MakeDirs(point_); }
  ~InotifyMountTest() override {
    source_.reset();
    while (!mounted_.empty()) Unmount();
  }

  // Whether this process may mount, and has a source that watches `directories`.
  bool Start(const std::vector<std::string>& directories) {
    if (unshare(CLONE_NEWNS) != 0) {
      EXPECT_EQ(errno, EPERM);
      return false;
    }
    EXPECT_EQ(mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr), 0);
    source_ = std::make_unique<InotifySource>();
    source_->SetDirectories(directories, {"@eaDir"}, model_);
    Told();
    return true;
  }

  void Mount(const std::string& path) {
    ASSERT_EQ(mount("none", path.c_str(), "tmpfs", 0, ""), 0);
    mounted_.push_back(path);
  }
  void Bind(const std::string& from, const std::string& path) {
    ASSERT_EQ(mount(from.c_str(), path.c_str(), nullptr, MS_BIND, nullptr), 0);
    mounted_.push_back(path);
  }
  // Nothing is kept open, so everything can be unmounted at any time.
  void Unmount() {
    EXPECT_EQ(umount2(mounted_.back().c_str(), 0), 0) << mounted_.back();
    mounted_.pop_back();
  }

  std::vector<std::string> Told() {
    test::ReadAll(*source_, model_);
    std::vector<std::string> told = model_.Told();
    model_.ForgetTold();
    return told;
  }
  std::vector<std::string> Refreshed() {
    source_->Refresh(model_);
    return Told();
  }
  // What is told of a file that somebody creates and has closed.
  std::vector<std::string> ToldOfNew(const std::string& path) {
    test::WriteFile(path, "");
    std::vector<std::string> told = Told();
    std::erase(told, "modify file " + path);
    return told;
  }
  std::map<std::string, std::string> Unwatched() const {
    SourceReport report;
    source_->Report(&report);
    return report.unwatched;
  }

  test::TempDir scratch_;
  const std::string top_ = scratch_ / "top";
  const std::string point_ = top_ + "/point";
  const std::string other_ = scratch_ / "other";
  test::DiskModel model_{top_, {"@eaDir"}};
  std::unique_ptr<InotifySource> source_;
  std::vector<std::string> mounted_;
};

TEST_F(InotifyMountTest, WhatIsCoveredIsWatchedAgainWhenItComesToLight) {
  test::MakeDirs(point_ + "/covered");
  if (!Start({top_})) return;
  const std::size_t all = source_->Directories();
  Mount(point_);
  EXPECT_THAT(Refreshed(), ElementsAre("doubt " + point_));
  EXPECT_EQ(source_->Directories(), all - 1);
  EXPECT_THAT(Refreshed(), IsEmpty());
  EXPECT_THAT(ToldOfNew(point_ + "/foreign"), IsEmpty());
  EXPECT_THAT(ToldOfNew(top_ + "/f"), ElementsAre("create file " + top_ + "/f"));
  Unmount();
  EXPECT_THAT(Refreshed(), ElementsAre("doubt " + point_));
  EXPECT_THAT(Refreshed(), IsEmpty());
  const std::string file = point_ + "/covered/f";
  EXPECT_THAT(ToldOfNew(file), ElementsAre("create file " + file));
}

// Nothing of the file system ends, and so the kernel has no event of it.
TEST_F(InotifyMountTest, ADirectoryThatCoversAnotherOne) {
  test::MakeDirs(point_ + "/covered");
  test::MakeDirs(other_);
  if (!Start({top_})) return;
  Bind(other_, point_);
  EXPECT_THAT(Refreshed(), ElementsAre("doubt " + point_));
  EXPECT_THAT(ToldOfNew(other_ + "/f"), IsEmpty());
  Unmount();
  EXPECT_THAT(Refreshed(), ElementsAre("doubt " + point_));
  const std::string file = point_ + "/covered/f";
  EXPECT_THAT(ToldOfNew(file), ElementsAre("create file " + file));
}

TEST_F(InotifyMountTest, MountsElsewhereAreNoNews) {
  test::MakeDirs(other_);
  test::MakeDirs(top_ + "/@eaDir/deep");
  if (!Start({top_})) return;
  Mount(other_);
  Mount(top_ + "/@eaDir/deep");
  EXPECT_THAT(Refreshed(), IsEmpty());
  // One that stays is none either.
  Mount(point_);
  EXPECT_THAT(Refreshed(), ElementsAre("doubt " + point_));
  Mount(other_);
  EXPECT_THAT(Refreshed(), IsEmpty());
}

TEST_F(InotifyMountTest, AShareThatIsAFileSystemIsPartOfTheTree) {
  test::ResetTestRoot();
  test::WriteFile(test::TestRoot() + "/etc/quarry/shares.json",
                  R"({"shares":[{"name":"point","path":")" + point_ + "\"}]}");
  if (!Start({top_})) return;
  for (int round = 0; round < 2; ++round) {
    Mount(point_);
    EXPECT_THAT(Refreshed(), ElementsAre("doubt " + point_));
    EXPECT_THAT(ToldOfNew(point_ + "/f"), ElementsAre("create file " + point_ + "/f"));
    // Registered by itself it is no more than it was.
    source_->SetDirectories({top_, point_}, {"@eaDir"}, model_);
    EXPECT_THAT(Told(), ElementsAre("doubt " + point_));
    EXPECT_THAT(Refreshed(), IsEmpty());
    EXPECT_THAT(ToldOfNew(point_ + "/g"), ElementsAre("create file " + point_ + "/g"));
    source_->SetDirectories({top_}, {"@eaDir"}, model_);
    Unmount();
    Refreshed();
    EXPECT_THAT(ToldOfNew(point_ + "/h"), ElementsAre("create file " + point_ + "/h"));
    std::filesystem::remove(point_ + "/h");
    Told();
  }
  test::ResetTestRoot();
}

// Another one before anybody has looked, which may have the numbers of the first: then it is found
// at the second look.
TEST_F(InotifyMountTest, AFileSystemThatIsReplaced) {
  if (!Start({top_, point_})) return;
  for (int round = 0; round < 3; ++round) {
    if (round > 0) Unmount();
    Mount(point_);
    const std::vector<std::string> told = Refreshed();
    EXPECT_THAT(told.empty() ? Refreshed() : told, Contains("doubt " + point_));
    EXPECT_THAT(Refreshed(), IsEmpty());
    EXPECT_THAT(ToldOfNew(point_ + "/f"), ElementsAre("create file " + point_ + "/f"));
  }
  Unmount();
  EXPECT_THAT(Refreshed(), Contains("doubt " + point_));
  EXPECT_THAT(ToldOfNew(point_ + "/f"), ElementsAre("create file " + point_ + "/f"));
}

// The kernel tells of a directory by one path only.
TEST_F(InotifyMountTest, ADirectoryThatIsWatchedAtAnotherPlaceIsInDoubt) {
  test::MakeDirs(top_ + "/a/b");
  test::MakeDirs(other_);
  if (!Start({top_})) return;
  Bind(top_ + "/a", other_);
  source_->SetDirectories({top_, other_}, {"@eaDir"}, model_);
  EXPECT_THAT(Told(), ElementsAre("doubt " + other_));
  EXPECT_THAT(Refreshed(), IsEmpty());
  EXPECT_THAT(Unwatched(),
              ElementsAre(Pair(other_, HasSubstr("is the same directory as " + top_ + "/a"))));
  Unmount();
  EXPECT_TRUE(test::WaitUntil([&] {
    Refreshed();
    return Unwatched().empty();
  }));
  EXPECT_THAT(ToldOfNew(other_ + "/f"), ElementsAre("create file " + other_ + "/f"));
  EXPECT_THAT(ToldOfNew(top_ + "/a/b/f"), ElementsAre("create file " + top_ + "/a/b/f"));
}

class InotifyMountSeedTest : public InotifyMountTest,
                             public ::testing::WithParamInterface<unsigned> {};

// In the end everything that is not covered is watched, and nothing else.
TEST_P(InotifyMountSeedTest, RandomMounts) {
  std::vector<std::string> places;
  for (const char* name : {"/point", "/point/a", "/point/a/b", "/c", "/c/d"}) {
    places.push_back(top_ + name);
    test::MakeDirs(places.back());
  }
  test::MakeDirs(other_ + "/a/b");
  if (!Start({top_})) return;
  std::mt19937 random(GetParam());
  for (int i = 0; i < 60; ++i) {
    const std::string place = places[random() % places.size()];
    test::MakeDirs(place);
    switch (random() % 4) {
      case 0:
        Mount(place);
        break;
      case 1:
        Bind(other_, place);
        break;
      default:
        if (!mounted_.empty()) Unmount();
    }
    if (random() % 2 == 0) Refreshed();
  }
  while (!mounted_.empty()) Unmount();
  Refreshed();
  for (const std::string& place : places) {
    test::MakeDirs(place);
    Told();
    const std::string file = place + "/last";
    EXPECT_THAT(ToldOfNew(file), ElementsAre("create file " + file)) << "seed " << GetParam();
  }
  EXPECT_EQ(model_.Paths(), test::ListTree(top_));
  EXPECT_EQ(source_->Directories(), places.size() + 1);
}

INSTANTIATE_TEST_SUITE_P(Seeds, InotifyMountSeedTest, ::testing::Range(0U, 6U));

}  // namespace
}  // namespace quarry::notify
