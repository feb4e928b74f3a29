// What each answer of the platform means where a place is judged, the unusual ones included.

#include <gtest/gtest.h>

#include <string>

#include "common/error.h"
#include "fileindex/util/util.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::fileindex {
namespace {

class PlatformAnswersTest : public fake::FakePlatformTest {
 protected:
  PlatformAnswersTest() {
    for (const char* share : {"photo", "homes"}) {
      test::MakeDirs(dir_ / (std::string(share) + "/#recycle"));
      test::MakeDirs(dir_ / (std::string(share) + "/#snapshot"));
      fake::AddShare(share, dir_ / share);
    }
  }

  // Whether the place may be indexed when `function` gives this answer.
  bool MayBeIndexed(const std::string& place, const std::string& function, int answer) const {
    fake::FailCall(function, 1, {answer, 0, 0});
    return CanFullPathBeIndexed(dir_ / place);
  }
  bool IsInBin(const std::string& place, const std::string& function, int answer) const {
    fake::FailCall(function, 1, {answer, 0, 0});
    return IsFullPathInRecycleBin(dir_ / place);
  }

  test::TempDir dir_;
};

TEST_F(PlatformAnswersTest, OnlyZeroSaysThatAFileSystemIsNeitherRemoteNorAnImage) {
  for (const char* function : {"TARNFSIsRemoteFS", "TARNFSIsImageFS"}) {
    for (const int answer : {-1, 1, 2}) {
      EXPECT_FALSE(MayBeIndexed("photo", function, answer)) << function << " " << answer;
    }
    EXPECT_TRUE(MayBeIndexed("photo", function, 0)) << function;
  }
}

TEST_F(PlatformAnswersTest, NoNegativeTypeIsAFileSystem) {
  for (const int answer : {-1, -12}) {
    EXPECT_FALSE(MayBeIndexed("photo", "TARNGetFSType", answer)) << answer;
  }
}

TEST_F(PlatformAnswersTest, OnlyOneSaysThatThereIsARecycleBin) {
  for (const int answer : {-1, 0, 2}) {
    EXPECT_FALSE(IsInBin("photo/#recycle", "TARNShareIsShareRecycle", answer)) << answer;
    EXPECT_FALSE(IsInBin("homes/x", "TARNRecycleUserHomePathIsExist", answer)) << answer;
  }
  EXPECT_TRUE(IsInBin("photo/#recycle", "TARNShareIsShareRecycle", 1));
  EXPECT_TRUE(IsInBin("homes/x", "TARNRecycleUserHomePathIsExist", 1));
}

TEST_F(PlatformAnswersTest, AHomesBinIsAskedForOnlyWhereTheSharesIsNone) {
  fake::AddShareRecycle(dir_ / "homes/#recycle");
  EXPECT_TRUE(IsFullPathInRecycleBin(dir_ / "homes/#recycle"));
  EXPECT_TRUE(fake::CallsOf("TARNRecycleUserHomePathIsExist").empty());
}

TEST_F(PlatformAnswersTest, TheQuestionAboutSnapshotsDecidesOnlyWhenItSucceeds) {
  fake::AddSnapshot(dir_ / "photo/#snapshot");
  EXPECT_FALSE(CanFullPathBeIndexed(dir_ / "photo/#snapshot"));
  for (const int answer : {-1, 1}) {
    EXPECT_TRUE(MayBeIndexed("photo/#snapshot", "HLIBFhsPathInSnapshot", answer)) << answer;
  }
}

// A mount point that is not there either: were the path looked at first, nobody would be asked.
TEST_F(PlatformAnswersTest, MountPointsAreJudgedBeforeTheFormOfThePath) {
  fake::AddMountPoint(dir_ / "photo/gone");
  fake::FailCall("HLIBShareIsEncryptionGet");
  try {
    CanFullPathBeIndexed(dir_ / "photo/gone");
    FAIL();
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), 502);
  }
}

}  // namespace
}  // namespace quarry::fileindex
