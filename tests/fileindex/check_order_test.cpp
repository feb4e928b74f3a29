// Which of several failures is reported, and what has been done by then.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdint>
#include <string>

#include "common/json.h"
#include "fileindex/config/folder.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_internal.h"
#include "tests/fileindex/operation_fixture.h"

namespace quarry::fileindex {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class CheckOrderTest : public OperationTest {
 protected:
  static void Break(const std::string& path) { test::WriteFile(path, "["); }
  static std::string CannotLoad(const std::string& path) { return "504 Cannot load json: " + path; }
  static Texts Logs() {
    Texts lines;
    for (const std::string& line : fake::Logs()) lines.push_back(fake::AnyLine(line));
    return lines;
  }
};

TEST_F(CheckOrderTest, AnUpsertLoadsTheListBeforeItLooksAtItsArgument) {
  Break(kFileIndexFoldersCfgPath);
  for (const auto& operation : {&FolderAdd, &FolderSet}) {
    EXPECT_EQ(FailureOf([&] { operation(Json::Value(5), false); }),
              CannotLoad(kFileIndexFoldersCfgPath));
  }
}

TEST_F(CheckOrderTest, UpdaterModeAsksAllTheSameWhetherAPlaceMayBeIndexed) {
  fake::FailEveryCall("HLIBShareIsReadOnlyGet");
  Begin();
  for (const auto& operation : {&FolderAdd, &FolderSet}) {
    EXPECT_EQ(FailureOf([&] { operation(Array({Record("/photo/a")}), true); }).substr(0, 3), "502");
  }
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(CheckOrderTest, TheIndexOfAVanishedShareIsNotRebuilt) {
  SaveList({Record("/photo/a")});
  test::WriteFile(kFileIndexStatusCfgPath, R"({"share":{"photo":3}})");
  fake::RemoveShare("photo");
  Begin();
  EXPECT_EQ(FailureOf([] { FolderReindex(Array({"/photo/a"})); }).substr(0, 3), "800");
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(CheckOrderTest, APageWithoutFoldersAsksForNothingBeside) {
  Json::Value result;
  FolderList(result, 0, 9, "path", "", Json::Value(5));
  EXPECT_EQ(toString(result), R"({"folder":[],"offset":0,"total":0})");
}

TEST_F(CheckOrderTest, TheOffsetOfAPageIsUnsigned) {
  Json::Value result;
  FolderList(result, UINT32_MAX, 9, "path", "", Array({}));
  EXPECT_EQ(toString(result), R"({"folder":[],"offset":4294967295,"total":0})");
}

TEST_F(CheckOrderTest, AClearedVolumeLoadsTheListBeforeTheStatus) {
  Break(kFileIndexFoldersCfgPath);
  Break(kFileIndexStatusCfgPath);
  EXPECT_EQ(FailureOf([this] { VolumeClearPaused(volume_); }),
            CannotLoad(kFileIndexFoldersCfgPath));
}

TEST_F(CheckOrderTest, AReindexLoadsTheStatusBeforeTheList) {
  Break(kFileIndexFoldersCfgPath);
  Break(kFileIndexStatusCfgPath);
  EXPECT_EQ(FailureOf([] { FolderReindex(Json::Value(5)); }), CannotLoad(kFileIndexStatusCfgPath));
}

TEST_F(CheckOrderTest, ASharesRemovalIsLoggedBeforeItsStatusIsCleared) {
  Json::Value record = Record("/photo/a");
  record["paused"] = true;
  record["volume_to_be_clean"] = volume_;
  SaveList({record});
  fake::FailEveryCall("ResetCredentialsByName");
  Begin();
  EXPECT_EQ(FailureOf([this] { VolumeClearPaused(volume_); }).substr(0, 3), "503");
  ASSERT_FALSE(fake::Logs().empty());
  EXPECT_EQ(Logs().front(), "index_mgr.cpp:N Remove share photo from folder mgr");
  EXPECT_EQ(StoredList(), toString(Array({record})));
}

// ---- What counts as a failure of the services

TEST_F(CheckOrderTest, ResultsAboveZeroOfTheServicesAreNoFailures) {
  for (const bool enable : {true, false}) {
    for (const char* call : {"HLIBServiceStart", "HLIBServicectlStart", "HLIBServiceStop",
                             "HLIBServicectlStop", "HLIBServiceRestart", "TARNSMBSetSpotlight"}) {
      fake::FailCall(call, 1, {1, 0, 0});
    }
    fake::SetSpotlight(!enable);
    Begin();
    SetupRelatedServices(enable);
    EXPECT_THAT(Logs(), IsEmpty());
    EXPECT_EQ(fake::CallsOf("HLIBServiceRestart").size(), 1U);
    End();
    fake::Reset();
  }
}

TEST_F(CheckOrderTest, AnyAnswerAboveZeroMeansThatSearchSupportIsOn) {
  fake::FailEveryCall("TARNSMBIsEnableSpotlight", {2, 0, 0});
  Begin();
  SetupRelatedServices(true);
  EXPECT_THAT(fake::CallsOf("TARNSMBSetSpotlight"), IsEmpty());
  SetupRelatedServices(false);
  EXPECT_THAT(fake::CallsOf("TARNSMBSetSpotlight"), ElementsAre("TARNSMBSetSpotlight(0)"));
}

// ---- A folder's own checks

TEST_F(CheckOrderTest, AdditionalElementsAreLookedAtOneByOne) {
  const Folder folder("/photo", "n", true, true, true, true, false, false);
  EXPECT_EQ(FailureOf([&] {
              folder.GetDataWithAdditional(Array({"size", 5}));
            }),
            "120 Unknown additioal: size");
  EXPECT_EQ(FailureOf([&] { folder.GetDataWithAdditional(Array({5, "size"})); }), "120 5");
}

TEST_F(CheckOrderTest, TheStatusIsLoadedBeforeAFoldersPlaceIsLookedAt) {
  const Folder folder("/gone/a", "n", true, true, true, true, false, false);
  Json::Value out;
  EXPECT_EQ(FailureOf([&] { folder.GetStatus(out); }).substr(0, 3), "800");
  Break(kFileIndexStatusCfgPath);
  EXPECT_EQ(FailureOf([&] { folder.GetStatus(out); }), CannotLoad(kFileIndexStatusCfgPath));
}

// ---- Paths that just fit

TEST_F(CheckOrderTest, QueueAndIndexMayHavePathsOfAnyLengthThatFits) {
  const std::string gone = "/volume9/gone";
  const std::string longest = "/" + std::string(4094, 'p');
  fake::SetQueuePath(gone, longest);
  fake::SetIndexPath(gone, longest);
  Begin();
  EXPECT_EQ(FailureOf([&] { CleanShareIndexData("gone", gone); }), "");
  const std::string removed = "call HLIBCExec(/bin/rm, -rf, " + longest;
  EXPECT_THAT(effects_->All(), ElementsAre(removed + ")", removed + ".tmp)", removed + ")",
                                           kBecomeRoot, R"(status = {"share":null})"));
}

}  // namespace
}  // namespace quarry::fileindex
