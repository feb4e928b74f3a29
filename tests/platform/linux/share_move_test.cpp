#include "platform/linux/share_move.h"

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "common/error.h"
#include "common/json.h"
#include "common/paths.h"
#include "platform/include/index_path.h"
#include "platform/include/monitor.h"
#include "platform/include/share.h"
#include "platform/linux/path_name.h"
#include "tests/platform/linux/share_fixture.h"

namespace quarry::platform {
namespace {

using TARN::TARNOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION;
using TARN::TARNOTIFYD::MonitorQueue;

class ShareMoveTest : public ShareTest {
 protected:
  static std::string Queue(const std::string& share_path) {
    return RootedPath("/var/lib/quarry/queue/") + NameForPath(share_path);
  }

  static void Register(const std::string& application, const std::string& queue,
                       const std::string& path) {
    Json::Value config;
    config["queue"] = queue;
    config["config"][0]["path"] = path;
    config["config"][0]["mask"] = 7;
    config["config"][0]["ignore"].append("@eaDir");
    ASSERT_TRUE(
        MonitorQueue::Upsert(MonitorQueue(config), application, MONITOR_QUEUE_TYPE_APPLICATION));
  }

  // "application queue path" of each registration, sorted by files.
  static std::vector<std::string> Registrations() {
    std::vector<std::string> texts;
    const std::string directory = RootedPath("/var/lib/quarry/monitor");
    for (const std::string& name : test::ListDir(directory)) {
      Json::Value document;
      if (!fromString(document, test::ReadFile(directory + "/" + name))) continue;
      for (const Json::Value& entry : document["config"]) {
        texts.push_back(document["application"].asString() + " " + document["queue"].asString() +
                        " " + entry["path"].asString());
      }
    }
    return texts;
  }

  ShareRecord AddMovedAway(const std::string& from, const std::string& to) {
    ShareRecord share = Add(from);
    std::filesystem::rename(share.path, volume_ / to);
    return share;
  }

