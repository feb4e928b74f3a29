#include "fileindex/index_mgr.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <functional>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/config/status_mgr.h"
#include "fileindex/index_mgr_internal.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/index_daemon.h"
#include "tests/support/files.h"
#include "tests/support/thrown.h"

namespace quarry::fileindex {
namespace {

using test::FailureOf;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class IndexMgrTest : public fake::FakePlatformTest {
 protected:
  IndexMgrTest() {
    fake::AddShare("photo", volume_ + "/photo");
    test::MakeDirs(volume_ + "/photo/a");
    errno = 0;
  }

  static Folder Make(const std::string& path, const std::string& name = "n") {
    return Folder(path, name, true, false, true, false, false, false);
  }
  static void SaveList(const std::vector<Folder>& folders) {
    Json::Value list(Json::arrayValue);
    for (const Folder& folder : folders) list.append(folder.GetData());
    test::WriteFile(kFileIndexFoldersCfgPath, toString(list));
  }
  const std::string volume_ = test::TestRoot() + "/volume1";
};

// ---- FolderGet and FolderList

TEST_F(IndexMgrTest, FolderGetGivesTheRecord) {
  SaveList({Make("/photo/a"), Make("/photo/b")});
  Json::Value result = "old";
  FolderGet(result, "/photo/b");
  EXPECT_EQ(toString(result), toString(Make("/photo/b").GetData()));
}

TEST_F(IndexMgrTest, FolderGetOfAnUnknownFolderKeepsTheResult) {
  Json::Value result = "old";
  EXPECT_EQ(FailureOf([&] { FolderGet(result, "/photo/a"); }), "902 ");
  test::WriteFile(kFileIndexFoldersCfgPath, "[");
  EXPECT_EQ(FailureOf([&] { FolderGet(result, "/photo/a"); }),
            "504 Cannot load json: " + kFileIndexFoldersCfgPath);
  EXPECT_EQ(toString(result), "\"old\"");
}

TEST_F(IndexMgrTest, FolderListOfNoFolders) {
  Json::Value result = "old";
  FolderList(result, 3, 5, "name", "asc", Json::Value(Json::arrayValue));
  EXPECT_EQ(toString(result), R"({"folder":[],"offset":3,"total":0})");
}

TEST_F(IndexMgrTest, FolderListGivesAPageOfTheSortedList) {
  SaveList({Make("/photo/a", "c"), Make("/photo/b", "a"), Make("/photo/c", "b")});
  Json::Value result;
  FolderList(result, 1, 1, "name", "desc", Json::Value(Json::arrayValue));
  EXPECT_EQ(toString(result), "{\"folder\":[" + toString(Make("/photo/c", "b").GetData()) +
                                  "],\"offset\":1,\"total\":3}");
  FolderList(result, 0, 2, "path", "", Json::Value(Json::arrayValue));
  EXPECT_EQ(toString(result), "{\"folder\":[" + toString(Make("/photo/a", "c").GetData()) + "," +
                                  toString(Make("/photo/b", "a").GetData()) +
                                  "],\"offset\":0,\"total\":3}");
}

TEST_F(IndexMgrTest, FolderListCarriesWhatIsAskedForBeside) {
  SaveList({Make("/photo/a")});
  Json::Value additional;
  additional.append("status");
  Json::Value result;
  FolderList(result, 0, 9, "path", "", additional);
  Json::Value record = Make("/photo/a").GetData();
  record["additional"]["status"]["text"] = "finished";
  EXPECT_EQ(toString(result), "{\"folder\":[" + toString(record) + "],\"offset\":0,\"total\":1}");
}

TEST_F(IndexMgrTest, FolderListThatFailsOnTheWayHoldsWhatWasThere) {
  SaveList({Make("/photo/a"), Make("/photo/b")});
  test::MakeDirs(volume_ + "/photo/b");
  fake::FailCall("FILEIDXQueuePathCompose", 2);
  Json::Value additional;
  additional.append("status");
  Json::Value result;
  EXPECT_EQ(FailureOf([&] { FolderList(result, 0, 9, "path", "", additional); }).substr(0, 3),
            "502");
  EXPECT_EQ(result["total"].asUInt(), 2U);
  ASSERT_EQ(result["folder"].size(), 1U);
  EXPECT_EQ(result["folder"][0]["path"].asString(), "/photo/a");

  EXPECT_EQ(FailureOf([&] { FolderList(result, 0, 9, "path", "", Json::Value()); }), "120 null");
  EXPECT_EQ(toString(result), R"({"folder":[],"offset":0,"total":2})");
}

TEST_F(IndexMgrTest, FolderListThatCannotLoadKeepsTheResult) {
  test::WriteFile(kFileIndexFoldersCfgPath, "{}");
  Json::Value result = "old";
  EXPECT_EQ(FailureOf([&] { FolderList(result, 0, 9, "", "", Json::Value()); }),
            "120 Not an array, data={}");
  EXPECT_EQ(toString(result), "\"old\"");
}

// ---- NotifySettingChanged

TEST_F(IndexMgrTest, NotifySettingChangedNamesTheShareAndTheChange) {
  test::IndexDaemon daemon;
  NotifySettingChanged("photo", true);
  NotifySettingChanged("", false);
  EXPECT_THAT(
      daemon.Commands(),
      ElementsAre(
          R"({"data":{"is_upsert":true,"share_name":"photo"},"type":"notify_setting_changed"})",
          R"({"data":{"is_upsert":false,"share_name":""},"type":"notify_setting_changed"})"));
}

TEST_F(IndexMgrTest, NotifySettingChangedFailsWithoutADaemon) {
  EXPECT_EQ(FailureOf([] { NotifySettingChanged("photo", true); }).substr(0, 16),
            "502 write failed");
}

// ---- UpsertTARNotifydCfg

class MonitorCfgTest : public IndexMgrTest {
 protected:
  std::string QueuePath() const { return fake::QueuePath(volume_ + "/photo"); }
  Json::Value Registered() const { return fake::MonitorQueues()[{"fileindex", QueuePath()}]; }
};

TEST_F(MonitorCfgTest, RegistersTheFoldersOfTheShareInTheirOrder) {
  fake::AddShare("photos", volume_ + "/photos");
  SaveList({Make("/photo/b"), Make("/photos"), Make("/photo/a")});
  UpsertTARNotifydCfg("photo", FolderMgr());
  EXPECT_EQ(toString(Registered()), R"({"config":[{"ignore":["@eaDir"],"mask":65478,"path":")" +
                                        volume_ +
                                        R"(/photo/b"},{"ignore":["@eaDir"],"mask":65478,"path":")" +
                                        volume_ + R"(/photo/a"}],"queue":")" + QueuePath() + "\"}");
}

