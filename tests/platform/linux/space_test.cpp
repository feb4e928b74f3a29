#include "platform/linux/space.h"

#include <gtest/gtest.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <limits>

#include "platform/include/error.h"
#include "platform/include/filesystem.h"
#include "platform/linux/last_error.h"
#include "tests/support/temp_dir.h"

namespace quarry::platform {
namespace {

TEST(SpaceTest, ComparesWithWhatTheVolumeHasLeft) {
  test::TempDir dir;
  struct statvfs volume {};
  ASSERT_EQ(statvfs(dir.path().c_str(), &volume), 0);
  ASSERT_GT(volume.f_bavail, 0u);
  EXPECT_NE(TARNQuotaIsEnough(dir.path().c_str(), 0, 0), 0);
  EXPECT_NE(TARNQuotaIsEnough(dir.path().c_str(), 0, 1), 0);
  SetLastError(0, "", 0);
  // More than the whole volume, so that what others write meanwhile makes no difference.
  const unsigned long long too_much =
      static_cast<unsigned long long>(volume.f_blocks + 1) * volume.f_frsize;
  EXPECT_EQ(TARNQuotaIsEnough(dir.path().c_str(), 0, too_much), 0);
  EXPECT_EQ(HLIBCErrGet(), kHLIBErrNoSpace);
  EXPECT_STREQ(HLIBCErrorGetFile(), "space.cpp");
  constexpr unsigned long long kMost = std::numeric_limits<unsigned long long>::max();
  EXPECT_EQ(TARNQuotaIsEnough(dir.path().c_str(), 0, kMost), 0);
  EXPECT_EQ(TARNQuotaIsEnough(dir.path().c_str(), geteuid(), too_much), 0);
  EXPECT_EQ(HLIBCErrGet(), kHLIBErrNoSpace);
}

TEST(SpaceTest, AVolumeThatCannotBeAskedIsNotReportedAsFull) {
  test::TempDir dir;
  EXPECT_EQ(TARNQuotaIsEnough((dir / "missing").c_str(), 0, 1), 0);
  EXPECT_EQ(HLIBCErrGet(), kErrSystem);
  EXPECT_EQ(TARNQuotaIsEnough(nullptr, 0, 1), 0);
  EXPECT_EQ(HLIBCErrGet(), kErrBadParameter);
}

TEST(SpaceTest, UsersWithoutAQuotaHaveTheVolume) {
  test::TempDir dir;
  EXPECT_NE(TARNQuotaIsEnough(dir.path().c_str(), geteuid(), 1), 0);
  EXPECT_NE(TARNQuotaIsEnough(dir.path().c_str(), 12345678, 1), 0);
}

TEST(SpaceTest, KeepsWithinTheHardLimit) {
  dqblk quota{};
  quota.dqb_curspace = 500;
  EXPECT_TRUE(FitsQuota(quota, std::numeric_limits<unsigned long long>::max())) << "no limit";
  quota.dqb_bhardlimit = 1;  // KiB
  EXPECT_TRUE(FitsQuota(quota, 524));
  EXPECT_FALSE(FitsQuota(quota, 525));
  EXPECT_FALSE(FitsQuota(quota, std::numeric_limits<unsigned long long>::max()));
  quota.dqb_curspace = 1024;
  EXPECT_TRUE(FitsQuota(quota, 0));
  EXPECT_FALSE(FitsQuota(quota, 1));
  quota.dqb_curspace = 2000;
  EXPECT_FALSE(FitsQuota(quota, 0)) << "over the limit already";
}

}  // namespace
}  // namespace quarry::platform
