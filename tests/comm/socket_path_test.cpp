#include "comm/socket_path.h"

#include <gmock/gmock.h>

#include "tests/fake_platform/fixture.h"

namespace quarry::fileindex {
namespace {

class SocketPathTest : public fake::FakePlatformTest {};

TEST_F(SocketPathTest, TheLongestPathThatFits) {
  RequireSocketPath(QUARRY_SITE("comm"), kErrorEngineRequest, "/" + std::string(106, 'a'));
  EXPECT_THAT(fake::Logs(), ::testing::IsEmpty());
}

TEST_F(SocketPathTest, ALongerPathIsRefusedWithASentence) {
  const std::string path = "/" + std::string(107, 'a');
  const std::string sentence =
      "The socket's path is too long, choose a shorter QUARRY_ROOT: " + path;
  errno = ENOENT;
  try {
    RequireSocketPath(LogSite{"comm.cpp", 5, "Name"}, kErrorEngineRequest, path);
    FAIL();
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), 913);
    EXPECT_EQ(error.reason(), sentence);
  }
  EXPECT_THAT(fake::Logs(),
              ::testing::ElementsAre(fake::LogHead("comm", 5, "Name") +
                                     "Failed [path.size() >= sizeof(sockaddr_un::sun_path)], "
                                     "reason: " +
                                     sentence));
}

}  // namespace
}  // namespace quarry::fileindex