TEST_F(MonitorCfgTest, AShareWithoutFoldersHasAnEmptyConfiguration) {
  UpsertTARNotifydCfg("photo", FolderMgr());
  EXPECT_EQ(toString(Registered()), R"({"config":[],"queue":")" + QueuePath() + "\"}");
}

TEST_F(MonitorCfgTest, ARefusalIsLoggedAndFails) {
  fake::FailCall("MonitorQueue::Upsert", 1, {-1, EIO, 0});
  EXPECT_EQ(FailureOf([] { UpsertTARNotifydCfg("photo", FolderMgr()); }),
            "502 MonitorQueue::Upsert failed, share=photo");
  ASSERT_EQ(fake::Logs().size(), 1U);
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("index_mgr", 1, "UpsertTARNotifydCfg")) +
                "Failed [!MonitorQueue::Upsert(monitor_queue, kAppName, "
                "MONITOR_QUEUE_TYPE_APPLICATION)], reason: MonitorQueue::Upsert failed, "
                "share=photo [err: Input/output error]");
}

TEST_F(MonitorCfgTest, NothingIsRegisteredForAShareThatIsNotKnown) {
  EXPECT_EQ(FailureOf([] { UpsertTARNotifydCfg("gone", FolderMgr()); }).substr(0, 3), "800");
  fake::FailCall("FILEIDXQueuePathCompose");
  EXPECT_EQ(FailureOf([] { UpsertTARNotifydCfg("photo", FolderMgr()); }).substr(0, 3), "502");
  EXPECT_THAT(fake::MonitorQueues(), IsEmpty());
}

// ---- SetupRelatedServices and PrepareServices

