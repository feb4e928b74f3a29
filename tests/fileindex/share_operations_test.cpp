// What happens to shares, by the whole sequence of what is done.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "common/json.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_internal.h"
#include "tests/fileindex/operation_fixture.h"

namespace quarry::fileindex {
namespace {

using ::testing::ElementsAre;
using ::testing::ElementsAreArray;
using ::testing::IsEmpty;

Json::Value Paused(Json::Value record) {
  record["paused"] = true;
  return record;
}

class ShareOperationTest : public OperationTest {
 protected:
  ShareOperationTest() {
    holds_lock_ = false;
    Prepare();
  }

  static void Prepare() {
    SaveList({Record("/photo/a", "d"), Record("/music"), Record("/photo/b")});
  }

  // Expects `operation` to fail without any effect and to log the failure of `condition`.
  void ExpectRefused(const std::string& function, const std::string& condition,
                     const std::string& reason, const Action& operation) {
    Begin();
    EXPECT_EQ(FailureOf(operation), "120 " + reason);
    EXPECT_THAT(effects_->All(), IsEmpty());
    ASSERT_EQ(fake::Logs().size(), 1U);
    EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
              fake::AnyLine(fake::LogHead("index_mgr", 1, function)) + "Failed [" + condition +
                  "], reason: " + reason);
    End();
  }

  // The engine's last command, without what all commands have.
  static std::string LastRequest() {
    const Json::Value request = fake::JsonRequests().back();
    return request["command"].asString() + " " + toString(request["data"]);
  }
  static std::string Removed(const std::string& path) {
    return "call HLIBCExec(/bin/rm, -rf, " + path + ")";
  }
};

// ---- DeleteTARNotifydCfg

TEST_F(ShareOperationTest, AMonitorConfigurationIsWithdrawn) {
  Begin();
  DeleteTARNotifydCfg("photo");
  EXPECT_THAT(effects_->All(), ElementsAre(Unmonitored("photo")));
}

TEST_F(ShareOperationTest, AMonitorThatRefusesIsLoggedAndFails) {
  fake::FailCall("MonitorQueue::Delete", 1, {-1, EIO, 0});
  Begin();
  EXPECT_EQ(FailureOf([] { DeleteTARNotifydCfg("photo"); }),
            "502 MonitorQueue::Delete failed, share=photo");
  ASSERT_EQ(fake::Logs().size(), 1U);
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("index_mgr", 1, "DeleteTARNotifydCfg")) +
                "Failed [!MonitorQueue::Delete(share.GetQueuePath(), kAppName, "
                "MONITOR_QUEUE_TYPE_APPLICATION)], reason: MonitorQueue::Delete failed, "
                "share=photo [err: Input/output error]");
  EXPECT_EQ(FailureOf([] { DeleteTARNotifydCfg("gone"); }).substr(0, 3), "800");
}

// ---- CleanShareIndexData

class CleanShareIndexDataTest : public ShareOperationTest {
 protected:
  const std::string gone_ = "/volume9/gone";  // where a share was that the platform has forgotten
};

TEST_F(CleanShareIndexDataTest, RemovesQueueSnapshotAndIndexAndForgetsTheStatus) {
  test::WriteFile(kFileIndexStatusCfgPath, R"({"share":{"gone":3,"photo":1}})");
  Begin();
  CleanShareIndexData("gone", gone_);
  EXPECT_THAT(effects_->All(),
              ElementsAre(Removed(fake::QueuePath(gone_)), Removed(fake::QueuePath(gone_) + ".tmp"),
                          Removed(fake::IndexPath(gone_)), kBecomeRoot,
                          R"(status = {"share":{"photo":1}})"));
}