  // What MoveShare says to a move that it refuses.
  static std::string Refusal(const std::string& name, const std::string& new_path) {
    try {
      MoveShare(name, new_path);
    } catch (const Error& error) {
      return error.reason();
    }
    return "";
  }
};

TEST_F(ShareMoveTest, TheRecordFollows) {
  Add("first");
  ShareRecord old = AddMovedAway("old", "new");
  Add("last");
  MoveShare("old", volume_ / "new");
  const auto shares = ReadShares();
  ASSERT_EQ(shares.size(), 3U);
  EXPECT_EQ(shares[1].name, "new");
  EXPECT_EQ(shares[1].path, volume_ / "new");
  EXPECT_EQ(shares[1].moved_from, old.path);
  old.name = "new";
  old.path = volume_ / "new";
  AddShare(old);
  EXPECT_EQ(ReadShares()[1].moved_from, volume_ / "old");
  EndShareMove("new");
  EXPECT_EQ(ReadShares()[1].moved_from, "");
  EndShareMove("new");
  EndShareMove("nobody");
}

TEST_F(ShareMoveTest, LinesOfSnapshotAndQueueFollowInTheirOrder) {
  const ShareRecord old = AddMovedAway("old", "new");
  const std::string queue = Queue(volume_ / "new");
  test::WriteFile(Queue(old.path) + ".tmp", "{\"a\":1}\n{\"torn");
  test::WriteFile(Queue(old.path), "{\"b\":1}\n");
  test::WriteFile(queue, "what an earlier attempt has left\n");
  test::WriteFile(queue + ".tmp", "that too\n");
  MoveShare("old", volume_ / "new");
  EXPECT_EQ(test::ReadFile(queue), "{\"a\":1}\n{\"torn\n{\"b\":1}\n");
  EXPECT_EQ(test::ListDir(RootedPath("/var/lib/quarry/queue")),
            std::vector<std::string>{NameForPath(volume_ / "new")});
}

TEST_F(ShareMoveTest, LongQueuesFollowWhole) {
  const ShareRecord old = AddMovedAway("old", "new");
  std::string text;
  for (int i = 0; i < 20'000; ++i) text += "line " + std::to_string(i) + "\n";
  test::WriteFile(Queue(old.path), text);
  MoveShare("old", volume_ / "new");
  EXPECT_EQ(test::ReadFile(Queue(volume_ / "new")), text);
}

TEST_F(ShareMoveTest, RegistrationsFollow) {
  const ShareRecord old = AddMovedAway("old", "new");
  const std::string old_queue = Queue(old.path);
  Register("fileindex", old_queue, old.path + "/a");
  Register("other", old_queue, volume_ / "older/b");
  Register("third", Queue(volume_ / "elsewhere"), volume_ / "elsewhere");
  const std::string new_queue = Queue(volume_ / "new");
  MoveShare("old", volume_ / "new");
  const std::vector<std::string> expected{
      "fileindex " + new_queue + " " + (volume_ / "new/a"),
      "other " + new_queue + " " + (volume_ / "older/b"),
      "third " + Queue(volume_ / "elsewhere") + " " + (volume_ / "elsewhere")};
  EXPECT_EQ(Registrations(), expected);
}

TEST_F(ShareMoveTest, NothingHangsOnAShareThatIsNotIndexed) {
  const ShareRecord old = AddMovedAway("old", "new");
  MoveShare("old", volume_ / "new");
  EXPECT_EQ(test::ReadFile(Queue(volume_ / "new")), "");
  EXPECT_TRUE(Registrations().empty());
}

TEST_F(ShareMoveTest, RefusalsChangeNothing) {
  const ShareRecord old = Add("old");
  const ShareRecord other = Add("other");
  test::WriteFile(Queue(old.path), "{}\n");
  const std::string before = test::ReadFile(ShareFilePath());
  EXPECT_NE(Refusal("nobody", volume_ / "new").find("no share called \"nobody\""),
            std::string::npos);
  EXPECT_NE(Refusal("old", volume_ / "new").find("No such file"), std::string::npos);
  EXPECT_NE(Refusal("old", other.path).find("already"), std::string::npos);
  test::MakeDirs(old.path + "/old");
  EXPECT_NE(Refusal("old", old.path + "/old").find("lies in the share itself"), std::string::npos);
  EXPECT_NE(Refusal("old", "relative").find("absolute"), std::string::npos);
  EXPECT_EQ(test::ReadFile(ShareFilePath()), before);
  EXPECT_EQ(test::ReadFile(Queue(old.path)), "{}\n");
}

TEST_F(ShareMoveTest, AShareOnItsWayIsKnownToWhoAsksForIt) {
  const auto is_known = [this] {
    TARNSHARE* share = nullptr;
    const bool found = TARNShareGet("new", &share) == 0;
    TARNShareFree(share);
    char name[64];
    char path[4096];
    const std::string place = volume_ / "new/x";
    const int held = TARNShareNamePathGet(place.c_str(), name, sizeof(name), path, sizeof(path));
    EXPECT_EQ(found, held == 0);
    return found;
  };
  AddMovedAway("old", "new");
  MoveShare("old", volume_ / "new");
  EXPECT_FALSE(is_known());
  ShowMovingShares(true);
  EXPECT_TRUE(is_known());
  ShowMovingShares(false);
  EXPECT_FALSE(is_known());
  EndShareMove("new");
  EXPECT_TRUE(is_known());
}

TEST_F(ShareMoveTest, OneMoveAtATime) {
  AddMovedAway("old", "new");
  MoveShare("old", volume_ / "new");
  test::MakeDirs(volume_ / "newer");
  EXPECT_NE(Refusal("new", volume_ / "newer").find("still on its way"), std::string::npos);
}

TEST_F(ShareMoveTest, WhatAKillLeftBehindIsRemoved) {
  const std::string gone = volume_ / "gone";
  test::WriteFile(Queue(gone), "{}\n");
  test::WriteFile(Queue(gone) + ".tmp", "{}\n");
  Register("fileindex", Queue(gone), gone);
  CleanUpShareMove(gone);
  CleanUpShareMove(gone);
  EXPECT_TRUE(Registrations().empty());
  EXPECT_TRUE(test::ListDir(RootedPath("/var/lib/quarry/queue")).empty());
}

TEST_F(ShareMoveTest, WatchesOfADirectoryFollowIt) {
  const ShareRecord homes = Add("homes");
  const std::string queue = Queue(homes.path);
  Register("fileindex", queue, homes.path + "/ann/docs");
  Register("other", queue, homes.path + "/anna");
  MoveWatches(homes.path, homes.path + "/ann", homes.path + "/eve");
  const std::vector<std::string> expected{"fileindex " + queue + " " + homes.path + "/eve/docs",
                                          "other " + queue + " " + homes.path + "/anna"};
  EXPECT_EQ(Registrations(), expected);
}

TEST_F(ShareMoveTest, AForeignFileAmongTheRegistrationsIsLeft) {
  const ShareRecord old = AddMovedAway("old", "new");
  test::WriteFile(RootedPath("/var/lib/quarry/monitor/notes.json"), "no JSON");
  test::WriteFile(RootedPath("/var/lib/quarry/monitor/list.json"), "[]");
  MoveShare("old", volume_ / "new");
  EXPECT_EQ(test::ListDir(RootedPath("/var/lib/quarry/monitor")).size(), 2U);
}

TEST_F(ShareMoveTest, AQueueThatCannotBeWrittenStopsTheMove) {
  const ShareRecord old = AddMovedAway("old", "new");
  test::WriteFile(Queue(old.path), "{}\n");
  test::MakeDirs(Queue(volume_ / "new") + ".moving");
  EXPECT_NE(Refusal("old", volume_ / "new").find("Cannot make"), std::string::npos);
  EXPECT_EQ(ReadShares()[0].name, "old");
  EXPECT_EQ(test::ReadFile(Queue(old.path)), "{}\n");
}

}  // namespace
}  // namespace quarry::platform