class ServicesTest : public IndexMgrTest {
 protected:
  // The lines of the log without their numbers.
  static std::vector<std::string> Logs() {
    std::vector<std::string> lines;
    for (const std::string& line : fake::Logs()) lines.push_back(fake::AnyLine(line));
    return lines;
  }
  static std::string Logged(const std::string& text) {
    return fake::AnyLine(fake::LogHead("index_mgr", 1, "SetupRelatedServices")) + text;
  }
  // The calls without the questions about the platform's last error.
  static std::vector<std::string> Calls() {
    std::vector<std::string> calls;
    for (const std::string& call : fake::Calls()) {
      if (call.compare(0, 7, "HLIBCEr") != 0) calls.push_back(call);
    }
    return calls;
  }
};

TEST_F(ServicesTest, SwitchesAllThreeOn) {
  SetupRelatedServices(true);
  EXPECT_THAT(Calls(),
              ElementsAre("TARNSMBIsEnableSpotlight()", "TARNSMBSetSpotlight(1)",
                          "HLIBServiceRestart(samba)", "HLIBServiceStart(tarncontentextractd, 1)",
                          "HLIBServicectlStart(pkg-Quarry-fileindexd, 1)"));
  EXPECT_THAT(Logs(), IsEmpty());
}

TEST_F(ServicesTest, SwitchesAllThreeOff) {
  fake::SetSpotlight(true);
  SetupRelatedServices(false);
  EXPECT_THAT(Calls(),
              ElementsAre("TARNSMBIsEnableSpotlight()", "TARNSMBSetSpotlight(0)",
                          "HLIBServiceRestart(samba)", "HLIBServiceStop(tarncontentextractd, 0)",
                          "HLIBServicectlStop(pkg-Quarry-fileindexd, 1)"));
  EXPECT_THAT(Logs(), IsEmpty());
}

TEST_F(ServicesTest, LeavesTheSharingServiceAloneWhereNothingChanges) {
  fake::SetSpotlight(true);
  SetupRelatedServices(true);
  EXPECT_THAT(Calls(),
              ElementsAre("TARNSMBIsEnableSpotlight()", "HLIBServiceStart(tarncontentextractd, 1)",
                          "HLIBServicectlStart(pkg-Quarry-fileindexd, 1)"));
  fake::SetSpotlight(false);
  fake::ClearCalls();
  SetupRelatedServices(false);
  EXPECT_THAT(Calls(),
              ElementsAre("TARNSMBIsEnableSpotlight()", "HLIBServiceStop(tarncontentextractd, 0)",
                          "HLIBServicectlStop(pkg-Quarry-fileindexd, 1)"));
}

TEST_F(ServicesTest, LeavesTheSharingServiceAloneWhereItsSettingIsNotKnown) {
  for (bool enable : {true, false}) {
    fake::FailCall("TARNSMBIsEnableSpotlight", 1, {-1, enable ? EACCES : 0, 0});
    fake::ClearCalls();
    fake::ClearLogs();
    SetupRelatedServices(enable);
    EXPECT_THAT(Logs(),
                ElementsAre(Logged("Failed [0 > TARNSMBIsEnableSpotlight()]" +
                                   std::string(enable ? " [err: Permission denied]" : ""))));
    EXPECT_THAT(fake::CallsOf("TARNSMBSetSpotlight"), IsEmpty());
    EXPECT_THAT(fake::CallsOf("HLIBServiceRestart"), IsEmpty());
    EXPECT_EQ(Calls().size(), 3U);
  }
}

TEST_F(ServicesTest, AFailedSettingIsLoggedAndDoesNotRestart) {
  for (bool enable : {true, false}) {
    fake::SetSpotlight(!enable);
    fake::SetPlatformError(0xAB, "smb.c", 42);
    fake::FailCall("TARNSMBSetSpotlight");
    fake::ClearCalls();
    fake::ClearLogs();
    SetupRelatedServices(enable);
    EXPECT_THAT(Logs(), ElementsAre(Logged("TARNSMBSetSpotlight failed: err=[0x00AB smb.c:42]")));
    EXPECT_THAT(fake::CallsOf("HLIBServiceRestart"), IsEmpty());
    EXPECT_EQ(Calls().size(), 4U);
  }
}

