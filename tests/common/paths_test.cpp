#include "common/paths.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <string>

#include "tests/support/root.h"

namespace quarry {
namespace {

// The root is read while a program is loaded, so that each value needs a program of its own: this
// one, started with the variable below, says where a fixed path lies and ends.
const bool is_told = [] {
  if (std::getenv("QUARRY_TEST_TELL_PATH") == nullptr) return false;
  std::printf("[%s] [%s]", Root().c_str(), RootedPath("/var/run/x.sock").c_str());
  std::exit(0);
}();

// What the program says when `setting` ("-u NAME" or "NAME=value") is applied to its environment.
std::string ToldWith(const std::string& setting) {
  const std::string program = std::filesystem::read_symlink("/proc/self/exe").string();
  const std::string command = "env " + setting + " QUARRY_TEST_TELL_PATH=1 '" + program + "'";
  FILE* pipe = popen(command.c_str(), "r");
  if (pipe == nullptr) return "not started";
  std::string told;
  for (int c = std::fgetc(pipe); c != EOF; c = std::fgetc(pipe)) told += static_cast<char>(c);
  return pclose(pipe) == 0 ? told : "failed: " + told;
}

TEST(PathsTest, FixedPathsLieBelowTheRoot) {
  EXPECT_FALSE(is_told);
  EXPECT_EQ(Root(), test::TestRoot());
  EXPECT_EQ(RootedPath("/var/run/x.sock"), test::TestRoot() + "/var/run/x.sock");
}

TEST(PathsTest, RootIsComputedOnce) {
  const std::string before = Root();
  setenv("QUARRY_ROOT", "/elsewhere", 1);
  EXPECT_EQ(Root(), before);
  setenv("QUARRY_ROOT", before.c_str(), 1);
}

TEST(PathsTest, WithoutARootTheFixedPathsAreExactlyThemselves) {
  for (const char* setting :
       {"-u QUARRY_ROOT", "QUARRY_ROOT=", "QUARRY_ROOT=/", "QUARRY_ROOT=//"}) {
    EXPECT_EQ(ToldWith(setting), "[] [/var/run/x.sock]") << setting;
  }
}

TEST(PathsTest, SlashesAtTheEndOfTheRootAreNoPartOfIt) {
  for (const char* setting : {"QUARRY_ROOT=/a/b", "QUARRY_ROOT=/a/b/", "QUARRY_ROOT=/a/b//"}) {
    EXPECT_EQ(ToldWith(setting), "[/a/b] [/a/b/var/run/x.sock]") << setting;
  }
}

}  // namespace
}  // namespace quarry
