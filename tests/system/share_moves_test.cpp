// A share that gets another name or place is found there without a document read again, whatever is
// killed on the way.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <csignal>
#include <filesystem>

#include "cli/supervisor/child.h"
#include "cli/system.h"
#include "common/file_util.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/sdk/share.h"
#include "fileindex/queue/event.h"
#include "platform/linux/share_move.h"
#include "platform/linux/share_registry.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/system/running_system.h"

namespace quarry::test {
namespace {

constexpr int kFiles = 120;

class ShareMovesTest : public testing::Test {
 protected:
  void SetUp() override {
    for (int i = 0; i < kFiles; ++i) WriteFile(Path(i, docs_), "capybara");
    std::filesystem::create_directory(system_.Files() + "/other");
    system_.Start();
    system_.IndexShare(docs_);
    ASSERT_EQ(Found("capybara"), kFiles);
    // The monitor would tell of what follows, and have it read.
    ASSERT_TRUE(system_.StopMonitor());
    for (int i = 0; i < kFiles; ++i) Disguise(Path(i, docs_));
  }
  void TearDown() override { system_.Stop(); }

  static std::string Path(int i, const std::string& share) {
    return share + "/d" + std::to_string(i % 7) + "/f" + std::to_string(i) + ".txt";
  }

  // Another text that looks like the old one: only who reads the file sees it.
  static void Disguise(const std::string& path) {
    struct stat before {};
    ASSERT_EQ(stat(path.c_str(), &before), 0);
    WriteFile(path, "aardvark");
    const timespec times[2] = {before.st_atim, before.st_mtim};
    ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
  }

  // The sentence with which a command is refused.
  std::string Refusal(const std::vector<std::string>& arguments) {
    const Ran ran = system_.Quarry(arguments);
    EXPECT_EQ(ran.end, "exit code 1") << ran.output;
    return ran.output;
  }

  int Found(const std::string& word) {
    return system_.QuarryJson({"search", word})["total"].asInt();
  }

  // Everything is in the index once, by its new path, and no file was read again.
  void ExpectArrived(const std::string& share) {
    ASSERT_TRUE(system_.WaitUntilIdle());
    EXPECT_EQ(system_.Documents(share), Listing(share));
    EXPECT_EQ(Found("capybara in:" + share), kFiles);
    EXPECT_EQ(Found("aardvark"), 0);
    const auto shares = platform::ReadShares();
    ASSERT_EQ(shares.size(), 1U);
    EXPECT_EQ(shares[0].path, share);
    EXPECT_EQ(shares[0].moved_from, "");
    EXPECT_EQ(ListDir(TestRoot() + "/var/lib/quarry/index").size(), 1U);
    EXPECT_EQ(system_.Registrations(), 1);
    const std::vector<std::string> queues = ListDir(TestRoot() + "/var/lib/quarry/queue");
    EXPECT_LE(queues.size(), 1U) << testing::PrintToString(queues);
  }

