#include "fileindex/config/folder.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <functional>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/config/status_mgr.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"
#include "tests/support/thrown.h"

namespace quarry::fileindex {
namespace {

using test::FailureOf;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

const char kRecord[] =
    R"({"path":"/photo/2019","name":"n","document":true,"audio":false,"video":true,)"
    R"("photo":false})";

class FolderTest : public fake::FakePlatformTest {
 protected:
  FolderTest() {
    fake::AddShare("photo", root_ + "/volume1/photo");
    fake::AddShare("new", root_ + "/volume2/new");
    test::MakeDirs(root_ + "/volume1/photo/2019");
    errno = 0;
  }

  static Folder Sample() {
    return Folder("/photo/2019", "name", true, false, true, false, false, false);
  }

  // What reading the record without one key, or with another value for it, comes to.
  static std::string FailureWith(const std::string& key, const Json::Value& value) {
    Json::Value json = Parse(kRecord);
    json[key] = value;
    return FailureOf([&] { Folder folder(json); });
  }

  void Queue(const std::string& lines) {
    test::WriteFile(fake::QueuePath(root_ + "/volume1/photo"), lines);
  }
  // A queued change of a place below the volume of the share.
  std::string Line(const std::string& path) const {
    return R"({"event":2,"is_dir":false,"path":")" + root_ + "/volume1" + path +
           R"(","path_old":"","data":null})" + "\n";
  }

  static std::string StatusOf(const Folder& folder) {
    Json::Value out;
    folder.GetStatus(out);
    return toString(out);
  }

  const std::string root_ = test::TestRoot();
};

TEST_F(FolderTest, TheConstructorStoresItsArguments) {
  const Folder folder("/photo/2019", "name", true, false, true, false, true, true);
  EXPECT_EQ(folder.GetPath(), "/photo/2019");
  EXPECT_EQ(folder.GetName(), "name");
  EXPECT_TRUE(folder.IsDocument());
  EXPECT_FALSE(folder.IsAudio());
  EXPECT_TRUE(folder.IsVideo());
  EXPECT_FALSE(folder.IsPhoto());
  EXPECT_TRUE(folder.IsPrivileged());
  EXPECT_TRUE(folder.IsPaused());
  EXPECT_EQ(folder.GetVolumeToBeClean(), "");
  const Folder other("/photo", "", false, true, false, true, false, false);
  EXPECT_EQ(toString(other.GetData()),
            R"({"audio":true,"document":false,"name":"","path":"/photo","paused":false,)"
            R"("photo":true,"privileged":false,"video":false,"volume_to_be_clean":""})");
  EXPECT_THAT(fake::Calls(), IsEmpty());
}

TEST_F(FolderTest, ARecordIsReadAndWritten) {
  const std::string text =
      R"({"audio":false,"document":true,"name":"n","path":"/photo/2019","paused":true,)"
      R"("photo":true,"privileged":true,"video":false,"volume_to_be_clean":"/volume1"})";
  const Folder folder(Parse(text));
  EXPECT_EQ(toString(folder.GetData()), text);
  EXPECT_EQ(folder.GetVolumeToBeClean(), "/volume1");
}

TEST_F(FolderTest, OptionalKeysHaveDefaults) {
  const Folder folder(Parse(kRecord));
  EXPECT_EQ(toString(folder.GetData()),
            R"({"audio":false,"document":true,"name":"n","path":"/photo/2019","paused":false,)"
            R"("photo":false,"privileged":false,"video":true,"volume_to_be_clean":""})");
}

TEST_F(FolderTest, OptionalKeysOfTheWrongTypeCountAsAbsent) {
  Json::Value json = Parse(kRecord);
  json["paused"] = "yes";
  json["privileged"] = Json::Value(Json::arrayValue);
  json["volume_to_be_clean"] = Json::Value(Json::objectValue);
  const Folder folder(json);
  EXPECT_FALSE(folder.IsPaused());
  EXPECT_FALSE(folder.IsPrivileged());
  EXPECT_EQ(folder.GetVolumeToBeClean(), "");
}

