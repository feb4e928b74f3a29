#include "platform/linux/file_copy.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <string>

#include "platform/include/filesystem.h"
#include "tests/platform/linux/child.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::platform {
namespace {

using test::ListDir;
using test::ReadFile;
using test::TempDir;
using test::WriteFile;
using Names = std::vector<std::string>;

int Copy(const std::string& from, const std::string& to, int preserve = 0, int move = 0) {
  TARNCOPYARGS args{};
  args.preserve = preserve;
  args.move = move;
  errno = 0;
  return TARNFileCopy(from.c_str(), to.c_str(), &args);
}

bool Exists(const std::string& path) {
  struct stat info {};
  return lstat(path.c_str(), &info) == 0;
}

void SetTime(const std::string& path, time_t seconds) {
  const timespec times[] = {{seconds, 11}, {seconds, 22}};
  ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW), 0);
}

struct stat Status(const std::string& path) {
  struct stat info {};
  EXPECT_EQ(lstat(path.c_str(), &info), 0) << path;
  return info;
}

// A tree with something of every kind.
void MakeTree(const std::string& root) {
  WriteFile(root + "/file", "text");
  WriteFile(root + "/empty", "");
  WriteFile(root + "/sub/deep/file", std::string(3'000'000, 'x'));
  test::MakeDirs(root + "/void");
  ASSERT_EQ(symlink("nowhere", (root + "/link").c_str()), 0);
  ASSERT_EQ(symlink("sub", (root + "/dirlink").c_str()), 0);
  ASSERT_EQ(mkfifo((root + "/fifo").c_str(), 0600), 0);
}

void ExpectTree(const std::string& root) {
  EXPECT_EQ(ListDir(root), (Names{"dirlink", "empty", "fifo", "file", "link", "sub", "void"}));
  EXPECT_EQ(ReadFile(root + "/file"), "text");
  EXPECT_EQ(ReadFile(root + "/empty"), "");
  EXPECT_TRUE(ReadFile(root + "/sub/deep/file") == std::string(3'000'000, 'x'));
  EXPECT_TRUE(S_ISLNK(Status(root + "/dirlink").st_mode));
  EXPECT_TRUE(S_ISFIFO(Status(root + "/fifo").st_mode));
  char target[32] = {};
  EXPECT_EQ(readlink((root + "/link").c_str(), target, sizeof(target)), 7);
  EXPECT_STREQ(target, "nowhere");
}

TEST(FileCopyTest, CopiesOneFile) {
  TempDir dir;
  WriteFile(dir / "a", "text");
  EXPECT_EQ(Copy(dir / "a", dir / "b"), 0);
  EXPECT_EQ(ReadFile(dir / "b"), "text");
  EXPECT_EQ(ReadFile(dir / "a"), "text");
  EXPECT_EQ(ListDir(dir.path()), (Names{"a", "b"}));
}

TEST(FileCopyTest, ReplacesAFileWhole) {
  TempDir dir;
  WriteFile(dir / "a", "new");
  WriteFile(dir / "b", "old and longer");
  const ino_t old = Status(dir / "b").st_ino;
  EXPECT_EQ(Copy(dir / "a", dir / "b"), 0);
  EXPECT_EQ(ReadFile(dir / "b"), "new");
  EXPECT_NE(Status(dir / "b").st_ino, old);
}

TEST(FileCopyTest, CopiesATreeOfEveryKind) {
  TempDir dir;
  MakeTree(dir / "a");
  EXPECT_EQ(Copy(dir / "a", dir / "b"), 0);
  ExpectTree(dir / "a");
  ExpectTree(dir / "b");
  EXPECT_EQ(Copy(dir / "a/", dir / "c/"), 0) << "a slash at the end makes no difference";
  ExpectTree(dir / "c");
}

TEST(FileCopyTest, ASymbolicLinkIsCopiedAsALink) {
  TempDir dir;
  WriteFile(dir / "target", "text");
  ASSERT_EQ(symlink("target", (dir / "link").c_str()), 0);
  EXPECT_EQ(Copy(dir / "link", dir / "copy"), 0);
  EXPECT_TRUE(S_ISLNK(Status(dir / "copy").st_mode));
}

