// File systems that come and go. Everything is mounted in a mount namespace of this process alone.

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <system_error>

#include "tests/daemons/tarnotifyd/support/fanotify_fixture.h"

namespace quarry::notify {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;

class FanotifyMountTest : public FanotifyFixture {
 protected:
  ~FanotifyMountTest() override {
    source_.reset();
    while (!mounted_.empty()) Unmount();
  }

  // Whether this process may mount, and has a source that watches `directories`.
  bool StartMounting(const std::vector<std::string>& directories) {
    if (unshare(CLONE_NEWNS) != 0) {
      EXPECT_EQ(errno, EPERM);
      return false;
    }
    EXPECT_EQ(mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr), 0);
    if (!Start(directories, model_)) return false;
    model_.ForgetTold();
    return true;
  }

  bool Mount(const std::string& type, const std::string& path, const std::string& options = "") {
    if (mount("none", path.c_str(), type.c_str(), 0, options.c_str()) != 0) return false;
    mounted_.push_back(path);
    return true;
  }
  void Bind(const std::string& from, const std::string& path) {
    ASSERT_EQ(mount(from.c_str(), path.c_str(), nullptr, MS_BIND, nullptr), 0);
    mounted_.push_back(path);
  }
  // What the source may keep open only for a moment can be unmounted at any time.
  void Unmount() {
    EXPECT_EQ(umount2(mounted_.back().c_str(), 0), 0) << std::generic_category().message(errno);
    mounted_.pop_back();
  }

  // What is told up to now; each of the file systems has a queue of its own.
  std::vector<std::string> Told() {
    ReadAll(model_);
    ReadAll(model_);
    std::vector<std::string> told = model_.Told();
    model_.ForgetTold();
    const auto is_end = [&](const std::string& line) {
      return line.find("/last") != std::string::npos;
    };
    told.erase(std::remove_if(told.begin(), told.end(), is_end), told.end());
    return told;
  }
  std::vector<std::string> Refreshed() {
    source_->Refresh(model_);
    return Told();
  }

  test::DiskModel model_{inside_, {"@eaDir"}};
  std::vector<std::string> mounted_;
};

TEST_F(FanotifyMountTest, FileSystemWithinADirectory) {
  const std::string point = inside_ + "/point";
  test::MakeDirs(point);
  if (!StartMounting({inside_}) || !Mount("tmpfs", point)) return;
  EXPECT_THAT(Refreshed(), ElementsAre("doubt " + point));
  EXPECT_THAT(Refreshed(), IsEmpty());
  test::WriteFile(point + "/d/f", "");
  EXPECT_THAT(Told(), ElementsAre("create dir " + point + "/d", "create file " + point + "/d/f"));
  Unmount();
  EXPECT_THAT(Refreshed(), ElementsAre("doubt " + point));
  test::WriteFile(point + "/f", "");
  EXPECT_THAT(Told(), ElementsAre("create file " + point + "/f"));
}

