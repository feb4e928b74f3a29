// A folder on disk becomes a searchable index.

#include <gtest/gtest.h>

#include <csignal>
#include <filesystem>

#include "cli/system.h"
#include "common/file_util.h"
#include "daemons/common/client.h"
#include "daemons/common/single_instance.h"
#include "tests/support/files.h"
#include "tests/system/running_system.h"

namespace quarry::test {
namespace {

class FirstLightTest : public testing::Test {
 protected:
  void SetUp() override {
    WriteFile(docs_ + "/plain.txt", "The quick brown fox jumps over the lazy dog.");
    WriteFile(docs_ + "/deep/er/page.html",
              "<html><head><title>Harvest</title></head><body>wheat and barley</body></html>");
    WriteFile(docs_ + "/notes.md", "# Agenda\n\nDiscuss the *zeppelin* maintenance.\n");
    WriteFile(docs_ + "/utf16.txt", std::string("\xff\xfez\0e\0b\0r\0a\0", 12));
    WriteFile(docs_ + "/holiday-snapshot.jpg", "not really a picture");
    WriteFile(docs_ + "/source.cpp", "int main() { return quixotic; }\n");
  }

  // The names of the hits for a query, best first.
  std::vector<std::string> Hits(const std::vector<std::string>& words) {
    std::vector<std::string> arguments{"search"};
    arguments.insert(arguments.end(), words.begin(), words.end());
    std::vector<std::string> names;
    const Json::Value found = system_.QuarryJson(arguments);
    for (const Json::Value& hit : found["hits"]) {
      names.push_back(Basename(hit["path"].asString()));
    }
    return names;
  }

  void IndexAll() {
    system_.Start();
    system_.IndexShare(docs_);
  }

