#include "daemons/tarnotifyd/registrations.h"

#include <gtest/gtest.h>
#include <poll.h>

#include <filesystem>

#include "tests/support/files.h"
#include "tests/support/root.h"

namespace quarry::notify {
namespace {

class RegistrationsTest : public ::testing::Test {
 protected:
  RegistrationsTest() { test::ResetTestRoot(); }

  // As a registration is written: beside its name, and renamed.
  void Put(const std::string& name, const std::string& text) const {
    test::WriteFile(directory_ + "/x.tmp", text);
    std::filesystem::rename(directory_ + "/x.tmp", directory_ + "/" + name);
  }
  static std::string Text(const std::string& queue, const std::string& place) {
    return R"({"application":"a","type":1,"queue":")" + queue + R"(","config":[{"path":")" + place +
           R"(","mask":65478,"ignore":["@eaDir"]}]})";
  }
  bool IsReady() const {
    pollfd polled{registrations_.Descriptor(), POLLIN, 0};
    return poll(&polled, 1, 0) > 0;
  }

  const std::string directory_ = test::TestRoot() + "/var/lib/quarry/monitor";
  Registrations registrations_;
};

TEST_F(RegistrationsTest, TheDirectoryMayComeLater) {
  std::filesystem::remove_all(std::filesystem::path(directory_).parent_path());
  EXPECT_FALSE(registrations_.Refresh());
  EXPECT_EQ(registrations_.Descriptor(), -1);
  Put("a.json", Text("/q", "/v/a"));
  EXPECT_TRUE(registrations_.Refresh());
  EXPECT_FALSE(registrations_.Refresh());
  const platform::WatchedPlace place{"/v/a", 0xFFC6, {"@eaDir"}};
  EXPECT_EQ(registrations_.Queues(), (QueuePlaces{{"/q", {place}}}));
}

TEST_F(RegistrationsTest, TheFirstRegistrationWakes) {
  EXPECT_FALSE(registrations_.Refresh());
  EXPECT_FALSE(IsReady());
  Put("a.json", Text("/q", "/v/a"));
  EXPECT_TRUE(IsReady());
  EXPECT_TRUE(registrations_.Refresh());
}

TEST_F(RegistrationsTest, EveryChangeWakes) {
  Put("a.json", Text("/q", "/v/a"));
  registrations_.Refresh();
  EXPECT_FALSE(IsReady());
  Put("a.json", Text("/q", "/v/b"));
  EXPECT_TRUE(IsReady());
  EXPECT_TRUE(registrations_.Refresh());
  EXPECT_FALSE(IsReady());
  EXPECT_EQ(registrations_.Queues().at("/q").at(0).path, "/v/b");
  std::filesystem::remove(directory_ + "/a.json");
  EXPECT_TRUE(IsReady());
  EXPECT_TRUE(registrations_.Refresh());
  EXPECT_TRUE(registrations_.Queues().empty());
}

TEST_F(RegistrationsTest, AnotherDirectoryInItsPlaceIsFollowed) {
  Put("a.json", Text("/q", "/v/a"));
  registrations_.Refresh();
  std::filesystem::rename(directory_, directory_ + ".old");
  EXPECT_TRUE(registrations_.Refresh());
  EXPECT_TRUE(registrations_.Queues().empty());
  Put("b.json", Text("/q", "/v/b"));
  EXPECT_TRUE(registrations_.Refresh());
  EXPECT_FALSE(IsReady());
  Put("c.json", Text("/r", "/v/c"));
  EXPECT_TRUE(IsReady());
}

TEST_F(RegistrationsTest, WhatCannotBeListedHolds) {
  Put("a.json", Text("/q", "/v/a"));
  registrations_.Refresh();
  std::filesystem::rename(directory_, directory_ + ".old");
  test::WriteFile(directory_, "in the way");
  EXPECT_FALSE(registrations_.Refresh());
  EXPECT_EQ(registrations_.Queues().size(), 1U);
}

// As for want of descriptors: what was registered is not withdrawn by that.
TEST_F(RegistrationsTest, WhatCannotBeReadForNowHolds) {
  Put("a.json", Text("/q", "/v/a"));
  registrations_.Refresh();
  std::filesystem::remove(directory_ + "/a.json");
  std::filesystem::create_symlink("a.json", directory_ + "/a.json");
  for (int i = 0; i < 2; ++i) {
    EXPECT_FALSE(registrations_.Refresh());
    EXPECT_EQ(registrations_.Queues().size(), 1U);
  }
  Put("a.json", Text("/q", "/v/b"));
  EXPECT_TRUE(registrations_.Refresh());
  EXPECT_EQ(registrations_.Queues().at("/q").at(0).path, "/v/b");
  std::filesystem::remove(directory_ + "/a.json");
  EXPECT_TRUE(registrations_.Refresh());
  EXPECT_TRUE(registrations_.Queues().empty());
}

TEST_F(RegistrationsTest, PathsAreBroughtIntoTheirShortestForm) {
  Put("a.json", Text("/q/./x//y", "/v//a/../b/"));
  EXPECT_TRUE(registrations_.Refresh());
  EXPECT_EQ(registrations_.Queues().at("/q/x/y").at(0).path, "/v/b");
}

TEST_F(RegistrationsTest, ADamagedFileConcernsNobodyElse) {
  Put("good.json", Text("/q", "/v/a"));
  const std::string whole = Text("/other", "/v/b");
  for (std::size_t cut = 0; cut < whole.size(); ++cut) {
    Put("cut.json", whole.substr(0, cut));
    registrations_.Refresh();
    EXPECT_EQ(registrations_.Queues().size(), 1U) << cut;
  }
  for (const char* place : {"", "/", "relative", "/.."}) {
    Put("cut.json", Text("/other", place));
    registrations_.Refresh();
    EXPECT_EQ(registrations_.Queues().size(), 1U) << place;
  }
  std::filesystem::create_directory(directory_ + "/directory.json");
  Put("cut.json", whole);
  EXPECT_TRUE(registrations_.Refresh());
  EXPECT_EQ(registrations_.Queues().size(), 2U);
}

}  // namespace
}  // namespace quarry::notify
