// What the command line says when the system cannot do what it is asked.

#include <gtest/gtest.h>

#include <chrono>
#include <csignal>
#include <filesystem>

#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/system/running_system.h"

namespace quarry::test {
namespace {

class ProblemsTest : public testing::Test {
 protected:
  void SetUp() override {
    WriteFile(docs_ + "/one.txt", "capybara");
    system_.Start();
    system_.IndexShare(docs_);
  }
  void TearDown() override { system_.Stop(); }

  // What a command that fails says.
  std::string Refusal(const std::vector<std::string>& arguments) {
    const Ran ran = system_.Quarry(arguments);
    EXPECT_EQ(ran.end, "exit code 1") << ran.output;
    return ran.output;
  }

  RunningSystem system_;
  const std::string docs_ = system_.Files() + "/docs";
  const std::string shares_ = TestRoot() + "/etc/quarry/shares.json";
};

constexpr char kVanished[] =
    "quarry: The share \"docs\", of which folders are indexed, is not known any more; add it again "
    "(quarry share add DIRECTORY), or drop it from the index (quarry share clear NAME /FULL/PATH)";

TEST_F(ProblemsTest, NamesAShareThatHasVanished) {
  std::filesystem::remove(shares_);
  EXPECT_EQ(Refusal({"folder", "reindex", "/docs/live"}), kVanished + std::string(".\n"));
  EXPECT_EQ(Refusal({"folder", "get", "/docs"}), kVanished + std::string(".\n"));
  EXPECT_EQ(Refusal({"search", "capybara"}), kVanished + std::string(".\n"));
  EXPECT_EQ(Refusal({"share", "pause", "docs"}), kVanished + std::string(" (code 800)\n"));
  EXPECT_EQ(Refusal({"queue", "show", "docs"}),
            "quarry: There is no share named \"docs\". \"quarry share list\" names those there "
            "are.\n");
  EXPECT_EQ(
      Refusal({"folder", "get", "/other"}),
      "quarry: There is no share named \"other\", and no directory \"/other\". \"quarry share "
      "list\" names the shares there are.\n");
}

TEST_F(ProblemsTest, DoesNotTakeADamagedListOfSharesForNone) {
  WriteFile(shares_, "{\"shares\":[");
  const std::string cause = "quarry: The list of shares (" + shares_ +
                            ") is damaged; mend it with \"quarry doctor\": The share file " +
                            shares_ + " is no JSON document";
  EXPECT_EQ(Refusal({"search", "capybara"}), cause + " (code 504)\n");
  EXPECT_EQ(Refusal({"share", "list"}), cause + " (code 121)\n");
  EXPECT_EQ(Refusal({"queue", "show", "docs"}), cause + " (code 504)\n");
}

TEST_F(ProblemsTest, AStartRemovesWhatKilledWritersHaveLeft) {
  system_.Kill();
  const std::string directory = TestRoot() + "/var/packages/Quarry/etc/";
  const std::string old_draft = directory + ".quarry-1-2.tmp";
  const std::string new_draft = directory + ".quarry-3-4.tmp";
  for (const std::string& draft : {old_draft, new_draft}) WriteFile(draft, "[");
  std::filesystem::last_write_time(
      old_draft, std::filesystem::file_time_type::clock::now() - std::chrono::hours(1));
  system_.Start();
  EXPECT_FALSE(std::filesystem::exists(old_draft));
  EXPECT_TRUE(std::filesystem::exists(new_draft));
  EXPECT_EQ(system_.QuarryJson({"folder", "list"})["total"].asInt(), 1);
}

TEST_F(ProblemsTest, NamesTheFolderThatIsNotIndexed) {
  EXPECT_EQ(Refusal({"folder", "get", "/docs/live"}),
            "quarry: No such folder is indexed; \"quarry folder list\" names those there are: "
            "/docs/live (code 902)\n");
}

TEST_F(ProblemsTest, TellsAnEngineThatDoesNotStartFromASystemThatDoesNotRun) {
  WriteFile(TestRoot() + "/var/lib/quarry/engine/indexes.json", "{");
  ASSERT_EQ(kill(system_.Pid("tarnelasticd"), SIGKILL), 0);
  std::string said;
  EXPECT_TRUE(WaitUntil([&] {
    said = system_.Quarry({"search", "capybara"}).output;
    return said ==
           "quarry: The search engine (tarnelasticd) does not start (exit code 1). Its reason is "
           "in the log of \"quarry run\"; mend what is damaged with: quarry doctor\n";
  })) << said;
  EXPECT_EQ(system_.Quarry({"doctor"}).end, "exit code 0");
  EXPECT_TRUE(WaitUntil([&] {
    return system_.QuarryJson({"search", "capybara"})["total"].asInt() == 1;
  }));
}

}  // namespace
}  // namespace quarry::test