TEST_F(FolderTest, EveryRequiredKeyIsMissed) {
  for (const char* key : {"path", "name", "document", "audio", "video", "photo"}) {
    Json::Value json = Parse(kRecord);
    json.removeMember(key);
    EXPECT_EQ(FailureOf([&] { Folder folder(json); }),
              std::string("120 Missing property: ") + key + ", data=" + toString(json));
  }
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(FolderTest, KeysAreReadInTheirOrder) {
  const std::vector<std::string> keys = {"path", "name", "document", "audio", "video", "photo"};
  Json::Value json(Json::objectValue);
  for (const std::string& key : keys) {
    EXPECT_EQ(FailureOf([&] { Folder folder(json); }),
              "120 Missing property: " + key + ", data=" + toString(json));
    json[key] = key == "path" || key == "name" ? Json::Value("x") : Json::Value(true);
  }
  EXPECT_EQ(FailureOf([&] { Folder folder(json); }), "");
}

TEST_F(FolderTest, RequiredKeysOfTheWrongTypeAreRefused) {
  for (const char* key : {"path", "name", "document", "audio", "video", "photo"}) {
    Json::Value json = Parse(kRecord);
    json[key] = Json::Value(Json::arrayValue);
    EXPECT_EQ(FailureWith(key, json[key]), "120 Not a string, data=" + toString(json)) << key;
  }
  EXPECT_EQ(FailureWith("photo", "true").substr(0, 16), "120 Not a string");
}

TEST_F(FolderTest, WhatIsNoObjectIsRefused) {
  for (const char* text : {"[]", "\"x\"", "5", "true"}) {
    EXPECT_EQ(FailureOf([&] { Folder folder(Parse(text)); }),
              std::string("120 Not an object, data=") + text);
  }
  EXPECT_EQ(FailureOf([] { Folder folder{Json::Value()}; }),
            "120 Missing property: path, data=null");
}

TEST_F(FolderTest, TheFormOfThePathIsNotChecked) {
  EXPECT_EQ(FailureWith("path", ""), "");
  EXPECT_EQ(FailureWith("path", "no slash"), "");
}

TEST_F(FolderTest, IndexCfgHoldsTheKindsAlone) {
  EXPECT_EQ(toString(Sample().GetIndexCfg()),
            R"({"audio":false,"document":true,"photo":false,"video":true})");
}

TEST_F(FolderTest, SettersChangeTheRecord) {
  Folder folder = Sample();
  folder.SetName("other");
  folder.SetPaused(true);
  folder.SetVolumeToBeClean("/volume1");
  EXPECT_EQ(folder.GetName(), "other");
  EXPECT_TRUE(folder.IsPaused());
  EXPECT_EQ(folder.GetVolumeToBeClean(), "/volume1");
  folder.SetPaused(false);
  EXPECT_FALSE(folder.IsPaused());
}

TEST_F(FolderTest, ShareAndFullPathFollowThePath) {
  const Folder folder = Sample();
  EXPECT_EQ(folder.GetShare(), "photo");
  EXPECT_EQ(folder.GetFullPath(), root_ + "/volume1/photo/2019");
  EXPECT_EQ(Folder("/photo", "", true, true, true, true, false, false).GetShare(), "photo");
}

TEST_F(FolderTest, ThePlatformIsAskedOnce) {
  const Folder folder = Sample();
  folder.GetFullPath();
  fake::ClearCalls();
  fake::RemoveShare("photo");
  EXPECT_EQ(folder.GetFullPath(), root_ + "/volume1/photo/2019");
  EXPECT_THAT(fake::Calls(), IsEmpty());
}

TEST_F(FolderTest, CopiesAskForThemselves) {
  const Folder folder = Sample();
  folder.GetFullPath();
  fake::AddShare("photo", root_ + "/volume2/photo");
  const Folder copy = folder;
  Folder assigned("/new", "", true, true, true, true, false, false);
  assigned.GetFullPath();
  assigned = folder;
  EXPECT_EQ(folder.GetFullPath(), root_ + "/volume1/photo/2019");
  EXPECT_EQ(copy.GetFullPath(), root_ + "/volume2/photo/2019");
  EXPECT_EQ(assigned.GetFullPath(), root_ + "/volume2/photo/2019");
  EXPECT_EQ(assigned.GetShare(), "photo");
  EXPECT_EQ(toString(assigned.GetData()), toString(folder.GetData()));
}

TEST_F(FolderTest, SetPathForgetsWhereTheOldOneLed) {
  Folder folder = Sample();
  folder.GetFullPath();
  folder.SetPath("/new/x");
  EXPECT_EQ(folder.GetPath(), "/new/x");
  EXPECT_EQ(folder.GetShare(), "new");
  EXPECT_EQ(folder.GetFullPath(), root_ + "/volume2/new/x");
}

TEST_F(FolderTest, SetShareKeepsAFullPathThatWasAskedFor) {
  Folder folder = Sample();
  folder.GetFullPath();
  folder.SetShare("new");
  EXPECT_EQ(folder.GetPath(), "/new/2019");
  EXPECT_EQ(folder.GetShare(), "new");
  EXPECT_EQ(folder.GetFullPath(), root_ + "/volume1/photo/2019");

  Folder fresh("/photo", "", true, true, true, true, false, false);
  fresh.SetShare("new");
  EXPECT_EQ(fresh.GetPath(), "/new");
  EXPECT_EQ(fresh.GetFullPath(), root_ + "/volume2/new");
}

TEST_F(FolderTest, SetShareExchangesTheFirstComponentOnly) {
  Folder folder("/photo/photo/photo", "", true, true, true, true, false, false);
  folder.SetShare("new");
  EXPECT_EQ(folder.GetPath(), "/new/photo/photo");
}

TEST_F(FolderTest, APathWithoutALeadingSlashHasNoShare) {
  Folder folder("photo", "", true, true, true, true, false, false);
  EXPECT_EQ(FailureOf([&] { folder.GetShare(); }), "120 photo");
  EXPECT_EQ(FailureOf([&] { folder.GetFullPath(); }), "120 photo");
  EXPECT_EQ(FailureOf([&] { folder.SetShare("new"); }), "120 photo");
  EXPECT_EQ(folder.GetPath(), "photo");
}

TEST_F(FolderTest, AnUnknownShareHasNoFullPath) {
  const Folder folder("/gone/x", "", true, true, true, true, false, false);
  EXPECT_EQ(FailureOf([&] { folder.GetFullPath(); }).substr(0, 3), "800");
  EXPECT_EQ(FailureOf([&] { folder.IsIndexing(); }).substr(0, 3), "800");
  EXPECT_EQ(FailureOf([&] { StatusOf(folder); }).substr(0, 3), "800");
}

TEST_F(FolderTest, IsIndexingLooksForWorkAtOrBelowTheFolder) {
  const Folder folder = Sample();
  EXPECT_FALSE(folder.IsIndexing());
  Queue(Line("/photo/2018/a") + Line("/photo/20190/a") + Line("/photo"));
  EXPECT_FALSE(folder.IsIndexing());
  Queue(Line("/photo/2019"));
  EXPECT_TRUE(folder.IsIndexing());
  Queue(Line("/photo/2018/a") + Line("/photo/2019/a/b"));
  EXPECT_TRUE(folder.IsIndexing());
}

TEST_F(FolderTest, IsIndexingLooksIntoTheSnapshotToo) {
  test::WriteFile(fake::QueuePath(root_ + "/volume1/photo") + ".tmp", Line("/photo/2019/a"));
  EXPECT_TRUE(Sample().IsIndexing());
}

TEST_F(FolderTest, IsIndexingFailsOnAMalformedLineAndAnUnknownQueue) {
  Queue("nonsense\n");
  EXPECT_EQ(FailureOf([] { Sample().IsIndexing(); }).substr(0, 3), "906");
  fake::FailCall("FILEIDXQueuePathCompose");
  EXPECT_EQ(FailureOf([] { Sample().IsIndexing(); }).substr(0, 3), "502");
}

TEST_F(FolderTest, NothingQueuedIsFinished) {
  EXPECT_EQ(StatusOf(Sample()), R"({"text":"finished"})");
  test::WriteFile(kFileIndexStatusCfgPath, R"({"resume_time":0})");
  EXPECT_EQ(StatusOf(Sample()), R"({"text":"finished"})");
}

TEST_F(FolderTest, WorkQueuedIsPausedOrProcessing) {
  Queue(Line("/photo/2019/a"));
  fake::SetTime(1700000000);
  EXPECT_EQ(StatusOf(Sample()), R"({"text":"processing"})");
  const std::vector<std::pair<std::string, std::string>> rows = {
      {"-1", "processing"},         {"0", "paused"},
      {"1699999999", "processing"},  // its end has passed
      {"1700000000", "processing"},  // not later than now
      {"1700000001", "paused"},     {"-3600", "processing"},
      {"9000000000", "paused"},
  };
  for (const auto& [resume_time, text] : rows) {
    test::WriteFile(kFileIndexStatusCfgPath, "{\"resume_time\":" + resume_time + "}");
    EXPECT_EQ(StatusOf(Sample()), "{\"text\":\"" + text + "\"}") << resume_time;
  }
}

TEST_F(FolderTest, TheFoldersOwnPausePlaysNoPart) {
  Queue(Line("/photo/2019/a"));
  const Folder folder("/photo/2019", "", true, true, true, true, false, true);
  EXPECT_EQ(StatusOf(folder), R"({"text":"processing"})");
}

TEST_F(FolderTest, BitZeroOfTheShareAsksForAReindex) {
  Queue(Line("/photo/2019/a"));
  for (const auto& [bits, text] : std::vector<std::pair<int, std::string>>{{0, "processing"},
                                                                           {1, "need_reindex"},
                                                                           {2, "processing"},
                                                                           {3, "need_reindex"},
                                                                           {-1, "need_reindex"},
                                                                           {4, "processing"}}) {
    test::WriteFile(kFileIndexStatusCfgPath,
                    R"({"share":{"other":1,"photo":)" + std::to_string(bits) + "}}");
    EXPECT_EQ(StatusOf(Sample()), "{\"text\":\"" + text + "\"}") << bits;
  }
}

TEST_F(FolderTest, APlaceThatCannotBeIndexedIsAnErrorWhateverElse) {
  test::WriteFile(kFileIndexStatusCfgPath, R"({"resume_time":0,"share":{"photo":1}})");
  Queue(Line("/photo/gone/a"));
  const Folder folder("/photo/gone", "", true, true, true, true, false, true);
  EXPECT_EQ(StatusOf(folder), R"({"desc":"invalid_path","text":"error"})");
}

TEST_F(FolderTest, GetStatusKeepsOtherMembers) {
  Json::Value out = Parse(R"({"desc":"old","more":1,"text":"old"})");
  Sample().GetStatus(out);
  EXPECT_EQ(toString(out), R"({"desc":"old","more":1,"text":"finished"})");
}

TEST_F(FolderTest, GetStatusNeedsAnObject) {
  for (const char* text : {"[]", "\"x\"", "5"}) {
    Json::Value out = Parse(text);
    EXPECT_EQ(FailureOf([&] { Sample().GetStatus(out); }),
              std::string("120 Not an object, data=") + text);
    EXPECT_EQ(toString(out), text);
  }
}

TEST_F(FolderTest, GetStatusFailsWithTheStatusFile) {
  test::WriteFile(kFileIndexStatusCfgPath, "broken");
  EXPECT_EQ(FailureOf([] { StatusOf(Sample()); }),
            "504 Cannot load json: " + kFileIndexStatusCfgPath);
  const Folder gone("/photo/gone", "", true, true, true, true, false, false);
  EXPECT_EQ(FailureOf([&] { StatusOf(gone); }), "504 Cannot load json: " + kFileIndexStatusCfgPath);
  test::WriteFile(kFileIndexStatusCfgPath, R"({"share":"x"})");
  EXPECT_EQ(FailureOf([] { StatusOf(Sample()); }), "120 Not an object, data=\"x\"");
  EXPECT_EQ(StatusOf(gone), R"({"desc":"invalid_path","text":"error"})");
}

TEST_F(FolderTest, NoAdditionalGivesTheRecord) {
  const Folder folder = Sample();
  EXPECT_EQ(toString(folder.GetDataWithAdditional(Json::Value(Json::arrayValue))),
            toString(folder.GetData()));
  EXPECT_THAT(fake::Calls(), IsEmpty());
}

TEST_F(FolderTest, TheStatusIsAdditional) {
  test::WriteFile(kFileIndexStatusCfgPath, R"({"share":{"photo":1}})");
  const Folder folder = Sample();
  Json::Value expected = folder.GetData();
  expected["additional"]["status"]["text"] = "need_reindex";
  EXPECT_EQ(toString(folder.GetDataWithAdditional(Parse(R"(["status"])"))), toString(expected));
  EXPECT_EQ(toString(folder.GetDataWithAdditional(Parse(R"(["status","status"])"))),
            toString(expected));
}

TEST_F(FolderTest, AdditionalThatIsNoArrayIsLoggedAndRefused) {
  for (const char* text : {"\"status\"", "null", "{\"a\":1}", "5"}) {
    fake::ClearLogs();
    EXPECT_EQ(FailureOf([&] { Sample().GetDataWithAdditional(Parse(text)); }),
              std::string("120 ") + text);
    EXPECT_THAT(fake::Logs(), ElementsAre(fake::LogHead("folder", 46, "GetDataWithAdditional") +
                                          "Failed [!addiitionals.isArray()], reason: " + text));
  }
}

TEST_F(FolderTest, AdditionalElementsThatAreNoStringsAreLoggedAndRefused) {
  for (const char* text : {"5", "null", "[\"status\"]", "{}"}) {
    fake::ClearLogs();
    const Json::Value list = Parse(std::string("[") + text + ",\"status\"]");
    EXPECT_EQ(FailureOf([&] { Sample().GetDataWithAdditional(list); }), std::string("120 ") + text);
    EXPECT_THAT(fake::Logs(), ElementsAre(fake::LogHead("folder", 49, "GetDataWithAdditional") +
                                          "Failed [!it.isString()], reason: " + text));
  }
}

TEST_F(FolderTest, UnknownAdditionalIsRefusedWithoutALogLine) {
  EXPECT_EQ(FailureOf([] { Sample().GetDataWithAdditional(Parse(R"(["size"])")); }),
            "120 Unknown additioal: size");
  EXPECT_EQ(FailureOf([] { Sample().GetDataWithAdditional(Parse(R"(["Status"])")); }),
            "120 Unknown additioal: Status");
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

}  // namespace
}  // namespace quarry::fileindex
