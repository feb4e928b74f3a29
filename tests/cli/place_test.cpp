#include "cli/place.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "cli/problem.h"
#include "tests/support/temp_dir.h"

namespace quarry::cli {
namespace {

const std::vector<KnownShare> kShares{{"photo", "/volume1/photo"}, {"music", "/srv/music"}};

std::string ProblemOf(const std::string& directory) {
  try {
    PlanPlace(directory, kShares);
  } catch (const Problem& problem) {
    return problem.what();
  }
  return {};
}

TEST(PlanPlaceTest, TakesADirectoryOutsideAllSharesAsANewShare) {
  const Place place = PlanPlace("/home/docs", kShares);
  EXPECT_TRUE(place.new_share);
  EXPECT_EQ(place.share, "docs");
  EXPECT_EQ(place.share_path, "/home/docs");
  EXPECT_EQ(place.folder, "/docs");
}

TEST(PlanPlaceTest, TakesADirectoryInAShareAsItsFolder) {
  const Place place = PlanPlace("/volume1/photo/2019/may", kShares);
  EXPECT_FALSE(place.new_share);
  EXPECT_EQ(place.share, "photo");
  EXPECT_EQ(place.share_path, "/volume1/photo");
  EXPECT_EQ(place.folder, "/photo/2019/may");
}

TEST(PlanPlaceTest, TakesAShareItselfAsItsTopFolder) {
  EXPECT_EQ(PlanPlace("/srv/music", kShares).folder, "/music");
}

TEST(PlanPlaceTest, PrefersTheDeepestShare) {
  const std::vector<KnownShare> nested{{"a", "/v/a"}, {"b", "/v/a/b"}};
  EXPECT_EQ(PlanPlace("/v/a/b/c", nested).folder, "/b/c");
  EXPECT_EQ(PlanPlace("/v/a/bc", nested).folder, "/a/bc");
}

TEST(PlanPlaceTest, DoesNotTakeANeighbourForAShare) {
  EXPECT_TRUE(PlanPlace("/volume1/photography", kShares).new_share);
}

TEST(PlanPlaceTest, RefusesTheRootDirectory) {
  EXPECT_EQ(ProblemOf("/"), "\"/\" cannot be a share. Name a directory below it.");
}

TEST(PlanPlaceTest, RefusesAParentOfAShare) {
  EXPECT_EQ(
      ProblemOf("/volume1"),
      "\"/volume1\" holds the share \"photo\" (/volume1/photo). Shares cannot lie within each "
      "other; name a directory beside it.");
}

TEST(PlanPlaceTest, RefusesASecondShareOfTheSameName) {
  EXPECT_EQ(ProblemOf("/home/photo"),
            "There is a share named \"photo\" already (/volume1/photo). A share is named after its "
            "directory; rename one of the two directories.");
}

class ResolveDirectoryTest : public testing::Test {
 protected:
  static std::string ProblemOf(const std::string& argument) {
    try {
      ResolveDirectory(argument);
    } catch (const Problem& problem) {
      return problem.what();
    }
    return {};
  }

  test::TempDir dir_;
};

TEST_F(ResolveDirectoryTest, FollowsLinksAndDropsDots) {
  const std::string real = dir_.path() + "/real";
  ASSERT_TRUE(std::filesystem::create_directory(real));
  std::filesystem::create_directory_symlink(real, dir_.path() + "/link");
  EXPECT_EQ(ResolveDirectory(dir_.path() + "/link/../link/."), std::filesystem::canonical(real));
}

TEST_F(ResolveDirectoryTest, NamesAMissingPlace) {
  const std::string missing = dir_.path() + "/missing";
  EXPECT_EQ(ProblemOf(missing), "Cannot open \"" + missing +
                                    "\": No such file or directory. Name a directory that exists.");
}

TEST_F(ResolveDirectoryTest, RefusesAFile) {
  const std::string file = std::filesystem::canonical(dir_.path()).string() + "/file";
  std::ofstream(file) << "x";
  EXPECT_EQ(ProblemOf(file),
            "\"" + file + "\" is not a directory. Name the directory that holds it.");
}

TEST_F(ResolveDirectoryTest, RefusesADirectoryThatMayNotBeRead) {
  const std::string closed = std::filesystem::canonical(dir_.path()).string() + "/closed";
  ASSERT_EQ(mkdir(closed.c_str(), 0700), 0);
  ASSERT_EQ(chmod(closed.c_str(), 0), 0);
  const std::string problem = ProblemOf(closed);
  if (geteuid() == 0) {
    EXPECT_EQ(problem, "");  // nothing is closed to root
  } else {
    EXPECT_EQ(problem,
              "You may not read \"" + closed + "\". Ask its owner for permission, or run as root.");
  }
}

}  // namespace
}  // namespace quarry::cli
