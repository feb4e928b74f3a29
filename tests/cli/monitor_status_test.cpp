#include "cli/monitor_status.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <optional>
#include <sstream>
#include <string>

#include "common/json.h"
#include "daemons/common/single_instance.h"
#include "daemons/common/status_file.h"
#include "tests/support/root.h"

namespace quarry::cli {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

class MonitorStatusTest : public ::testing::Test {
 protected:
  MonitorStatusTest() {
    test::ResetTestRoot();
    instance_.emplace("tarnotifyd");
    file_.emplace("tarnotifyd");
  }

  void Say(const std::string& text) {
    Json::Value status;
    ASSERT_TRUE(fromString(status, text));
    file_->Write(status);
  }
  static std::string Printed() {
    std::ostringstream out;
    PrintMonitor(out, MonitorStatus());
    return out.str();
  }

  std::optional<daemon::SingleInstance> instance_;
  std::optional<daemon::StatusFile> file_;
};

TEST_F(MonitorStatusTest, WithoutAMonitorChangesAreNotFollowed) {
  Say(R"({"source":"inotify","directories":7,"queues":[]})");
  instance_.reset();
  EXPECT_EQ(toString(MonitorStatus()), "{\"running\":false}");
  EXPECT_THAT(Printed(), HasSubstr("Changes are not followed, since tarnotifyd does not run"));
}

TEST_F(MonitorStatusTest, AMonitorThatStartsHasNothingToSay) {
  EXPECT_EQ(toString(MonitorStatus()),
            "{\"pid\":" + std::to_string(getpid()) + ",\"running\":true}");
  EXPECT_EQ(Printed(), "Changes: tarnotifyd starts.\n");
}

TEST_F(MonitorStatusTest, SaysWhatIsWatched) {
  Say(R"({"source":"inotify","file_systems":0,"directories":1,"unwatched":[],"queues":[
      {"queue":"/q/a","places":1,"overflows":1,"problem":""},
      {"queue":"/q/b","places":2,"overflows":2,"problem":""}]})");
  EXPECT_EQ(Printed(),
            "Changes: inotify watches 1 directory for 2 queues, 3 overflows since the start.\n");
  Say(R"({"source":"fanotify","file_systems":1,"directories":20,"unwatched":[],"queues":[
      {"queue":"/q/a","places":1,"overflows":1,"problem":""}]})");
  EXPECT_EQ(Printed(),
            "Changes: fanotify watches 1 file system and 20 directories for 1 queue, 1 overflow "
            "since the start.\n");
}

TEST_F(MonitorStatusTest, SaysWhatIsAmiss) {
  Say(R"({"source":"inotify","file_systems":0,"directories":1,"unwatched":[
      {"path":"/v/\u0001a","reason":"the limit fs.inotify.max_user_watches is reached"},
      {"path":"/v/b","reason":"/v/b/c: Input/output error"}],
      "queues":[{"queue":"/q/a","places":1,"overflows":1,"problem":"No space left on device"}]})");
  const std::string printed = Printed();
  EXPECT_THAT(printed, HasSubstr("Not all in /v/\\x01a can be watched: the limit "
                                 "fs.inotify.max_user_watches is reached."));
  EXPECT_THAT(printed, HasSubstr("sysctl fs.inotify.max_user_watches="));
  EXPECT_THAT(printed, HasSubstr("Not all in /v/b can be watched: /v/b/c: Input/output error."));
  EXPECT_THAT(printed, HasSubstr("The queue /q/a cannot be written: No space left on device.\n"));
  const Json::Value unwatched = MonitorStatus()["unwatched"];
  EXPECT_THAT(unwatched[0]["sysctl"].asString(), HasSubstr("fs.inotify.max_user_watches="));
  EXPECT_FALSE(unwatched[1].isMember("sysctl"));
}

}  // namespace
}  // namespace quarry::cli
