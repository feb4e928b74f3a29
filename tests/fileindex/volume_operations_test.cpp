// What happens to volumes, home folders and accounts, by the whole sequence of what is done.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <string>
#include <vector>

#include "common/json.h"
#include "fileindex/index_mgr.h"
#include "platform/include/recycle.h"
#include "tests/fileindex/operation_fixture.h"

namespace quarry::fileindex {
namespace {

using ::testing::ElementsAre;
using ::testing::ElementsAreArray;
using ::testing::IsEmpty;

// As VolumePause leaves a record.
Json::Value Paused(Json::Value record, const std::string& volume) {
  record["paused"] = true;
  record["volume_to_be_clean"] = volume;
  return record;
}

class VolumeTest : public OperationTest {
 protected:
  VolumeTest() {
    holds_lock_ = false;
    Prepare();
  }

  // "far" is on a volume whose name begins like that of the others.
  void Prepare() const {
    fake::AddShare("far", volume_ + "0/far");
    SaveList({Record("/photo/a", "d"), Record("/far"), Record("/music"), Record("/photo/b")});
  }
  void PreparePaused() const {
    Prepare();
    SaveList({Paused(Record("/photo/a", "d"), volume_), Paused(Record("/far"), volume_ + "0"),
              Paused(Record("/music"), volume_), Paused(Record("/photo/b"), volume_)});
  }