TEST_F(CleanShareIndexDataTest, ResultsOfTheRemovalAreIgnored) {
  fake::FailEveryCall("HLIBCExec", {-1, ENOENT, 0});
  Begin();
  EXPECT_EQ(FailureOf([&] { CleanShareIndexData("gone", gone_); }), "");
  EXPECT_EQ(effects_->All().size(), 5U);
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(CleanShareIndexDataTest, AnUnknownQueueRemovesNothing) {
  fake::FailCall("FILEIDXQueuePathCompose");
  Begin();
  EXPECT_EQ(FailureOf([&] { CleanShareIndexData("gone", gone_); }),
            "502 FILEIDXQueuePathCompose failed, share_path=/volume9/gone");
  EXPECT_THAT(effects_->All(), IsEmpty());
  ASSERT_EQ(fake::Logs().size(), 1U);
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("index_mgr", 1, "CleanShareIndexData")) +
                "Failed [0 > FILEIDXQueuePathCompose(share_path.c_str(), path, sizeof(path))], "
                "reason: FILEIDXQueuePathCompose failed, share_path=/volume9/gone");
}

TEST_F(CleanShareIndexDataTest, AnUnknownIndexLeavesTheQueueRemoved) {
  fake::FailCall("FILEIDXDBPathCompose");
  Begin();
  EXPECT_EQ(FailureOf([&] { CleanShareIndexData("gone", gone_); }),
            "502 FILEIDXDBPathCompose failed, share_path=/volume9/gone");
  EXPECT_EQ(effects_->All().size(), 2U);
  ASSERT_EQ(fake::Logs().size(), 1U);
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("index_mgr", 1, "CleanShareIndexData")) +
                "Failed [0 > FILEIDXDBPathCompose(share_path.c_str(), path, sizeof(path))], "
                "reason: FILEIDXDBPathCompose failed, share_path=/volume9/gone");
}

TEST_F(CleanShareIndexDataTest, PlacesThatMustNotBeRemovedAreRefused) {
  for (const char* path : {"", "/", "//", "queue/gone", "-rf"}) {
    fake::SetQueuePath(gone_, path);
    Begin();
    EXPECT_EQ(FailureOf([&] { CleanShareIndexData("gone", gone_); }),
              std::string("120 Not a path to remove: ") + path);
    EXPECT_THAT(effects_->All(), IsEmpty());
    End();
  }
  fake::SetQueuePath(gone_, "/queue");
  fake::SetIndexPath(gone_, "/");
  Begin();
  EXPECT_EQ(FailureOf([&] { CleanShareIndexData("gone", gone_); }), "120 Not a path to remove: /");
  EXPECT_THAT(effects_->All(), ElementsAre(Removed("/queue"), Removed("/queue.tmp")));
}

TEST_F(CleanShareIndexDataTest, APathWithANulByteIsRefused) {
  Begin();
  EXPECT_EQ(FailureOf([&] {
              CleanShareIndexData("photo", volume_ + "/photo" + std::string("\0x", 2));
            }).substr(0, 3),
            "502");
  EXPECT_THAT(effects_->All(), IsEmpty());
}

// ---- ShareRename

class ShareRenameTest : public ShareOperationTest {
 protected:
  ShareRenameTest() {
    watched_queues_["pictures"] = "pictures";
    Rename();
  }
  // The platform has given the share its new name already.
  void Rename() const {
    fake::RemoveShare("photo");
    fake::AddShare("pictures", volume_ + "/pictures");
  }
  std::string RenameLine() const {
    return EventLine(0x100, volume_ + "/pictures", volume_ + "/photo", Json::Value());
  }
};

TEST_F(ShareRenameTest, DoesAllOfItInThisOrder) {
  Begin();
  EXPECT_EQ(FailureOf([] { ShareRename("photo", "pictures"); }), "");
  EXPECT_THAT(
      effects_->All(),
      ElementsAre(kBecomeRoot,
                  Saved({Record("/pictures/a", "d"), Record("/music"), Record("/pictures/b")}),
                  "engine index_config_set fileindex_photo", "queue pictures = " + RenameLine()));
  EXPECT_EQ(LastRequest(), R"(index_config_set {"data":{"id":"fileindex_pictures","path":")" +
                               fake::IndexPath(volume_ + "/pictures") +
                               R"("},"id":"fileindex_photo"})");
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(ShareRenameTest, AShareWithoutFoldersIsRenamedAllTheSame) {
  SaveList({Record("/music")});
  test::WriteFile(kFileIndexFoldersCfgPath, StoredList() + " ");
  Begin();
  ShareRename("photo", "pictures");
  EXPECT_THAT(effects_->All(), ElementsAre(kBecomeRoot, Saved({Record("/music")}),
                                           "engine index_config_set fileindex_photo",
                                           "queue pictures = " + RenameLine()));
}