// Its changes are met while no path leads to it.
TEST_F(FanotifyMountTest, DirectoryThatIsCoveredForAWhile) {
  const std::string point = inside_ + "/point";
  test::MakeDirs(point + "/a/b");
  if (!StartMounting({inside_})) return;
  const UniqueFd fd(open(point.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!Mount("tmpfs", point)) return;
  EXPECT_THAT(Refreshed(), ElementsAre("doubt " + point));
  ASSERT_EQ(mkdirat(fd.get(), "a/b/unseen", 0700), 0);
  EXPECT_THAT(Told(), IsEmpty());
  Unmount();
  EXPECT_THAT(Refreshed(), ElementsAre("doubt " + point));
  test::WriteFile(point + "/a/b/f", "");
  EXPECT_THAT(Told(), ElementsAre("create file " + point + "/a/b/f"));
}

TEST_F(FanotifyMountTest, DirectoryThatIsCoveredUnnoticed) {
  const std::string point = inside_ + "/point";
  test::MakeDirs(point + "/a/b");
  if (!StartMounting({inside_})) return;
  const UniqueFd fd(open(point.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!Mount("tmpfs", point)) return;
  ASSERT_EQ(renameat(fd.get(), "a", fd.get(), "c"), 0);
  ASSERT_EQ(mkdirat(fd.get(), "c/b/unseen", 0700), 0);
  EXPECT_THAT(Told(), ElementsAre("rename dir " + point + "/a -> " + point + "/c"));
  Unmount();
  test::WriteFile(point + "/c/b/f", "");
  EXPECT_THAT(Told(), ElementsAre("create file " + point + "/c/b/f"));
}

TEST_F(FanotifyMountTest, IgnoredFileSystemIsNotWatched) {
  const std::string point = inside_ + "/@eaDir/point";
  test::MakeDirs(point);
  if (!StartMounting({inside_}) || !Mount("tmpfs", point)) return;
  EXPECT_THAT(Refreshed(), IsEmpty());
  EXPECT_THAT(source_->Unwatchable(), IsEmpty());
}

TEST_F(FanotifyMountTest, FileSystemOfADirectoryComesAndGoes) {
  const std::string share = scratch_ / "disk/share";
  test::MakeDirs(scratch_ / "disk");
  if (!StartMounting({inside_, share})) return;
  for (int round = 0; round < 3; ++round) {
    ASSERT_TRUE(Mount("tmpfs", scratch_ / "disk"));
    EXPECT_THAT(Refreshed(), IsEmpty());
    test::WriteFile(share + "/f", "");
    EXPECT_THAT(Refreshed(), ElementsAre("doubt " + share));
    test::WriteFile(share + "/g", "");
    EXPECT_THAT(Told(), ElementsAre("create file " + share + "/g"));
    Unmount();
    EXPECT_THAT(Refreshed(), ElementsAre("doubt " + share));
  }
}

// The same file system again, before anybody has looked: only the mark is missing.
TEST_F(FanotifyMountTest, FileSystemThatWasAwayForAMoment) {
  const std::string image = scratch_ / "image";
  const std::string disk = scratch_ / "disk";
  test::MakeDirs(disk);
  test::WriteFile(image, "");
  std::filesystem::resize_file(image, 4 << 20);
  const auto run = [](const std::string& command) {
    return std::system((command + " >/dev/null 2>&1").c_str()) == 0;
  };
  const auto mount_image = [&] { return run("mount -o loop " + image + " " + disk); };
  if (!StartMounting({inside_, disk})) return;
  if (!run("mkfs.ext4 -q " + image) || !mount_image()) return;
  EXPECT_THAT(Refreshed(), ElementsAre("doubt " + disk));
  EXPECT_TRUE(run("umount " + disk));
  EXPECT_TRUE(mount_image());
  test::WriteFile(disk + "/unheard", "");
  EXPECT_THAT(Refreshed(), ElementsAre("doubt " + disk));
  test::WriteFile(disk + "/f", "");
  EXPECT_THAT(Told(), Contains("create file " + disk + "/f"));
  source_.reset();
  EXPECT_TRUE(run("umount " + disk));
}

TEST_F(FanotifyMountTest, SameDirectoryUnderAnotherPath) {
  const std::string bound = scratch_ / "bound";
  test::MakeDirs(bound);
  test::MakeDirs(outside_ + "/d");
  if (!StartMounting({inside_})) return;
  Bind(outside_ + "/d", bound);
  source_->SetDirectories({inside_, bound}, {}, model_);
  model_.ForgetTold();
  test::WriteFile(outside_ + "/d/e/f", "");
  test::WriteFile(bound + "/e/g", "");
  test::WriteFile(outside_ + "/unheard", "");
  EXPECT_THAT(Told(), ElementsAre("create dir " + bound + "/e", "create file " + bound + "/e/f",
                                  "create file " + bound + "/e/g"));
  source_->SetDirectories({inside_, bound, outside_}, {}, model_);
  model_.ForgetTold();
  std::rename((bound + "/e/f").c_str(), (bound + "/f").c_str());
  EXPECT_THAT(Told(), ElementsAre("rename file " + bound + "/e/f -> " + bound + "/f",
                                  "rename file " + outside_ + "/d/e/f -> " + outside_ + "/d/f"));
}

// Only this mount leads to the directory; the mount shows a part of its file system.
TEST_F(FanotifyMountTest, PartOfAFileSystem) {
  const std::string disk = scratch_ / "disk";
  const std::string part = scratch_ / "part";
  test::MakeDirs(disk);
  test::MakeDirs(part);
  if (!StartMounting({inside_}) || !Mount("tmpfs", disk)) return;
  test::MakeDirs(disk + "/a/b/c");
  test::MakeDirs(disk + "/other/x");
  Bind(disk + "/a", part);
  source_->SetDirectories({inside_, part + "/b"}, {}, model_);
  model_.ForgetTold();
  test::WriteFile(disk + "/other/x/unheard", "");
  test::WriteFile(disk + "/a/unheard", "");
  test::WriteFile(disk + "/a/b/c/f", "");
  EXPECT_THAT(Told(), ElementsAre("create file " + part + "/b/c/f"));
  std::rename((disk + "/other").c_str(), (disk + "/a/b/came").c_str());
  test::WriteFile(disk + "/a/b/came/x/f", "");
  EXPECT_THAT(Told(),
              ElementsAre("create dir " + part + "/b/came", "create file " + part + "/b/came/x/f"));
}

TEST_F(FanotifyMountTest, WhatCannotBeWatchedIsNamed) {
  const std::string point = inside_ + "/point";
  test::MakeDirs(point);
  if (!StartMounting({inside_}) || !Mount("ramfs", point)) return;
  const std::vector<std::string> told = Refreshed();
  // Whether it can be watched depends on the kernel.
  if (told.empty()) {
    EXPECT_THAT(source_->Unwatchable(), ElementsAre(point));
  } else {
    EXPECT_THAT(told, ElementsAre("doubt " + point));
    EXPECT_THAT(source_->Unwatchable(), IsEmpty());
  }
  Unmount();
  EXPECT_THAT(Refreshed(), ElementsAre("doubt " + point));
  EXPECT_THAT(source_->Unwatchable(), IsEmpty());
}

}  // namespace
}  // namespace quarry::notify