  void ExpectRefused(const std::string& function, const std::string& condition,
                     const std::string& reason, const Action& operation) {
    test::WriteFile(kFileIndexFoldersCfgPath, "[");  // not even looked at
    Begin();
    EXPECT_EQ(FailureOf(operation), "120 " + reason);
    EXPECT_THAT(effects_->All(), IsEmpty());
    ASSERT_EQ(fake::Logs().size(), 1U);
    EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
              fake::AnyLine(fake::LogHead("index_mgr", 1, function)) + "Failed [" + condition +
                  "], reason: " + reason);
    End();
  }
  static Texts Logs() {
    Texts lines;
    for (const std::string& line : fake::Logs()) lines.push_back(fake::AnyLine(line));
    return lines;
  }
};

TEST_F(VolumeTest, PauseDoesAllOfItInThisOrder) {
  Begin();
  EXPECT_EQ(FailureOf([&] { VolumePause(volume_); }), "");
  EXPECT_THAT(
      effects_->All(),
      ElementsAre(kBecomeRoot,
                  Saved({Paused(Record("/photo/a", "d"), volume_), Record("/far"),
                         Paused(Record("/music"), volume_), Paused(Record("/photo/b"), volume_)}),
                  Worker("worker_delete", "music"), Unmonitored("music"),
                  "engine index_pause fileindex_music", Worker("worker_delete", "photo"),
                  Unmonitored("photo"), "engine index_pause fileindex_photo"));
  EXPECT_THAT(Logs(), IsEmpty());
}

TEST_F(VolumeTest, ResumeDoesAllOfItInThisOrder) {
  PreparePaused();
  Begin();
  EXPECT_EQ(FailureOf([&] { VolumeResume(volume_); }), "");
  const auto resumed = [&](const Json::Value& record) {
    Json::Value with_volume = record;
    with_volume["volume_to_be_clean"] = volume_;
    return with_volume;
  };
  EXPECT_THAT(
      effects_->All(),
      ElementsAre(kBecomeRoot,
                  Saved({resumed(Record("/photo/a", "d")), Paused(Record("/far"), volume_ + "0"),
                         resumed(Record("/music")), resumed(Record("/photo/b"))}),
                  "engine index_resume fileindex_music", Worker("worker_create", "music"),
                  Monitored("music", {"/music"}), "engine index_resume fileindex_photo",
                  Worker("worker_create", "photo"), Monitored("photo", {"/photo/a", "/photo/b"})));
  EXPECT_THAT(Logs(), IsEmpty());
}

TEST_F(VolumeTest, AVolumeThatWasNotPausedIsResumedAllTheSame) {
  SaveList({Record("/far"), Record("/music")});
  Begin();
  VolumeResume(volume_);
  EXPECT_EQ(StoredList(), toString(Array({Record("/far"), Record("/music")})));
  const Texts effects = effects_->All();
  ASSERT_GE(effects.size(), 3U);
  EXPECT_THAT(Texts(effects.end() - 3, effects.end()),
              ElementsAre("engine index_resume fileindex_music", Worker("worker_create", "music"),
                          Monitored("music", {"/music"})));
}

TEST_F(VolumeTest, AVolumeWithoutFoldersOnlySaves) {
  const std::vector<Json::Value> records = {Record("/photo/a", "d")};
  for (const auto& operation : {&VolumePause, &VolumeResume}) {
    test::WriteFile(kFileIndexFoldersCfgPath, " " + toString(Array(records)));
    Begin();
    operation("/volume9");
    EXPECT_THAT(effects_->All(), ElementsAre(kBecomeRoot, Saved(records)));
    End();
  }
}

TEST_F(VolumeTest, AFolderMayBeTheVolumeItself) {
  fake::AddShare("photo", volume_ + "/photo");
  Begin();
  VolumePause(volume_ + "/photo/b");
  EXPECT_EQ(effects_->All()[1], Saved({Record("/photo/a", "d"), Record("/far"), Record("/music"),
                                       Paused(Record("/photo/b"), volume_ + "/photo/b")}));
}

TEST_F(VolumeTest, ClearForgetsTheSharesThatThisVolumePaused) {
  SaveList({Paused(Record("/photo/a"), volume_), Record("/photo/b"),
            Paused(Record("/far"), volume_ + "0"), Paused(Record("/music"), volume_)});
  test::WriteFile(kFileIndexStatusCfgPath, R"({"share":{"far":1,"music":1,"photo":2}})");
  Begin();
  EXPECT_EQ(FailureOf([&] { VolumeClearPaused(volume_); }), "");
  EXPECT_THAT(effects_->All(),
              ElementsAre(kBecomeRoot, R"(status = {"share":{"far":1,"photo":2}})", kBecomeRoot,
                          R"(status = {"share":{"far":1}})", kBecomeRoot,
                          Saved({Paused(Record("/far"), volume_ + "0")})));
  EXPECT_THAT(Logs(), ElementsAre("index_mgr.cpp:N Remove share music from folder mgr",
                                  "index_mgr.cpp:N Remove share photo from folder mgr"));
}

TEST_F(VolumeTest, ClearNeedsBothThePauseAndTheVolume) {
  Json::Value resumed = Paused(Record("/photo/a"), volume_);
  resumed["paused"] = false;
  const std::vector<Json::Value> records = {resumed, Paused(Record("/music"), volume_ + "/"),
                                            Paused(Record("/far"), "")};
  test::WriteFile(kFileIndexFoldersCfgPath, " " + toString(Array(records)));
  Begin();
  VolumeClearPaused(volume_);
  EXPECT_THAT(effects_->All(), ElementsAre(kBecomeRoot, Saved(records)));
  EXPECT_THAT(Logs(), IsEmpty());
}

TEST_F(VolumeTest, ClearOfTheLastShareStopsTheServices) {
  SaveList({Paused(Record("/photo/a"), volume_)});
  fake::RemoveShare("photo");
  Begin();
  VolumeClearPaused(volume_);
  EXPECT_THAT(effects_->All(), ElementsAreArray(Texts{kBecomeRoot, R"(status = {"share":null})",
                                                      kBecomeRoot, "list = []"} +
                                                ServicesOff()));
}

TEST_F(VolumeTest, ClearOfAnEmptyListStopsTheServices) {
  test::WriteFile(kFileIndexFoldersCfgPath, " []");
  Begin();
  VolumeClearPaused(volume_);
  EXPECT_THAT(effects_->All(), ElementsAreArray(Texts{kBecomeRoot, "list = []"} + ServicesOff()));
}

TEST_F(VolumeTest, ClearStopsAtAStatusThatCannotBeLoaded) {
  test::WriteFile(kFileIndexStatusCfgPath, "[");
  Begin();
  EXPECT_EQ(FailureOf([&] { VolumeClearPaused(volume_); }).substr(0, 3), "504");
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(VolumeTest, TheMountPointIsMissing) {
  const std::string condition = "mount_point.empty()";
  const std::string reason = "Missing mount point";
  ExpectRefused("VolumePause", condition, reason, [] { VolumePause(""); });
  ExpectRefused("VolumeResume", condition, reason, [] { VolumeResume(""); });
  ExpectRefused("VolumeClearPaused", condition, reason, [] { VolumeClearPaused(""); });
}

TEST_F(VolumeTest, WithoutADaemonTheListIsSavedAndTheFirstShareEndsIt) {
  Begin();
  daemon_.reset();
  EXPECT_EQ(FailureOf([&] { VolumePause(volume_); }).substr(0, 16), "502 write failed");
  EXPECT_EQ(effects_->All().size(), 2U);
  End();
  PreparePaused();
  Begin();
  daemon_.reset();
  EXPECT_EQ(FailureOf([&] { VolumeResume(volume_); }).substr(0, 16), "502 write failed");
  ASSERT_EQ(effects_->All().size(), 3U);
  EXPECT_EQ(effects_->All()[2], "engine index_resume fileindex_music");
}

TEST_F(VolumeTest, AFolderThatWasPausedBeforeIsTheVolumesFromNowOn) {
  SaveList({Paused(Record("/photo/a"), ""), Paused(Record("/photo/b"), volume_ + "0")});
  Begin();
  VolumePause(volume_);
  const Texts effects = effects_->All();
  ASSERT_EQ(effects.size(), 5U);
  EXPECT_EQ(effects[1],
            Saved({Paused(Record("/photo/a"), volume_), Paused(Record("/photo/b"), volume_)}));
  EXPECT_EQ(effects[2], Worker("worker_delete", "photo"));
}

TEST_F(VolumeTest, EverySingleFailureEndsThePause) {
  ExpectEveryFailureToEndIt([this] { Prepare(); }, [this] { VolumePause(volume_); });
}

TEST_F(VolumeTest, EverySingleFailureEndsTheResumption) {
  ExpectEveryFailureToEndIt([this] { PreparePaused(); }, [this] { VolumeResume(volume_); });
}

TEST_F(VolumeTest, EverySingleFailureEndsTheClearing) {
  ExpectEveryFailureToEndIt(
      [this] {
        SaveList({Paused(Record("/photo/a"), volume_), Paused(Record("/music"), volume_)});
        test::WriteFile(kFileIndexStatusCfgPath, R"({"share":{"music":1,"photo":2}})");
        fake::SetSpotlight(true);
      },
      [this] { VolumeClearPaused(volume_); });
}

// ---- Home folders

class HomeTest : public VolumeTest {
 protected:
  HomeTest() {
    watched_queues_["homes"] = "homes";
    Prepare();
  }

  void Prepare() const {
    fake::AddShare("homes", volume_ + "/homes");
    fake::AddHomeRecycle(volume_ + "/homes/ann/#recycle", AUTH_TYPE_LOCAL);
    fake::AddHomeRecycle(volume_ + "/homes/bob/#recycle", AUTH_TYPE_LOCAL);
    fake::AddHomeRecycle(volume_ + "/homes/DOM/amy/#recycle", AUTH_TYPE_DOMAIN);
    SaveList({Record("/homes/ann", "d"), Record("/homes/anna"), Record("/homes/ann/x"),
              Record("/photo/homes/ann")});
  }
  std::string Ann() const { return ReindexLine("/homes/ann/#recycle"); }
  std::string Bob() const { return ReindexLine("/homes/bob/#recycle"); }
  std::string Amy() const { return ReindexLine("/homes/DOM/amy/#recycle"); }
  static std::string Logged(const std::string& function, const std::string& text) {
    return fake::AnyLine(fake::LogHead("index_mgr", 1, function)) + text;
  }
};

TEST_F(HomeTest, DisableQueuesTheBinsOfAllAccounts) {
  Begin();
  HomeDisable(AUTH_TYPE_DOMAIN);
  EXPECT_THAT(effects_->All(),
              ElementsAre("call HLIBCSzListAlloc(1024)", "call TARNRecycleHomeEnumRecyclePath()",
                          "queue homes = " + Ann(), "queue homes = " + Ann() + Bob(),
                          "queue homes = " + Ann() + Bob() + Amy(), "call HLIBCSzListFree()"));
  EXPECT_THAT(Logs(), IsEmpty());
}

TEST_F(HomeTest, EnableQueuesTheBinsOfOneKindOfAccount) {
  Begin();
  HomeEnable(AUTH_TYPE_DOMAIN);
  EXPECT_THAT(effects_->All(), ElementsAre("call HLIBCSzListAlloc(1024)",
                                           "call TARNRecycleHomeEnumRecyclePathForAuthType(1)",
                                           "queue homes = " + Amy(), "call HLIBCSzListFree()"));
  EXPECT_THAT(Logs(), IsEmpty());
}

TEST_F(HomeTest, AListThatCannotBeMadeIsLogged) {
  for (const auto& [function, operation] : std::vector<std::pair<std::string, void (*)(AUTH_TYPE)>>{
           {"HomeDisable", &HomeDisable}, {"HomeEnable", &HomeEnable}}) {
    fake::FailCall("HLIBCSzListAlloc", 1, {-1, ENOMEM, 0});
    Begin();
    EXPECT_EQ(FailureOf([&, run = operation] { run(AUTH_TYPE_LOCAL); }), "");
    EXPECT_THAT(effects_->All(), ElementsAre("call HLIBCSzListAlloc(1024)"));
    EXPECT_THAT(Logs(), ElementsAre(Logged(function,
                                           "HLIBCSzListAlloc failed "
                                           "[err: Cannot allocate memory]")));
    End();
  }
}

TEST_F(HomeTest, AnEnumerationThatFailsIsLogged) {
  for (int result : {-1, 1}) {
    fake::FailCall("TARNRecycleHomeEnumRecyclePath", 1, {result, 0, 0});
    fake::FailCall("TARNRecycleHomeEnumRecyclePathForAuthType", 1, {result, 0, 0});
    Begin();
    HomeDisable(AUTH_TYPE_LDAP);
    HomeEnable(AUTH_TYPE_DOMAIN);
    EXPECT_THAT(
        effects_->All(),
        ElementsAre("call HLIBCSzListAlloc(1024)", "call TARNRecycleHomeEnumRecyclePath()",
                    "call HLIBCSzListFree()", "call HLIBCSzListAlloc(1024)",
                    "call TARNRecycleHomeEnumRecyclePathForAuthType(1)", "call HLIBCSzListFree()"));
    EXPECT_THAT(Logs(),
                ElementsAre(Logged("HomeDisable", "TARNRecycleHomeEnumRecyclePath failed. auth: 2"),
                            Logged("HomeEnable",
                                   "TARNRecycleHomeEnumRecyclePathForAuthType failed. auth: 1")));
    End();
  }
}

TEST_F(HomeTest, AnEventThatCannotBeQueuedFreesTheList) {
  test::WriteFile(QueueOf("homes"), "nonsense\n");
  Begin();
  EXPECT_EQ(FailureOf([] { HomeDisable(AUTH_TYPE_LOCAL); }).substr(0, 3), "906");
  EXPECT_THAT(
      effects_->All(),
      ElementsAre("call HLIBCSzListAlloc(1024)", "call TARNRecycleHomeEnumRecyclePath()",
                  kBecomeRoot, R"(status = {"share":{"homes":1}})", "call HLIBCSzListFree()"));
  EXPECT_EQ(fake::Outstanding(), 0);
}

// ---- UserRename

using UserRenameTest = HomeTest;

TEST_F(UserRenameTest, DoesAllOfItInThisOrder) {
  Begin();
  EXPECT_EQ(FailureOf([] { UserRename("ann", "joan"); }), "");
  EXPECT_THAT(effects_->All(),
              ElementsAre(kBecomeRoot,
                          Saved({Record("/homes/joan", "d"), Record("/homes/anna"),
                                 Record("/homes/joan/x"), Record("/photo/homes/ann")}),
                          "queue homes = " + EventLine(0x100, volume_ + "/homes/joan",
                                                       volume_ + "/homes/ann", Json::Value())));
  EXPECT_THAT(Logs(),
              ElementsAre("index_mgr.cpp:N Update homes rule: [/homes/ann] -> [/homes/joan]",
                          "index_mgr.cpp:N Update homes rule: [/homes/ann/x] -> "
                          "[/homes/joan/x]"));
}

TEST_F(UserRenameTest, AUserWithoutFoldersIsRenamedAllTheSame) {
  SaveList({Record("/homes/anna")});
  test::WriteFile(kFileIndexFoldersCfgPath, StoredList() + " ");
  Begin();
  UserRename("ann", "joan");
  EXPECT_THAT(effects_->All(),
              ElementsAre(kBecomeRoot, Saved({Record("/homes/anna")}),
                          "queue homes = " + EventLine(0x100, volume_ + "/homes/joan",
                                                       volume_ + "/homes/ann", Json::Value())));
  EXPECT_THAT(Logs(), IsEmpty());
}

TEST_F(UserRenameTest, ANameIsMissing) {
  ExpectRefused("UserRename", "user_from.empty()", "Missing user_from", [] { UserRename("", ""); });
  ExpectRefused("UserRename", "user_to.empty()", "Missing user_to", [] { UserRename("ann", ""); });
}

TEST_F(UserRenameTest, ANewNameWithANulByteIsRefusedBeforeItIsSaved) {
  Begin();
  const std::string name("jo\0an", 5);
  EXPECT_EQ(FailureOf([&] { UserRename("ann", name); }), "120 /homes/" + name);
  EXPECT_THAT(effects_->All(), IsEmpty());
  EXPECT_THAT(Logs(), IsEmpty());
}

TEST_F(UserRenameTest, WithoutHomeFoldersTheListIsSaved) {
  fake::RemoveShare("homes");
  Begin();
  EXPECT_EQ(FailureOf([] { UserRename("ann", "joan"); }).substr(0, 3), "800");
  EXPECT_EQ(effects_->All().size(), 2U);
}

TEST_F(UserRenameTest, EverySingleFailureEndsIt) {
  ExpectEveryFailureToEndIt([this] { Prepare(); }, [] { UserRename("ann", "joan"); });
}

}  // namespace
}  // namespace quarry::fileindex
