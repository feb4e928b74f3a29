#include <gtest/gtest.h>

#include "platform/include/service.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace quarry::platform {
namespace {

class SpotlightTest : public ::testing::Test {
 protected:
  SpotlightTest() { test::ResetTestRoot(); }
  const std::string path_ = test::TestRoot() + "/etc/quarry/samba-spotlight.conf";
};

TEST_F(SpotlightTest, IsOffUntilItIsSwitchedOn) {
  EXPECT_EQ(TARNSMBIsEnableSpotlight(), 0);
  EXPECT_EQ(TARNSMBSetSpotlight(1), 0);
  EXPECT_EQ(TARNSMBIsEnableSpotlight(), 1);
  EXPECT_EQ(TARNSMBSetSpotlight(0), 0);
  EXPECT_EQ(TARNSMBIsEnableSpotlight(), 0);
}

TEST_F(SpotlightTest, IsAFileThatSambaReads) {
  ASSERT_EQ(TARNSMBSetSpotlight(1), 0);
  EXPECT_EQ(test::ReadFile(path_),
            "# Kept by Quarry. Include it from [global] in smb.conf.\nspotlight = yes\n");
  ASSERT_EQ(TARNSMBSetSpotlight(0), 0);
  EXPECT_EQ(test::ReadFile(path_),
            "# Kept by Quarry. Include it from [global] in smb.conf.\nspotlight = no\n");
}

TEST_F(SpotlightTest, MakesItsDirectory) {
  test::RemoveTree(test::TestRoot() + "/etc");
  EXPECT_EQ(TARNSMBSetSpotlight(1), 0);
  EXPECT_EQ(TARNSMBIsEnableSpotlight(), 1);
}

TEST_F(SpotlightTest, FailsWhenTheSettingCannotBeKept) {
  test::MakeDirs(path_ + "/inner");
  EXPECT_LT(TARNSMBSetSpotlight(1), 0);
  EXPECT_LT(TARNSMBIsEnableSpotlight(), 0);
}

}  // namespace
}  // namespace quarry::platform
