#include "common/paths.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <string>

#include "tests/support/root.h"

namespace quarry {
namespace {

TEST(PathsTest, FixedPathsLieBelowTheRoot) {
  EXPECT_EQ(Root(), test::TestRoot());
  EXPECT_EQ(RootedPath("/var/run/x.sock"), test::TestRoot() + "/var/run/x.sock");
}

TEST(PathsTest, RootIsComputedOnce) {
  const std::string before = Root();
  setenv("QUARRY_ROOT", "/elsewhere", 1);
  EXPECT_EQ(Root(), before);
  setenv("QUARRY_ROOT", before.c_str(), 1);
}

}  // namespace
}  // namespace quarry
