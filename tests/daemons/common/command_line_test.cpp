#include "daemons/common/command_line.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace quarry::daemon {
namespace {

class CommandLineTest : public testing::Test {
 protected:
  CommandLineTest() { app_.add_option("--number", number_, "A number"); }

  std::optional<int> Parse(std::vector<std::string> words) {
    words.insert(words.begin(), "daemon");
    std::vector<char*> arguments;
    for (std::string& word : words) arguments.push_back(word.data());
    return ParseCommandLine(&app_, static_cast<int>(arguments.size()), arguments.data());
  }

  CLI::App app_{"A daemon", "daemon"};
  int number_ = 7;
};

TEST_F(CommandLineTest, GoesOnWithWhatItUnderstands) {
  EXPECT_EQ(Parse({}), std::nullopt);
  EXPECT_EQ(number_, 7);
  EXPECT_EQ(Parse({"--number", "8"}), std::nullopt);
  EXPECT_EQ(number_, 8);
}

TEST_F(CommandLineTest, HelpIsNoFailure) {
  testing::internal::CaptureStdout();
  EXPECT_EQ(Parse({"--help"}), 0);
  EXPECT_NE(testing::internal::GetCapturedStdout().find("--number"), std::string::npos);
}

TEST_F(CommandLineTest, RefusesAllElse) {
  for (const std::vector<std::string>& words :
       {std::vector<std::string>{"--other"}, {"word"}, {"--number"}, {"--number", "many"}}) {
    testing::internal::CaptureStderr();
    EXPECT_EQ(Parse(words), 2) << words.front();
    EXPECT_NE(testing::internal::GetCapturedStderr(), "");
  }
}

}  // namespace
}  // namespace quarry::daemon
