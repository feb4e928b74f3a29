// Reindexing, pausing, dropping: what each command does to a running system, and what it refuses.

#include <gtest/gtest.h>

#include <csignal>
#include <ctime>
#include <filesystem>

#include "cli/system.h"
#include "common/file_util.h"
#include "daemons/common/client.h"
#include "fileindex/config/status_mgr.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/system/running_system.h"

namespace quarry::test {
namespace {

class OperationsTest : public testing::Test {
 protected:
  void SetUp() override {
    WriteFile(docs_ + "/a/one.txt", "capybara");
    WriteFile(docs_ + "/b/two.txt", "capybara");
    system_.Start();
  }
  void TearDown() override { system_.Stop(); }

  void IndexDocs() {
    system_.IndexShare(docs_);
    ASSERT_EQ(Found("capybara"), 2);
  }

  // Whether the command is refused with these words, and nothing else but them on its line.
  bool Refuses(const std::vector<std::string>& arguments, const std::string& words) {
    const Ran ran = system_.Quarry(arguments);
    const bool one_line = ran.output.find('\n') + 1 == ran.output.size();
    const bool refused =
        ran.end == "exit code 1" && one_line && ran.output.find(words) != std::string::npos;
    if (!refused) ADD_FAILURE() << ran.end << ": " << ran.output;
    return refused;
  }

  int Found(const std::string& word) {
    return system_.QuarryJson({"search", word})["total"].asInt();
  }
  std::string Status() { return system_.Quarry({"status"}).output; }
  bool StatusSays(const std::string& words) { return Status().find(words) != std::string::npos; }

  static std::size_t Count(const std::string& kind) {
    return ListDir(TestRoot() + "/var/lib/quarry/" + kind).size();
  }
  static Json::Value EngineIndexes() {
    return cli::AskEngine("engine_status", Json::Value(Json::objectValue))["indexes"];
  }

  // Nothing of any share is left on disk and in the engine.
  void ExpectGone() {
    EXPECT_EQ(Count("index"), 0U);
    EXPECT_EQ(system_.Registrations(), 0);
    // A worker that was just looking at the queue may leave an empty one, until it is swept away.
    const std::string queues = TestRoot() + "/var/lib/quarry/queue/";
    for (const std::string& name : ListDir(queues)) EXPECT_EQ(ReadFile(queues + name), "");
    EXPECT_TRUE(EngineIndexes().empty());
  }

