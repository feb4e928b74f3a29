// What is damaged, full or gone under a running system ends in a clear log line, in a status that a
// person understands, and in an index that equals the disk again: by itself, or by "quarry doctor".

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <csignal>
#include <cstring>
#include <filesystem>

#include "cli/system.h"
#include "common/error.h"
#include "common/file_util.h"
#include "common/unique_fd.h"
#include "daemons/common/client.h"
#include "daemons/common/single_instance.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "fileindex/queue/queue_mgr.h"
#include "platform/linux/share_registry.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/system/running_system.h"

namespace quarry::test {
namespace {

bool Contains(const std::string& text, const std::string& words) {
  return text.find(words) != std::string::npos;
}

class DamageTest : public testing::Test {
 protected:
  void SetUp() override {
    // A limit on the size of files is to fail writes, not to kill the writer.
    std::signal(SIGXFSZ, SIG_IGN);
    for (int i = 0; i < 40; ++i) {
      WriteFile(docs_ + "/d" + std::to_string(i % 4) + "/f" + std::to_string(i) + ".txt",
                "capybara number " + std::to_string(i));
    }
    system_.Start();
    system_.IndexShare(docs_);
  }
  void TearDown() override { system_.Stop(); }

  // What the doctor says when it could mend everything; it has nothing to say thereafter.
  std::string Mended() {
    const Ran look = system_.Quarry({"doctor", "--check"});
    EXPECT_EQ(look.end, "exit code 1") << look.output;
    const std::string output = system_.Run({"doctor"});
    EXPECT_TRUE(Contains(output, "mended: ")) << output;
    EXPECT_EQ(system_.Run({"doctor", "--check"}), "All is well.\n");
    return output;
  }
  // What the doctor has to leave to somebody.
  std::string Left() {
    const Ran ran = system_.Quarry({"doctor"});
    EXPECT_EQ(ran.end, "exit code 1") << ran.output;
    return ran.output;
  }
  bool StatusSays(const std::string& words) {
    return WaitUntil([&] { return Contains(system_.Quarry({"status"}).output, words); });
  }
  bool LogSays(const std::string& words) {
    return WaitUntil([&] { return Contains(system_.Log(), words); });
  }

  void ExpectWhole() {
    ASSERT_TRUE(system_.WaitUntilIdle());
    EXPECT_TRUE(WaitUntil([&] { return IsWhole(); }));
    EXPECT_TRUE(StatusSays("up to date"));
  }

  bool IsWhole() const {
    try {
      return system_.Documents(docs_) == Listing(docs_);
    } catch (const Error&) {
      return false;  // it is just being made
    }
  }

  // Kills the supervisor and waits until the daemons have followed it.
  void KillAll() {
    system_.Kill();
    ASSERT_TRUE(WaitUntil([] {
      return daemon::RunningPid(daemon::PidFilePath("tarnelasticd")) == 0 &&
             daemon::RunningPid(daemon::PidFilePath("fileindexd")) == 0 &&
             daemon::RunningPid(daemon::PidFilePath("tarncontentextractd")) == 0;
    }));
  }

  static std::string Only(const std::string& directory) {
    const std::vector<std::string> names = ListDir(directory);
    return names.size() == 1 ? directory + "/" + names[0] : "";
  }
  static std::string Database() {
    return Only(TestRoot() + "/var/lib/quarry/index") + "/quarry.db";
  }
  std::string Queue() const {
    std::string name = docs_.substr(1);
    for (char& c : name) c = c == '/' ? '+' : c;
    return TestRoot() + "/var/lib/quarry/queue/" + name;
  }

  void Kill(const std::string& service) {
    pid_t pid = 0;
    ASSERT_TRUE(WaitUntil([&] { return (pid = system_.Pid(service)) > 0; }));
    kill(pid, SIGKILL);
    ASSERT_TRUE(WaitUntil([&] { return system_.Pid(service) != pid; }));
  }

