#include "daemons/fileindexd/index_daemon.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <ctime>
#include <filesystem>
#include <optional>
#include <thread>

#include "comm/communication.h"
#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/paths.h"
#include "daemons/common/client.h"
#include "daemons/common/frame.h"
#include "daemons/fileindexd/elastic_index.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "tests/daemons/common/harness.h"
#include "tests/daemons/fileindexd/share_fixture.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace quarry::fileindexd {
namespace {

using fileindex::SendCommandToDaemon;
using fileindex::StatusMgr;
using test::WaitUntil;

// The daemon in a thread, with shares and folders but without an engine: what its workers do is
// shown elsewhere.
class IndexDaemonTest : public ::testing::Test {
 protected:
  void SetUp() override {
    test::ResetTestRoot();
    for (const char* name : {"s", "t"}) {
      test::MakeDirs(volume_ / name);
      RegisterShare(volume_ / name);
    }
    SaveFolders({"/s"});
  }

  void TearDown() override { StopDaemon(); }

  void StartDaemon() {
    stop_ = false;
    daemon_.emplace(2);
    thread_ = std::thread([this] {
      while (!stop_) daemon_->Step(5);
    });
  }

  void StopDaemon() {
    if (!daemon_) return;
    stop_ = true;
    thread_.join();
    EXPECT_TRUE(daemon_->Stop(std::chrono::seconds(20)));
    daemon_.reset();
  }

  static void SaveFolders(const std::vector<std::string>& paths) {
    Json::Value list(Json::arrayValue);
    for (const std::string& path : paths) {
      list.append(fileindex::Folder(path, "n", true, true, true, true, false, false).GetData());
    }
    ASSERT_TRUE(toFile(list, fileindex::kFileIndexFoldersCfgPath));
  }

  static Json::Value Ask(const std::string& type, const Json::Value& data = Json::Value()) {
    Json::Value request;
    request["type"] = type;
    request["data"] = data;
    return daemon::Request("fileindexd", CommandSocketPath(), request);
  }

  static Json::Value Share(const std::string& name, bool is_upsert = true) {
    Json::Value data;
    data["share_name"] = name;
    data["is_upsert"] = is_upsert;
    return data;
  }

  // The state of each share's worker.
  static std::map<std::string, std::string> States() {
    std::map<std::string, std::string> states;
    const Json::Value answer = Ask("status");
    for (const Json::Value& share : answer["data"]["shares"]) {
      states[share["share"].asString()] = share["state"].asString();
    }
    return states;
  }

  static bool Becomes(const std::map<std::string, std::string>& states) {
    return WaitUntil([&] { return States() == states; });
  }

