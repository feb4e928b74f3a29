// "Did you mean", and words that complete a line of the shell.

#include <gtest/gtest.h>

#include <cstdlib>

#include "cli/supervisor/child.h"
#include "common/file_util.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/system/running_system.h"

namespace quarry::test {
namespace {

class SuggestionsTest : public testing::Test {
 protected:
  void SetUp() override {
    WriteFile(docs_ + "/one.txt", "a capybara in the harbour");
    WriteFile(docs_ + "/two.txt", "a capybara in the water");
    system_.Start();
  }
  void TearDown() override { system_.Stop(); }

  // What bash offers for the last of the words, with blanks between.
  std::string Offered(const std::string& words) {
    const std::string script =
        "cd \"$2\" && PATH=\"$1:$PATH\" && source <(quarry completion) && COMP_WORDS=(" + words +
        ") && COMP_CWORD=$((${#COMP_WORDS[@]} - 1)) && _quarry && echo \"${COMPREPLY[*]}\"";
    const std::string output = scratch_ / "offered";
    Unlink(output);
    cli::Child bash("/bin/bash",
                    {"-c", script, "bash", Dirname(RunningSystem::Program()), scratch_.path()},
                    output);
    EXPECT_TRUE(bash.WaitEnded(60'000));
    EXPECT_EQ(bash.Ended().value_or("still running"), "exit code 0");
    const std::string offered = ReadFile(output);
    return offered.substr(0, offered.find('\n'));
  }

  RunningSystem system_;
  TempDir scratch_;
  std::string docs_ = system_.Files() + "/docs";
};

TEST_F(SuggestionsTest, ComeOnceWordsHaveBeenCollected) {
  system_.IndexShare(docs_);
  EXPECT_EQ(system_.Run({"search", "capibara"}), "Nothing found.\n");
  EXPECT_EQ(system_.Run({"search", "--complete", "cap"}), "");
  EXPECT_EQ(system_.QuarryJson({"suggest"})["indexes"][0], "fileindex_docs");
  EXPECT_EQ(system_.Run({"search", "capibara"}), "Nothing found.\nDid you mean \"capybara\"?\n");
  EXPECT_EQ(system_.Run({"search", "capibara -lion", "type:document"}),
            "Nothing found.\n");  // one word of the shell is a phrase
  const Json::Value found = system_.QuarryJson({"search", "capibara -lion type:document"});
  EXPECT_EQ(found["suggestion"], "capybara -lion type:document");
  EXPECT_EQ(found["total"].asInt(), 0);
  EXPECT_FALSE(system_.QuarryJson({"search", "capybara"}).isMember("suggestion"));
  EXPECT_EQ(system_.QuarryJson({"suggest", "docs"})["indexes"].size(), 1U);
  const Ran refused = system_.Quarry({"suggest", "nobody"});
  EXPECT_EQ(refused.end, "exit code 1");
  EXPECT_NE(refused.output.find("There is no share named \"nobody\""), std::string::npos);
}

TEST_F(SuggestionsTest, AreThereAfterTheIndexCommand) {
  const std::string shown = system_.Run({"index", docs_, "--", "capibara"});
  EXPECT_NE(shown.find("Did you mean \"capybara\"?"), std::string::npos) << shown;
}

TEST_F(SuggestionsTest, CompleteWords) {
  system_.IndexShare(docs_);
  EXPECT_EQ(system_.Run({"suggest"}).substr(0, 41), "Refreshed the words to suggest (1 share).");
  EXPECT_EQ(system_.Run({"search", "--complete", "CAP"}), "capybara\n");
  EXPECT_EQ(system_.QuarryJson({"search", "--complete", "cap"})["words"][0], "capybara");
  EXPECT_EQ(system_.Run({"search", "--complete", "zzz"}), "");
  EXPECT_EQ(system_.Run({"search", "--complete", ""}), "");
  EXPECT_EQ(system_.Quarry({"search"}).end, "exit code 2");
  EXPECT_EQ(system_.Quarry({"search", "--complete"}).end, "exit code 2");
  EXPECT_EQ(system_.Quarry({"search", "--complete", "cap", "word"}).end, "exit code 2");
  EXPECT_EQ(Offered("quarry search water cap"), "capybara");
  EXPECT_EQ(Offered("quarry search --l"), "--limit");
  EXPECT_EQ(Offered("quarry search --limit cap"), "");
}

TEST_F(SuggestionsTest, CompletionIsSilentWithoutASystem) {
  system_.IndexShare(docs_);
  system_.Run({"suggest"});
  system_.Stop();
  EXPECT_EQ(system_.Run({"search", "--complete", "cap"}), "");
  EXPECT_EQ(system_.QuarryJson({"search", "--complete", "cap"})["words"].size(), 0U);
  EXPECT_EQ(Offered("quarry search cap"), "");
  system_.Start();
}

TEST_F(SuggestionsTest, CompletionTakesNamesAsTheyStand) {
  const std::string strange = system_.Files() + "/a $(touch hit) b";
  WriteFile(strange + "/one.txt", "x");
  system_.IndexShare(docs_);
  system_.Run({"share", "add", strange});
  EXPECT_EQ(Offered("quarry share pause d"), "docs");
  EXPECT_EQ(Offered("quarry share pause a"), "a $(touch hit) b");
  EXPECT_EQ(Offered("quarry sh"), "share");
  EXPECT_EQ(Offered("quarry share re"), "remove rename resume");
  EXPECT_FALSE(IsFileExist(scratch_ / "hit"));
}

}  // namespace
}  // namespace quarry::test