  RunningSystem system_;
  std::string docs_ = system_.Files() + "/docs";
};

TEST_F(ShareMovesTest, Renamed) {
  const Json::Value done = system_.QuarryJson({"share", "rename", "docs", "papers"});
  const std::string papers = system_.Files() + "/papers";
  EXPECT_EQ(done["path"], papers);
  EXPECT_EQ(done["old_name"], "docs");
  EXPECT_FALSE(IsDirExist(docs_, false));
  ExpectArrived(papers);
  EXPECT_EQ(system_.QuarryJson({"folder", "list"})["folder"][0]["path"], "/papers");
  // What happens afterwards is seen.
  WriteFile(papers + "/new.txt", "armadillo");
  system_.Run({"folder", "reindex", "/papers"});
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_EQ(Found("armadillo"), 1);
}

TEST_F(ShareMovesTest, RenamedAfterItsDirectory) {
  std::filesystem::rename(docs_, system_.Files() + "/papers");
  system_.Run({"share", "rename", "docs", "papers"});
  ExpectArrived(system_.Files() + "/papers");
}

TEST_F(ShareMovesTest, WaitingWorkComesAlong) {
  system_.Run({"pause"});
  WriteFile(docs_ + "/d1/new.txt", "armadillo");
  system_.Run({"folder", "reindex", "/docs/d1"});
  system_.Run({"share", "rename", "docs", "papers"});
  const Json::Value waiting = system_.QuarryJson({"queue", "show", "papers"});
  bool carried = false;
  for (const Json::Value& entry : waiting) {
    carried = carried ||
              (entry["operation"] == "reindex" && entry["path"] == system_.Files() + "/papers/d1");
  }
  EXPECT_TRUE(carried) << waiting.toStyledString();
  system_.Run({"resume"});
  ExpectArrived(system_.Files() + "/papers");
  EXPECT_EQ(Found("armadillo"), 1);
}

TEST_F(ShareMovesTest, APausedShareMovesToo) {
  system_.Run({"share", "pause", "docs"});
  system_.Run({"share", "rename", "docs", "papers"});
  system_.Run({"share", "migrate", "papers", system_.Files() + "/other"});
  EXPECT_EQ(Found("capybara"), kFiles);
  EXPECT_EQ(system_.Registrations(), 0);
  system_.Run({"share", "resume", "papers"});
  ExpectArrived(system_.Files() + "/other/papers");
}

TEST_F(ShareMovesTest, Migrated) {
  const std::string other = system_.Files() + "/other";
  system_.Run({"share", "migrate", "docs", other + "/"});
  EXPECT_FALSE(IsDirExist(docs_, false));
  ExpectArrived(other + "/docs");
}

TEST_F(ShareMovesTest, MigratedToACopy) {
  const std::string other = system_.Files() + "/other";
  cli::Child copy("/bin/cp", {"-a", docs_, other + "/"}, system_.Files() + "/cp.log");
  ASSERT_TRUE(copy.WaitEnded(60'000));
  EXPECT_NE(Refusal({"share", "migrate", "docs", other}).find("is there already"),
            std::string::npos);
  system_.Run({"share", "migrate", "docs", other, "--copied"});
  EXPECT_TRUE(IsDirExist(docs_, false));
  ExpectArrived(other + "/docs");
}

TEST_F(ShareMovesTest, RefusalsChangeNothing) {
  const std::string files = system_.Files();
  EXPECT_NE(Refusal({"share", "rename", "nobody", "x"}).find("no share named \"nobody\""),
            std::string::npos);
  EXPECT_NE(Refusal({"share", "rename", "docs", "docs"}).find("has that name already"),
            std::string::npos);
  EXPECT_NE(Refusal({"share", "rename", "docs", "a/b"}).find("no name for a share"),
            std::string::npos);
  EXPECT_NE(Refusal({"share", "rename", "docs", "other"}).find("is there already"),
            std::string::npos);
  EXPECT_NE(Refusal({"share", "migrate", "docs", files}).find("already"), std::string::npos);
  EXPECT_NE(Refusal({"share", "migrate", "docs", files + "/none"}).find("Cannot open"),
            std::string::npos);
  EXPECT_NE(Refusal({"share", "migrate", "docs", docs_}).find("lies in the share itself"),
            std::string::npos);
  // Another file system than any in which files can be.
  EXPECT_NE(Refusal({"share", "migrate", "docs", "/proc/sys"}).find("--copied"), std::string::npos);
  EXPECT_NE(Refusal({"share", "migrate", "docs", files + "/other", "--copied"})
                .find("There is no directory"),
            std::string::npos);
  ExpectArrived(docs_);
  EXPECT_GT(system_.Pid("fileindexd"), 0);
}

TEST_F(ShareMovesTest, KilledAnywhereAndRunAgain) {
  std::string from = "docs";
  std::string to = "papers";
  for (int milliseconds = 0; milliseconds < 200; milliseconds += 10) {
    system_.KillQuarry({"share", "rename", from, to}, milliseconds);
    const bool done =
        platform::ReadShares()[0].name == to && platform::ReadShares()[0].moved_from.empty();
    if (!done) system_.Run({"share", "rename", from, to});
    std::swap(from, to);
  }
  ExpectArrived(system_.Files() + "/" + from);
}

TEST_F(ShareMovesTest, MigrationKilledAnywhereAndRunAgain) {
  std::string from = system_.Files();
  std::string to = system_.Files() + "/other";
  for (int milliseconds = 0; milliseconds < 200; milliseconds += 10) {
    system_.KillQuarry({"share", "migrate", "docs", to}, milliseconds);
    const platform::ShareRecord share = platform::ReadShares()[0];
    if (share.path != to + "/docs" || !share.moved_from.empty()) {
      system_.Run({"share", "migrate", "docs", to});
    }
    std::swap(from, to);
  }
  ExpectArrived(from + "/docs");
}

// The state of the share's worker, as the index daemon reports it.
std::string WorkerState() {
  const Json::Value report = cli::AskIndexDaemon("status", Json::Value());
  return report["shares"].size() == 1 ? report["shares"][0]["state"].asString() : "";
}

// Nobody may have to start the index daemon anew because somebody had second thoughts.
TEST_F(ShareMovesTest, AKilledMoveLeavesNoShareWithoutItsWorker) {
  const std::string other = system_.Files() + "/other";
  {
    // The queue's lock keeps the command from replacing the share's record.
    const LockFile lock(sdk::SDKShare("docs").GetQueuePath(), true);
    cli::Child move(RunningSystem::Program(), {"share", "migrate", "docs", other},
                    system_.Files() + "/move.log");
    EXPECT_TRUE(WaitUntil([] { return WorkerState() == "stopped"; }));
    EXPECT_TRUE(WaitUntil([&] { return IsDirExist(other + "/docs", false); }));
    move.Signal(SIGKILL);
    EXPECT_TRUE(move.WaitEnded(60'000));
    EXPECT_EQ(move.Ended().value_or("still running"), "signal 9");
  }
  EXPECT_TRUE(WaitUntil([] { return WorkerState() == "retrying"; })) << WorkerState();
  // As if it had never been asked for.
  std::filesystem::rename(other + "/docs", docs_);
  ExpectArrived(docs_);
  system_.Run({"share", "migrate", "docs", other});
  ExpectArrived(other + "/docs");
}

// What a kill right after the share's record was replaced leaves: directory, record and queue are
// at the new place, everything else is not.
TEST_F(ShareMovesTest, AMoveThatWasCutShortIsNamedAndEnded) {
  const std::string papers = system_.Files() + "/papers";
  system_.Run({"share", "pause", "docs"});
  std::filesystem::rename(docs_, papers);
  platform::MoveShare("docs", papers);
  const std::string command = "quarry share rename docs papers";
  EXPECT_NE(system_.Run({"status"}).find(command), std::string::npos);
  EXPECT_NE(system_.Run({"share", "list"}).find(command), std::string::npos);
  for (const char* word : {"pause", "remove"}) {
    EXPECT_NE(Refusal({"share", word, "papers"}).find(command), std::string::npos) << word;
  }
  EXPECT_NE(Refusal({"share", "rename", "papers", "more"}).find(command), std::string::npos);
  system_.Run({"share", "rename", "docs", "papers"});
  system_.Run({"share", "resume", "papers"});
  ExpectArrived(papers);
}

std::string Line(int event, const std::string& path, const std::string& old_path) {
  Json::Value line;
  line["event"] = event;
  line["is_dir"] = true;
  line["path"] = path;
  line["path_old"] = old_path;
  return toString(line) + "\n";
}

// What a kill at the very end leaves when the monitor has written behind the rename: it is queued
// once more, and done once.
TEST_F(ShareMovesTest, ALineBehindTheRenameDoesNoHarm) {
  const std::string other = system_.Files() + "/other";
  const std::string moved = other + "/docs";
  system_.Run({"pause"});
  std::filesystem::rename(docs_, moved);
  platform::MoveShare("docs", moved);
  const std::string queues = TestRoot() + "/var/lib/quarry/queue";
  ASSERT_EQ(ListDir(queues).size(), 1U);
  const std::string queue = queues + "/" + ListDir(queues)[0];
  const std::string rename = Line(fileindex::EVENT_RENAME, moved, docs_);
  WriteFile(queue, ReadFile(queue) + rename + Line(fileindex::EVENT_DELETE, moved + "/gone", ""));
  system_.Run({"share", "migrate", "docs", other});
  const std::string lines = ReadFile(queue);
  const std::string twice = "\"path_old\":\"" + docs_ + "\"";
  EXPECT_NE(lines.find(twice), lines.rfind(twice)) << lines;
  system_.Run({"resume"});
  ExpectArrived(moved);
}

TEST_F(ShareMovesTest, AShareThatIsNotIndexedNeedsNoSystem) {
  system_.Run({"folder", "delete", "/docs"});
  system_.Stop();
  system_.Run({"share", "rename", "docs", "papers"});
  EXPECT_TRUE(IsDirExist(system_.Files() + "/papers", false));
  EXPECT_EQ(platform::ReadShares()[0].name, "papers");
  EXPECT_EQ(ReadFile(TestRoot() + "/var/lib/quarry/queue/" +
                     ListDir(TestRoot() + "/var/lib/quarry/queue").at(0)),
            "");
  system_.Start();
}

}  // namespace
}  // namespace quarry::test