TEST(FileCopyTest, PreservesModeAndTimesWhenAsked) {
  TempDir dir;
  MakeTree(dir / "a");
  chmod((dir / "a/file").c_str(), 06751);
  chmod((dir / "a/sub").c_str(), 0510);
  SetTime(dir / "a/file", 1000);
  SetTime(dir / "a/link", 2000);
  SetTime(dir / "a/sub/deep", 3000);
  SetTime(dir / "a/sub", 4000);
  SetTime(dir / "a", 5000);
  ASSERT_EQ(Copy(dir / "a", dir / "b", 1), 0);
  EXPECT_EQ(Status(dir / "b/file").st_mode & 07777u, 06751u);
  EXPECT_EQ(Status(dir / "b/sub").st_mode & 07777u, 0510u);
  EXPECT_EQ(Status(dir / "b/file").st_mtim.tv_sec, 1000);
  EXPECT_EQ(Status(dir / "b/file").st_mtim.tv_nsec, 22);
  EXPECT_EQ(Status(dir / "b/link").st_mtim.tv_sec, 2000);
  EXPECT_EQ(Status(dir / "b/sub/deep").st_mtim.tv_sec, 3000);
  EXPECT_EQ(Status(dir / "b/sub").st_mtim.tv_sec, 4000);
  EXPECT_EQ(Status(dir / "b").st_mtim.tv_sec, 5000);
}

// An access list as the kernel takes it: the owner, user 12345 and the mask may do everything.
std::string AccessList() {
  const auto entry = [](int tag, int permissions, std::uint32_t id) {
    std::string bytes{static_cast<char>(tag), 0, static_cast<char>(permissions), 0};
    for (int shift = 0; shift < 32; shift += 8) bytes += static_cast<char>(id >> shift & 0xFFU);
    return bytes;
  };
  constexpr std::uint32_t kNone = 0xFFFFFFFFU;
  return std::string("\2\0\0\0", 4) + entry(1, 7, kNone) + entry(2, 7, 12345) + entry(4, 0, kNone) +
         entry(16, 7, kNone) + entry(32, 0, kNone);
}

// The value of an attribute, or why there is none.
std::string Attribute(const std::string& path, const char* name) {
  std::string value(4096, '\0');
  const ssize_t size = lgetxattr(path.c_str(), name, value.data(), value.size());
  return size < 0 ? strerror(errno) : value.substr(0, static_cast<std::size_t>(size));
}

// What the file system of the tests does not keep is not kept by a copy on it either.
TEST(FileCopyTest, PreservesAccessListsAndOtherAttributesWhenAsked) {
  const TempDir dir;
  const std::string acl = AccessList();
  WriteFile(dir / "tree/file", "text");
  for (const std::string& path : {dir / "tree/file", dir / "tree"}) {
    setxattr(path.c_str(), "user.quarry", "a\0b", 3, 0);
    setxattr(path.c_str(), "system.posix_acl_access", acl.data(), acl.size(), 0);
  }
  ASSERT_EQ(chmod((dir / "tree/file").c_str(), 0440), 0);
  ASSERT_EQ(Copy(dir / "tree", dir / "kept", 1), 0);
  ASSERT_EQ(Copy(dir / "tree", dir / "plain"), 0);
  for (const std::string name : {"", "/file"}) {
    for (const char* attribute : {"user.quarry", "system.posix_acl_access"}) {
      EXPECT_EQ(Attribute(dir / "kept" + name, attribute),
                Attribute(dir / "tree" + name, attribute));
    }
    EXPECT_EQ(Status(dir / "kept" + name).st_mode, Status(dir / "tree" + name).st_mode);
    EXPECT_EQ(Attribute(dir / "plain" + name, "user.quarry"),
              Attribute(dir / "kept" + name, "user.none"));
  }
}

TEST(FileCopyTest, WithoutAskingNewFilesAreOrdinaryOnes) {
  TempDir dir;
  MakeTree(dir / "a");
  chmod((dir / "a/file").c_str(), 06666);
  chmod((dir / "a/sub").c_str(), 0555);
  SetTime(dir / "a/file", 1000);
  const mode_t old = umask(027);
  EXPECT_EQ(Copy(dir / "a", dir / "b"), 0);
  umask(old);
  EXPECT_EQ(Status(dir / "b/file").st_mode & 07777u, 0640u);
  EXPECT_EQ(Status(dir / "b/sub").st_mode & 07777u, 0550u);
  EXPECT_GT(Status(dir / "b/file").st_mtim.tv_sec, 1000);
  EXPECT_EQ(TARNFileCopy((dir / "a").c_str(), (dir / "c").c_str(), nullptr), 0);
  ExpectTree(dir / "c");
}

