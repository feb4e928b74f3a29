#include "platform/include/index_path.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "platform/include/error.h"
#include "platform/linux/last_error.h"
#include "tests/support/files.h"
#include "tests/support/root.h"

namespace quarry::platform {
namespace {

using Compose = int (*)(const char*, char*, size_t);

std::string Composed(Compose compose, const std::string& path) {
  char buffer[4096];
  return compose(path.c_str(), buffer, sizeof(buffer)) == 0 ? buffer : "failed";
}

TEST(IndexPathTest, LiesUnderTheRoot) {
  EXPECT_EQ(Composed(FILEIDXQueuePathCompose, "/volume1/photo"),
            test::TestRoot() + "/var/lib/quarry/queue/volume1+photo");
  EXPECT_EQ(Composed(FILEIDXDBPathCompose, "/volume1/photo"),
            test::TestRoot() + "/var/lib/quarry/index/volume1+photo");
}

TEST(IndexPathTest, RefusesWhatIsNoSharePath) {
  for (const Compose compose : {FILEIDXQueuePathCompose, FILEIDXDBPathCompose}) {
    for (const char* bad : {"", "/", "a", "a/b", "/a/", "/a/..", "/../a", "//a"}) {
      EXPECT_EQ(Composed(compose, bad), "failed") << bad;
      EXPECT_EQ(HLIBCErrGet(), kErrBadParameter);
    }
    char buffer[8];
    EXPECT_LT(compose(nullptr, buffer, sizeof(buffer)), 0);
  }
}

TEST(IndexPathTest, FitsOrFails) {
  for (const Compose compose : {FILEIDXQueuePathCompose, FILEIDXDBPathCompose}) {
    const std::string whole = Composed(compose, "/a");
    std::string buffer(whole.size() + 1, 'x');
    EXPECT_EQ(compose("/a", buffer.data(), buffer.size()), 0);
    EXPECT_STREQ(buffer.c_str(), whole.c_str());
    EXPECT_LT(compose("/a", buffer.data(), whole.size()), 0);
    EXPECT_EQ(HLIBCErrGet(), kErrNameTooLong);
    EXPECT_LT(compose("/a", buffer.data(), 0), 0);
    EXPECT_LT(compose("/a", nullptr, 100), 0);
  }
}

TEST(IndexPathTest, QueueNamesLeaveRoomForTheirSnapshots) {
  test::ResetTestRoot();
  const std::string queue = Composed(FILEIDXQueuePathCompose, "/" + std::string(2000, 'a'));
  test::WriteFile(queue + ".tmp", "");
  EXPECT_EQ(test::ReadFile(queue + ".tmp"), "");
}

TEST(IndexNameTest, IsThePrefixAndTheName) {
  char buffer[1024];
  EXPECT_EQ(FILEIDXGetIndexID("photo", buffer, sizeof(buffer)), 0);
  EXPECT_STREQ(buffer, "fileindex_photo");
  EXPECT_EQ(FILEIDXGetIndexID("a b\xff", buffer, sizeof(buffer)), 0);
  EXPECT_STREQ(buffer, "fileindex_a b\xff");
}

TEST(IndexNameTest, RefusesWhatIsNoName) {
  char buffer[64];
  EXPECT_LT(FILEIDXGetIndexID("", buffer, sizeof(buffer)), 0);
  EXPECT_LT(FILEIDXGetIndexID("a/b", buffer, sizeof(buffer)), 0);
  EXPECT_LT(FILEIDXGetIndexID(nullptr, buffer, sizeof(buffer)), 0);
  EXPECT_LT(FILEIDXGetIndexID("photo", buffer, sizeof("fileindex_photo") - 1), 0);
  EXPECT_EQ(FILEIDXGetIndexID("photo", buffer, sizeof("fileindex_photo")), 0);
}

}  // namespace
}  // namespace quarry::platform
