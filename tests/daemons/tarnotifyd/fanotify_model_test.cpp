// Random changes, told by fanotify to somebody who looks only where he is told to, against the
// disk.

#include <gtest/gtest.h>

#include <atomic>
#include <random>
#include <thread>

#include "tests/daemons/tarnotifyd/support/fanotify_fixture.h"
#include "tests/daemons/tarnotifyd/support/vandal.h"

namespace quarry::notify {
namespace {

const std::set<std::string> kIgnored{"@eaDir"};

struct Course {
  MoveReports reports;
  unsigned seed;
};

class FanotifyModelTest : public FanotifyFixture, public testing::WithParamInterface<Course> {
 protected:
  // What is watched beside, or within, what the model knows makes no difference to it.
  std::vector<std::string> Directories() const {
    switch (GetParam().seed % 3) {
      case 0:
        return {inside_};
      case 1:
        return {inside_, outside_};
      default:
        return {inside_, inside_ + "/a", inside_ + "/a/b"};
    }
  }

  bool StartCourse() {
    if (!Start(Directories(), model_)) return false;
    if (GetParam().reports == ProbeFanotify()) return true;
    // A kernel that tells renames can tell their halves, too.
    source_ = std::make_unique<FanotifySource>(MoveReports::kHalves);
    source_->SetDirectories(Directories(), {"@eaDir"}, model_);
    EXPECT_TRUE(source_->Unwatchable().empty());
    return true;
  }

  void ExpectSame() {
    ReadAll(model_);
    source_->Refresh(model_);
    const test::StampedTree disk = test::StampTree(inside_, kIgnored);
    ASSERT_TRUE(model_.Stamps() == disk)
        << "not told of: " << Beyond(disk, model_.Stamps())
        << "\nnot told to be gone: " << Beyond(model_.Stamps(), disk) << Told();
  }

  static std::string Beyond(const test::StampedTree& some, const test::StampedTree& others) {
    std::string text;
    for (const auto& [path, stamp] : some) {
      const auto other = others.find(path);
      if (other == others.end() || other->second != stamp) text += "\n  " + path + " " + stamp;
    }
    return text;
  }

  std::string Told() const {
    std::string text = "\ntold:\n";
    for (const std::string& line : model_.Told()) text += line + "\n";
    return text;
  }

  test::DiskModel model_{inside_, kIgnored};
};

// The source reads now and then, and so is behind by a few changes or by many.
TEST_P(FanotifyModelTest, KnowsTheDiskWhenItReadsLate) {
  if (!StartCourse()) return;
  test::Vandal vandal(inside_, outside_, GetParam().seed);
  std::mt19937 random(GetParam().seed + 1000);
  for (int round = 0; round < 25; ++round) {
    for (auto left = random() % 40; left > 0; --left) {
      vandal.DoOne();
      if (random() % 4 == 0) source_->Read(model_);
      if (random() % 40 == 0) source_->Refresh(model_);
    }
    if (random() % 3 != 0) continue;
    ASSERT_NO_FATAL_FAILURE(ExpectSame());
  }
  ASSERT_NO_FATAL_FAILURE(ExpectSame());
}

// Somebody else changes the disk at full speed.
TEST_P(FanotifyModelTest, KnowsTheDiskAfterAStorm) {
  if (!StartCourse()) return;
  std::atomic<bool> is_over{false};
  std::thread storm([&] {
    test::Vandal vandal(inside_, outside_, GetParam().seed + 500);
    for (int i = 0; i < 1500; ++i) vandal.DoOne();
    is_over = true;
  });
  pollfd polled{source_->Descriptor(), POLLIN, 0};
  while (!is_over) {
    if (poll(&polled, 1, 1) > 0) source_->Read(model_);
  }
  storm.join();
  ASSERT_NO_FATAL_FAILURE(ExpectSame());
}

std::vector<Course> Courses() {
  std::vector<Course> courses;
  for (unsigned seed = 0; seed < 9; ++seed) {
    courses.push_back({MoveReports::kRenames, seed});
    courses.push_back({MoveReports::kHalves, seed});
  }
  return courses;
}

std::string NameOf(const testing::TestParamInfo<Course>& info) {
  return (info.param.reports == MoveReports::kRenames ? "Renames" : "Halves") +
         std::to_string(info.param.seed);
}

INSTANTIATE_TEST_SUITE_P(Seeds, FanotifyModelTest, testing::ValuesIn(Courses()), NameOf);

}  // namespace
}  // namespace quarry::notify
