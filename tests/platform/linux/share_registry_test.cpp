#include "platform/linux/share_registry.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <thread>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "platform/linux/share_store.h"
#include "tests/platform/linux/share_fixture.h"
#include "tests/support/thrown.h"

namespace quarry::platform {
namespace {

using test::FailureOf;

class ShareRegistryTest : public ShareTest {};

TEST_F(ShareRegistryTest, AMissingFileIsAMachineWithoutShares) {
  EXPECT_TRUE(ReadShares().empty());
  EXPECT_FALSE(RemoveShare("photo"));
}

TEST_F(ShareRegistryTest, KeepsWhatIsAddedInOrder) {
  ShareRecord photo = Add("photo");
  photo.encryption = true;
  photo.recycle_bin = true;
  AddShare(photo);
  Add("audio");
  const std::vector<ShareRecord> shares = ReadShares();
  ASSERT_EQ(shares.size(), 2u);
  EXPECT_EQ(shares[0].name, "photo");
  EXPECT_EQ(shares[0].path, volume_ / "photo");
  EXPECT_TRUE(shares[0].encryption);
  EXPECT_TRUE(shares[0].recycle_bin);
  EXPECT_FALSE(shares[0].encrypted);
  EXPECT_FALSE(shares[0].read_only);
  EXPECT_FALSE(shares[0].hide_unreadable);
  EXPECT_EQ(shares[1].name, "audio");
}

TEST_F(ShareRegistryTest, WritesAReadableFile) {
  Add("photo");
  Json::Value root;
  ASSERT_TRUE(fromString(root, test::ReadFile(ShareFilePath())));
  EXPECT_EQ(root["shares"][0]["name"].asString(), "photo");
  EXPECT_EQ(root["shares"][0]["path"].asString(), volume_ / "photo");
  EXPECT_FALSE(root["shares"][0]["encrypted"].asBool());
  EXPECT_EQ(test::FileMode(ShareFilePath()), 0644u);
}

TEST_F(ShareRegistryTest, AddMakesTheDirectoriesOfQueuesAndIndexes) {
  test::RemoveTree(test::TestRoot() + "/var");
  test::RemoveTree(test::TestRoot() + "/etc");
  Add("photo");
  EXPECT_EQ(test::FileMode(test::TestRoot() + "/var/lib/quarry/queue"), 0750u);
  EXPECT_EQ(test::FileMode(test::TestRoot() + "/var/lib/quarry/index"), 0750u);
  EXPECT_EQ(test::FileMode(test::TestRoot() + "/var/lib/quarry/monitor"), 0750u);
}

TEST_F(ShareRegistryTest, RemovesOneShareAndLeavesItsFiles) {
  Add("photo");
  Add("audio");
  EXPECT_TRUE(RemoveShare("photo"));
  EXPECT_FALSE(RemoveShare("photo"));
  ASSERT_EQ(ReadShares().size(), 1u);
  EXPECT_EQ(ReadShares()[0].name, "audio");
  EXPECT_EQ(test::ListDir(volume_.path()), (std::vector<std::string>{"audio", "photo"}));
}

TEST_F(ShareRegistryTest, RefusesNamesAndPathsThatNoShareHas) {
  const auto refused = [&](const std::string& name, const std::string& path) {
    ShareRecord share;
    share.name = name;
    share.path = path;
    return FailureOf([&] { ValidateShare(share); });
  };
  EXPECT_EQ(refused("photo", "/volume1/photo"), "");
  EXPECT_EQ(refused("photo", "/photo"), "");
  EXPECT_EQ(refused("", "/a"), "120 A share needs a name.");
  EXPECT_EQ(refused(".", "/a/."), "120 A share needs a name.");
  EXPECT_EQ(refused("..", "/a/.."), "120 A share needs a name.");
  const std::string bad_name =
      "120 A share's name has at most 255 bytes, no \"/\" and no control characters.";
  EXPECT_EQ(refused("a/b", "/a/b"), bad_name);
  EXPECT_EQ(refused("a\nb", "/a\nb"), bad_name);
  EXPECT_EQ(refused(std::string("a\0b", 3), "/a"), bad_name);
  EXPECT_EQ(refused(std::string(256, 'a'), "/" + std::string(256, 'a')), bad_name);
  EXPECT_EQ(refused(std::string(255, 'a'), "/" + std::string(255, 'a')), "");
  for (const std::string path :
       {"", "/", "photo", "a/photo", "/a/../photo", "/a//photo", "/photo/", "/./photo"}) {
    EXPECT_EQ(refused("photo", path),
              "120 \"" + path +
                  "\" cannot be a share: give an absolute path below \"/\", without "
                  "\".\", \"..\", \"//\" or a \"/\" at its end.");
  }
  EXPECT_NE(refused("photo", std::string("/a\0/photo", 9)), "");
  EXPECT_EQ(
      refused("photo", "/volume1/Photo"),
      "120 The share \"photo\" cannot live at \"/volume1/Photo\": a share's directory ends in "
      "its name.");
  std::string deep;
  while (deep.size() <= 3000) deep += "/0123456789";
  EXPECT_EQ(refused("photo", deep + "/photo"), "120 A share's path has at most 3000 bytes.");
}

TEST_F(ShareRegistryTest, RefusesPlacesThatAreNoDirectory) {
  ShareRecord share;
  share.name = "photo";
  share.path = volume_ / "photo";
  const auto add = [&] { AddShare(share); };
  EXPECT_EQ(FailureOf(add), "120 \"" + share.path + "\": No such file or directory.");
  test::WriteFile(share.path, "");
  EXPECT_EQ(FailureOf(add), "120 \"" + share.path + "\" is no directory.");
  test::MakeDirs(volume_ / "real/photo");
  ASSERT_EQ(symlink("real", (volume_ / "link").c_str()), 0);
  share.path = volume_ / "link/photo";
  EXPECT_EQ(FailureOf(add), "120 \"" + share.path + "\" leads through a link; the directory is \"" +
                                (volume_ / "real/photo") + "\".");
  EXPECT_TRUE(ReadShares().empty());
}

TEST_F(ShareRegistryTest, RefusesSharesThatMeet) {
  const ShareRecord first = Add("one");
  const auto add = [&](const std::string& name, const std::string& path) {
    test::MakeDirs(path);
    ShareRecord share;
    share.name = name;
    share.path = path;
    return FailureOf([&] { AddShare(share); });
  };
  EXPECT_EQ(add("one", volume_ / "other/one"),
            "120 There is a share called \"one\" already, at \"" + first.path + "\".");
  EXPECT_EQ(add("inner", first.path + "/inner"),
            "120 \"" + first.path +
                "/inner\" lies in the share \"one\": add it as "
                "a folder.");
  const std::string volume_name = volume_.path().substr(volume_.path().rfind('/') + 1);
  EXPECT_EQ(add(volume_name, volume_.path()), "120 \"" + volume_.path() +
                                                  "\" contains the share \"one\" (\"" + first.path +
                                                  "\"): shares do not contain each other.");
  EXPECT_EQ(add("onetwo", volume_ / "onetwo"), "");
  EXPECT_EQ(ReadShares().size(), 2u);
}

TEST_F(ShareRegistryTest, ABadFileIsAnErrorAndIsNotReplaced) {
  const std::string photo = "{\"name\":\"photo\",\"path\":\"/v/photo\"}";
  const std::vector<std::pair<std::string, std::string>> cases = {
      {"", "is no JSON document"},
      {"{\"shares\":[]", "is no JSON document"},
      {"[]", "has no list \"shares\""},
      {"{}", "has no list \"shares\""},
      {"{\"shares\":{}}", "has no list \"shares\""},
      {"{\"shares\":[1]}", "has a share that is no object"},
      {"{\"shares\":[{\"path\":\"/v/photo\"}]}", "has a share without the text \"name\""},
      {"{\"shares\":[{\"name\":\"photo\",\"path\":7}]}", "has a share without the text \"path\""},
      {"{\"shares\":[{\"name\":\"a\",\"path\":\"/v/a\",\"read_only\":1}]}",
       "has a share whose \"read_only\" is not true or false"},
      {"{\"shares\":[{\"name\":\"\",\"path\":\"/\"}]}",
       "has a share that cannot be used: A share needs a name."},
      {"{\"shares\":[" + photo + "," + photo + "]}", "has two shares called \"photo\""}};
  test::MakeDirs(volume_ / "new");
  ShareRecord share;
  share.name = "new";
  share.path = volume_ / "new";
  for (const auto& [text, what] : cases) {
    WriteShareFile(text);
    const std::string error = "504 The share file " + ShareFilePath() + " " + what;
    EXPECT_EQ(FailureOf([] { ReadShares(); }), error) << text;
    EXPECT_EQ(FailureOf([&] { AddShare(share); }), error) << text;
    EXPECT_EQ(FailureOf([] { RemoveShare("photo"); }), error) << text;
    EXPECT_EQ(test::ReadFile(ShareFilePath()), text);
  }
}

TEST_F(ShareRegistryTest, AFileOfAnotherKindIsAnError) {
  test::MakeDirs(ShareFilePath());
  EXPECT_EQ(FailureOf([] { ReadShares(); }),
            "504 The share file " + ShareFilePath() + " cannot be read: Invalid argument");
}

TEST_F(ShareRegistryTest, SeesEveryReplacementOfTheFile) {
  for (int i = 0; i < 100; ++i) {
    const std::string name = std::to_string(i % 10);
    WriteShareFile("");
    unlink(ShareFilePath().c_str());
    WriteShareFile("{\"shares\":[{\"name\":\"" + name + "\",\"path\":\"/v/" + name + "\"}]}");
    ASSERT_EQ(ReadShares().at(0).name, name);
    unlink(ShareFilePath().c_str());
    ASSERT_TRUE(ReadShares().empty());
  }
}

TEST_F(ShareRegistryTest, ReadsTheFileOnceUntilItChanges) {
  Add("photo");
  const ShareList first = LoadShares();
  EXPECT_EQ(LoadShares(), first);
  Add("audio");
  EXPECT_NE(LoadShares(), first);
  EXPECT_EQ(first->size(), 1u) << "what was handed out does not change";
}

TEST_F(ShareRegistryTest, AddersAndReadersDoNotDisturbEachOther) {
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    test::MakeDirs(volume_ / std::to_string(t));
    threads.emplace_back([this, t] {
      ShareRecord share;
      share.name = std::to_string(t);
      share.path = volume_ / share.name;
      AddShare(share);
      for (int i = 0; i < 50; ++i) EXPECT_GE(ReadShares().size(), 1u);
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(ReadShares().size(), 4u);
}

TEST_F(ShareRegistryTest, FindsTheDeepestShare) {
  std::vector<ShareRecord> shares(3);
  shares[0].path = "/v/a";
  shares[1].path = "/v/a/b";
  shares[2].path = "/v/ab";
  EXPECT_EQ(ShareHolding(shares, "/v/a/b/c"), &shares[1]);
  EXPECT_EQ(ShareHolding(shares, "/v/a/b"), &shares[1]);
  EXPECT_EQ(ShareHolding(shares, "/v/a/bc"), &shares[0]);
  EXPECT_EQ(ShareHolding(shares, "/v/ab/x"), &shares[2]);
  EXPECT_EQ(ShareHolding(shares, "/v"), nullptr);
  EXPECT_EQ(ShareHolding({}, "/v"), nullptr);
}

}  // namespace
}  // namespace quarry::platform
