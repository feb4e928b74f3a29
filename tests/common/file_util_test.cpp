#include "common/file_util.h"

#include <dirent.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "common/lock_file.h"
#include "common/sdk/share.h"
#include "platform/include/filesystem.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace fs = std::filesystem;

namespace quarry {
namespace {

using Strings = std::vector<std::string>;

class FileUtilTest : public fake::FakePlatformTest {
 protected:
  FileUtilTest() {
    test::WriteFile(file_, "text");
    test::MakeDirs(directory_);
    fs::create_symlink(file_, dir_ / "file_link");
    fs::create_symlink(directory_, dir_ / "dir_link");
    fs::create_symlink(dir_ / "none", dir_ / "dangling");
  }

  // Makes `count` links, each leading to the one before; the first leads to `target`. Returns the
  // last one.
  std::string Chain(int count, const std::string& target) {
    std::string last = target;
    for (int i = 0; i < count; ++i) {
      const std::string link = dir_ / ("chain" + std::to_string(i));
      fs::create_symlink(last, link);
      last = link;
    }
    return last;
  }

  test::TempDir dir_;
  const std::string file_ = dir_ / "file";
  const std::string directory_ = dir_ / "directory";
  const std::string nul_ = std::string("\0x", 2);
};

TEST_F(FileUtilTest, OnlyARegularFileIsAFile) {
  EXPECT_TRUE(IsFileExist(file_));
  EXPECT_FALSE(IsFileExist(directory_));
  EXPECT_FALSE(IsFileExist(dir_ / "file_link"));
  EXPECT_FALSE(IsFileExist(dir_ / "dangling"));
  EXPECT_FALSE(IsFileExist(dir_ / "none"));
  EXPECT_FALSE(IsFileExist(""));
  EXPECT_FALSE(IsFileExist("/dev/null"));
  EXPECT_FALSE(IsFileExist(file_ + "/"));
}

TEST_F(FileUtilTest, DirectoryIsADirectory) {
  for (const bool follow : {true, false}) {
    EXPECT_TRUE(IsDirExist(directory_, follow));
    EXPECT_TRUE(IsDirExist("/", follow));
    EXPECT_FALSE(IsDirExist(file_, follow));
    EXPECT_FALSE(IsDirExist(dir_ / "none", follow));
    EXPECT_FALSE(IsDirExist(dir_ / "file_link", follow));
    EXPECT_FALSE(IsDirExist(dir_ / "dangling", follow));
    EXPECT_FALSE(IsDirExist("", follow));
  }
}

TEST_F(FileUtilTest, LinkToADirectoryIsOneWhenFollowed) {
  EXPECT_FALSE(IsDirExist(dir_ / "dir_link", false));
  EXPECT_TRUE(IsDirExist(dir_ / "dir_link", true));
}

TEST_F(FileUtilTest, ChainsOfLinksAreFollowedFor40Hops) {
  const std::string chain = Chain(41, directory_);
  EXPECT_TRUE(IsDirExist(dir_ / "chain0", true));
  EXPECT_TRUE(IsDirExist(dir_ / "chain39", true));
  EXPECT_FALSE(IsDirExist(chain, true));
}

TEST_F(FileUtilTest, CyclesOfLinksEnd) {
  fs::create_symlink(dir_ / "b", dir_ / "a");
  fs::create_symlink(dir_ / "a", dir_ / "b");
  fs::create_symlink(dir_ / "self", dir_ / "self");
  EXPECT_FALSE(IsDirExist(dir_ / "a", true));
  EXPECT_FALSE(IsDirExist(dir_ / "self", true));
}

TEST_F(FileUtilTest, RelativeLinkIsTakenFromTheWorkingDirectory) {
  test::MakeDirs(dir_ / "sub");
  fs::create_symlink("directory", dir_ / "sub/link");
  const fs::path before = fs::current_path();
  fs::current_path(dir_.path());
  EXPECT_TRUE(IsDirExist(dir_ / "sub/link", true));
  fs::current_path(dir_ / "sub");
  EXPECT_FALSE(IsDirExist(dir_ / "sub/link", true));
  fs::current_path(before);
}

TEST_F(FileUtilTest, LinkThatCannotBeReadLeadsNowhere) {
  fake::FailSystemCall("readlink", 1, EACCES);
  EXPECT_FALSE(IsDirExist(dir_ / "dir_link", true));
  EXPECT_TRUE(IsDirExist(dir_ / "dir_link", true));
}

TEST_F(FileUtilTest, LongestLinkTextIsFollowed) {
  std::string target = directory_;
  while (target.size() < 4000) target += "/../directory";
  ASSERT_LT(target.size(), 4096u);
  fs::create_symlink(target, dir_ / "long");
  EXPECT_TRUE(IsDirExist(dir_ / "long", true));
}

TEST_F(FileUtilTest, EntryIsADirectoryByItsKnownTypeOnly) {
  dirent entry{};
  for (const unsigned char type : {DT_REG, DT_LNK, DT_FIFO, DT_SOCK, DT_CHR, DT_BLK, DT_UNKNOWN}) {
    entry.d_type = type;
    EXPECT_FALSE(IsDirentDir(entry, directory_)) << int{type};
    EXPECT_FALSE(IsDirentDir(entry, dir_ / "none")) << int{type};
  }
  entry.d_type = DT_DIR;
  EXPECT_TRUE(IsDirentDir(entry, directory_));
  EXPECT_TRUE(IsDirentDir(entry, file_));
}

TEST_F(FileUtilTest, AnyBitOfThePermissionIsEnough) {
  fake::SetACLPerm("/a", 5);
  EXPECT_TRUE(CheckACLPerm("/a", 4));
  EXPECT_TRUE(CheckACLPerm("/a", 6));
  EXPECT_FALSE(CheckACLPerm("/a", 2));
  EXPECT_FALSE(CheckACLPerm("/a", 0));
  EXPECT_EQ(fake::CallsOf("TARNACLPermGet")[0], "TARNACLPermGet(/a)");
}

TEST_F(FileUtilTest, UnknownPermissionIsNone) {
  fake::FailEveryCall("TARNACLPermGet", {-1});
  EXPECT_FALSE(CheckACLPerm("/a", 7));
}

TEST_F(FileUtilTest, MountPointNeedsAPositiveAnswer) {
  fake::AddMountPoint("/mnt");
  EXPECT_TRUE(IsMountPoint("/mnt"));
  EXPECT_FALSE(IsMountPoint("/mnt/a"));
  fake::FailCall("TARNFSDirIsMntPoint", 1, {-1});
  EXPECT_FALSE(IsMountPoint("/mnt"));
  fake::FailCall("TARNFSDirIsMntPoint", 1, {2});
  EXPECT_TRUE(IsMountPoint("/a"));
}

TEST(StringStartWithTest, ComparesTheBeginning) {
  EXPECT_TRUE(StringStartWith("abc", "ab"));
  EXPECT_TRUE(StringStartWith("abc", "abc"));
  EXPECT_TRUE(StringStartWith("abc", ""));
  EXPECT_TRUE(StringStartWith("", ""));
  EXPECT_FALSE(StringStartWith("abc", "abcd"));
  EXPECT_FALSE(StringStartWith("abc", "b"));
  EXPECT_FALSE(StringStartWith("", "a"));
  EXPECT_TRUE(StringStartWith(std::string("a\0b", 3), std::string("a\0", 2)));
}

TEST(BasenameTest, IsTheTextAfterTheLastSlash) {
  EXPECT_EQ(Basename("/a/b"), "b");
  EXPECT_EQ(Basename("file"), "file");
  EXPECT_EQ(Basename("dir/"), "");
  EXPECT_EQ(Basename("/"), "");
  EXPECT_EQ(Basename(""), "");
}

TEST(DirnameTest, IsTheTextBeforeTheLastSlash) {
  EXPECT_EQ(Dirname("/a/b"), "/a");
  EXPECT_EQ(Dirname("file"), "file");
  EXPECT_EQ(Dirname("/file"), "");
  EXPECT_EQ(Dirname("/"), "");
  EXPECT_EQ(Dirname("dir/"), "dir");
  EXPECT_EQ(Dirname("/a//b"), "/a/");
  EXPECT_EQ(Dirname(""), "");
}

TEST(GetFileExtensionTest, IsTheTextAfterTheLastDotOfTheName) {
  EXPECT_EQ(GetFileExtension("archive.tar.gz", false), "gz");
  EXPECT_EQ(GetFileExtension(".bashrc", false), "bashrc");
  EXPECT_EQ(GetFileExtension("name.", false), "");
  EXPECT_EQ(GetFileExtension("name", false), "");
  EXPECT_EQ(GetFileExtension("/x.d/file", false), "");
  EXPECT_EQ(GetFileExtension("/x.d/", false), "");
  EXPECT_EQ(GetFileExtension("", true), "");
}

TEST(GetFileExtensionTest, LowersAsciiLettersOnly) {
  EXPECT_EQ(GetFileExtension("/x/Photo.JPG", true), "jpg");
  EXPECT_EQ(GetFileExtension("/x/Photo.JPG", false), "JPG");
  EXPECT_EQ(GetFileExtension("a.AZ@[`{09", true), "az@[`{09");
  EXPECT_EQ(GetFileExtension("a.\xc3\x84X\xff", true), "\xc3\x84x\xff");
}

TEST_F(FileUtilTest, RealPathHasNoLinks) {
  EXPECT_EQ(RealPath(dir_ / "dir_link/../file_link"), file_);
  EXPECT_EQ(RealPath("/"), "/");
  EXPECT_EQ(RealPath(dir_ / "none"), "");
  EXPECT_EQ(RealPath(dir_ / "dangling"), "");
  EXPECT_EQ(RealPath(""), "");
}

TEST_F(FileUtilTest, UnlinkRemovesAFileOrFindsNone) {
  EXPECT_TRUE(Unlink(file_));
  EXPECT_FALSE(fs::exists(file_));
  EXPECT_TRUE(Unlink(file_));
  EXPECT_FALSE(Unlink(directory_));
  EXPECT_TRUE(fs::exists(directory_));
  EXPECT_TRUE(Unlink(dir_ / "dangling"));
  fake::FailSystemCall("unlink", 1, EACCES);
  EXPECT_FALSE(Unlink(dir_ / "file_link"));
  EXPECT_EQ(errno, EACCES);
}

TEST_F(FileUtilTest, CopyGoesThroughThePlatform) {
  TARNCOPYARGS args{};
  EXPECT_TRUE(MVFileImpl("/none/a", "/none/b", &args));
  EXPECT_TRUE(CPFile("/none/a", "/none/b"));
  EXPECT_TRUE(MVFile("/none/a", "/none/b"));
  EXPECT_EQ(fake::Calls(), Strings({"TARNFileCopy(/none/a, /none/b, preserve=0, move=0)",
                                    "TARNFileCopy(/none/a, /none/b, preserve=1, move=0)",
                                    "TARNFileCopy(/none/a, /none/b, preserve=1, move=1)"}));
}

TEST_F(FileUtilTest, CopySucceedsOnlyWithTheResultZero) {
  for (const int result : {-1, 1, 7}) {
    fake::FailCall("TARNFileCopy", 1, {result, ENOSPC});
    EXPECT_FALSE(CPFile(file_, dir_ / "copy")) << result;
    EXPECT_EQ(errno, ENOSPC);
    fake::FailCall("TARNFileCopy", 1, {result});
    EXPECT_FALSE(MVFile(file_, dir_ / "copy")) << result;
  }
}

TEST_F(FileUtilTest, CopyKeepsTheSourceAndMoveDoesNot) {
  EXPECT_TRUE(CPFile(file_, dir_ / "copy"));
  EXPECT_TRUE(fs::exists(file_));
  EXPECT_EQ(test::ReadFile(dir_ / "copy"), "text");
  EXPECT_TRUE(MVFile(file_, dir_ / "moved"));
  EXPECT_FALSE(fs::exists(file_));
}

TEST_F(FileUtilTest, PathsWithNulBytesAreRefused) {
  EXPECT_FALSE(IsFileExist(file_ + nul_));
  EXPECT_FALSE(IsDirExist(directory_ + nul_, true));
  EXPECT_FALSE(IsDirExist(directory_ + nul_, false));
  EXPECT_FALSE(CheckACLPerm(file_ + nul_, 7));
  fake::AddMountPoint(directory_);
  EXPECT_FALSE(IsMountPoint(directory_ + nul_));
  EXPECT_EQ(RealPath(file_ + nul_), "");
  EXPECT_FALSE(Unlink(file_ + nul_));
  EXPECT_EQ(errno, EINVAL);
  EXPECT_TRUE(fs::exists(file_));
  EXPECT_FALSE(CPFile(file_ + nul_, dir_ / "copy"));
  EXPECT_FALSE(MVFile(file_, dir_ / "copy" + nul_));
  EXPECT_FALSE(ChownQuarry(file_ + nul_));
  EXPECT_TRUE(fake::CallsOf("TARNFileCopy").empty());
  EXPECT_EQ(fake::SystemCallCount("chown"), 0);
}

TEST_F(FileUtilTest, HelpersLogNothing) {
  fake::FailEveryCall("TARNFileCopy");
  IsFileExist(dir_ / "none");
  IsDirExist(dir_ / "none", true);
  RealPath(dir_ / "none");
  Unlink(directory_);
  CPFile(file_, dir_ / "copy");
  EXPECT_TRUE(fake::Logs().empty());
}

// ---- ChownQuarry

TEST_F(FileUtilTest, PathIsGivenToTheServiceAccount) {
  fake::AddUser({"Quarry", geteuid(), getegid(), false});
  EXPECT_TRUE(ChownQuarry(file_));
  EXPECT_EQ(fake::Calls(), Strings({"TARNUserGet(Quarry)", "TARNUserFree(Quarry)"}));
  EXPECT_EQ(fake::SystemCallCount("chown"), 1);
}

TEST_F(FileUtilTest, LinkIsFollowedAndModesAreKept) {
  if (geteuid() != 0) {
    // The only owner that an ordinary user can give is the present one.
    EXPECT_TRUE(ChownQuarry(dir_ / "file_link"));
    return;
  }
  fake::AddUser({"Quarry", 1234, 4321, false});
  ASSERT_EQ(chmod(file_.c_str(), 0640), 0);
  EXPECT_TRUE(ChownQuarry(dir_ / "file_link"));
  struct stat info {};
  ASSERT_EQ(stat(file_.c_str(), &info), 0);
  EXPECT_EQ(info.st_uid, 1234u);
  EXPECT_EQ(info.st_gid, 4321u);
  EXPECT_EQ(test::FileMode(file_), 0640u);
  ASSERT_EQ(lstat((dir_ / "file_link").c_str(), &info), 0);
  EXPECT_NE(info.st_uid, 1234u);
}

TEST_F(FileUtilTest, FailedChangeOfOwnerIsFalse) {
  fake::FailSystemCall("chown", 1, EPERM);
  EXPECT_FALSE(ChownQuarry(file_));
  EXPECT_EQ(errno, EPERM);
  EXPECT_FALSE(ChownQuarry(dir_ / "none"));
  EXPECT_TRUE(fake::Logs().empty());
}

TEST_F(FileUtilTest, MissingServiceAccountIsAnError) {
  fake::RemoveUser("Quarry");
  try {
    ChownQuarry(file_);
    FAIL() << "nothing was thrown";
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), 801);
    EXPECT_EQ(error.reason(), "");
  }
  EXPECT_TRUE(fake::Logs().empty());
  EXPECT_TRUE(sdk::SDKMutex().TryLock());
  sdk::SDKMutex().Unlock();
  EXPECT_EQ(fake::SystemCallCount("chown"), 0);
}

TEST_F(FileUtilTest, SuccessWithoutAnAccountIsAnErrorToo) {
  fake::Failure nobody;
  nobody.result = 0;
  fake::FailCall("TARNUserGet", 1, nobody);
  try {
    ChownQuarry(file_);
    FAIL() << "nothing was thrown";
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), 801);
    EXPECT_EQ(error.reason(), "");
  }
  EXPECT_EQ(fake::SystemCallCount("chown"), 0);
}

TEST_F(FileUtilTest, AccountIsLookedUpUnderTheLockAndTheOwnerChangedWithoutIt) {
  auto is_free = [] {
    bool locked = false;
    std::thread([&locked] {
      locked = sdk::SDKMutex().TryLock();
      if (locked) sdk::SDKMutex().Unlock();
    }).join();
    return locked;
  };
  int calls = 0;
  fake::OnCall([&](const std::string& function) {
    EXPECT_FALSE(is_free()) << function;
    ++calls;
  });
  fake::OnSystemCall("chown", [&] { EXPECT_TRUE(is_free()); });
  EXPECT_TRUE(ChownQuarry(file_));
  EXPECT_EQ(calls, 2);
}

}  // namespace
}  // namespace quarry
