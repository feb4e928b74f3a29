#include "daemons/tarnotifyd/mount_table.h"

#include <gtest/gtest.h>

#include <algorithm>

namespace quarry::notify {
namespace {

TEST(MountTable, LinesOfTheKernel) {
  const std::vector<Mount> mounts = ParseMounts(
      "22 1 254:0 / / rw,relatime shared:1 - ext4 /dev/vda rw\n"
      "36 35 98:0 /mnt1 /mnt/a\\040b\\134 rw master:1 shared:2 - xfs /dev/root rw\n"
      "40 22 0:5 / /dev rw - devtmpfs devtmpfs rw\n");
  ASSERT_EQ(mounts.size(), 3U);
  EXPECT_EQ(mounts[0].path, "/");
  EXPECT_EQ(mounts[0].type, "ext4");
  EXPECT_EQ(mounts[1].path, "/mnt/a b\\");
  EXPECT_EQ(mounts[1].type, "xfs");
  EXPECT_EQ(mounts[2].path, "/dev");
  EXPECT_EQ(mounts[2].type, "devtmpfs");
}

TEST(MountTable, LinesThatAreNone) {
  EXPECT_TRUE(ParseMounts("").empty());
  EXPECT_TRUE(ParseMounts("\n\n  \n").empty());
  EXPECT_TRUE(ParseMounts("22 1 254:0 / / rw").empty());
  EXPECT_TRUE(ParseMounts("22 1 254:0 / relative rw - ext4 x rw\n").empty());
  const std::vector<Mount> mounts = ParseMounts("rubbish\n1 2 3:4 / /m\\0 rw - t s o");
  ASSERT_EQ(mounts.size(), 1U);
  EXPECT_EQ(mounts[0].path, "/m\\0");
}

TEST(MountTable, WhatTheKernelMakesUp) {
  EXPECT_TRUE(IsKernelsOwn("proc"));
  EXPECT_TRUE(IsKernelsOwn("cgroup2"));
  EXPECT_FALSE(IsKernelsOwn("ext4"));
  EXPECT_FALSE(IsKernelsOwn("tmpfs"));
  EXPECT_FALSE(IsKernelsOwn("fuse.sshfs"));
}

TEST(MountTable, ThisProcessSeesItsRootAgainAndAgain) {
  MountTable table;
  for (int i = 0; i < 2; ++i) {
    const std::vector<Mount> mounts = table.Read();
    EXPECT_TRUE(std::any_of(mounts.begin(), mounts.end(),
                            [](const Mount& mount) { return mount.path == "/"; }));
  }
}

}  // namespace
}  // namespace quarry::notify
