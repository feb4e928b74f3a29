#include "fileindex/util/util.h"

#include <gmock/gmock.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/lock_file.h"
#include "common/sdk/share.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"
#include "tests/support/thrown.h"

namespace quarry::fileindex {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;
using namespace std::string_literals;
using test::Thrown;

// Shares really exist below a temporary directory, as volume1/photo and so on.
class UtilTest : public fake::FakePlatformTest {
 protected:
  UtilTest() : volume_(dir_ / "volume1") {
    AddShare("photo");
    errno = 0;
  }

  std::string AddShare(const std::string& name) {
    const std::string path = volume_ + "/" + name;
    test::MakeDirs(path);
    fake::AddShare(name, path);
    return path;
  }

  std::string Photo(const std::string& inner = "") const { return volume_ + "/photo" + inner; }

  test::TempDir dir_;
  std::string volume_;
};

// ---- Share paths

TEST_F(UtilTest, ShareNameIsTheFirstComponent) {
  const struct {
    std::string path;
    std::string name;
  } cases[] = {{"/photo", "photo"}, {"/photo/2019", "photo"}, {"/photo/", "photo"},  {"/", ""},
               {"//x", ""},         {"/a b/ä/c", "a b"},      {"/photo//x", "photo"}};
  for (const auto& one : cases) {
    EXPECT_EQ(GetShareNameByPath(one.path), one.name) << one.path;
    std::string name = "before";
    GetShareNameByPath(name, one.path);
    EXPECT_EQ(name, one.name) << one.path;
  }
}

TEST_F(UtilTest, ShareNameNeedsALeadingSlash) {
  for (const std::string path : {"", "photo", "photo/2019"}) {
    fake::ClearLogs();
    std::string name = "before";
    const Error error = Thrown([&] { GetShareNameByPath(name, path); });
    EXPECT_EQ(error.code(), 120);
    EXPECT_EQ(error.reason(), path);
    EXPECT_EQ(name, "before");
    EXPECT_THAT(
        fake::Logs(),
        ElementsAre(fake::LogHead("util", 800, "GetShareNameByPath") +
                    "Failed [1 > share_path.size() || '/' != share_path.at(0)], reason: " + path));
  }
  EXPECT_EQ(Thrown([] { GetShareNameByPath("photo"); }).code(), 120);
}

TEST_F(UtilTest, ShareNameFailureIsLoggedWithErrno) {
  errno = ENOENT;
  Thrown([] { GetShareNameByPath("photo"); });
  EXPECT_THAT(fake::Logs(),
              ElementsAre(fake::LogHead("util", 800, "GetShareNameByPath") +
                          "Failed [1 > share_path.size() || '/' != share_path.at(0)], reason: "
                          "photo [err: No such file or directory]"));
  EXPECT_EQ(errno, 0);
}

TEST_F(UtilTest, PathsWithNulBytesAreRefused) {
  EXPECT_EQ(Thrown([] { GetShareNameByPath("/photo\0x"s); }).code(), 120);
  EXPECT_EQ(Thrown([] { GetFullPath("/photo/a\0b"s); }).code(), 120);
  std::string name;
  std::string path;
  EXPECT_EQ(Thrown([&] { GetShareNamePathByFullPath(name, path, Photo("/a\0b"s)); }).code(), 502);
  EXPECT_FALSE(CanFullPathBeIndexed(Photo("\0"s)));
  EXPECT_THAT(fake::CallsOf("TARNShareNamePathGet"), IsEmpty());
}

TEST_F(UtilTest, FullPathIsTheVolumeAndTheSharePath) {
  fake::AddShare("music", "/volume9/music");
  fake::AddShare("top", "/top");
  EXPECT_EQ(GetFullPath("/music"), "/volume9/music");
  EXPECT_EQ(GetFullPath("/music/2019"), "/volume9/music/2019");
  EXPECT_EQ(GetFullPath("/music/a//b/"), "/volume9/music/a//b/");
  EXPECT_EQ(GetFullPath("/top/x"), "/top/x");
  std::string full = "before";
  GetFullPath(full, "/music/x");
  EXPECT_EQ(full, "/volume9/music/x");
}

TEST_F(UtilTest, FullPathFailuresPassThrough) {
  std::string full = "before";
  EXPECT_EQ(Thrown([&] { GetFullPath(full, "photo"); }).code(), 120);
  EXPECT_EQ(Thrown([&] { GetFullPath(full, "/nobody/x"); }).code(), 800);
  EXPECT_EQ(full, "before");
}

TEST_F(UtilTest, ShareOfAFullPath) {
  std::string name;
  std::string path;
  GetShareNamePathByFullPath(name, path, Photo("/2019/a.jpg"));
  EXPECT_EQ(name, "photo");
  EXPECT_EQ(path, Photo());
  GetShareNamePathByFullPath(name, path, Photo());
  EXPECT_EQ(path, Photo());
}

TEST_F(UtilTest, ShareOfAPathOutside) {
  std::string name = "n";
  std::string path = "p";
  const Error error = Thrown([&] { GetShareNamePathByFullPath(name, path, "/elsewhere/x"); });
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), "TARNShareNamePathGet failed, full_path=/elsewhere/x");
  EXPECT_EQ(name + path, "np");
  EXPECT_THAT(fake::Logs(),
              ElementsAre(fake::LogHead("util", 789, "GetShareNamePathByFullPath") +
                          "Failed [0 > TARNShareNamePathGet(full_path.c_str(), szShareName, "
                          "sizeof(szShareName), szSharePath, sizeof(szSharePath))], reason: "
                          "TARNShareNamePathGet failed, full_path=/elsewhere/x"));
  // The platform's lock is free again.
  EXPECT_TRUE(sdk::SDKMutex().TryLock());
  sdk::SDKMutex().Unlock();
}