TEST(FileCopyTest, RootPreservesOwners) {
  TempDir dir;
  WriteFile(dir / "a", "text");
  const uid_t owner = geteuid() == 0 ? 12345 : geteuid();
  ASSERT_EQ(lchown((dir / "a").c_str(), owner, static_cast<gid_t>(-1)), 0);
  EXPECT_EQ(Copy(dir / "a", dir / "b", 1), 0);
  EXPECT_EQ(Status(dir / "b").st_uid, owner);
}

TEST(FileCopyTest, RightsOfAnOwnerThatCannotBeKeptAreNotLent) {
  TempDir dir;
  chmod(dir.path().c_str(), 0755);
  WriteFile(dir / "a", "text");
  chmod((dir / "a").c_str(), 06755);
  test::MakeDirs(dir / "to");
  chmod((dir / "to").c_str(), 0777);
  EXPECT_EQ(test::RunInChild([&] {
              if (geteuid() != 0) return 0;
              if (setegid(65534) != 0 || seteuid(65534) != 0) return 1;
              if (Copy(dir / "a", dir / "to/b", 1) != 0) return 2;
              return (Status(dir / "to/b").st_mode & 07777u) == 0755u ? 0 : 3;
            }),
            0);
}

TEST(FileCopyTest, MovesInAndOutOfDirectoriesThatCannotBeListed) {
  TempDir dir;
  WriteFile(dir / "from/a", "text");
  test::MakeDirs(dir / "to");
  chmod((dir / "from").c_str(), 0300);
  chmod((dir / "to").c_str(), 0300);
  EXPECT_EQ(Copy(dir / "from/a", dir / "to/b", 1, 1), 0);
  EXPECT_FALSE(Exists(dir / "from/a"));
  EXPECT_EQ(ReadFile(dir / "to/b"), "text");
}

TEST(FileCopyTest, MovesByRenamingWhereItCan) {
  TempDir dir;
  MakeTree(dir / "a");
  const ino_t inode = Status(dir / "a").st_ino;
  EXPECT_EQ(Copy(dir / "a", dir / "b", 1, 1), 0);
  ExpectTree(dir / "b");
  EXPECT_EQ(Status(dir / "b").st_ino, inode);
  EXPECT_EQ(ListDir(dir.path()), Names{"b"});
  WriteFile(dir / "f", "new");
  WriteFile(dir / "g", "old");
  EXPECT_EQ(Copy(dir / "f", dir / "g", 1, 1), 0);
  EXPECT_EQ(ReadFile(dir / "g"), "new");
}

TEST(FileCopyTest, MovesByCopyingWhereItMust) {
  TempDir dir;
  MakeTree(dir / "a");
  const ino_t inode = Status(dir / "a").st_ino;
  EXPECT_TRUE(MoveByCopy(dir / "a", dir / "b", true));
  ExpectTree(dir / "b");
  EXPECT_NE(Status(dir / "b").st_ino, inode);
  EXPECT_EQ(ListDir(dir.path()), Names{"b"});
}

TEST(FileCopyTest, MovesBetweenFileSystems) {
  TempDir dir;
  std::string other = "/dev/shm/quarry-test-XXXXXX";
  // Where there is no second file system the move is an ordinary one, with the same outcome.
  if (mkdtemp(other.data()) == nullptr) other = dir / "other", test::MakeDirs(other);
  MakeTree(dir / "a");
  EXPECT_EQ(Copy(dir / "a", other + "/b", 1, 1), 0);
  ExpectTree(other + "/b");
  EXPECT_FALSE(Exists(dir / "a"));
  EXPECT_EQ(Copy(other + "/b", dir / "c", 1, 1), 0);
  ExpectTree(dir / "c");
  EXPECT_EQ(ListDir(other), Names{});
  test::RemoveTree(other);
}