TEST_F(ShareRenameTest, SharesWhoseNamesBeginTheSameKeepTheirs) {
  SaveList({Record("/photos/a"), Record("/photo"), Record("/phot"), Record("/music/photo")});
  Begin();
  ShareRename("photo", "pictures");
  EXPECT_EQ(StoredList(), toString(Array({Record("/photos/a"), Record("/pictures"), Record("/phot"),
                                          Record("/music/photo")})));
}

TEST_F(ShareRenameTest, OnlyTheShareItselfIsExchangedInItsPath) {
  const std::string place = volume_ + "/pictures/pictures";
  fake::AddShare("pictures", place);
  Begin();
  ShareRename("photo", "pictures");
  EXPECT_EQ(test::ReadFile(fake::QueuePath(place)),
            EventLine(0x100, place, volume_ + "/pictures/photo", Json::Value()));
}

TEST_F(ShareRenameTest, ANameIsMissing) {
  ExpectRefused("ShareRename", "share_from.empty()", "Missing share_from",
                [] { ShareRename("", ""); });
  ExpectRefused("ShareRename", "share_to.empty()", "Missing share_to",
                [] { ShareRename("photo", ""); });
  test::WriteFile(kFileIndexFoldersCfgPath, "[");
  EXPECT_EQ(FailureOf([] { ShareRename("", ""); }).substr(0, 3), "504");
}

