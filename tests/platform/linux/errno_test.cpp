// A call that succeeds leaves errno as it was, whatever failed on its way: callers log errno with
// the next failure.

#include <unistd.h>

#include <cerrno>

#include "platform/include/filesystem.h"
#include "platform/include/list.h"
#include "platform/include/monitor.h"
#include "platform/include/recycle.h"
#include "platform/include/service.h"
#include "platform/include/share.h"
#include "platform/include/user.h"
#include "tests/platform/linux/fake_daemon.h"
#include "tests/platform/linux/share_fixture.h"

namespace quarry::platform {
namespace {

using TARN::TARNOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION;
using TARN::TARNOTIFYD::MonitorQueue;

constexpr int kBefore = EDOM;  // what none of the calls sets

// What `call` returns when errno is untouched, else -errno.
template <typename Call>
int Untouched(const Call& call) {
  errno = kBefore;
  const int result = static_cast<int>(call());
  return errno == kBefore ? result : -errno;
}

class ErrnoTest : public ShareTest {};

TEST_F(ErrnoTest, WithoutAShareFile) {
  HLIBCSZLIST* list = HLIBCSzListAlloc(0);
  EXPECT_EQ(Untouched([&] { return HLIBShareEnum(&list, HLIBCSzListPush); }), 0);
  EXPECT_EQ(Untouched([&] { return TARNFSDirIsMntPoint("/proc"); }), 1);
  HLIBCSzListFree(list);
}

TEST_F(ErrnoTest, OfPlaces) {
  const std::string share = Add("photo", true).path;
  const std::string file = share + "/f";
  test::WriteFile(file, "");
  ASSERT_EQ(access(file.c_str(), X_OK), -1);
  EXPECT_GE(Untouched([&] { return TARNACLPermGet(file.c_str()); }), 4);
  EXPECT_GE(Untouched([&] { return TARNGetFSType(share.c_str(), 0); }), 0);
  EXPECT_EQ(Untouched([&] { return TARNFSDirIsMntPoint(share.c_str()); }), 0);
  EXPECT_NE(Untouched([&] { return TARNQuotaIsEnough(share.c_str(), 4321, 1); }), 0);
  EXPECT_EQ(Untouched([&] { return TARNShareIsShareRecycle((share + "/#recycle").c_str()); }), 1);
  test::MakeDirs(share + "/#snapshot");
  int flag = 7;
  EXPECT_EQ(Untouched([&] { return HLIBFhsPathInSnapshot((share + "/#snapshot").c_str(), &flag); }),
            0);
}

TEST_F(ErrnoTest, OfRecycleBins) {
  HLIBCSZLIST* list = HLIBCSzListAlloc(0);
  EXPECT_EQ(Untouched([&] { return TARNRecycleHomeEnumRecyclePath(&list); }), 0);
  const std::string homes = Add("homes").path;
  test::MakeDirs(homes + "/alice/#recycle");
  test::MakeDirs(homes + "/bob");
  EXPECT_EQ(Untouched([&] { return TARNRecycleHomeEnumRecyclePath(&list); }), 0);
  EXPECT_EQ(HLIBCSzListCount(list), 1);
  EXPECT_EQ(
      Untouched([&] { return TARNRecycleHomeEnumRecyclePathForAuthType(&list, AUTH_TYPE_LOCAL); }),
      0);
  HLIBCSzListFree(list);
}

TEST_F(ErrnoTest, OfCopies) {
  test::WriteFile(volume_ / "a", "text");
  TARNCOPYARGS args{};
  EXPECT_EQ(Untouched([&] {
              return TARNFileCopy((volume_ / "a").c_str(), (volume_ / "b").c_str(), &args);
            }),
            0);
  args.move = 1;
  EXPECT_EQ(Untouched([&] {
              return TARNFileCopy((volume_ / "a").c_str(), (volume_ / "c").c_str(), &args);
            }),
            0);
}

TEST_F(ErrnoTest, OfAccounts) {
  TARNUSER* user = nullptr;
  EXPECT_EQ(Untouched([&] { return TARNUserGetByUID(geteuid(), &user); }), 0);
  EXPECT_GE(Untouched([&] { return HLIBGroupIsAdminGroupMem(user->szName, 0); }), 0);
  EXPECT_EQ(Untouched([&] { return ResetCredentialsByName(user->szName); }), 1);
  TARNUserFree(user);
  EXPECT_EQ(Untouched([&] { return TARNUserGet("Quarry", &user); }), 0);
  TARNUserFree(user);
}

TEST_F(ErrnoTest, OfSettings) {
  Json::Value config;
  config["queue"] = "/q/photo";
  config["config"] = Json::Value(Json::arrayValue);
  constexpr auto kType = MONITOR_QUEUE_TYPE_APPLICATION;
  EXPECT_EQ(Untouched([&] { return MonitorQueue::Upsert(MonitorQueue(config), "a", kType); }), 1);
  EXPECT_EQ(Untouched([] { return MonitorQueue::Delete("/q/photo", "a", kType); }), 1);
  EXPECT_EQ(Untouched([] { return MonitorQueue::Delete("/q/photo", "a", kType); }), 1);
  EXPECT_EQ(Untouched([] { return TARNSMBIsEnableSpotlight(); }), 0);
  EXPECT_EQ(Untouched([] { return TARNSMBSetSpotlight(1); }), 0);
  EXPECT_EQ(Untouched([] { return TARNSMBIsEnableSpotlight(); }), 1);
}

TEST_F(ErrnoTest, OfServices) {
  test::FakeDaemon supervisor(test::TestRoot() + "/var/run/quarry.sock", [](const std::string&) {
    return test::FakeDaemon::Frame("{\"success\":true}");
  });
  EXPECT_EQ(Untouched([] { return HLIBServiceStart("fileindexd", 1); }), 0);
  EXPECT_EQ(Untouched([] { return HLIBServiceRestart("samba"); }), 0);
  EXPECT_EQ(Untouched([] { return HLIBCExec("/bin/sh", "-c", "exit 3", nullptr); }), 3);
}

}  // namespace
}  // namespace quarry::platform