  RunningSystem system_;
  std::string docs_ = system_.Files() + "/docs";
};

TEST_F(DamageTest, AHealthySystemIsLeftAlone) {
  EXPECT_EQ(system_.Run({"doctor", "--check"}), "All is well.\n");
  EXPECT_EQ(system_.Run({"doctor"}), "All is well.\n");
  const Json::Value report = system_.QuarryJson({"doctor"});
  EXPECT_TRUE(report["well"].asBool());
  EXPECT_TRUE(report["findings"].isArray() && report["findings"].empty());
}

TEST_F(DamageTest, AnIndexWhoseFileIsOverwritten) {
  system_.Run({"pause"});
  system_.Stop();
  WriteFile(Database(), std::string(20'000, 'x'));
  system_.Start();
  EXPECT_TRUE(LogSays("An index cannot be used: "));
  EXPECT_TRUE(StatusSays("The index of the share docs cannot be used"));
  EXPECT_TRUE(StatusSays("quarry doctor"));
  Mended();
  system_.Run({"resume"});
  ExpectWhole();
}

TEST_F(DamageTest, AnIndexWithBadPages) {
  system_.Stop();
  // All but the list of tables.
  std::string pages = ReadFile(Database());
  for (std::size_t at = 4096; at < pages.size(); ++at) pages[at] = '\x55';
  system_.Run({"pause"});
  WriteFile(Database(), pages);
  system_.Start();
  // Nobody has read them yet.
  const std::string output = Mended();
  EXPECT_TRUE(Contains(output, "The index of the share docs is damaged")) << output;
  EXPECT_EQ(fileindex::StatusMgr().GetShareStatus("docs"), 0);
  system_.Run({"resume"});
  ExpectWhole();
}

TEST_F(DamageTest, AnIndexThatIsCutOffOrRemovedIsMadeAnewByItself) {
  for (const bool removed : {false, true}) {
    system_.Stop();
    if (removed) {
      Unlink(Database());
    } else {
      std::filesystem::resize_file(Database(), 5000);
    }
    system_.Start();
    EXPECT_TRUE(LogSays("made it anew"));
    ExpectWhole();
  }
}

TEST_F(DamageTest, ARebuildThatWasCutShortIsEnded) {
  system_.Run({"pause"});
  fileindex::StatusMgr().SetShareStatus(
      "docs", fileindex::kShareNeedReindex | fileindex::kShareNeedRebuild);
  const std::string output = Mended();
  EXPECT_TRUE(Contains(output, "is marked as to be made anew")) << output;
  system_.Run({"resume"});
  ExpectWhole();
}

TEST_F(DamageTest, APausedShareStaysPaused) {
  system_.Run({"share", "pause", "docs"});
  system_.Stop();
  Unlink(Database());
  system_.Start();
  Mended();
  const Json::Value nothing(Json::objectValue);
  EXPECT_TRUE(cli::AskEngine("engine_status", nothing)["indexes"][0]["paused"].asBool());
  system_.Run({"share", "resume", "docs"});
  ExpectWhole();
}

TEST_F(DamageTest, StateFilesThatAreCutOff) {
  for (const std::string& path : {fileindex::kFileIndexFoldersCfgPath,
                                  fileindex::kFileIndexStatusCfgPath, platform::ShareFilePath()}) {
    WriteFile(path, "[{\"path\":\"/do");
    // Its name, and what to do.
    EXPECT_TRUE(StatusSays(path)) << path;
    EXPECT_TRUE(StatusSays("quarry doctor")) << path;
    const std::string output = Mended();
    EXPECT_TRUE(Contains(output, path + ".damaged-")) << output;
    ExpectWhole();
  }
  EXPECT_TRUE(LogSays("Cannot load the folder list: "));
  EXPECT_TRUE(LogSays("Cannot load the status: "));
}

TEST_F(DamageTest, AnEngineThatCannotReadItsListIsStartedAgain) {
  const std::string path = TestRoot() + "/var/lib/quarry/engine/indexes.json";
  KillAll();
  WriteFile(path, ReadFile(path).substr(0, 60));
  system_.StartSupervisor();
  EXPECT_TRUE(LogSays("The list of indexes cannot be read: " + path));
  EXPECT_TRUE(StatusSays("tarnelasticd is restarting"));
  // The index daemon brings the index back, which is missing from the list at first.
  const Ran ran = system_.Quarry({"doctor"});
  EXPECT_TRUE(Contains(ran.output, path + ".damaged-")) << ran.output;
  ASSERT_TRUE(WaitUntil([] { return daemon::IsListening(cli::EngineSocket()); }));
  ExpectWhole();
  EXPECT_EQ(system_.Run({"doctor"}), "All is well.\n");
}

TEST_F(DamageTest, GarbageInAQueueThatWaits) {
  system_.Run({"share", "pause", "docs"});
  WriteFile(docs_ + "/d0/new.txt", "armadillo");
  WriteFile(docs_ + "/d1/new.txt", "armadillo");
  const std::string good = R"({"event":64,"path":")" + docs_ + "/d0/new.txt\"}\n";
  WriteFile(Queue(), "garbage\n" + good + "{\"event\":");
  WriteFile(Queue() + ".tmp", std::string(100, '\0') + "\n");
  // It blocks whoever asks what is waiting.
  EXPECT_FALSE(system_.Quarry({"folder", "reindex", "/docs/d1"}).end == "exit code 0");
  Mended();
  EXPECT_TRUE(Contains(ReadFile(Queue()), good));
  system_.Run({"folder", "reindex", "/docs/d1"});
  system_.Run({"share", "resume", "docs"});
  ExpectWhole();
}

// What it may have told of is found by comparing.
TEST_F(DamageTest, GarbageInAQueueInWorkIsPassedOver) {
  ASSERT_TRUE(system_.StopMonitor());
  WriteFile(docs_ + "/d0/new.txt", "armadillo");
  WriteFile(docs_ + "/d1/untold.txt", "armadillo");
  WriteFile(Queue(), "garbage\n{\"event\":64,\"path\":\"" + docs_ + "/d0/new.txt\"}\n{\"event\":6");
  EXPECT_TRUE(WaitUntil([&] { return !IsFileExist(Queue()) || ReadFile(Queue()).empty(); }));
  ExpectWhole();
  EXPECT_TRUE(LogSays("has lines that cannot be read: 2; comparing the whole share"));
}

TEST_F(DamageTest, AFullDiskIsWaitedFor) {
  const pid_t engine = system_.Pid("tarnelasticd");
  const rlimit full{1, RLIM_INFINITY};
  rlimit before{};
  ASSERT_EQ(prlimit(engine, RLIMIT_FSIZE, &full, &before), 0);
  for (int i = 0; i < 20; ++i) {
    WriteFile(docs_ + "/new/" + std::to_string(i) + ".txt", "armadillo");
  }
  system_.Run({"folder", "reindex", "/docs"});
  EXPECT_TRUE(StatusSays("will try again"));
  EXPECT_TRUE(LogSays("Share docs cannot be indexed now: "));
  EXPECT_EQ(system_.Pid("tarnelasticd"), engine);
  ASSERT_EQ(prlimit(engine, RLIMIT_FSIZE, &before, nullptr), 0);
  ExpectWhole();
  EXPECT_TRUE(LogSays("Share docs is indexed again"));
}

TEST_F(DamageTest, AShareThatVanishesAndComesBack) {
  const std::string elsewhere = system_.Files() + "/elsewhere";
  std::filesystem::rename(docs_, elsewhere);
  Kill("fileindexd");
  EXPECT_TRUE(LogSays("The share's directory " + docs_ + " is not there"));
  EXPECT_TRUE(StatusSays("cannot be indexed any longer (moved, unmounted or read-only)"));
  const std::string output = Left();
  EXPECT_TRUE(Contains(output, "The directory of the share docs (" + docs_ + ") is not there"));
  EXPECT_TRUE(Contains(output, "quarry share pause docs; quarry share clear docs")) << output;
  // Nothing was taken for deleted.
  EXPECT_EQ(system_.QuarryJson({"search", "capybara"})["total"].asInt(), 40);
  std::filesystem::rename(elsewhere, docs_);
  ExpectWhole();
  EXPECT_EQ(system_.Run({"doctor"}), "All is well.\n");
}

TEST_F(DamageTest, AShareThatNobodyKnowsAnyMoreIsNamedWithItsPlace) {
  WriteFile(platform::ShareFilePath(), R"({"shares":[]})");
  const std::string output = Left();
  EXPECT_TRUE(Contains(output, "quarry share add " + docs_)) << output;
  EXPECT_TRUE(Contains(output, "quarry share clear docs " + docs_)) << output;
  system_.Run({"share", "add", docs_});
  ExpectWhole();
  EXPECT_EQ(system_.Run({"doctor"}), "All is well.\n");
}

TEST_F(DamageTest, AFolderThatIsGoneIsNamed) {
  WriteFile(docs_ + "/sub/x.txt", "x");
  system_.Run({"folder", "add", "/docs/sub"});
  ASSERT_TRUE(system_.WaitUntilIdle());
  RemoveTree(docs_ + "/sub");
  EXPECT_TRUE(Contains(Left(), "quarry folder delete /docs/sub"));
  system_.Run({"folder", "delete", "/docs/sub"});
  EXPECT_EQ(system_.Run({"doctor"}), "All is well.\n");
}

TEST_F(DamageTest, WhatIsToBeWatchedIsRegisteredAnew) {
  const std::string file = Only(TestRoot() + "/var/lib/quarry/monitor");
  const std::string whole = ReadFile(file);
  WriteFile(file, whole.substr(0, whole.size() / 2));
  const std::string output = Mended();
  EXPECT_TRUE(Contains(output, "does not know what to watch of the share docs")) << output;
  EXPECT_EQ(ReadFile(file), whole);
  Unlink(file);
  Mended();
  EXPECT_EQ(ReadFile(file), whole);
}

// A socket at the path with nobody behind it, as a killed process leaves it.
void LeaveSocket(const std::string& path) {
  Unlink(path);
  const UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, path.c_str(), sizeof(address.sun_path) - 1);
  ASSERT_EQ(bind(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
}

TEST_F(DamageTest, SocketsThatWereLeftAreNoObstacle) {
  KillAll();
  for (const std::string& socket : {cli::SupervisorSocket(), cli::EngineSocket(),
                                    cli::IndexDaemonSocket(), cli::ExtractorSocket()}) {
    LeaveSocket(socket);
  }
  EXPECT_TRUE(Contains(system_.Quarry({"status"}).output, "quarry run"));
  const std::string output = Left();
  EXPECT_TRUE(Contains(output, "tarnelasticd was killed and has left its socket")) << output;
  EXPECT_TRUE(Contains(output, "The system does not run. Start it with: quarry run")) << output;
  for (const std::string& name : ListDir(TestRoot() + "/var/run")) {
    EXPECT_EQ(GetFileExtension(name, false), "pid") << name;
    EXPECT_EQ(ReadFile(TestRoot() + "/var/run/" + name), "") << name;
  }
  LeaveSocket(cli::EngineSocket());
  system_.Start();
  ExpectWhole();
}

TEST_F(DamageTest, ADaemonThatLostItsSocketIsStartedAgain) {
  const pid_t before = system_.Pid("fileindexd");
  Unlink(cli::IndexDaemonSocket());
  const std::string output = Mended();
  EXPECT_TRUE(Contains(output, "fileindexd runs, but nobody can reach it")) << output;
  EXPECT_NE(system_.Pid("fileindexd"), before);
  ExpectWhole();
}

}  // namespace
}  // namespace quarry::test