TEST_F(ServicesTest, AFailedRestartIsLogged) {
  for (bool enable : {true, false}) {
    fake::SetSpotlight(!enable);
    fake::SetPlatformError(0x12345, "service.c", 7);
    fake::FailCall("HLIBServiceRestart");
    fake::ClearCalls();
    fake::ClearLogs();
    SetupRelatedServices(enable);
    EXPECT_THAT(Logs(),
                ElementsAre(Logged("HLIBServiceRestart failed: err=[0x12345 service.c:7]")));
    EXPECT_EQ(Calls().size(), 5U);
  }
}

TEST_F(ServicesTest, FailuresOfTheSharingServiceAreLoggedWithErrno) {
  fake::FailCall("TARNSMBSetSpotlight", 1, {-1, EROFS, 0x400});
  SetupRelatedServices(true);
  EXPECT_THAT(Logs(), ElementsAre(Logged("TARNSMBSetSpotlight failed: err=[0x0400 :0] "
                                         "[err: Read-only file system]")));
  fake::ClearLogs();
  fake::FailCall("HLIBServiceRestart", 1, {-2, ENOENT, 0});
  SetupRelatedServices(true);
  EXPECT_THAT(Logs(), ElementsAre(Logged("HLIBServiceRestart failed: err=[0x0400 :0] "
                                         "[err: No such file or directory]")));
  EXPECT_EQ(errno, 0);
}

TEST_F(ServicesTest, EveryFailureIsLoggedAndTheRestIsDone) {
  for (const char* call : {"HLIBServiceStart", "HLIBServicectlStart"}) fake::FailEveryCall(call);
  SetupRelatedServices(true);
  EXPECT_THAT(Logs(),
              ElementsAre(Logged("Failed [0 > HLIBServiceStart(\"tarncontentextractd\", TRUE)]"),
                          Logged("Failed [0 > HLIBServicectlStart(\"pkg-Quarry-fileindexd\", "
                                 "HLIB_SERVICECTL_UPSTART)]")));
  EXPECT_EQ(Calls().size(), 5U);
}

TEST_F(ServicesTest, EveryFailureToStopIsLoggedWithErrno) {
  fake::FailCall("HLIBServiceStop", 1, {-1, ENOENT, 0});
  fake::FailCall("HLIBServicectlStop", 1, {-5, 0, 0});
  SetupRelatedServices(false);
  EXPECT_THAT(Logs(),
              ElementsAre(Logged("Failed [0 > HLIBServiceStop(\"tarncontentextractd\", FALSE)] "
                                 "[err: No such file or directory]"),
                          Logged("Failed [0 > HLIBServicectlStop(\"pkg-Quarry-fileindexd\", "
                                 "HLIB_SERVICECTL_UPSTART)]")));
  EXPECT_EQ(errno, 0);
}

TEST_F(ServicesTest, ResultsAboveZeroAreNoFailures) {
  for (const char* call : {"HLIBServiceStart", "HLIBServicectlStart", "HLIBServiceRestart"}) {
    fake::FailCall(call, 1, {1, 0, 0});
  }
  SetupRelatedServices(true);
  EXPECT_THAT(Logs(), IsEmpty());
}

TEST_F(ServicesTest, PrepareServicesFollowsTheList) {
  fake::SetSpotlight(true);
  PrepareServices();
  EXPECT_THAT(Calls(),
              ElementsAre("TARNSMBIsEnableSpotlight()", "TARNSMBSetSpotlight(0)",
                          "HLIBServiceRestart(samba)", "HLIBServiceStop(tarncontentextractd, 0)",
                          "HLIBServicectlStop(pkg-Quarry-fileindexd, 1)"));
  SaveList({Make("/photo/a")});
  fake::ClearCalls();
  PrepareServices();
  EXPECT_THAT(Calls(),
              ElementsAre("TARNSMBIsEnableSpotlight()", "TARNSMBSetSpotlight(1)",
                          "HLIBServiceRestart(samba)", "HLIBServiceStart(tarncontentextractd, 1)",
                          "HLIBServicectlStart(pkg-Quarry-fileindexd, 1)"));
}

TEST_F(ServicesTest, PrepareServicesTouchesNothingWhenTheListCannotBeLoaded) {
  test::WriteFile(kFileIndexFoldersCfgPath, "[");
  EXPECT_EQ(FailureOf([] { PrepareServices(); }).substr(0, 3), "504");
  EXPECT_THAT(Calls(), IsEmpty());
}

}  // namespace
}  // namespace quarry::fileindex
