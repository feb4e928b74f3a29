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
  bool StartCourse() {
    if (!Start({inside_}, model_)) return false;
    if (GetParam().reports == ProbeFanotify()) return true;
    // A kernel that tells renames can tell their halves, too.
    source_ = std::make_unique<FanotifySource>(MoveReports::kHalves);
    source_->SetDirectories({inside_}, {"@eaDir"}, model_);
    EXPECT_TRUE(source_->Unwatchable().empty());
    return true;
  }

  void ExpectSame() {
    ReadAll(model_);
    source_->Refresh(model_);
    const std::set<std::string> disk = test::ListTree(inside_, kIgnored);
    ASSERT_TRUE(model_.Paths() == disk)
        << "not told of: " << Beyond(disk, model_.Paths())
        << "\nnot told to be gone: " << Beyond(model_.Paths(), disk) << Told();
  }

  static std::string Beyond(const std::set<std::string>& some,
                            const std::set<std::string>& others) {
    std::string text;
    for (const std::string& path : some) {
      if (others.count(path) == 0) text += "\n  " + path;
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
  for (unsigned seed = 0; seed < 6; ++seed) {
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