  using Names = std::vector<std::string>;
  RunningSystem system_;
  std::string docs_ = system_.Files() + "/docs";
};

TEST_F(FirstLightTest, FindsByContentAndByName) {
  IndexAll();
  EXPECT_EQ(Hits({"fox"}), Names{"plain.txt"});
  EXPECT_EQ(Hits({"barley"}), Names{"page.html"});
  EXPECT_EQ(Hits({"Harvest"}), Names{"page.html"});
  EXPECT_EQ(Hits({"zeppelin"}), Names{"notes.md"});
  EXPECT_EQ(Hits({"zebra"}), Names{"utf16.txt"});
  EXPECT_EQ(Hits({"quixotic"}), Names{"source.cpp"});
  EXPECT_EQ(Hits({"snapsh"}), Names{"holiday-snapshot.jpg"});
  EXPECT_EQ(Hits({"\"brown fox\""}), Names{"plain.txt"});
  EXPECT_EQ(Hits({"\"fox brown\""}), Names{});
  EXPECT_EQ(Hits({"whea*"}), Names{"page.html"});
  EXPECT_EQ(Hits({"type:photo"}), Names{"holiday-snapshot.jpg"});
  EXPECT_EQ(Hits({"ext:md"}), Names{"notes.md"});
  EXPECT_EQ(Hits({"name:plain"}), Names{"plain.txt"});
  EXPECT_EQ(Hits({"the -zeppelin ext:txt"}), Names{"plain.txt"});
  EXPECT_EQ(Hits({"zebra OR quixotic ext:cpp"}).size(), 1U);
  EXPECT_EQ(Hits({"barley in:" + docs_ + "/deep"}), Names{"page.html"});
  EXPECT_EQ(Hits({"barley in:" + docs_ + "/other"}), Names{});
  EXPECT_EQ(system_.Documents(docs_), Listing(docs_));
  system_.Stop();
}

TEST_F(FirstLightTest, OneCommandIndexesAndSearches) {
  const Ran first = system_.Quarry({"index", docs_, "--", "zeppelin"});
  EXPECT_EQ(first.end, "exit code 0");
  EXPECT_NE(first.output.find(docs_ + "/notes.md"), std::string::npos) << first.output;
  EXPECT_NE(first.output.find("9 documents"), std::string::npos) << first.output;

  // Only what was named is searched.
  const Ran below = system_.Quarry({"index", docs_ + "/deep", "--", "zeppelin"});
  EXPECT_NE(below.output.find("Nothing found."), std::string::npos) << below.output;

  // The next run goes on where this one was, and sees what changed in between.
  WriteFile(docs_ + "/added.txt", "a brand new armadillo");
  WriteFile(docs_ + "/plain.txt", "the text is another one, about capybaras");
  std::filesystem::remove(docs_ + "/source.cpp");
  const Ran second = system_.Quarry({"index", docs_, "--", "armadillo"});
  EXPECT_NE(second.output.find(docs_ + "/added.txt"), std::string::npos) << second.output;
  system_.Start();
  EXPECT_EQ(Hits({"capybaras"}), Names{"plain.txt"});
  EXPECT_EQ(Hits({"fox"}), Names{});
  EXPECT_EQ(system_.Documents(docs_), Listing(docs_));
  system_.Stop();
}

TEST_F(FirstLightTest, OneCommandWaitsForASystemThatIsEnding) {
  system_.Start();
  const pid_t engine = system_.Pid("tarnelasticd");
  ASSERT_EQ(kill(engine, SIGSTOP), 0);
  ASSERT_EQ(kill(daemon::RunningPid(daemon::PidFilePath("quarry")), SIGTERM), 0);
  // It has stopped listening and now waits for its engine.
  EXPECT_TRUE(WaitUntil([] { return !daemon::IsListening(cli::SupervisorSocket()); }));
  EXPECT_GT(daemon::RunningPid(daemon::PidFilePath("quarry")), 0);
  cli::Child index(RunningSystem::Program(), {"index", docs_, "--", "zeppelin"},
                   system_.Files() + "/output");
  EXPECT_FALSE(index.WaitEnded(300));
  ASSERT_EQ(kill(engine, SIGCONT), 0);
  EXPECT_TRUE(index.WaitEnded(60'000));
  EXPECT_EQ(index.Ended().value_or("still running"), "exit code 0");
  EXPECT_NE(ReadFile(system_.Files() + "/output").find(docs_ + "/notes.md"), std::string::npos);
  system_.Stop();
}

TEST_F(FirstLightTest, ReadsOnlyTheKindsThatAreWanted) {
  system_.Start();
  system_.Quarry({"share", "add", docs_});
  system_.Quarry({"folder", "add", "/docs", "--only", "photo"});
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_EQ(Hits({"fox"}), Names{});
  EXPECT_EQ(Hits({"plain"}), Names{"plain.txt"});
  EXPECT_EQ(system_.Quarry({"folder", "set", "/docs", "--with", "document"}).end, "exit code 0");
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_EQ(Hits({"fox"}), Names{"plain.txt"});
  EXPECT_EQ(system_.Quarry({"folder", "set", "/docs", "--without", "document"}).end, "exit code 0");
  ASSERT_TRUE(system_.WaitUntilIdle());
  EXPECT_EQ(Hits({"fox"}), Names{});
  system_.Stop();
}

TEST_F(FirstLightTest, RefusesBeforeAnythingIsChanged) {
  const Ran idle = system_.Quarry({"folder", "add", "/docs"});
  EXPECT_EQ(idle.end, "exit code 1");
  EXPECT_NE(idle.output.find("The supervisor (quarry run) is not running."), std::string::npos)
      << idle.output;

  system_.Start();
  EXPECT_EQ(system_.Quarry({"share", "add", "/"}).end, "exit code 1");
  EXPECT_EQ(system_.Quarry({"share", "add", docs_ + "/missing"}).end, "exit code 1");
  EXPECT_EQ(system_.Quarry({"share", "add", docs_}).end, "exit code 0");
  EXPECT_EQ(system_.Quarry({"share", "add", docs_}).end, "exit code 1");
  EXPECT_EQ(system_.Quarry({"share", "add", Dirname(docs_)}).end, "exit code 1");
  EXPECT_EQ(system_.Quarry({"folder", "add", "/docs/plain.txt/x"}).end, "exit code 1");
  EXPECT_EQ(system_.Quarry({"folder", "get", "/docs"}).end, "exit code 1");
  EXPECT_EQ(system_.Quarry({"folder", "add", "/docs"}).end, "exit code 0");
  EXPECT_EQ(system_.Quarry({"folder", "add", "/docs"}).end, "exit code 1");
  const Ran unknown = system_.Quarry({"no-such-command"});
  EXPECT_EQ(unknown.end, "exit code 2");
  EXPECT_NE(unknown.output.find("not expected: no-such-command\n"), std::string::npos)
      << unknown.output;
  EXPECT_NE(system_.Quarry({"share"}).output.find("A subcommand is required\n"), std::string::npos);
  EXPECT_EQ(system_.QuarryJson({"share", "list"}).size(), 1U);
  EXPECT_EQ(system_.QuarryJson({"folder", "list"})["total"].asInt(), 1);
  EXPECT_EQ(system_.Quarry({"folder", "list", "--offset", "1"}).output,
            "FOLDER  NAME  CONTENT  PAUSED\n");
  system_.Stop();
}

TEST_F(FirstLightTest, ASecondSupervisorIsRefused) {
  system_.Start();
  const Ran second = system_.Quarry({"run"});
  EXPECT_EQ(second.end, "exit code 1");
  system_.Stop();
}

}  // namespace
}  // namespace quarry::test