TEST_F(ShareRenameTest, ANewNameWithANulByteIsRefusedBeforeItIsSaved) {
  Begin();
  const std::string name("pic\0tures", 9);
  EXPECT_EQ(FailureOf([&] { ShareRename("photo", name); }), "120 /" + name);
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(ShareRenameTest, AShareThatThePlatformDoesNotKnowLeavesTheListSaved) {
  Begin();
  EXPECT_EQ(FailureOf([] { ShareRename("music", "tunes"); }).substr(0, 3), "800");
  EXPECT_THAT(effects_->All(),
              ElementsAre(kBecomeRoot,
                          Saved({Record("/photo/a", "d"), Record("/tunes"), Record("/photo/b")})));
}

TEST_F(ShareRenameTest, EverySingleFailureEndsIt) {
  ExpectEveryFailureToEndIt(
      [this] {
        Prepare();
        Rename();
      },
      [] { ShareRename("photo", "pictures"); });
}

// ---- ShareMigrate

class ShareMigrateTest : public ShareOperationTest {
 protected:
  void Migrate(const std::string& share) {
    ShareMigrate(share, "/volume9/" + share, volume_ + "/" + share);
  }
};

TEST_F(ShareMigrateTest, DoesAllOfItInThisOrder) {
  Begin();
  EXPECT_EQ(FailureOf([&] { Migrate("photo"); }), "");
  EXPECT_THAT(effects_->All(),
              ElementsAre("engine index_config_set fileindex_photo",
                          "queue photo = " + EventLine(0x100, volume_ + "/photo", "/volume9/photo",
                                                       Json::Value())));
  EXPECT_EQ(LastRequest(), R"(index_config_set {"data":{"path":")" +
                               fake::IndexPath(volume_ + "/photo") +
                               R"("},"id":"fileindex_photo"})");
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(ShareMigrateTest, AShareWithoutFoldersIsLeftAlone) {
  SaveList({Record("/photo/a")});
  Begin();
  Migrate("music");
  Migrate("gone");
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(ShareMigrateTest, AnArgumentIsMissing) {
  ExpectRefused("ShareMigrate", "share_name.empty()", "Missing share_name",
                [] { ShareMigrate("", "", ""); });
  ExpectRefused("ShareMigrate", "path_from.empty()", "Missing path_from",
                [] { ShareMigrate("photo", "", ""); });
  ExpectRefused("ShareMigrate", "path_to.empty()", "Missing path_to",
                [] { ShareMigrate("photo", "/a", ""); });
  test::WriteFile(kFileIndexFoldersCfgPath, "[");
  EXPECT_EQ(FailureOf([] { ShareMigrate("", "", ""); }).substr(0, 3), "504");
}

TEST_F(ShareMigrateTest, EverySingleFailureEndsIt) {
  ExpectEveryFailureToEndIt(&Prepare, [this] { Migrate("photo"); });
}

// ---- ShareCheckRecycle

class ShareCheckRecycleTest : public ShareOperationTest {};

TEST_F(ShareCheckRecycleTest, ARecycleBinIsQueued) {
  SaveList({});
  test::MakeDirs(volume_ + "/photo/#recycle");
  Begin();
  ShareCheckRecycle("photo");
  EXPECT_THAT(effects_->All(), ElementsAre("queue photo = " + ReindexLine("/photo/#recycle")));
}

TEST_F(ShareCheckRecycleTest, WithoutARecycleBinNothingIsDone) {
  Begin();
  ShareCheckRecycle("photo");
  test::WriteFile(volume_ + "/photo/#recycle", "");
  ShareCheckRecycle("photo");
  ASSERT_EQ(unlink((volume_ + "/photo/#recycle").c_str()), 0);
  ASSERT_EQ(symlink((volume_ + "/photo/a").c_str(), (volume_ + "/photo/#recycle").c_str()), 0);
  ShareCheckRecycle("photo");
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(ShareCheckRecycleTest, AnUnknownShareFails) {
  EXPECT_EQ(FailureOf([] { ShareCheckRecycle("gone"); }).substr(0, 3), "800");
  EXPECT_EQ(FailureOf([] { ShareCheckRecycle(""); }).substr(0, 3), "800");
}

TEST_F(ShareCheckRecycleTest, EverySingleFailureEndsIt) {
  ExpectEveryFailureToEndIt([this] { test::MakeDirs(volume_ + "/photo/#recycle"); },
                            [] { ShareCheckRecycle("photo"); });
}

// ---- SharePause and ShareResume

class SharePauseTest : public ShareOperationTest {
 protected:
  static void PreparePaused() {
    SaveList(
        {Paused(Record("/photo/a", "d")), Paused(Record("/music")), Paused(Record("/photo/b"))});
  }
};

TEST_F(SharePauseTest, PauseDoesAllOfItInThisOrder) {
  Begin();
  EXPECT_EQ(FailureOf([] { SharePause("photo"); }), "");
  EXPECT_THAT(effects_->All(), ElementsAre(Worker("worker_delete", "photo"), Unmonitored("photo"),
                                           "engine index_pause fileindex_photo", kBecomeRoot,
                                           Saved({Paused(Record("/photo/a", "d")), Record("/music"),
                                                  Paused(Record("/photo/b"))})));
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(SharePauseTest, ResumeDoesAllOfItInThisOrder) {
  PreparePaused();
  Begin();
  EXPECT_EQ(FailureOf([] { ShareResume("photo"); }), "");
  EXPECT_THAT(
      effects_->All(),
      ElementsAre("engine index_resume fileindex_photo",
                  Monitored("photo", {"/photo/a", "/photo/b"}), Worker("worker_create", "photo"),
                  kBecomeRoot,
                  Saved({Record("/photo/a", "d"), Paused(Record("/music")), Record("/photo/b")})));
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(SharePauseTest, AShareWithoutFoldersIsLeftAlone) {
  SaveList({Record("/photo/a")});
  Begin();
  for (const char* share : {"music", "gone"}) {
    SharePause(share);
    ShareResume(share);
  }
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(SharePauseTest, TheNameIsMissing) {
  test::WriteFile(kFileIndexFoldersCfgPath, "[");  // not even looked at
  ExpectRefused("SharePause", "share_name.empty()", "Missing share name", [] { SharePause(""); });
  ExpectRefused("ShareResume", "share_name.empty()", "Missing share name", [] { ShareResume(""); });
}

TEST_F(SharePauseTest, APauseThatTheEngineRefusesHasStoppedTheWorkerAndTheMonitor) {
  Begin();
  effects_->Refuse("index_pause", 777);
  EXPECT_EQ(FailureOf([] { SharePause("photo"); }), "777 Request failed, msg=no");
  EXPECT_THAT(effects_->All(), ElementsAre(Worker("worker_delete", "photo"), Unmonitored("photo"),
                                           "engine index_pause fileindex_photo"));
}

TEST_F(SharePauseTest, WithoutADaemonNothingIsPausedAndNothingSavedAsResumed) {
  PreparePaused();
  Begin();
  daemon_.reset();
  EXPECT_EQ(FailureOf([] { SharePause("photo"); }).substr(0, 3), "502");
  EXPECT_THAT(effects_->All(), IsEmpty());
  EXPECT_EQ(FailureOf([] { ShareResume("photo"); }).substr(0, 3), "502");
  EXPECT_EQ(effects_->All().size(), 2U);
}

TEST_F(SharePauseTest, EverySingleFailureEndsThePause) {
  ExpectEveryFailureToEndIt(&Prepare, [] { SharePause("photo"); });
}

TEST_F(SharePauseTest, EverySingleFailureEndsTheResumption) {
  ExpectEveryFailureToEndIt(&PreparePaused, [] { ShareResume("photo"); });
}

// ---- ShareClearPaused

class ShareClearPausedTest : public ShareOperationTest {
 protected:
  void Clear() { ShareClearPaused("photo", volume_ + "/photo"); }

  Texts Cleared(const std::vector<Json::Value>& left) const {
    return {Removed(QueueOf("photo")),
            Removed(QueueOf("photo") + ".tmp"),
            Removed(fake::IndexPath(volume_ + "/photo")),
            kBecomeRoot,
            R"(status = {"share":{}})",
            "engine index_delete fileindex_photo",
            kBecomeRoot,
            Saved(left)};
  }
};

TEST_F(ShareClearPausedTest, DoesAllOfItInThisOrder) {
  test::WriteFile(kFileIndexStatusCfgPath, R"({"share":{"photo":3}})");
  Begin();
  EXPECT_EQ(FailureOf([&] { Clear(); }), "");
  EXPECT_THAT(effects_->All(), ElementsAreArray(Cleared({Record("/music")})));
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(ShareClearPausedTest, TheLastShareStopsTheServices) {
  SaveList({Paused(Record("/photo/a"))});
  test::WriteFile(kFileIndexStatusCfgPath, R"({"share":{"photo":3}})");
  fake::RemoveShare("photo");  // its volume is gone
  Begin();
  Clear();
  EXPECT_THAT(effects_->All(), ElementsAreArray(Cleared({}) + ServicesOff()));
}

TEST_F(ShareClearPausedTest, AShareWithoutFoldersIsClearedAllTheSame) {
  const std::vector<Json::Value> records = {Record("/music")};
  test::WriteFile(kFileIndexFoldersCfgPath, " " + toString(Array(records)));
  test::WriteFile(kFileIndexStatusCfgPath, R"({"share":{"photo":3}})");
  Begin();
  Clear();
  EXPECT_THAT(effects_->All(), ElementsAreArray(Cleared(records)));
}

TEST_F(ShareClearPausedTest, AnArgumentIsMissing) {
  test::WriteFile(kFileIndexFoldersCfgPath, "[");  // not even looked at
  ExpectRefused("ShareClearPaused", "share_name.empty()", "Missing share name",
                [] { ShareClearPaused("", ""); });
  ExpectRefused("ShareClearPaused", "share_path.empty()", "Missing share path",
                [] { ShareClearPaused("photo", ""); });
}

TEST_F(ShareClearPausedTest, AListThatCannotBeLoadedKeepsEverything) {
  test::WriteFile(kFileIndexFoldersCfgPath, "[");
  Begin();
  EXPECT_EQ(FailureOf([&] { Clear(); }), "504 Cannot load json: " + kFileIndexFoldersCfgPath);
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(ShareClearPausedTest, EverySingleFailureEndsIt) {
  ExpectEveryFailureToEndIt(
      [] {
        SaveList({Paused(Record("/photo/a"))});
        test::WriteFile(kFileIndexStatusCfgPath, R"({"share":{"photo":3}})");
        fake::SetSpotlight(true);
      },
      [this] { Clear(); });
}

}  // namespace
}  // namespace quarry::fileindex