TEST_F(UtilTest, ShareNamesAndPathsOfAnyLengthThatFits) {
  const std::string longest_name(491, 'n');
  const std::string longest_path = "/" + std::string(4094, 'p');
  std::string name;
  std::string path;
  fake::AddShare(longest_name, longest_path);
  GetShareNamePathByFullPath(name, path, longest_path + "/a");
  EXPECT_EQ(name, longest_name);
  EXPECT_EQ(path, longest_path);
  fake::AddShare(longest_name + "n", "/volume2/x");
  EXPECT_EQ(Thrown([&] { GetShareNamePathByFullPath(name, path, "/volume2/x"); }).code(), 502);
  fake::AddShare("y", longest_path + "p");
  EXPECT_EQ(Thrown([&] { GetShareNamePathByFullPath(name, path, longest_path + "p"); }).code(),
            502);
}

// ---- Text of paths

TEST_F(UtilTest, HelpersOfPathsAreOneDefinition) {
  EXPECT_EQ(&fileindex::StringStartWith, &quarry::StringStartWith);
  EXPECT_EQ(&fileindex::Basename, &quarry::Basename);
  EXPECT_EQ(&fileindex::Dirname, &quarry::Dirname);
}

TEST_F(UtilTest, ReplacePathShare) {
  EXPECT_EQ(ReplacePathShare("/old/x", "new", "old"), "/new/x");
  EXPECT_EQ(ReplacePathShare("/volume1/old/x", "new", "old"), "/volume1/new/x");
  EXPECT_EQ(ReplacePathShare("/volume1/old", "new", "old"), "/volume1/new");
  EXPECT_EQ(ReplacePathShare("/volume1/old/", "new", "old"), "/volume1/new/");
  EXPECT_EQ(ReplacePathShare("/volume1/a/b", "c", "a"), "/volume1/c/b");
  EXPECT_EQ(ReplacePathShare("/old/old/x", "new", "old"), "/new/old/x");
  EXPECT_EQ(ReplacePathShare("/older/old/x", "n", "old"), "/older/n/x");
  EXPECT_EQ(ReplacePathShare("/old", "much longer", "old"), "/much longer");
}

TEST_F(UtilTest, ReplacePathShareNeedsTheShare) {
  for (const std::string path : {"/volume1/ab/x", "", "a", "/ba", "a/b"}) {
    fake::ClearLogs();
    const Error error = Thrown([&] { ReplacePathShare(path, "c", "a"); });
    EXPECT_EQ(error.code(), 120);
    EXPECT_EQ(error.reason(), "Cannot find share: a");
    EXPECT_THAT(fake::Logs(), ElementsAre(fake::LogHead("util", 993, "ReplacePathShare") +
                                          "Failed [string::npos == pos], reason: Cannot find "
                                          "share: a"));
  }
}

