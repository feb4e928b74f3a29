// FolderAdd and FolderSet, by the whole sequence of what they do.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cerrno>
#include <string>
#include <utility>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/index_mgr.h"
#include "tests/fileindex/operation_fixture.h"

namespace quarry::fileindex {
namespace {

using ::testing::ElementsAreArray;
using ::testing::IsEmpty;

class FolderUpsertTest : public OperationTest {};

// ---- What is done when all goes well

class FolderAddTest : public FolderUpsertTest {
 protected:
  const std::vector<Json::Value> records_ = {Record("/photo/b", "d"), Record("/music", "a"),
                                             Record("/photo/a", "dp")};

  void Add() { FolderAdd(Array(records_), false); }

  // All that Add() does to an empty system.
  Texts AllOfIt() const {
    return ServicesOn() +
           Texts{"engine index_create fileindex_music",
                 Monitored("music", {"/music"}),
                 "engine index_create fileindex_photo",
                 Monitored("photo", {"/photo/b", "/photo/a"}),
                 kBecomeRoot,
                 Saved(records_),
                 Told("music"),
                 Told("photo"),
                 "queue photo = " + Line("/photo/b", "davp"),
                 "queue music = " + Line("/music", "davp"),
                 "queue photo = " + Line("/photo/b", "davp") + Line("/photo/a", "davp")};
  }
  // What of it comes before an effect that begins so, and that effect with `included`.
  Texts Until(const std::string& beginning, bool included) const {
    Texts some;
    for (const std::string& effect : AllOfIt()) {
      const bool last = effect.compare(0, beginning.size(), beginning) == 0;
      if (!last || included) some.push_back(effect);
      if (last) return some;
    }
    ADD_FAILURE() << "no effect begins with " << beginning;
    return some;
  }
};

TEST_F(FolderAddTest, DoesAllOfItInThisOrder) {
  Begin();
  EXPECT_EQ(FailureOf([&] { Add(); }), "");
  EXPECT_THAT(effects_->All(), ElementsAreArray(AllOfIt()));
  EXPECT_EQ(test::FileMode(kFileIndexFoldersCfgPath), 0644U);
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(FolderAddTest, CreatesIndexesOnlyForSharesThatHadNoFolder) {
  SaveList({Record("/photo/a", "v")});
  Begin();
  FolderAdd(Array({Record("/photo/b"), Record("/music")}), false);
  EXPECT_THAT(effects_->All(),
              ElementsAreArray(
                  ServicesOn() +
                  Texts{"engine index_create fileindex_music", Monitored("music", {"/music"}),
                        Monitored("photo", {"/photo/a", "/photo/b"}), kBecomeRoot,
                        Saved({Record("/photo/a", "v"), Record("/photo/b"), Record("/music")}),
                        Told("music"), Told("photo"), "queue photo = " + Line("/photo/b", "davp"),
                        "queue music = " + Line("/music", "davp")}));
}

TEST_F(FolderAddTest, AnEmptyListStillStartsServicesAndSaves) {
  SaveList({Record("/photo/a")});
  test::WriteFile(kFileIndexFoldersCfgPath, " " + StoredList());  // the save shows in the text
  Begin();
  FolderAdd(Array({}), false);
  EXPECT_THAT(effects_->All(),
              ElementsAreArray(ServicesOn() + Texts{kBecomeRoot, Saved({Record("/photo/a")})}));
}

TEST_F(FolderAddTest, AllKindsAreQueuedWhateverTheFolderWants) {
  Begin();
  FolderAdd(Array({Record("/photo/a", ""), Record("/photo/a/deep", "")}), false);
  EXPECT_EQ(effects_->All().back(),
            "queue photo = " + Line("/photo/a", "davp") + Line("/photo/a/deep", "davp"));
}

TEST_F(FolderAddTest, UpdaterModeQueuesNothing) {
  Begin();
  FolderAdd(Array(records_), true);
  EXPECT_THAT(effects_->All(), ElementsAreArray(Until("queue photo", false)));
}

TEST_F(FolderAddTest, UpdaterModeAcceptsAPathThatCannotBeIndexed) {
  Begin();
  FolderAdd(Array({Record("/photo/gone")}), true);
  EXPECT_THAT(
      effects_->All(),
      ElementsAreArray(ServicesOn() + Texts{"engine index_create fileindex_photo",
                                            Monitored("photo", {"/photo/gone"}), kBecomeRoot,
                                            Saved({Record("/photo/gone")}), Told("photo")}));
}

TEST_F(FolderAddTest, CarriesEveryMemberOfARecord) {
  Json::Value record = Record("/photo/a");
  record["privileged"] = true;
  record["paused"] = true;
  record["volume_to_be_clean"] = "/volume9";
  record["unknown"] = 1;
  Begin();
  FolderAdd(Array({record}), false);
  record.removeMember("unknown");
  EXPECT_EQ(StoredList(), toString(Array({record})));
}

TEST_F(FolderAddTest, APendingReindexTakesTheEventsPlace) {
  const std::string waiting = R"({"event":65536,"path":")" + volume_ + "/photo\"}\n";
  test::WriteFile(QueueOf("photo"), waiting);
  Begin();
  EXPECT_EQ(FailureOf([&] { FolderAdd(Array({Record("/photo/a")}), false); }), "");
  EXPECT_EQ(effects_->All().back(), Told("photo"));
  EXPECT_EQ(test::ReadFile(QueueOf("photo")), waiting);
}

TEST_F(FolderAddTest, TheIndexIsMadeWhereThePlatformSays) {
  Begin();
  FolderAdd(Array({Record("/photo/a")}), false);
  ASSERT_EQ(fake::JsonRequests().size(), 1U);
  EXPECT_EQ(fake::JsonRequests()[0]["data"]["path"].asString(),
            fake::IndexPath(volume_ + "/photo"));
}

class FolderSetTest : public FolderUpsertTest {};

TEST_F(FolderSetTest, ReplacesAndQueuesTheKindsThatChanged) {
  SaveList({Record("/photo/a", "dv"), Record("/photo/b")});
  Begin();
  EXPECT_EQ(FailureOf([] { FolderSet(Array({Record("/photo/a", "dp")}), false); }), "");
  EXPECT_THAT(effects_->All(),
              ElementsAreArray(ServicesOn() +
                               Texts{Monitored("photo", {"/photo/b", "/photo/a"}), kBecomeRoot,
                                     Saved({Record("/photo/b"), Record("/photo/a", "dp")}),
                                     Told("photo"), "queue photo = " + Line("/photo/a", "vp")}));
}

TEST_F(FolderSetTest, AnUnchangedRecordIsSavedAndQueuedWithNoKind) {
  SaveList({Record("/photo/a", "dv"), Record("/photo/b")});
  Begin();
  FolderSet(Array({Record("/photo/a", "dv")}), false);
  EXPECT_EQ(StoredList(), toString(Array({Record("/photo/b"), Record("/photo/a", "dv")})));
  EXPECT_EQ(effects_->All().back(), "queue photo = " + Line("/photo/a", ""));
}

TEST_F(FolderSetTest, InsertsWhatIsNotThereWithoutCreatingAnIndex) {
  SaveList({Record("/photo/a", "dv")});
  Begin();
  FolderSet(Array({Record("/photo/a/deep", "d"), Record("/music", "")}), false);
  EXPECT_THAT(effects_->All(),
              ElementsAreArray(ServicesOn() +
                               Texts{Monitored("music", {"/music"}),
                                     Monitored("photo", {"/photo/a", "/photo/a/deep"}), kBecomeRoot,
                                     Saved({Record("/photo/a", "dv"), Record("/photo/a/deep", "d"),
                                            Record("/music", "")}),
                                     Told("music"), Told("photo"),
                                     "queue photo = " + Line("/photo/a/deep", "v"),
                                     "queue music = " + Line("/music", "davp")}));
}

TEST_F(FolderSetTest, EachElementIsComparedWithWhatTheOnesBeforeItMade) {
  Begin();
  FolderSet(Array({Record("/photo/a", "d"), Record("/photo/a", "da")}), false);
  EXPECT_EQ(StoredList(), toString(Array({Record("/photo/a", "da")})));
  EXPECT_EQ(effects_->All().back(),
            "queue photo = " + Line("/photo/a", "davp") + Line("/photo/a", "a"));
}

TEST_F(FolderSetTest, UpdaterModeQueuesNothing) {
  SaveList({Record("/photo/a", "dv")});
  Begin();
  FolderSet(Array({Record("/photo/gone", "d")}), true);
  EXPECT_EQ(effects_->All().back(), Told("photo"));
}

// ---- Refusals: nothing outside is touched

class FolderRefusalTest : public FolderUpsertTest {
 protected:
  void ExpectRefused(const Json::Value& list, bool create, const std::string& failure,
                     const Texts& logs) {
    Begin();
    const std::string before = StoredList();
    EXPECT_EQ(FailureOf([&] { create ? FolderAdd(list, false) : FolderSet(list, false); }),
              failure);
    EXPECT_THAT(effects_->All(), IsEmpty());
    EXPECT_EQ(StoredList(), before);
    EXPECT_EQ(fake::Logs().size(), logs.size());
    for (size_t i = 0; i < std::min(logs.size(), fake::Logs().size()); ++i) {
      const std::string log = fake::Logs()[i];
      EXPECT_EQ(fake::AnyLine(log.substr(0, log.find(" [err: "))), logs[i]);
    }
    End();
  }
  static std::string Logged(const std::string& text) {
    return fake::AnyLine(fake::LogHead("index_mgr", 1, "FolderUpsert")) + text;
  }
};

TEST_F(FolderRefusalTest, AListThatIsNoArray) {
  for (const char* text : {R"({"path":"/photo/a"})", "null", "\"x\"", "5"}) {
    Json::Value list;
    ASSERT_TRUE(fromString(list, text));
    for (bool create : {true, false}) {
      ExpectRefused(list, create, std::string("120 ") + text,
                    {Logged(std::string("Failed [!folder_list.isArray()], reason: ") + text)});
    }
  }
}

TEST_F(FolderRefusalTest, AMalformedRecordBehindAGoodOne) {
  SaveList({Record("/photo/b")});
  for (bool create : {true, false}) {
    ExpectRefused(Array({Record("/photo/a"), 5}), create, "120 Not an object, data=5", {});
    Json::Value record = Record("/music");
    record.removeMember("video");
    ExpectRefused(Array({Record("/photo/a"), record}), create,
                  "120 Missing property: video, data=" + toString(record), {});
  }
}

TEST_F(FolderRefusalTest, APathThatCannotBeIndexed) {
  for (bool create : {true, false}) {
    for (const char* path : {"/photo/gone", "/photo/a/", "/photo//a", "/photo/a/../b"}) {
      ExpectRefused(
          Array({Record("/music"), Record(path)}), create,
          std::string("903 Path cannot index: ") + path,
          {Logged("Failed [!CanPathBeIndexed(folder_new->GetPath()) && !updater_mode], reason: "
                  "Path cannot index: " +
                  std::string(path))});
    }
  }
}

TEST_F(FolderRefusalTest, AFolderThatIsThereAlready) {
  SaveList({Record("/photo/a", "d")});
  const std::string logged = Logged(
      "Failed [create && folder_mgr.HasFolder(folder_new->GetPath())], reason: "
      "Duplicated ID: ");
  ExpectRefused(Array({Record("/music"), Record("/photo/a")}), true, "901 Duplicated ID: /photo/a",
                {logged + "/photo/a"});
  ExpectRefused(Array({Record("/music"), Record("/music")}), true, "901 Duplicated ID: /music",
                {logged + "/music"});
}

TEST_F(FolderRefusalTest, EachCheckComesBeforeTheNext) {
  std::vector<Json::Value> records = {Record("/photo/gone"), Record("/photo/a")};
  for (int i = 2; i < 1000; ++i) records.push_back(Record("/photo/" + std::to_string(i)));
  SaveList(records);
  fake::SetQuota(false, 0x2900);
  const auto failure_of = [](const Json::Value& list) {
    return FailureOf([&] { FolderAdd(list, false); }).substr(0, 3);
  };
  Begin();
  EXPECT_EQ(failure_of(Json::Value(5)), "120");
  EXPECT_EQ(failure_of(Array({Record("/photo/gone")})), "903");
  EXPECT_EQ(failure_of(Array({Record("/photo/a")})), "901");
  EXPECT_EQ(failure_of(Array({Record("/photo/b")})), "900");
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(FolderRefusalTest, UpdaterModeAcceptsNothingElse) {
  SaveList({Record("/photo/gone")});
  Begin();
  EXPECT_EQ(FailureOf([] { FolderAdd(Array({Record("/photo/gone")}), true); }),
            "901 Duplicated ID: /photo/gone");
  fake::SetQuota(false, 0x2400);
  for (const auto& operation : {&FolderAdd, &FolderSet}) {
    EXPECT_EQ(FailureOf([&] { operation(Array({Record("/photo/a")}), true); }),
              "1003 Share (photo) space not enough");
  }
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(FolderRefusalTest, OneFolderTooMany) {
  std::vector<Json::Value> records;
  for (int i = 0; i < 1000; ++i) records.push_back(Record("/photo/" + std::to_string(i)));
  SaveList(records);
  for (bool create : {true, false}) {
    ExpectRefused(Array({Record("/photo/a")}), create, "900 ",
                  {fake::AnyLine(fake::LogHead("folder_mgr", 76, "Upsert")) +
                   "Failed [folders_.size() > kFileIndexFoldersMax], reason: "});
  }
}

TEST_F(FolderRefusalTest, AVolumeThatIsFull) {
  fake::SetQuota(false, 0x2900);
  for (bool create : {true, false}) {
    ExpectRefused(Array({Record("/photo/a")}), create, "1003 Share (photo) space not enough",
                  {Logged("Failed [!share.IsSpaceEnough()], reason: "
                          "Share (photo) space not enough")});
  }
}

TEST_F(FolderRefusalTest, AnUnknownShareAndAPathOfNoShare) {
  Begin();
  EXPECT_EQ(FailureOf([] { FolderAdd(Array({Record("/gone/a")}), true); }).substr(0, 3), "800");
  EXPECT_EQ(FailureOf([] { FolderAdd(Array({Record("photo/a")}), true); }), "120 photo/a");
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(FolderRefusalTest, APathWithANulByteEvenInUpdaterMode) {
  Begin();
  for (const std::string& path : {std::string("/photo/a\0b", 10), std::string("/photo\0/a", 9)}) {
    for (bool updater_mode : {true, false}) {
      EXPECT_NE(FailureOf([&] { FolderAdd(Array({Record(path)}), updater_mode); }), "");
      EXPECT_NE(FailureOf([&] { FolderSet(Array({Record(path)}), updater_mode); }), "");
    }
  }
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(FolderRefusalTest, AShareThatMayHaveNoIndex) {
  fake::AddShare({"photo", volume_ + "/photo", false, true});
  Begin();
  EXPECT_EQ(FailureOf([] { FolderAdd(Array({Record("/photo/a")}), false); }),
            "903 Path cannot index: /photo/a");
  EXPECT_THAT(effects_->All(), IsEmpty());
}

TEST_F(FolderRefusalTest, AListThatCannotBeLoaded) {
  for (const auto& [text, failure] : std::vector<std::pair<std::string, std::string>>{
           {"[", "504 Cannot load json: " + kFileIndexFoldersCfgPath},
           {"{}", "120 Not an array, data={}"},
           {"[5]", "120 Not an object, data=5"}}) {
    test::WriteFile(kFileIndexFoldersCfgPath, text);
    Begin();
    EXPECT_EQ(FailureOf([] { FolderAdd(Array({Record("/photo/a")}), false); }), failure);
    EXPECT_THAT(effects_->All(), IsEmpty());
    EXPECT_EQ(StoredList(), text);
    End();
  }
}

TEST_F(FolderRefusalTest, ALockThatCannotBeHad) {
  test::MakeDirs(kFolderLock);
  test::WriteFile(kFileIndexFoldersCfgPath, "[");  // looked at under the lock only
  Begin();
  std::string failure;
  try {
    FolderAdd(Array({Record("/photo/a")}), false);
  } catch (const Error& error) {
    failure = std::to_string(error.code());
  }
  EXPECT_EQ(failure, "506");
  EXPECT_THAT(effects_->All(), IsEmpty());
}

// ---- Failures on the way: what was done stays, and nothing else follows

class FolderAddFailureTest : public FolderAddTest {
 protected:
  void ExpectFailure(const std::string& failure, const Texts& effects) {
    EXPECT_EQ(FailureOf([&] { Add(); }), failure);
    EXPECT_THAT(effects_->All(), ElementsAreArray(effects));
  }
};

TEST_F(FolderAddFailureTest, ServicesThatFailAreLoggedAndAllElseIsDone) {
  for (const char* call : {"HLIBServiceRestart", "HLIBServiceStart", "HLIBServicectlStart"}) {
    fake::FailCall(call);
  }
  Begin();
  ExpectFailure("", AllOfIt());
  EXPECT_EQ(fake::LogsWith("(SetupRelatedServices)").size(), 3U);
}

TEST_F(FolderAddFailureTest, TheFirstIndexCannotBeCreated) {
  Begin();
  effects_->Refuse("index_create", 777);
  ExpectFailure("777 Request failed, msg=no", Until("engine index_create", true));
  EXPECT_EQ(StoredList(), "");
}

TEST_F(FolderAddFailureTest, TheEngineDoesNotAnswer) {
  fake::FailCall("DomainSockConnection::Connect", 2);
  Begin();
  ExpectFailure("913 Connect failed", Until("engine index_create fileindex_photo", false));
}

TEST_F(FolderAddFailureTest, TheMonitorRefusesTheFirstShare) {
  fake::FailCall("MonitorQueue::Upsert", 1);
  Begin();
  ExpectFailure("502 MonitorQueue::Upsert failed, share=music",
                Until("call MonitorQueue::Upsert", true));
  EXPECT_EQ(StoredList(), "");
}

TEST_F(FolderAddFailureTest, TheMonitorRefusesTheSecondShare) {
  fake::FailCall("MonitorQueue::Upsert", 2);
  Begin();
  ExpectFailure("502 MonitorQueue::Upsert failed, share=photo", Until(kBecomeRoot, false));
  EXPECT_EQ(fake::MonitorQueues().size(), 1U);
}

TEST_F(FolderAddFailureTest, RootCannotBeBecome) {
  fake::FailCall("ResetCredentialsByName");
  Begin();
  EXPECT_EQ(FailureOf([&] { Add(); }).substr(0, 3), "503");
  EXPECT_THAT(effects_->All(), ElementsAreArray(Until(kBecomeRoot, true)));
}

TEST_F(FolderAddFailureTest, TheListCannotBeSaved) {
  SaveList({});
  Begin();
  fake::FailEverySystemCall("rename", EIO);
  ExpectFailure("505 " + kFileIndexFoldersCfgPath, Until(kBecomeRoot, true));
  EXPECT_EQ(StoredList(), "[]");
}

TEST_F(FolderAddFailureTest, TheModeOfTheListCannotBeSet) {
  Begin();
  fake::FailEverySystemCall("chmod", EPERM);
  ExpectFailure("502 " + kFileIndexFoldersCfgPath, Until("list = ", true));
}

TEST_F(FolderAddFailureTest, TheDaemonIsNotThere) {
  Begin();
  daemon_.reset();
  EXPECT_EQ(FailureOf([&] { Add(); }).substr(0, 16), "502 write failed");
  EXPECT_THAT(effects_->All(), ElementsAreArray(Until("list = ", true)));
}

TEST_F(FolderAddFailureTest, TheDaemonGoesAwayAfterTheFirstShare) {
  vanish_after_command_ = true;
  Begin();
  EXPECT_EQ(FailureOf([&] { Add(); }).substr(0, 16), "502 write failed");
  EXPECT_THAT(effects_->All(), ElementsAreArray(Until("daemon ", true)));
}

TEST_F(FolderAddFailureTest, AnEventCannotBeQueued) {
  test::WriteFile(QueueOf("music"), "nonsense\n");
  Begin();
  EXPECT_EQ(FailureOf([&] { Add(); }).substr(0, 3), "906");
  EXPECT_THAT(effects_->All(),
              ElementsAreArray(Until("queue photo", true) +
                               Texts{kBecomeRoot, R"(status = {"share":{"music":1}})"}));
}

TEST_F(FolderAddFailureTest, EverySingleFailureEndsIt) {
  ExpectEveryFailureToEndIt(
      [] { SaveList({Record("/photo/b", "d")}); },
      [] {
        FolderAdd(Array({Record("/photo/a", "dp"), Record("/music", "a")}), false);
      });
}

class FolderSetFailureTest : public FolderUpsertTest {};

TEST_F(FolderSetFailureTest, EverySingleFailureEndsIt) {
  ExpectEveryFailureToEndIt([] { SaveList({Record("/photo/a", "d")}); },
                            [] { FolderSet(Array({Record("/photo/a", "dp")}), false); });
}

}  // namespace
}  // namespace quarry::fileindex
