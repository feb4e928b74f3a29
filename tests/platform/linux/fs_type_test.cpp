#include "platform/linux/fs_type.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <string>

#include "platform/include/filesystem.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::platform {
namespace {

Mount MountOf(const std::string& type, const std::string& source, unsigned device_major = 0,
              const std::string& point = "/mnt") {
  Mount mount;
  mount.type = type;
  mount.source = source;
  mount.device_major = device_major;
  mount.point = point;
  return mount;
}

bool IsRemote(int type) {
  return TARNFSIsRemoteFS(type) == 1;
}
bool IsImage(int type) {
  return TARNFSIsImageFS(type) == 1;
}

TEST(FsTypeTest, PseudoFileSystemsAreTheRefusedType) {
  EXPECT_EQ(kFsPseudo, kTARNFSTypeRefused);
  for (const unsigned long magic :
       {0x9FA0UL, 0x62656572UL, 0x27E0EBUL, 0x63677270UL, 0x1CD1UL, 0x64626720UL, 0x74726163UL,
        0x73636673UL, 0xCAFE4A11UL, 0x6165676CUL, 0xDE5E81E4UL, 0x62656570UL, 0x19800202UL,
        0x958458F6UL, 0x6E736673UL, 0x187UL}) {
    EXPECT_EQ(TypeOfMagic(magic), kFsPseudo) << std::hex << magic;
  }
  EXPECT_EQ(TARNGetFSType("/proc", 0), 12);
  EXPECT_EQ(TARNGetFSType("/proc/self/status", 0), 12);
  EXPECT_EQ(access("/sys/kernel", F_OK) == 0 ? TARNGetFSType("/sys/kernel", 0) : 12, 12);
}

TEST(FsTypeTest, LocalTypesAreNeitherRemoteNorImages) {
  for (const unsigned long magic :
       {0xEF53UL, 0x9123683EUL, 0x58465342UL, 0x2FC12FC1UL, 0xF2F52010UL, 0x4D44UL, 0x2011BAB0UL,
        0x7366746EUL, 0x482BUL, 0x01021994UL, 0x794C7630UL, 0x65735546UL, 0x12345678UL}) {
    const FsType type = TypeOfMagic(magic);
    EXPECT_FALSE(IsRemote(type)) << std::hex << magic;
    EXPECT_FALSE(IsImage(type)) << std::hex << magic;
    EXPECT_NE(type, kFsPseudo) << std::hex << magic;
    EXPECT_GE(type, 0);
  }
  EXPECT_NE(TypeOfMagic(0xEF53), TypeOfMagic(0x9123683E));
}

TEST(FsTypeTest, NetworkTypesAreRemote) {
  for (const unsigned long magic : {0x6969UL, 0x517BUL, 0xFF534D42UL, 0xFE534D42UL, 0x5346414FUL,
                                    0x6B414653UL, 0xC36400UL, 0x01021997UL, 0x73757245UL}) {
    EXPECT_TRUE(IsRemote(TypeOfMagic(magic))) << std::hex << magic;
    EXPECT_FALSE(IsImage(TypeOfMagic(magic))) << std::hex << magic;
  }
}

TEST(FsTypeTest, MediaAndArchivesAreImages) {
  for (const unsigned long magic :
       {0x9660UL, 0x15013346UL, 0x73717368UL, 0xE0F5E1E2UL, 0x28CD3D45UL, 0x7275UL}) {
    EXPECT_TRUE(IsImage(TypeOfMagic(magic))) << std::hex << magic;
    EXPECT_FALSE(IsRemote(TypeOfMagic(magic))) << std::hex << magic;
  }
}

TEST(FsTypeTest, ThePredicatesTakeAnyNumber) {
  for (const int type : {-1, 0, 12, 99}) {
    EXPECT_EQ(TARNFSIsRemoteFS(type), 0);
    EXPECT_EQ(TARNFSIsImageFS(type), 0);
  }
}

TEST(FsTypeTest, FuseIsWhatItsMountSays) {
  EXPECT_EQ(TypeOfFuse(MountOf("fuseblk", "/dev/sdb1", 8)), kFsFuseLocal);
  EXPECT_EQ(TypeOfFuse(MountOf("fuseblk", "/dev/loop0", 7)), kFsLoop);
  EXPECT_EQ(TypeOfFuse(MountOf("fuse.mergerfs", "/disk1:/disk2")), kFsFuseLocal);
  EXPECT_EQ(TypeOfFuse(MountOf("fuse.gocryptfs", "/home/alice/.crypt")), kFsFuseLocal);
  EXPECT_EQ(TypeOfFuse(MountOf("fuse.sshfs", "anything")), kFsFuseRemote);
  EXPECT_EQ(TypeOfFuse(MountOf("fuse.rclone", "cloud:")), kFsFuseRemote);
  EXPECT_EQ(TypeOfFuse(MountOf("fuse.unheard", "host:/export")), kFsFuseRemote);
  EXPECT_EQ(TypeOfFuse(MountOf("fuse", "https://example.org/dav")), kFsFuseRemote);
  EXPECT_EQ(TypeOfFuse(MountOf("fuse", "//server/share")), kFsFuseRemote);
  EXPECT_EQ(TypeOfFuse(MountOf("fuse.squashfuse", "a.squashfs")), kFsOtherImage);
  EXPECT_EQ(TypeOfFuse(MountOf("fuse.lxcfs", "lxcfs")), kFsPseudo);
  EXPECT_EQ(TypeOfFuse(MountOf("fuse", "")), kFsFuseLocal);
  EXPECT_TRUE(IsRemote(kFsFuseRemote));
  EXPECT_TRUE(IsImage(kFsLoop));
}

TEST(FsTypeTest, AnImageInAFileIsAnImageButForTheRoot) {
  EXPECT_TRUE(IsLoopMount(MountOf("ext4", "/dev/loop3", 7)));
  EXPECT_TRUE(IsLoopMount(MountOf("btrfs", "/dev/loop12", 0)));
  EXPECT_FALSE(IsLoopMount(MountOf("ext4", "/dev/sda1", 8)));
  EXPECT_FALSE(IsLoopMount(MountOf("ext4", "/dev/loop0", 7, "/")));
}

TEST(FsTypeTest, TellsTheTypeOfExistingPlacesOnly) {
  test::TempDir dir;
  test::WriteFile(dir / "f", "");
  const int type = TARNGetFSType(dir.path().c_str(), 0);
  EXPECT_GE(type, 0);
  EXPECT_NE(type, 12);
  EXPECT_EQ(TARNGetFSType((dir / "f").c_str(), 0), type);
  EXPECT_LT(TARNGetFSType((dir / "missing").c_str(), 0), 0);
  EXPECT_LT(TARNGetFSType("", 0), 0);
  EXPECT_LT(TARNGetFSType(nullptr, 0), 0);
}

}  // namespace
}  // namespace quarry::platform