TEST_F(UtilTest, PreservedNames) {
  fake::AddHiddenDirName("@meta");
  for (const char* name : {".TemporaryItems", ".TARNPPSDB", ".DS_Store", "@meta"}) {
    EXPECT_TRUE(IsSystemPreservedFileName(name)) << name;
  }
  for (const char* name : {".DS_Store2", ".ds_store", "DS_Store", "", "a", "x/.DS_Store"}) {
    EXPECT_FALSE(IsSystemPreservedFileName(name)) << name;
  }
  fake::FailCall("TARNEAIsHiddenDir", 1, {2});
  EXPECT_FALSE(IsSystemPreservedFileName("@meta"));
  fake::FailEveryCall("TARNEAIsHiddenDir");
  EXPECT_FALSE(IsSystemPreservedFileName("@meta"));
  EXPECT_TRUE(IsSystemPreservedFileName(".DS_Store"));
}

// ---- Recycle bins

TEST_F(UtilTest, RecycleBinOfAShare) {
  fake::AddShareRecycle(Photo("/#recycle"));
  EXPECT_TRUE(IsFullPathInRecycleBin(Photo("/#recycle/a")));
  EXPECT_TRUE(IsFullPathInRecycleBin(Photo("/#recycle")));
  EXPECT_FALSE(IsFullPathInRecycleBin(Photo("/a")));
}

TEST_F(UtilTest, ThePlatformDecidesWhatIsARecycleBin) {
  EXPECT_FALSE(IsFullPathInRecycleBin(Photo("/sub/#recycle")));
  EXPECT_THAT(fake::CallsOf("TARNShareIsShareRecycle"), SizeIs(1));
  fake::FailCall("TARNShareIsShareRecycle");
  EXPECT_FALSE(IsFullPathInRecycleBin(Photo("/#recycle")));
}

TEST_F(UtilTest, ThePlatformIsAskedOnlyWhereTheNameSuggestsABin) {
  fake::AddShareRecycle(Photo("/bin"));
  EXPECT_FALSE(IsFullPathInRecycleBin(Photo("/bin/a")));
  EXPECT_THAT(fake::CallsOf("TARNShareIsShareRecycle"), IsEmpty());
  EXPECT_THAT(fake::CallsOf("TARNRecycleUserHomePathIsExist"), IsEmpty());
}

TEST_F(UtilTest, RecycleBinOfAHome) {
  const std::string homes = AddShare("homes");
  fake::AddHomeRecycle(homes + "/tester/bin");
  fake::AddHomeRecycle(Photo("/tester/bin"));
  fake::AddHomeRecycle(AddShare("homes2") + "/tester/bin");
  EXPECT_TRUE(IsFullPathInRecycleBin(homes + "/tester/bin/a"));
  EXPECT_FALSE(IsFullPathInRecycleBin(homes + "/tester/a"));
  EXPECT_FALSE(IsFullPathInRecycleBin(Photo("/tester/bin/a")));
  EXPECT_FALSE(IsFullPathInRecycleBin(volume_ + "/homes2/tester/bin/a"));
  EXPECT_THAT(fake::CallsOf("TARNRecycleUserHomePathIsExist"),
              ElementsAre("TARNRecycleUserHomePathIsExist(" + homes + "/tester/bin/a, 11)",
                          "TARNRecycleUserHomePathIsExist(" + homes + "/tester/a, 11)"));
  fake::FailCall("TARNRecycleUserHomePathIsExist");
  EXPECT_FALSE(IsFullPathInRecycleBin(homes + "/tester/bin/a"));
}

TEST_F(UtilTest, RecycleBinOutsideEveryShare) {
  EXPECT_EQ(Thrown([] { IsFullPathInRecycleBin("/elsewhere/#recycle"); }).code(), 502);
}

// ---- What may be indexed

