#include "comm/socket_path.h"

#include <gmock/gmock.h>
#include <json/json.h>

#include <cerrno>
#include <cstdlib>
#include <string>

#include "comm/comm.h"
#include "comm/communication.h"
#include "common/error.h"
#include "common/paths.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"
#include "tests/support/root.h"

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

// Paths are fixed when a program starts, so a program of its own is started with a long root.
class LongRootTest : public fake::FakePlatformTest {
 protected:
  LongRootTest() : root_(test::TestRoot()) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    if (root_.size() > kAddressMax) return;
    const std::string long_root = root_ + "/" + std::string(kAddressMax, 'r');
    test::MakeDirs(long_root);
    setenv("QUARRY_ROOT", long_root.c_str(), 1);
    setenv("QUARRY_TEST_ROOT_OWNER", ("0:0:" + long_root).c_str(), 1);
  }
  ~LongRootTest() override {
    setenv("QUARRY_ROOT", root_.c_str(), 1);
    setenv("QUARRY_TEST_ROOT_OWNER", ("0:0:" + root_).c_str(), 1);
  }

  // Ends the program: with success when `call` throws `code` at once, and names the long path.
  template <typename Call>
  [[noreturn]] static void ExitOnRefusal(ErrorCode code, Call call) {
    try {
      call();
    } catch (const Error& error) {
      const bool told =
          error.reason().find("choose a shorter QUARRY_ROOT: " + Root()) != std::string::npos;
      std::_Exit(error.code() == code && told && fake::Sleeps().empty() ? 0 : 1);
    }
    std::_Exit(2);
  }

  static constexpr size_t kAddressMax = 107;

 private:
  const std::string root_;
};

TEST_F(LongRootTest, TheEngineIsNotAsked) {
  EXPECT_EXIT(ExitOnRefusal(kErrorEngineRequest,
                            [] {
                              Json::Value response;
                              elastic::SendRequestImpl(response, Json::Value());
                            }),
              ::testing::ExitedWithCode(0), "");
}

TEST_F(LongRootTest, TheIndexDaemonIsNotTold) {
  EXPECT_EXIT(ExitOnRefusal(kErrorSystem, [] { SendCommandToDaemon("resume", Json::Value()); }),
              ::testing::ExitedWithCode(0), "");
}

}  // namespace
}  // namespace quarry::fileindex
