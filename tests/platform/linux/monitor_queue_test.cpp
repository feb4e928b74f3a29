#include "platform/include/monitor.h"

#include <gtest/gtest.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <string>
#include <vector>

#include "common/json.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace {

// What has been synced, in its order.
std::vector<std::string>& Synced() {
  static std::vector<std::string> paths;
  return paths;
}

}  // namespace

// In the place of the C library's: nothing else tells what would outlast a power failure.
extern "C" int fsync(int fd) {
  std::error_code failure;
  Synced().push_back(
      std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(fd), failure).string());
  return static_cast<int>(syscall(SYS_fsync, fd));
}

namespace TARN::TARNOTIFYD {
namespace {

namespace test = quarry::test;
using Names = std::vector<std::string>;
constexpr MonitorQueueType kType = MONITOR_QUEUE_TYPE_APPLICATION;

Json::Value Config(const std::string& queue, int paths = 1) {
  Json::Value config;
  config["queue"] = queue;
  config["config"] = Json::Value(Json::arrayValue);
  for (int i = 0; i < paths; ++i) {
    Json::Value entry;
    entry["path"] = "/v/photo/" + std::to_string(i);
    entry["mask"] = 65478;
    entry["ignore"].append("@eaDir");
    config["config"].append(entry);
  }
  return config;
}

class MonitorQueueTest : public ::testing::Test {
 protected:
  MonitorQueueTest() { test::ResetTestRoot(); }
  const std::string dir_ = test::TestRoot() + "/var/lib/quarry/monitor";
};

TEST_F(MonitorQueueTest, KeepsARegistrationInAFileOfItsOwn) {
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(Config("/q/photo")), "fileindex", kType));
  ASSERT_EQ(test::ListDir(dir_), Names{"fileindex-q+photo.json"});
  Json::Value document;
  ASSERT_TRUE(quarry::fromString(document, test::ReadFile(dir_ + "/fileindex-q+photo.json")));
  EXPECT_EQ(quarry::toString(document),
            "{\"application\":\"fileindex\",\"config\":[{\"ignore\":[\"@eaDir\"],\"mask\":65478,"
            "\"path\":\"/v/photo/0\"}],\"queue\":\"/q/photo\",\"type\":1}");
}

TEST_F(MonitorQueueTest, ADirectoryThatSomebodyElseHasMadeLastsAsWell) {
  ASSERT_TRUE(std::filesystem::create_directories(dir_));
  Synced().clear();
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(Config("/q/photo")), "fileindex", kType));
  const std::string parent = std::filesystem::path(dir_).parent_path();
  EXPECT_EQ(std::count(Synced().begin(), Synced().end(), parent), 1);
  EXPECT_EQ(std::count(Synced().begin(), Synced().end(), dir_), 1);
}

TEST_F(MonitorQueueTest, ReplacesTheRegistrationOfTheSameQueueOnly) {
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(Config("/q/photo", 3)), "fileindex", kType));
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(Config("/q/audio", 1)), "fileindex", kType));
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(Config("/q/photo", 0)), "fileindex", kType));
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(Config("/q/photo", 2)), "other", kType));
  EXPECT_EQ(test::ListDir(dir_),
            (Names{"fileindex-q+audio.json", "fileindex-q+photo.json", "other-q+photo.json"}));
  Json::Value document;
  ASSERT_TRUE(quarry::fromString(document, test::ReadFile(dir_ + "/fileindex-q+photo.json")));
  EXPECT_TRUE(document["config"].isArray());
  EXPECT_EQ(document["config"].size(), 0u);
}

TEST_F(MonitorQueueTest, DeletesOneRegistrationAndIsContentWithoutOne) {
  EXPECT_TRUE(MonitorQueue::Delete("/q/photo", "fileindex", kType));
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(Config("/q/photo")), "fileindex", kType));
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(Config("/q/audio")), "fileindex", kType));
  EXPECT_TRUE(MonitorQueue::Delete("/q/photo", "fileindex", kType));
  EXPECT_EQ(test::ListDir(dir_), Names{"fileindex-q+audio.json"});
  EXPECT_TRUE(MonitorQueue::Delete("/q/photo", "fileindex", kType));
}