  RunningSystem system_;
  std::string docs_ = system_.Files() + "/docs";
};

TEST_F(OperationsTest, ReindexFindsWhatChanged) {
  IndexDocs();
  ASSERT_TRUE(system_.StopMonitor());
  WriteFile(docs_ + "/a/new.txt", "armadillo");
  WriteFile(docs_ + "/b/new.txt", "armadillo");
  const Json::Value done = system_.QuarryJson({"folder", "reindex", "/docs/a"});
  EXPECT_EQ(done["paths"][0], "/docs/a");
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_EQ(Found("armadillo"), 1);
  system_.Run({"folder", "reindex", "/docs/a", docs_ + "/b"});
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_EQ(Found("armadillo"), 2);
}

TEST_F(OperationsTest, ReindexMakesADoubtfulIndexAnew) {
  IndexDocs();
  fileindex::StatusMgr().SetShareStatus(
      "docs", fileindex::kShareNeedReindex | fileindex::kShareNeedRebuild);
  EXPECT_TRUE(StatusSays("needs a reindex: quarry folder reindex /docs")) << Status();
  system_.Run({"folder", "reindex", "/docs"});
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_TRUE(StatusSays("up to date")) << Status();
  EXPECT_EQ(system_.Documents(docs_), Listing(docs_));
}

TEST_F(OperationsTest, ReindexRefusesPlacesOutsideOfFolders) {
  system_.Run({"share", "add", docs_});
  EXPECT_TRUE(Refuses({"folder", "reindex", "/docs"}, "quarry folder add /docs"));
  system_.Run({"folder", "add", "/docs/a"});
  EXPECT_TRUE(Refuses({"folder", "reindex", "/docs/b"}, "lies in no indexed folder"));
  system_.Run({"folder", "reindex", "/docs"});
  EXPECT_TRUE(Refuses({"folder", "reindex", "/nowhere/x"}, "no share named \"nowhere\""));
}

TEST_F(OperationsTest, DeletedFoldersAreNotFoundAnyLonger) {
  system_.Run({"share", "add", docs_});
  system_.Run({"folder", "add", "/docs/a"});
  system_.Run({"folder", "add", "/docs/b"});
  ASSERT_TRUE(system_.WaitUntilIdle());
  system_.Run({"folder", "delete", "/docs/a"});
  EXPECT_TRUE(WaitUntil([&] { return Found("capybara") == 1; }));
  EXPECT_TRUE(Refuses({"folder", "delete", "/docs/a"}, "No such folder is indexed"));
  EXPECT_TRUE(Refuses({"share", "remove", "docs"}, "quarry folder delete /docs/b"));
  system_.Run({"folder", "delete", "/docs/b"});
  ExpectGone();
  const Json::Value done = system_.QuarryJson({"share", "remove", "docs"});
  EXPECT_EQ(done["path"], docs_);
  EXPECT_TRUE(IsDirExist(docs_, false));
  EXPECT_TRUE(Refuses({"share", "remove", "docs"}, "There is no share named \"docs\""));
}

TEST_F(OperationsTest, APausedShareAnswersAndTakesNothing) {
  IndexDocs();
  ASSERT_TRUE(system_.StopMonitor());
  system_.Run({"share", "pause", "docs"});
  EXPECT_TRUE(EngineIndexes()[0]["paused"].asBool());
  EXPECT_EQ(system_.Registrations(), 0);
  EXPECT_TRUE(StatusSays("paused")) << Status();
  WriteFile(docs_ + "/a/new.txt", "armadillo");
  system_.Run({"folder", "reindex", "/docs/a"});
  EXPECT_EQ(Found("capybara"), 2);
  EXPECT_EQ(system_.QuarryJson({"queue", "show", "docs"}).size(), 1U);
  // Daemons that are started anew keep the pause, too.
  for (const char* service : {"fileindexd", "tarnelasticd"}) {
    const pid_t pid = system_.Pid(service);
    kill(pid, SIGKILL);
    ASSERT_TRUE(WaitUntil([&] { return system_.Pid(service) > 0 && system_.Pid(service) != pid; }));
  }
  ASSERT_TRUE(WaitUntil([] { return daemon::IsListening(cli::EngineSocket()); }));
  EXPECT_TRUE(EngineIndexes()[0]["paused"].asBool());
  EXPECT_EQ(Found("armadillo"), 0);
  EXPECT_EQ(system_.QuarryJson({"queue", "show", "docs"}).size(), 1U);
  system_.Run({"share", "resume", "docs"});
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_EQ(Found("armadillo"), 1);
  EXPECT_EQ(system_.Registrations(), 1);
}

TEST_F(OperationsTest, AClearedShareIsGoneFromDisk) {
  IndexDocs();
  EXPECT_TRUE(Refuses({"share", "clear", "docs"}, "quarry share pause docs"));
  system_.Run({"share", "pause", "docs"});
  system_.Run({"folder", "reindex", "/docs/a"});
  EXPECT_TRUE(Refuses({"share", "clear", "docs", "/elsewhere"}, "lives at"));
  const Json::Value done = system_.QuarryJson({"share", "clear", "docs"});
  EXPECT_EQ(done["state"], "cleared");
  ExpectGone();
  EXPECT_TRUE(StatusSays("No folder is indexed."));
  EXPECT_TRUE(Refuses({"share", "clear", "docs"}, "Nothing of the share \"docs\" is indexed"));
  EXPECT_TRUE(Refuses({"share", "pause", "docs"}, "quarry folder add /docs"));
  EXPECT_TRUE(Refuses({"share", "resume", "nobody"}, "There is no share named \"nobody\""));
  system_.Run({"folder", "add", "/docs"});
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_EQ(Found("capybara"), 2);
}

TEST_F(OperationsTest, KilledAnywhereAndRunAgain) {
  IndexDocs();
  for (int milliseconds = 0; milliseconds < 80; milliseconds += 8) {
    for (const char* command : {"pause", "resume"}) {
      system_.KillQuarry({"share", command, "docs"}, milliseconds);
      system_.Run({"share", command, "docs"});
    }
  }
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_EQ(system_.Documents(docs_), Listing(docs_));
  for (int milliseconds = 0; milliseconds < 80; milliseconds += 8) {
    system_.Run({"share", "pause", "docs"});
    system_.KillQuarry({"share", "clear", "docs"}, milliseconds);
    if (!StatusSays("No folder")) system_.Run({"share", "clear", "docs"});
    ExpectGone();
    system_.Run({"folder", "add", "/docs"});
    system_.KillQuarry({"folder", "delete", "/docs"}, milliseconds);
    if (!StatusSays("No folder")) system_.Run({"folder", "delete", "/docs"});
    ExpectGone();
    system_.Run({"folder", "add", "/docs"});
  }
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_EQ(system_.Documents(docs_), Listing(docs_));
}

TEST_F(OperationsTest, AShareThatHasVanishedIsClearedByItsPath) {
  IndexDocs();
  WriteFile(TestRoot() + "/etc/quarry/shares.json", R"({"shares":[]})");
  EXPECT_TRUE(StatusSays("is not known any more")) << Status();
  EXPECT_TRUE(Refuses({"share", "clear", "docs"}, "Say where it lived"));
  system_.Run({"share", "clear", "docs", docs_});
  EXPECT_EQ(Count("index"), 0U);
  EXPECT_TRUE(StatusSays("No folder is indexed."));
}

TEST_F(OperationsTest, VolumesPauseResumeAndAreDropped) {
  IndexDocs();
  const std::string volume = system_.Files();
  EXPECT_TRUE(Refuses({"volume", "pause", volume + "x"}, "Nothing on the volume"));
  EXPECT_TRUE(Refuses({"volume", "pause", "/"}, "quarry pause"));
  EXPECT_TRUE(Refuses({"volume", "resume", "relative"}, "absolute path"));
  EXPECT_TRUE(Refuses({"volume", "clear", volume}, "quarry volume pause " + volume));
  EXPECT_EQ(system_.QuarryJson({"volume", "pause", volume + "/"})["shares"][0], "docs");
  EXPECT_TRUE(EngineIndexes()[0]["paused"].asBool());
  EXPECT_EQ(Found("capybara"), 2);
  WriteFile(docs_ + "/a/new.txt", "armadillo");
  system_.Run({"volume", "resume", volume});
  ASSERT_TRUE(WaitUntil([&] { return Found("armadillo") == 1; }));
  system_.Run({"volume", "pause", volume});
  system_.Run({"volume", "clear", volume});
  ExpectGone();
  EXPECT_TRUE(Refuses({"volume", "clear", volume}, "No folder was paused"));
}

TEST_F(OperationsTest, AllIndexingPausesForSomeHours) {
  IndexDocs();
  const std::int64_t before = std::time(nullptr);
  const std::int64_t end = system_.QuarryJson({"pause", "8"})["resume_time"].asInt64();
  EXPECT_GE(end, before + 8 * 3600);
  EXPECT_LE(end, std::time(nullptr) + 8 * 3600);
  EXPECT_TRUE(StatusSays("Indexing is paused until 20")) << Status();
  WriteFile(docs_ + "/a/new.txt", "armadillo");
  system_.Run({"folder", "reindex", "/docs/a"});
  EXPECT_TRUE(StatusSays("paused")) << Status();
  EXPECT_EQ(Found("armadillo"), 0);
  EXPECT_EQ(system_.QuarryJson({"pause"})["resume_time"].asInt64(), 0);
  EXPECT_TRUE(StatusSays("Indexing is paused.")) << Status();
  EXPECT_EQ(system_.QuarryJson({"resume"})["resume_time"].asInt64(), -1);
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_EQ(Found("armadillo"), 1);
  for (const char* hours : {"0", "-1", "8761", "99999999999", "many"}) {
    EXPECT_EQ(system_.Quarry({"pause", hours}).end, "exit code 2") << hours;
  }
}

TEST_F(OperationsTest, APauseNeedsNoIndexDaemon) {
  system_.Run({"pause", "1"});
  EXPECT_TRUE(StatusSays("Indexing is paused until"));
  system_.Run({"resume"});
  EXPECT_FALSE(StatusSays("paused"));
}

TEST_F(OperationsTest, HomesAndAccounts) {
  const std::string homes = system_.Files() + "/homes";
  WriteFile(homes + "/first/notes.txt", "armadillo");
  EXPECT_TRUE(Refuses({"home", "enable"}, "There is no share named \"homes\""));
  system_.Run({"share", "add", homes});
  EXPECT_TRUE(Refuses({"user", "rename", "first", "second"}, "quarry folder add /homes"));
  system_.Run({"folder", "add", "/homes/first"});
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_TRUE(Refuses({"user", "rename", "first", "second"}, "There is no home folder"));
  EXPECT_TRUE(Refuses({"user", "rename", "first", "../x"}, "is no account's name"));
  std::filesystem::rename(homes + "/first", homes + "/second");
  EXPECT_EQ(system_.QuarryJson({"user", "rename", "first", "second"})["path"], homes + "/second");
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_EQ(Found("armadillo in:" + homes + "/second"), 1);
  EXPECT_EQ(system_.QuarryJson({"folder", "list"})["folder"][0]["path"], "/homes/second");
  const std::string monitor = TestRoot() + "/var/lib/quarry/monitor/";
  EXPECT_NE(ReadFile(monitor + ListDir(monitor).at(0)).find("/homes/second\""), std::string::npos);
  system_.Run({"home", "disable"});
  EXPECT_EQ(system_.QuarryJson({"home", "enable", "--accounts", "ldap"})["accounts"], "ldap");
  EXPECT_EQ(system_.Quarry({"home", "enable", "--accounts", "all"}).end, "exit code 2");
}

TEST_F(OperationsTest, WithoutASystemNothingIsBegun) {
  IndexDocs();
  system_.Stop();
  for (const auto& arguments :
       std::vector<std::vector<std::string>>{{"folder", "reindex", "/docs"},
                                             {"folder", "delete", "/docs"},
                                             {"share", "rename", "docs", "papers"},
                                             {"share", "pause", "docs"},
                                             {"share", "resume", "docs"},
                                             {"volume", "pause", system_.Files()},
                                             {"suggest"}}) {
    EXPECT_TRUE(Refuses(arguments, "quarry run")) << arguments[0] << ' ' << arguments[1];
  }
  EXPECT_TRUE(IsDirExist(docs_, false));
  system_.Start();
}

}  // namespace
}  // namespace quarry::test
