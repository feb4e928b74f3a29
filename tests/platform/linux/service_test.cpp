#include "platform/include/service.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "common/json.h"
#include "platform/include/error.h"
#include "platform/linux/last_error.h"
#include "tests/platform/linux/fake_daemon.h"
#include "tests/support/root.h"

namespace quarry::platform {
namespace {

using test::FakeDaemon;
using Requests = std::vector<std::string>;

// A private system, with a supervisor that answers everything in the same way.
class ServiceTest : public ::testing::Test {
 protected:
  ServiceTest() { test::ResetTestRoot(); }

  static std::string SocketPath() { return test::TestRoot() + "/var/run/quarry.sock"; }
  static FakeDaemon::Answer Always(const std::string& reply) {
    return [reply](const std::string&) { return FakeDaemon::Frame(reply); };
  }
};

TEST_F(ServiceTest, APrivateSystemHasItsSupervisor) {
  FakeDaemon supervisor(SocketPath(), Always("{\"success\":true,\"data\":{}}"));
  EXPECT_EQ(HLIBServiceStart("tarncontentextractd", 1), 0);
  EXPECT_EQ(HLIBServiceStart("tarncontentextractd", 0), 0);
  EXPECT_EQ(HLIBServiceStop("tarncontentextractd", 0), 0);
  EXPECT_EQ(HLIBServiceStop("tarncontentextractd", 1), 0);
  EXPECT_EQ(HLIBServicectlStart("pkg-Quarry-fileindexd", HLIB_SERVICECTL_UPSTART), 0);
  EXPECT_EQ(HLIBServicectlStop("pkg-Quarry-fileindexd", HLIB_SERVICECTL_UPSTART), 0);
  EXPECT_EQ(HLIBServiceRestart("tarnelasticd"), 0);
  const std::string extractor = "\"data\":{\"service\":\"tarncontentextractd\"}}";
  EXPECT_EQ(supervisor.Requests(),
            (Requests{"{\"command\":\"start\"," + extractor, "{\"command\":\"start\"," + extractor,
                      "{\"command\":\"stop\"," + extractor,
                      "{\"command\":\"stop\",\"data\":{\"force\":true,\"service\":"
                      "\"tarncontentextractd\"}}",
                      "{\"command\":\"start\",\"data\":{\"service\":\"fileindexd\"}}",
                      "{\"command\":\"stop\",\"data\":{\"service\":\"fileindexd\"}}",
                      "{\"command\":\"stop\",\"data\":{\"service\":\"tarnelasticd\"}}",
                      "{\"command\":\"start\",\"data\":{\"service\":\"tarnelasticd\"}}"}));
}

TEST_F(ServiceTest, FailsWithoutASupervisor) {
  EXPECT_LT(HLIBServiceStart("tarncontentextractd", 1), 0);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_EQ(HLIBCErrGet(), kErrService);
  EXPECT_LT(HLIBServiceStop("tarncontentextractd", 0), 0);
  EXPECT_LT(HLIBServiceRestart("tarncontentextractd"), 0);
  EXPECT_LT(HLIBServicectlStart("pkg-Quarry-fileindexd", HLIB_SERVICECTL_UPSTART), 0);
}

TEST_F(ServiceTest, FailsWhenTheSupervisorRefusesOrTalksNonsense) {
  for (const char* reply : {"{\"success\":false,\"error\":{\"code\":1,\"msg\":\"no\"}}", "{}", "[]",
                            "null", "{\"success\":\"true\"}", "nonsense", ""}) {
    FakeDaemon supervisor(SocketPath(), Always(reply));
    EXPECT_LT(HLIBServiceStart("fileindexd", 1), 0) << reply;
    EXPECT_EQ(HLIBCErrGet(), kErrService);
  }
  FakeDaemon silent(SocketPath(), [](const std::string&) { return std::string(); });
  EXPECT_LT(HLIBServiceStart("fileindexd", 1), 0);
}

TEST_F(ServiceTest, RefusesNamesThatNoServiceHas) {
  FakeDaemon supervisor(SocketPath(), Always("{\"success\":true}"));
  for (const char* name : {"", "-rf", "a b", "a;b", "../x", "a\nb"}) {
    EXPECT_LT(HLIBServiceStart(name, 1), 0) << name;
    EXPECT_LT(HLIBServiceStop(name, 0), 0);
    EXPECT_LT(HLIBServiceRestart(name), 0);
  }
  EXPECT_LT(HLIBServiceStart(nullptr, 1), 0);
  EXPECT_LT(HLIBServicectlStart(nullptr, HLIB_SERVICECTL_UPSTART), 0);
  EXPECT_LT(HLIBServicectlStart("pkg-Quarry-fileindexd", 2), 0);
  EXPECT_LT(HLIBServicectlStop("pkg-Quarry-fileindexd", 2), 0);
  EXPECT_EQ(HLIBCErrGet(), kErrBadParameter);
  EXPECT_EQ(supervisor.Requests(), Requests{});
}

TEST_F(ServiceTest, APrivateSystemLeavesFileSharingAlone) {
  FakeDaemon supervisor(SocketPath(), Always("{\"success\":true}"));
  EXPECT_EQ(HLIBServiceRestart("samba"), 0);
  EXPECT_EQ(supervisor.Requests(), Requests{});
}

TEST_F(ServiceTest, ARestartEndsWithAStopThatFails) {
  FakeDaemon supervisor(SocketPath(), Always("{\"success\":false}"));
  EXPECT_LT(HLIBServiceRestart("tarnelasticd"), 0);
  EXPECT_EQ(errno, EREMOTEIO);
  EXPECT_EQ(supervisor.Requests().size(), 1u);
}

}  // namespace
}  // namespace quarry::platform
