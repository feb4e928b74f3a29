#include "platform/linux/mount_info.h"

#include <gtest/gtest.h>

#include <random>

#include "tests/support/temp_dir.h"

namespace quarry::platform {
namespace {

constexpr char kText[] =
    "22 27 0:21 / /proc rw,relatime - proc proc rw\n"
    "27 1 254:0 / / rw,relatime shared:1 - ext4 /dev/vda1 rw,errors=remount-ro\n"
    "30 27 0:40 / /mnt/with\\040blank\\134 rw shared:2 master:3 - fuse.sshfs host:/a\\040b rw\n"
    "31 27 7:3 / /mnt rw - ext4 /dev/loop3 rw\n"
    "32 31 8:1 / /mnt rw - xfs /dev/sda1 rw\n";

TEST(MountInfoTest, ReadsEveryLine) {
  const std::vector<Mount> mounts = ParseMountInfo(kText);
  ASSERT_EQ(mounts.size(), 5u);
  EXPECT_EQ(mounts[1].id, 27u);
  EXPECT_EQ(mounts[1].device_major, 254u);
  EXPECT_EQ(mounts[1].device_minor, 0u);
  EXPECT_EQ(mounts[1].point, "/");
  EXPECT_EQ(mounts[1].type, "ext4");
  EXPECT_EQ(mounts[1].source, "/dev/vda1");
  EXPECT_EQ(mounts[2].point, "/mnt/with blank\\");
  EXPECT_EQ(mounts[2].type, "fuse.sshfs");
  EXPECT_EQ(mounts[2].source, "host:/a b");
}

TEST(MountInfoTest, PassesOverWhatIsNoLine) {
  EXPECT_TRUE(ParseMountInfo("").empty());
  EXPECT_TRUE(ParseMountInfo("\n\nnonsense\n1 2 3:4 / /a rw\n1 2 x / /a rw - ext4 a rw\n").empty());
  std::mt19937 random(5);
  for (int i = 0; i < 500; ++i) {
    std::string text = kText;
    text[random() % text.size()] = static_cast<char>(random());
    EXPECT_LE(ParseMountInfo(text).size(), 6u);
  }
}

TEST(MountInfoTest, TheDeepestAndLastMountHoldsAPath) {
  const std::vector<Mount> mounts = ParseMountInfo(kText);
  EXPECT_EQ(MountHolding(mounts, "/mnt/x")->type, "xfs");
  EXPECT_EQ(MountHolding(mounts, "/mnt")->type, "xfs");
  EXPECT_EQ(MountHolding(mounts, "/mnt/with blank\\/x")->type, "fuse.sshfs");
  EXPECT_EQ(MountHolding(mounts, "/mntx")->point, "/");
  EXPECT_EQ(MountHolding(mounts, "/")->point, "/");
  EXPECT_EQ(MountHolding({}, "/"), nullptr);
}

TEST(MountInfoTest, FindsTheMountsOfThisMachine) {
  Mount mount;
  ASSERT_TRUE(FindMount("/proc/self", &mount));
  EXPECT_EQ(mount.type, "proc");
  EXPECT_EQ(mount.point, "/proc");
  test::TempDir dir;
  ASSERT_TRUE(FindMount(dir.path(), &mount));
  EXPECT_NE(mount.type, "proc");
  EXPECT_FALSE(FindMount(dir / "missing", &mount));
  EXPECT_FALSE(ReadMounts().empty());
}

}  // namespace
}  // namespace quarry::platform