TEST_F(UtilTest, AnOrdinaryFolderMayBeIndexed) {
  test::MakeDirs(Photo("/2019"));
  EXPECT_TRUE(CanFullPathBeIndexed(Photo()));
  EXPECT_TRUE(CanFullPathBeIndexed(Photo("/2019")));
  EXPECT_TRUE(CanPathBeIndexed("/photo"));
  EXPECT_TRUE(CanPathBeIndexed("/photo/2019"));
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(UtilTest, SnapshotsMayNot) {
  const std::string path = Photo("/#snapshot");
  test::MakeDirs(path);
  EXPECT_TRUE(CanFullPathBeIndexed(path)) << "a folder that is merely called so";
  fake::AddSnapshot(path);
  EXPECT_FALSE(CanFullPathBeIndexed(path));
  fake::FailCall("HLIBFhsPathInSnapshot");
  EXPECT_TRUE(CanFullPathBeIndexed(path)) << "a failing call decides nothing";
}

TEST_F(UtilTest, ThePlatformIsAskedOnlyWhereTheNameSuggestsASnapshot) {
  fake::AddSnapshot(Photo());
  EXPECT_TRUE(CanFullPathBeIndexed(Photo()));
  EXPECT_THAT(fake::CallsOf("HLIBFhsPathInSnapshot"), IsEmpty());
}

TEST_F(UtilTest, UnknownFileSystemsMayNot) {
  fake::FailCall("TARNGetFSType");
  EXPECT_FALSE(CanFullPathBeIndexed(Photo()));
  EXPECT_THAT(fake::CallsOf("TARNGetFSType"), ElementsAre("TARNGetFSType(" + Photo() + ", 0)"));
}

TEST_F(UtilTest, RemoteImageAndType12FileSystemsMayNot) {
  fake::SetRemoteFSType(20);
  fake::SetImageFSType(21);
  for (const int type : {20, 21, 12}) {
    fake::SetFSType(Photo(), type);
    EXPECT_FALSE(CanFullPathBeIndexed(Photo())) << type;
  }
  for (const int type : {0, 1, 11, 13}) {
    fake::SetFSType(Photo(), type);
    EXPECT_TRUE(CanFullPathBeIndexed(Photo())) << type;
  }
}

TEST_F(UtilTest, EncryptedAndReadOnlySharesMayNot) {
  fake::AddShare({.name = "photo", .path = Photo(), .encrypted = true});
  EXPECT_FALSE(CanFullPathBeIndexed(Photo()));
  fake::AddShare({.name = "photo", .path = Photo(), .read_only = true});
  EXPECT_FALSE(CanFullPathBeIndexed(Photo()));
}

TEST_F(UtilTest, AFailingShareQueryIsThrown) {
  fake::FailCall("HLIBShareIsReadOnlyGet");
  EXPECT_EQ(Thrown([&] { CanFullPathBeIndexed(Photo()); }).code(), 502);
  fake::FailCall("TARNShareGet");
  EXPECT_EQ(Thrown([&] { CanFullPathBeIndexed(Photo()); }).code(), 800);
}

TEST_F(UtilTest, APathOutsideEveryShareThrows) {
  EXPECT_EQ(Thrown([&] { CanFullPathBeIndexed(dir_.path()); }).code(), 502);
  EXPECT_EQ(Thrown([] { CanPathBeIndexed("/nobody"); }).code(), 800);
  EXPECT_EQ(Thrown([] { CanPathBeIndexed("photo"); }).code(), 120);
}

TEST_F(UtilTest, TheFileSystemIsAskedBeforeTheShare) {
  fake::SetFSType("/", 12);
  EXPECT_FALSE(CanFullPathBeIndexed("/outside every share"));
}

// Each test in turn is the first that fails, and all that come later would fail too.
TEST_F(UtilTest, TestsAreMadeInOrderAndTheFirstThatFailsEndsThem) {
  const std::string path = Photo("/#snapshot/#recycle");  // missing, so not canonical
  fake::SetRemoteFSType(20);
  fake::SetImageFSType(20);
  fake::SetFSType(Photo(), 20);
  fake::AddSnapshot(path);
  fake::AddShareRecycle(path);
  fake::AddMountPoint(path);
  fake::AddShare({.name = "photo", .path = Photo(), .encrypted = true});
  std::vector<std::string> asked;
  fake::OnCall([&asked](const std::string& function) { asked.push_back(function); });
  const auto last_asked = [&](const std::string& to_pass, int result) {
    if (!to_pass.empty()) fake::FailEveryCall(to_pass, {result});
    asked.clear();
    EXPECT_FALSE(CanFullPathBeIndexed(path));
    if (asked.back() == "TARNShareFree") asked.pop_back();
    return asked.back();
  };
  EXPECT_EQ(last_asked("", 0), "HLIBFhsPathInSnapshot");
  fake::FailCall("TARNGetFSType");
  EXPECT_EQ(last_asked("HLIBFhsPathInSnapshot", -1), "TARNGetFSType");
  EXPECT_EQ(last_asked("", 0), "TARNFSIsRemoteFS");
  EXPECT_EQ(last_asked("TARNFSIsRemoteFS", 0), "TARNFSIsImageFS");
  fake::SetFSType(Photo(), 12);
  EXPECT_EQ(last_asked("TARNFSIsImageFS", 0), "TARNFSIsImageFS");
  fake::SetFSType(Photo(), 20);
  EXPECT_EQ(last_asked("", 0), "HLIBShareIsReadOnlyGet");
  fake::AddShare({.name = "photo", .path = Photo()});
  EXPECT_EQ(last_asked("", 0), "TARNShareIsShareRecycle");
  EXPECT_EQ(last_asked("TARNShareIsShareRecycle", 0), "HLIBShareIsEncryptionGet");
  // What is left is that the path does not exist.
  EXPECT_EQ(last_asked("TARNFSDirIsMntPoint", 0), "TARNFSDirIsMntPoint");
  test::MakeDirs(path);
  EXPECT_TRUE(CanFullPathBeIndexed(path));
}

TEST_F(UtilTest, RecycleBinsMayNot) {
  test::MakeDirs(Photo("/#recycle"));
  EXPECT_TRUE(CanFullPathBeIndexed(Photo("/#recycle")));
  fake::AddShareRecycle(Photo("/#recycle"));
  EXPECT_FALSE(CanFullPathBeIndexed(Photo("/#recycle")));
}

TEST_F(UtilTest, ForeignMountPointsMayNot) {
  test::MakeDirs(Photo("/usb"));
  fake::AddMountPoint(Photo("/usb"));
  EXPECT_FALSE(CanFullPathBeIndexed(Photo("/usb")));
}

TEST_F(UtilTest, TheTopOfAnEncryptionShareMay) {
  fake::AddMountPoint(Photo());
  EXPECT_FALSE(CanFullPathBeIndexed(Photo()));
  fake::AddShare({.name = "photo", .path = Photo(), .encryption = true});
  EXPECT_TRUE(CanFullPathBeIndexed(Photo()));
  fake::FailCall("HLIBShareIsEncryptionGet");
  EXPECT_EQ(Thrown([&] { CanFullPathBeIndexed(Photo()); }).code(), 502);
}

TEST_F(UtilTest, OnlyTheAnswerOneTellsAMountPoint) {
  for (const int answer : {-1, 0, 2}) {
    fake::FailCall("TARNFSDirIsMntPoint", 1, {answer});
    EXPECT_TRUE(CanFullPathBeIndexed(Photo())) << answer;
  }
}

TEST_F(UtilTest, OnlyCanonicalPathsMay) {
  test::MakeDirs(Photo("/a/b"));
  ASSERT_EQ(symlink("a", Photo("/link").c_str()), 0);
  for (const char* inner :
       {"/", "/a/", "//a", "/a/.", "/a/../a", "/link", "/link/b", "/missing", "/a/b/."}) {
    EXPECT_FALSE(CanFullPathBeIndexed(Photo(inner))) << inner;
  }
  EXPECT_TRUE(CanFullPathBeIndexed(Photo("/a/b")));
  EXPECT_FALSE(CanFullPathBeIndexed(Photo("/" + std::string(5000, 'x'))));
  EXPECT_FALSE(CanPathBeIndexed("/photo/"));
}

TEST_F(UtilTest, AFileIsAsGoodAsADirectory) {
  test::WriteFile(Photo("/file"), "");
  EXPECT_TRUE(CanFullPathBeIndexed(Photo("/file")));
}

}  // namespace
}  // namespace quarry::fileindex
