// Random changes, told by inotify to somebody who looks only where he is told to, against the disk.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <unistd.h>

#include <atomic>
#include <filesystem>
#include <random>
#include <thread>

#include "daemons/tarnotifyd/inotify_source.h"
#include "tests/daemons/tarnotifyd/support/disk_model.h"
#include "tests/daemons/tarnotifyd/support/vandal.h"
#include "tests/support/temp_dir.h"

namespace quarry::notify {
namespace {

using test::DiskModel;
using test::Vandal;

const std::set<std::string> kIgnored{"@eaDir"};

class InotifyModelTest : public ::testing::Test {
 protected:
  InotifyModelTest() {
    std::filesystem::create_directory(inside_);
    std::filesystem::create_directory(outside_);
  }

  void Start() {
    source_.SetDirectories({inside_}, {"@eaDir"}, model_);
    test::ReadAll(source_, model_);
    model_.ForgetTold();
  }

  void ExpectSame(unsigned seed) {
    test::ReadAll(source_, model_);
    const std::set<std::string> disk = test::ListTree(inside_, kIgnored);
    ASSERT_TRUE(model_.Paths() == disk)
        << "seed " << seed << "\nnot told of: " << Beyond(disk, model_.Paths())
        << "\nnot told to be gone: " << Beyond(model_.Paths(), disk) << Told();
  }

  // Whether each directory is watched shows in what is told of it.
  void ExpectAllWatched(unsigned seed) {
    for (const std::string& path : test::ListTree(inside_, kIgnored)) {
      if (!std::filesystem::is_directory(std::filesystem::symlink_status(path))) continue;
      const int fd = open((path + "/probe").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
      if (fd >= 0) close(fd);
    }
    ExpectSame(seed);
  }

  static std::string Beyond(const std::set<std::string>& some,
                            const std::set<std::string>& others) {
    std::string text;
    for (const std::string& path : some) {
      if (others.count(path) == 0) text += "\n  " + path;
    }
    return text;
  }

  static std::set<std::string> Below(const std::string& root, const std::set<std::string>& paths) {
    std::set<std::string> below;
    for (const std::string& path : paths) {
      if (path == root || path.compare(0, root.size() + 1, root + "/") == 0) below.insert(path);
    }
    return below;
  }

  std::string Told() const {
    std::string text = "\ntold:\n";
    for (const std::string& line : model_.Told()) text += line + "\n";
    return text;
  }

  test::TempDir scratch_;
  const std::string inside_ = scratch_ / "inside";
  const std::string outside_ = scratch_ / "outside";
  DiskModel model_{inside_, kIgnored};
  InotifySource source_;
};

class InotifySeedTest : public InotifyModelTest, public ::testing::WithParamInterface<unsigned> {};

// The source reads now and then, and so is behind by a few changes or by many.
TEST_P(InotifySeedTest, KnowsTheDiskWhenItReadsLate) {
  Start();
  Vandal vandal(inside_, outside_, GetParam());
  std::mt19937 random(GetParam() + 1000);
  for (int round = 0; round < 25; ++round) {
    for (auto left = random() % 40; left > 0; --left) {
      vandal.DoOne();
      if (random() % 4 == 0) source_.Read(model_);
    }
    if (random() % 3 != 0) continue;
    ASSERT_NO_FATAL_FAILURE(ExpectSame(GetParam()));
  }
  ASSERT_NO_FATAL_FAILURE(ExpectSame(GetParam()));
  ExpectAllWatched(GetParam());
}

// Somebody else changes the disk at full speed.
TEST_P(InotifySeedTest, KnowsTheDiskAfterAStorm) {
  Start();
  std::atomic<bool> done{false};
  std::thread storm([&] {
    Vandal vandal(inside_, outside_, GetParam() + 500);
    for (int i = 0; i < 1500; ++i) vandal.DoOne();
    done = true;
  });
  pollfd polled{source_.Descriptor(), POLLIN, 0};
  while (!done) {
    if (poll(&polled, 1, 1) > 0) source_.Read(model_);
  }
  storm.join();
  ASSERT_NO_FATAL_FAILURE(ExpectSame(GetParam()));
  ExpectAllWatched(GetParam());
}

// What is registered comes and goes itself, lies within another one, and exchanges things with it.
TEST_P(InotifySeedTest, KnowsDirectoriesThatComeAndGo) {
  const std::vector<std::string> roots{inside_ + "/a", inside_ + "/b", inside_ + "/b/c",
                                       inside_ + "/c/d"};
  const std::vector<std::string> without_nested{roots[0], roots[2], roots[3]};
  source_.SetDirectories(roots, {"@eaDir"}, model_);
  Vandal vandal(inside_, outside_, GetParam() + 2000);
  std::mt19937 random(GetParam() + 3000);
  for (int i = 0; i < 500; ++i) {
    vandal.DoOne();
    if (random() % 4 == 0) source_.Read(model_);
    if (random() % 10 == 0) source_.Refresh(model_);
    if (random() % 50 == 0) {
      source_.SetDirectories(random() % 2 == 0 ? roots : without_nested, {"@eaDir"}, model_);
    }
  }
  source_.SetDirectories(roots, {"@eaDir"}, model_);
  for (int i = 0; i < 3; ++i) {
    test::ReadAll(source_, model_);
    source_.Refresh(model_);
  }
  test::ReadAll(source_, model_);
  for (const std::string& root : roots) {
    if (!std::filesystem::is_directory(std::filesystem::symlink_status(root))) continue;
    const std::set<std::string> disk = test::ListTree(root, kIgnored);
    const std::set<std::string> known = Below(root, model_.Paths());
    ASSERT_TRUE(known == disk) << "seed " << GetParam() << "\nnot told of: " << Beyond(disk, known)
                               << "\nnot told to be gone: " << Beyond(known, disk) << Told();
  }
}

INSTANTIATE_TEST_SUITE_P(Seeds, InotifySeedTest, ::testing::Range(0U, 12U));

}  // namespace
}  // namespace quarry::notify