TEST_F(MonitorQueueTest, LongQueuePathsHaveFilesOfTheirOwn) {
  const std::string path = "/" + std::string(1000, 'q');
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(Config(path + "a")), "fileindex", kType));
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(Config(path + "b")), "fileindex", kType));
  EXPECT_EQ(test::ListDir(dir_).size(), 2u);
  EXPECT_TRUE(MonitorQueue::Delete(path + "a", "fileindex", kType));
  EXPECT_EQ(test::ListDir(dir_).size(), 1u);
}

TEST_F(MonitorQueueTest, RefusesWhatIsNoConfigurationAndChangesNothing) {
  std::vector<Json::Value> bad(12, Config("/q/photo"));
  bad[0] = Json::Value();
  bad[1] = Json::Value(Json::arrayValue);
  bad[2].removeMember("queue");
  bad[3]["queue"] = 7;
  bad[4]["queue"] = "relative";
  bad[5]["queue"] = "/";
  bad[6]["config"] = Json::Value(Json::objectValue);
  bad[7]["config"].append("text");
  bad[8]["config"][0]["mask"] = "0xFFC6";
  bad[9]["config"][0].removeMember("path");
  bad[10]["config"][0]["ignore"] = "@eaDir";
  bad[11]["config"][0]["ignore"].append(7);
  for (const Json::Value& config : bad) {
    errno = 0;
    EXPECT_FALSE(MonitorQueue::Upsert(MonitorQueue(config), "fileindex", kType))
        << quarry::toString(config);
    EXPECT_EQ(errno, EINVAL);
  }
  for (const char* application : {"", "../x", "a/b", "a-b", ".hidden", "a b"}) {
    EXPECT_FALSE(MonitorQueue::Upsert(MonitorQueue(Config("/q/photo")), application, kType));
    EXPECT_FALSE(MonitorQueue::Delete("/q/photo", application, kType));
  }
  for (const char* queue : {"", "/", "relative", "/q/", "/.."}) {
    EXPECT_FALSE(MonitorQueue::Delete(queue, "fileindex", kType));
  }
  EXPECT_TRUE(test::ListDir(test::TestRoot() + "/var/lib/quarry") == (Names{"index", "queue"}) ||
              test::ListDir(dir_).empty());
}

TEST_F(MonitorQueueTest, TwoSpellingsOfAQueueAreOneRegistration) {
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(Config("/r//q/photo")), "fileindex", kType));
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(Config("/r/./q/photo")), "fileindex", kType));
  EXPECT_EQ(test::ListDir(dir_), Names{"fileindex-r+q+photo.json"});
  EXPECT_TRUE(MonitorQueue::Delete("/r/x/../q/photo", "fileindex", kType));
  EXPECT_EQ(test::ListDir(dir_), Names{});
}

TEST_F(MonitorQueueTest, FailsWhenItCannotBeKept) {
  test::RemoveTree(dir_);
  test::WriteFile(dir_, "in the way");
  errno = 0;
  EXPECT_FALSE(MonitorQueue::Upsert(MonitorQueue(Config("/q/photo")), "fileindex", kType));
  EXPECT_EQ(errno, ENOTDIR);
  EXPECT_FALSE(MonitorQueue::Delete("/q/photo", "fileindex", kType));
}

TEST_F(MonitorQueueTest, KeepsPathsOfAnyBytes) {
  Json::Value config = Config("/q/\xff\xc3");
  config["config"][0]["path"] = "/v/\xff\xfe \"quoted\"\n";
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(config), "fileindex", kType));
  Json::Value document;
  ASSERT_TRUE(quarry::fromString(document, test::ReadFile(dir_ + "/" + test::ListDir(dir_).at(0))));
  EXPECT_EQ(document["config"][0]["path"].asString(), "/v/\xff\xfe \"quoted\"\n");
  EXPECT_EQ(document["queue"].asString(), "/q/\xff\xc3");
}

}  // namespace
}  // namespace TARN::TARNOTIFYD
