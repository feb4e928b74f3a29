// Chains of renames within one pass: nothing is read again, whatever was done before.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <random>

#include "tests/daemons/fileindexd/share_fixture.h"

namespace quarry::fileindexd {
namespace {

using fileindex::EVENT_ATTR;
using fileindex::EVENT_RENAME;
using ::testing::Contains;
using ::testing::HasSubstr;
using ::testing::Not;

class RenamePassTest : public ShareFixture {
 protected:
  void SetUp() override {
    for (const char* path : {"/v/s/a/1.txt", "/v/s/a/deep/2.txt", "/v/s/other/3.txt"}) {
      disk_.WriteFile(path);
    }
    Run(true);
    index_.ForgetCommands();
  }

  void Rename(const std::string& from, const std::string& to) {
    disk_.Rename(from, to);
    Queue(EVENT_RENAME, to, true, from);
    for (const std::string& path : {from, to}) {
      Queue(EVENT_ATTR, path.substr(0, path.rfind('/')), true);
    }
  }

  void ExpectNothingRead(bool full) {
    EXPECT_THAT(CommandsOf(full), Not(Contains(HasSubstr(".txt content"))));
    ExpectInLine();
  }
};

TEST_F(RenamePassTest, AChainGoesToItsEnd) {
  Rename("/v/s/a", "/v/s/b");
  Rename("/v/s/b", "/v/s/other/c");
  Rename("/v/s/other/c", "/v/s/d");
  ExpectNothingRead(false);
}

TEST_F(RenamePassTest, AlsoWhenTheWholeShareIsCompared) {
  Rename("/v/s/a", "/v/s/b");
  Rename("/v/s/b", "/v/s/c");
  ExpectNothingRead(true);
}

TEST_F(RenamePassTest, ThereAndBack) {
  Rename("/v/s/a", "/v/s/b");
  Rename("/v/s/b", "/v/s/a");
  ExpectNothingRead(false);
}

// A pass was cut short after it had moved the documents, and they have moved on since.
TEST_F(RenamePassTest, FromAnyPlaceOfTheChain) {
  Rename("/v/s/a", "/v/s/b");
  index_.Rename("/v/s/b", "/v/s/a");
  Rename("/v/s/b", "/v/s/a");
  ExpectNothingRead(false);
}

// Whatever random renames do, to directories that come to stand in each other's places too, the
// index is in line with the disk afterwards.
TEST_F(RenamePassTest, RandomRenamesEndInLine) {
  std::mt19937 random(7);
  const std::vector<std::string> places{"/v/s/a",     "/v/s/b",      "/v/s/c",
                                        "/v/s/other", "/v/s/a/deep", "/v/s/b/deep"};
  for (int round = 0; round < 100; ++round) {
    for (int i = 0; i < 4; ++i) {
      const std::string& from = places[random() % places.size()];
      const std::string& to = places[random() % places.size()];
      const bool nested = (to + "/").starts_with(from + "/") || (from + "/").starts_with(to + "/");
      if (nested || disk_.Peek(from).kind != PlaceKind::kDirectory ||
          disk_.Peek(to).kind != PlaceKind::kAbsent ||
          disk_.Peek(to.substr(0, to.rfind('/'))).kind != PlaceKind::kDirectory) {
        continue;
      }
      Rename(from, to);
    }
    SCOPED_TRACE(round);
    Run();
    ExpectInLine();
  }
}

}  // namespace
}  // namespace quarry::fileindexd
