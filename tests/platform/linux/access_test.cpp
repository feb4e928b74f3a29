#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/include/filesystem.h"
#include "tests/platform/linux/child.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::platform {
namespace {

TEST(HiddenDirTest, KnowsMetadataNamesExactly) {
  for (const char* name : {"@eaDir", "lost+found", ".snapshots", ".zfs"}) {
    EXPECT_EQ(TARNEAIsHiddenDir(name), 1) << name;
  }
  for (const char* name : {"", "@eadir", "@eaDir2", "x@eaDir", "lost", "@eaDir/x", ".git", "."}) {
    EXPECT_EQ(TARNEAIsHiddenDir(name), 0) << name;
  }
  EXPECT_EQ(TARNEAIsHiddenDir(nullptr), 0);
}

TEST(PermissionTest, AreTheCallersEffectiveOnes) {
  test::TempDir dir;
  test::WriteFile(dir / "f", "");
  chmod((dir / "f").c_str(), 0);
  chmod(dir.path().c_str(), 0755);
  const std::string file = dir / "f";
  const bool root = geteuid() == 0;
  for (const mode_t mode : {0u, 1u, 2u, 3u, 4u, 5u, 6u, 7u}) {
    ASSERT_EQ(chmod(file.c_str(), mode << 6 | mode), 0);
    const int expected = static_cast<int>(root ? mode | 6u : mode);
    EXPECT_EQ(TARNACLPermGet(file.c_str()), expected) << mode;
  }
  // As another user, by the effective id alone.
  ASSERT_EQ(chmod(file.c_str(), 0704), 0);
  EXPECT_EQ(test::RunInChild([&] {
              if (!root) return 0;
              if (setegid(65534) != 0 || seteuid(65534) != 0) return 1;
              return TARNACLPermGet(file.c_str()) == 4 ? 0 : 2;
            }),
            0);
}

TEST(PermissionTest, FailForWhatIsNotThere) {
  test::TempDir dir;
  EXPECT_LT(TARNACLPermGet((dir / "missing").c_str()), 0);
  EXPECT_LT(TARNACLPermGet(""), 0);
  EXPECT_LT(TARNACLPermGet(nullptr), 0);
  EXPECT_EQ(TARNACLPermGet(dir.path().c_str()), 7);
}

}  // namespace
}  // namespace quarry::platform
