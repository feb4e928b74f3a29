#include "platform/linux/mount_point.h"

#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "platform/include/error.h"
#include "platform/include/filesystem.h"
#include "platform/linux/last_error.h"
#include "tests/platform/linux/child.h"
#include "tests/platform/linux/share_fixture.h"

namespace quarry::platform {
namespace {

constexpr int kNotAllowed = 77;

class MountPointTest : public ShareTest {
 protected:
  // Runs `body` where mounting disturbs nobody. 0 when all of it held, and also where the machine
  // does not let this user mount; otherwise what `body` returned.
  static int InMountNamespace(const std::function<int()>& body) {
    const int result = test::RunInChild([&] {
      if (unshare(CLONE_NEWNS) != 0) return kNotAllowed;
      if (mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0) return kNotAllowed;
      return body();
    });
    return result == kNotAllowed ? 0 : result;
  }
  static bool MountTmpfs(const std::string& path) {
    return mount("none", path.c_str(), "tmpfs", 0, "size=1m") == 0;
  }
};

TEST_F(MountPointTest, OrdinaryPlacesAreNone) {
  test::WriteFile(volume_ / "f", "");
  EXPECT_EQ(TARNFSDirIsMntPoint(volume_.path().c_str()), 0);
  EXPECT_EQ(TARNFSDirIsMntPoint((volume_ / "f").c_str()), 0);
  EXPECT_LT(TARNFSDirIsMntPoint((volume_ / "missing").c_str()), 0);
  EXPECT_LT(TARNFSDirIsMntPoint(""), 0);
  EXPECT_LT(TARNFSDirIsMntPoint(nullptr), 0);
}

TEST_F(MountPointTest, MountsAreFoundByTheKernelAndByTheList) {
  for (const bool ask_kernel : {true, false}) {
    EXPECT_EQ(IsMountRoot("/", ask_kernel), 1);
    EXPECT_EQ(IsMountRoot("/proc", ask_kernel), 1);
    EXPECT_EQ(IsMountRoot("/proc/self/task", ask_kernel), 0);
    EXPECT_EQ(IsMountRoot(volume_.path(), ask_kernel), 0);
    EXPECT_EQ(IsMountRoot(volume_ / "missing", ask_kernel), -1);
  }
  EXPECT_EQ(TARNFSDirIsMntPoint("/proc"), 1);
}

TEST_F(MountPointTest, BindMountsOfTheSameFileSystemCount) {
  test::MakeDirs(volume_ / "from");
  test::MakeDirs(volume_ / "on");
  EXPECT_EQ(InMountNamespace([this] {
              if (mount((volume_ / "from").c_str(), (volume_ / "on").c_str(), nullptr, MS_BIND,
                        nullptr) != 0) {
                return kNotAllowed;
              }
              const std::string on = volume_ / "on";
              if (TARNFSDirIsMntPoint(on.c_str()) != 1) return 1;
              if (IsMountRoot(on, false) != 1) return 2;
              return TARNFSDirIsMntPoint((volume_ / "from").c_str()) == 0 ? 0 : 3;
            }),
            0);
}

TEST_F(MountPointTest, AShareMayBeAWholeDisk) {
  const std::string share = Add("disk").path;
  test::MakeDirs(share + "/inner");
  EXPECT_EQ(InMountNamespace([&] {
              if (!MountTmpfs(share)) return kNotAllowed;
              if (IsMountRoot(share) != 1) return 1;
              if (TARNFSDirIsMntPoint(share.c_str()) != 0) return 2;
              // Another disk inside the share is a foreign one.
              if (mkdir((share + "/inner").c_str(), 0755) != 0) return 3;
              if (!MountTmpfs(share + "/inner")) return 4;
              return TARNFSDirIsMntPoint((share + "/inner").c_str()) == 1 ? 0 : 5;
            }),
            0);
}

TEST_F(MountPointTest, ABadShareFileHidesNoMount) {
  WriteShareFile("{");
  SetLastError(0, "", 0);
  EXPECT_EQ(TARNFSDirIsMntPoint("/proc"), 1);
  EXPECT_EQ(HLIBCErrGet(), 0);
  EXPECT_EQ(TARNFSDirIsMntPoint(volume_.path().c_str()), 0);
}

int InSnapshot(const std::string& path) {
  int value = 7;
  const int result = HLIBFhsPathInSnapshot(path.c_str(), &value);
  return result < 0 ? result : value;
}

TEST_F(MountPointTest, AFolderCalledSnapshotIsNone) {
  test::MakeDirs(volume_ / "#snapshot/monday/docs");
  test::MakeDirs(volume_ / "#snapshots");
  EXPECT_EQ(InSnapshot(volume_ / "#snapshot"), 0);
  EXPECT_EQ(InSnapshot(volume_ / "#snapshot/monday/docs"), 0);
  EXPECT_EQ(InSnapshot(volume_ / "#snapshots"), 0);
  EXPECT_EQ(InSnapshot(volume_.path()), 0);
  EXPECT_LT(InSnapshot(volume_ / "#snapshot/tuesday"), 0);
  int value = 0;
  EXPECT_LT(HLIBFhsPathInSnapshot(nullptr, &value), 0);
  EXPECT_LT(HLIBFhsPathInSnapshot("", &value), 0);
  EXPECT_LT(HLIBFhsPathInSnapshot("/", nullptr), 0);
}

TEST_F(MountPointTest, AnotherFileSystemBelowSnapshotIsOne) {
  test::MakeDirs(volume_ / "#snapshot/monday");
  test::MakeDirs(volume_ / "#snapshot-not/disk");
  test::MakeDirs(volume_ / "whole/#snapshot");
  EXPECT_EQ(InMountNamespace([this] {
              if (!MountTmpfs(volume_ / "#snapshot/monday")) return kNotAllowed;
              if (!MountTmpfs(volume_ / "#snapshot-not/disk")) return kNotAllowed;
              if (!MountTmpfs(volume_ / "whole/#snapshot")) return kNotAllowed;
              if (mkdir((volume_ / "#snapshot/monday/docs").c_str(), 0755) != 0) return 1;
              if (InSnapshot(volume_ / "#snapshot") != 0) return 2;
              if (InSnapshot(volume_ / "#snapshot/monday") != 1) return 3;
              if (InSnapshot(volume_ / "#snapshot/monday/docs") != 1) return 4;
              if (InSnapshot(volume_ / "#snapshot-not/disk") != 0) return 5;
              return InSnapshot(volume_ / "whole/#snapshot") == 1 ? 0 : 6;
            }),
            0);
}

}  // namespace
}  // namespace quarry::platform