TEST(FileCopyTest, FailuresLeaveTheSourceWholeAndNothingBeside) {
  TempDir dir;
  MakeTree(dir / "a");
  WriteFile(dir / "full/file", "x");
  WriteFile(dir / "plain", "x");
  for (const int move : {0, 1}) {
    EXPECT_LT(Copy(dir / "missing", dir / "b", 1, move), 0);
    EXPECT_EQ(errno, ENOENT);
    EXPECT_LT(Copy(dir / "a", dir / "no/such/place", 1, move), 0);
    EXPECT_EQ(errno, ENOENT);
    EXPECT_LT(Copy(dir / "a", dir / "full", 1, move), 0);
    EXPECT_EQ(errno, ENOTEMPTY);
    EXPECT_LT(Copy(dir / "a", dir / "plain", 1, move), 0);
    EXPECT_EQ(errno, ENOTDIR);
    EXPECT_LT(Copy(dir / "plain", dir / "full", 1, move), 0);
    EXPECT_EQ(errno, EISDIR);
    EXPECT_LT(Copy("", dir / "b", 1, move), 0);
    EXPECT_LT(Copy(dir / "a", "", 1, move), 0);
    EXPECT_EQ(errno, EINVAL);
  }
  EXPECT_FALSE(MoveByCopy(dir / "a", dir / "full", true));
  EXPECT_FALSE(MoveByCopy(dir / "missing", dir / "b", true));
  EXPECT_LT(TARNFileCopy(nullptr, "x", nullptr), 0);
  EXPECT_LT(TARNFileCopy("x", nullptr, nullptr), 0);
  ExpectTree(dir / "a");
  EXPECT_EQ(ListDir(dir.path()), (Names{"a", "full", "plain"}));
}

TEST(FileCopyTest, ADirectoryIsNotCopiedIntoItself) {
  TempDir dir;
  MakeTree(dir / "a");
  ASSERT_EQ(symlink("a/sub", (dir / "into").c_str()), 0);
  for (const int move : {0, 1}) {
    EXPECT_LT(Copy(dir / "a", dir / "a/sub/b", 0, move), 0);
    EXPECT_EQ(errno, EINVAL);
    EXPECT_LT(Copy(dir / "a", dir / "into/b", 0, move), 0);
    EXPECT_EQ(errno, EINVAL);
  }
  ExpectTree(dir / "a");
  EXPECT_EQ(Copy(dir / "a", dir / "ab"), 0);
}

TEST(FileCopyTest, AnUnreadableFileFailsTheCopy) {
  TempDir dir;
  chmod(dir.path().c_str(), 0755);
  WriteFile(dir / "a/secret", "x");
  chmod((dir / "a/secret").c_str(), 0);
  test::MakeDirs(dir / "to");
  chmod((dir / "to").c_str(), 0777);
  EXPECT_EQ(test::RunInChild([&] {
              if (geteuid() == 0 && (setegid(65534) != 0 || seteuid(65534) != 0)) return 1;
              if (Copy(dir / "a", dir / "to/b") == 0) return 2;
              return errno == EACCES && !Exists(dir / "to/b") ? 0 : 3;
            }),
            0);
  EXPECT_EQ(ListDir(dir / "to"), Names{});
}

TEST(FileCopyTest, DeepAndWideTreesNeedNoStack) {
  TempDir dir;
  std::string path = dir / "a";
  test::MakeDirs(path);
  for (int i = 0; i < 900; ++i) {
    path += "/d";
    ASSERT_EQ(mkdir(path.c_str(), 0755), 0);
  }
  WriteFile(path + "/leaf", "x");
  for (int i = 0; i < 1000; ++i) WriteFile(dir / ("a/w" + std::to_string(i)), "");
  ASSERT_EQ(Copy(dir / "a", dir / "b", 1), 0);
  EXPECT_EQ(ReadFile((dir / "b") + path.substr((dir / "a").size()) + "/leaf"), "x");
  EXPECT_EQ(ListDir(dir / "b").size(), 1001u);
  EXPECT_TRUE(RemoveTree(dir / "b"));
  EXPECT_FALSE(Exists(dir / "b"));
}

TEST(RemoveTreeTest, FollowsNoLinkAndReportsWhatIsMissing) {
  TempDir dir;
  WriteFile(dir / "keep/file", "x");
  test::MakeDirs(dir / "a");
  ASSERT_EQ(symlink((dir / "keep").c_str(), (dir / "a/link").c_str()), 0);
  EXPECT_TRUE(RemoveTree(dir / "a"));
  EXPECT_EQ(ReadFile(dir / "keep/file"), "x");
  EXPECT_FALSE(RemoveTree(dir / "a"));
  EXPECT_EQ(errno, ENOENT);
}

}  // namespace
}  // namespace quarry::platform