  test::TempDir volume_;
  std::optional<IndexDaemon> daemon_;
  std::thread thread_;
  std::atomic<bool> stop_{false};
};

TEST_F(IndexDaemonTest, AnswersThePing) {
  StartDaemon();
  const Json::Value answer = Ask("ping");
  EXPECT_TRUE(answer["success"].asBool());
  EXPECT_EQ(getpid(), answer["data"]["pid"].asInt());
}

TEST_F(IndexDaemonTest, KeepsAWorkerForEachShareWithFolders) {
  StartDaemon();
  // Nobody made an engine: the worker says so and goes on trying.
  EXPECT_TRUE(Becomes({{"s", "retrying"}}));
  const Json::Value share = Ask("status")["data"]["shares"][0];
  EXPECT_THAT(share["last_error"].asString(), ::testing::HasSubstr("tarnelasticd"));
  EXPECT_EQ("/s", share["folders"][0]["path"].asString());
}

TEST_F(IndexDaemonTest, NoticesTheFolderListWithoutACommand) {
  StartDaemon();
  SaveFolders({"/s", "/t"});
  EXPECT_TRUE(Becomes({{"s", "retrying"}, {"t", "retrying"}}));
  SaveFolders({"/t"});
  EXPECT_TRUE(Becomes({{"t", "retrying"}}));
  SaveFolders({});
  EXPECT_TRUE(Becomes({}));
}

TEST_F(IndexDaemonTest, AVanishedShareStopsNoOther) {
  SaveFolders({"/vanished", "no share", "/s"});
  StartDaemon();
  EXPECT_TRUE(Becomes({{"s", "retrying"}, {"vanished", "retrying"}}));
  const Json::Value shares = Ask("status")["data"]["shares"];
  EXPECT_THAT(shares[0]["last_error"].asString(), ::testing::HasSubstr("tarnelasticd"));
  EXPECT_THAT(shares[1]["last_error"].asString(), ::testing::Not(::testing::IsEmpty()));
}

TEST_F(IndexDaemonTest, AFolderListThatIsGarbageLeavesTheWorkersAsTheyAre) {
  StartDaemon();
  ASSERT_TRUE(Becomes({{"s", "retrying"}}));
  test::WriteFile(fileindex::kFileIndexFoldersCfgPath, "[{]");
  EXPECT_TRUE(WaitUntil([] {
    const Json::Value answer = Ask("status");
    return answer["data"]["shares"][0]["last_error"].asString().find("Cannot load json") !=
           std::string::npos;
  }));
  EXPECT_TRUE(Ask("notify_setting_changed", Share("s"))["success"].asBool());
  SaveFolders({"/s", "/t"});
  EXPECT_TRUE(Becomes({{"s", "retrying"}, {"t", "retrying"}}));
}

TEST_F(IndexDaemonTest, DeletesAndCreatesWorkersByCommand) {
  StartDaemon();
  ASSERT_TRUE(Becomes({{"s", "retrying"}}));
  SendCommandToDaemon("worker_delete", Share("s"));
  EXPECT_TRUE(Becomes({{"s", "stopped"}}));
  // Neither another share's change nor the removal of a folder brings it back.
  SendCommandToDaemon("notify_setting_changed", Share("t"));
  SendCommandToDaemon("notify_setting_changed", Share("s", false));
  EXPECT_TRUE(Becomes({{"s", "stopped"}}));
  SendCommandToDaemon("worker_create", Share("s"));
  EXPECT_TRUE(Becomes({{"s", "retrying"}}));
  SendCommandToDaemon("worker_delete", Share("s"));
  EXPECT_TRUE(Becomes({{"s", "stopped"}}));
  SendCommandToDaemon("notify_setting_changed", Share("s"));
  EXPECT_TRUE(Becomes({{"s", "retrying"}}));
}

TEST_F(IndexDaemonTest, CreatesNoWorkerForAShareWithoutFolders) {
  StartDaemon();
  SendCommandToDaemon("worker_create", Share("t"));
  SendCommandToDaemon("worker_delete", Share("t"));
  EXPECT_TRUE(Becomes({{"s", "retrying"}}));
}

// The library tells of the pause with the status lock in its hand.
TEST_F(IndexDaemonTest, KeepsThePauseThatTheLibraryTellsOf) {
  StartDaemon();
  StatusMgr().Pause(0);
  EXPECT_TRUE(Becomes({{"s", "paused"}}));
  Json::Value status = Ask("status")["data"];
  EXPECT_TRUE(status["paused"].asBool());
  EXPECT_EQ(0, status["resume_time"].asInt64());
  StatusMgr().Resume();
  EXPECT_TRUE(Becomes({{"s", "retrying"}}));
  StatusMgr().Pause(1);
  EXPECT_TRUE(Becomes({{"s", "paused"}}));
  EXPECT_GT(Ask("status")["data"]["resume_time"].asInt64(), std::time(nullptr) + 3000);
}

TEST_F(IndexDaemonTest, KeepsThePauseThatTheFileHas) {
  test::WriteFile(fileindex::kFileIndexStatusCfgPath, "{\"resume_time\":0}");
  StartDaemon();
  EXPECT_TRUE(Becomes({{"s", "paused"}}));
  // Replaced whole, as the library does.
  const std::string replacement = fileindex::kFileIndexStatusCfgPath + ".new";
  test::WriteFile(replacement, "{\"resume_time\":1}");
  std::filesystem::rename(replacement, fileindex::kFileIndexStatusCfgPath);
  EXPECT_TRUE(Becomes({{"s", "retrying"}}));
}

TEST_F(IndexDaemonTest, APauseEndsByItself) {
  StartDaemon();
  Json::Value data;
  data["resume_time"] = Json::Int64(std::time(nullptr) + 1);
  SendCommandToDaemon("pause", data);
  EXPECT_TRUE(WaitUntil([] { return !Ask("status")["data"]["paused"].asBool(); }));
  EXPECT_TRUE(Becomes({{"s", "retrying"}}));
}

TEST_F(IndexDaemonTest, AStatusThatIsGarbageKeepsThePause) {
  StartDaemon();
  StatusMgr().Pause(0);
  test::WriteFile(fileindex::kFileIndexStatusCfgPath, "[[[");
  SaveFolders({"/s", "/t"});
  EXPECT_TRUE(Becomes({{"s", "paused"}, {"t", "paused"}}));
}

TEST_F(IndexDaemonTest, AnswersWhileTheCallerHoldsEveryLock) {
  StartDaemon();
  ASSERT_TRUE(Becomes({{"s", "retrying"}}));
  const LockFile folders(RootedPath("/tmp/quarry_cfg_folder.lock"), true);
  const LockFile status(RootedPath("/tmp/quarry_cfg_fi_status.lock"), true);
  for (const char* type : {"notify_setting_changed", "worker_delete", "worker_create"}) {
    EXPECT_TRUE(Ask(type, Share("s"))["success"].asBool()) << type;
  }
  Json::Value data;
  data["resume_time"] = 0;
  EXPECT_TRUE(Ask("pause", data)["success"].asBool());
  EXPECT_TRUE(Ask("resume")["success"].asBool());
  EXPECT_TRUE(Ask("status")["success"].asBool());
}

// An engine that is busy with one share, and answers for the other.
TEST_F(IndexDaemonTest, ABusyEngineHoldsUpNoOtherShareAndNoCommand) {
  const test::ServerThread engine(
      EngineSocketPath(), [](const std::string& request, const daemon::Peer&) -> std::string {
        if (request.find("engine_status") != std::string::npos) {
          return R"({"success":true,"data":{"epoch":"e","indexes":[]}})";
        }
        if (request.find("fileindex_s") == std::string::npos)
          return R"({"success":true,"data":[]})";
        return R"({"success":false,"error":{"code":1401,"msg":"busy"}})";
      });
  SaveFolders({"/s", "/t"});
  StartDaemon();
  // The other share gets as far as it can without a reader of files.
  EXPECT_TRUE(Becomes({{"s", "indexing"}, {"t", "retrying"}}));
  SendCommandToDaemon("worker_delete", Share("s"));
  EXPECT_TRUE(Becomes({{"s", "stopped"}, {"t", "retrying"}}));
  SendCommandToDaemon("worker_create", Share("s"));
  EXPECT_TRUE(Becomes({{"s", "indexing"}, {"t", "retrying"}}));
}

TEST_F(IndexDaemonTest, GarbageHurtsNobody) {
  StartDaemon();
  {
    test::RawPeer peer(CommandSocketPath());
    peer.Send("GET / HTTP/1.1\r\n\r\n");
    EXPECT_TRUE(peer.IsClosed());
    test::RawPeer silent(CommandSocketPath());
    test::RawPeer half(CommandSocketPath());
    half.Send(daemon::MakeFrame("{\"type\":\"pi").substr(0, 9));
    test::RawPeer no_json(CommandSocketPath());
    no_json.Send(daemon::MakeFrame(std::string("\0\xff{", 3)));
    EXPECT_THAT(no_json.RecvFrame(), ::testing::HasSubstr("\"success\":false"));
    test::RawPeer deep(CommandSocketPath());
    deep.Send(daemon::MakeFrame(std::string(1000000, '[')));
    EXPECT_THAT(deep.RecvFrame(), ::testing::HasSubstr("\"success\":false"));
    EXPECT_TRUE(Ask("ping")["success"].asBool());
  }
  EXPECT_TRUE(Ask("ping")["success"].asBool());
}

TEST_F(IndexDaemonTest, RefusesAPlaceThatIsTaken) {
  StartDaemon();
  EXPECT_THROW(IndexDaemon(1), Error);
  EXPECT_TRUE(Ask("ping")["success"].asBool());
}

TEST_F(IndexDaemonTest, IsGoneAfterItsEnd) {
  StartDaemon();
  ASSERT_TRUE(Becomes({{"s", "retrying"}}));
  StopDaemon();
  EXPECT_FALSE(daemon::IsListening(CommandSocketPath()));
  EXPECT_NE(0, access(CommandSocketPath().c_str(), F_OK));
}

// Who is answered by nobody waits without end.
TEST_F(IndexDaemonTest, AnswersCommandsThatComeAtTheVeryEnd) {
  daemon_.emplace(1);
  test::RawPeer before(CommandSocketPath());
  before.Send(daemon::MakeFrame("{\"type\":\"ping\"}"));
  test::RawPeer half(CommandSocketPath());
  const std::string frame = daemon::MakeFrame("{\"type\":\"resume\"}");
  half.Send(frame.substr(0, 6));
  half.Send(frame.substr(6));
  EXPECT_TRUE(daemon_->Stop(std::chrono::seconds(20)));
  EXPECT_THAT(before.RecvFrame(), ::testing::HasSubstr("\"success\":true"));
  EXPECT_THAT(half.RecvFrame(), ::testing::HasSubstr("\"success\":true"));
  daemon_.reset();
}

}  // namespace
}  // namespace quarry::fileindexd
