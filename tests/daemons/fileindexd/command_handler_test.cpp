#include "daemons/fileindexd/command_handler.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <stdexcept>

#include "common/error.h"
#include "common/json.h"

namespace quarry::fileindexd {
namespace {

using ::testing::HasSubstr;
using ::testing::Return;
using ::testing::StrictMock;
using ::testing::Throw;

class MockTarget : public CommandTarget {
 public:
  MOCK_METHOD(void, SettingChanged, (const std::string& share, bool is_upsert), (override));
  MOCK_METHOD(void, Pause, (long long resume_time), (override));
  MOCK_METHOD(void, Resume, (), (override));
  MOCK_METHOD(void, CreateWorker, (const std::string& share), (override));
  MOCK_METHOD(void, DeleteWorker, (const std::string& share, pid_t while_running), (override));
  MOCK_METHOD(Json::Value, Status, (), (const, override));
};

class CommandHandlerTest : public ::testing::Test {
 protected:
  // The answer to a request's text.
  Json::Value Ask(const std::string& text) {
    Json::Value answer;
    EXPECT_TRUE(fromString(answer, HandleCommand(target_, text, 4711)));
    return answer;
  }

  void ExpectDone(const std::string& text) {
    EXPECT_EQ("{\"success\":true}", HandleCommand(target_, text, 4711)) << text;
  }

  void ExpectRefused(const std::string& text, const std::string& reason) {
    const Json::Value answer = Ask(text);
    EXPECT_FALSE(answer["success"].asBool()) << text;
    EXPECT_EQ(120, answer["error"]["code"].asInt()) << text;
    EXPECT_THAT(answer["error"]["msg"].asString(), HasSubstr(reason)) << text;
  }

  StrictMock<MockTarget> target_;
};

TEST_F(CommandHandlerTest, NotifySettingChanged) {
  EXPECT_CALL(target_, SettingChanged("photo", true));
  ExpectDone(R"({"type":"notify_setting_changed","data":{"share_name":"photo","is_upsert":true}})");
  EXPECT_CALL(target_, SettingChanged("photo", false));
  ExpectDone(
      R"({"type":"notify_setting_changed","data":{"share_name":"photo","is_upsert":false}})");
}

TEST_F(CommandHandlerTest, Pause) {
  EXPECT_CALL(target_, Pause(0));
  ExpectDone(R"({"type":"pause","data":{"resume_time":0}})");
  EXPECT_CALL(target_, Pause(4000000000LL));
  ExpectDone(R"({"type":"pause","data":{"resume_time":4000000000}})");
  EXPECT_CALL(target_, Pause(-5));
  ExpectDone(R"({"type":"pause","data":{"resume_time":-5}})");
}

TEST_F(CommandHandlerTest, ResumeWithAnyDataOrNone) {
  EXPECT_CALL(target_, Resume()).Times(3);
  ExpectDone(R"({"type":"resume","data":null})");
  ExpectDone(R"({"type":"resume","data":[1]})");
  ExpectDone(R"({"type":"resume"})");
}

TEST_F(CommandHandlerTest, WorkerCreateAndDelete) {
  EXPECT_CALL(target_, CreateWorker("photo"));
  ExpectDone(R"({"type":"worker_create","data":{"share_name":"photo"}})");
  EXPECT_CALL(target_, DeleteWorker("photo", 0)).Times(3);
  ExpectDone(R"({"type":"worker_delete","data":{"share_name":"photo"}})");
  ExpectDone(R"({"type":"worker_delete","data":{"share_name":"photo","while_running":false}})");
  ExpectDone(R"({"type":"worker_delete","data":{"share_name":"photo","while_running":"x"}})");
  EXPECT_CALL(target_, DeleteWorker("photo", 4711));
  ExpectDone(R"({"type":"worker_delete","data":{"share_name":"photo","while_running":true}})");
}

TEST_F(CommandHandlerTest, StatusIsHandedOutWithTheVersion) {
  Json::Value status;
  status["paused"] = true;
  EXPECT_CALL(target_, Status()).WillOnce(Return(status));
  const Json::Value answer = Ask(R"({"type":"status","data":null})");
  EXPECT_TRUE(answer["success"].asBool());
  EXPECT_TRUE(answer["data"]["paused"].asBool());
  EXPECT_EQ(1, answer["data"]["version"].asInt());
}

TEST_F(CommandHandlerTest, PingTellsWhoAnswers) {
  const Json::Value answer = Ask(R"({"type":"ping"})");
  EXPECT_TRUE(answer["success"].asBool());
  EXPECT_EQ(getpid(), answer["data"]["pid"].asInt());
  EXPECT_EQ(1, answer["data"]["version"].asInt());
}

TEST_F(CommandHandlerTest, RefusesWhatIsNoRequest) {
  ExpectRefused("", "not JSON");
  ExpectRefused("\xff\xfe\x01", "not JSON");
  ExpectRefused("{\"type\":\"ping\"} x", "not JSON");
  ExpectRefused("[]", "Not an object");
  ExpectRefused("7", "Not an object");
  ExpectRefused("null", "type");
  ExpectRefused("{}", "Missing property: type");
  ExpectRefused("{\"type\":[]}", "Not a string");
  ExpectRefused("{\"type\":\"nothing\"}", "Unknown type: nothing");
  ExpectRefused(std::string(100000, '['), "not JSON");
}

TEST_F(CommandHandlerTest, RefusesArgumentsThatAreMissingOrWrong) {
  for (const char* type : {"notify_setting_changed", "worker_create", "worker_delete", "pause"}) {
    const std::string begin = std::string("{\"type\":\"") + type + "\"";
    ExpectRefused(begin + "}", "");
    ExpectRefused(begin + ",\"data\":null}", "");
    ExpectRefused(begin + ",\"data\":[]}", "");
    ExpectRefused(begin + ",\"data\":\"x\"}", "");
    ExpectRefused(begin + ",\"data\":{}}", "");
    ExpectRefused(begin + ",\"data\":{\"share_name\":[],\"resume_time\":{},\"is_upsert\":true}}",
                  "");
  }
  for (const char* type : {"worker_create", "worker_delete"}) {
    const std::string begin = std::string("{\"type\":\"") + type + "\"";
    ExpectRefused(begin + ",\"data\":{\"share_name\":\"\"}}", "Missing share_name");
  }
  ExpectRefused(R"({"type":"notify_setting_changed","data":{"share_name":"a"}})", "is_upsert");
  ExpectRefused(R"({"type":"notify_setting_changed","data":{"share_name":"a","is_upsert":{}}})",
                "Not a string");
  ExpectRefused(R"({"type":"pause","data":{"resume_time":"soon"}})", "Not a string");
}

// The library waits for an answer as long as there is none.
TEST_F(CommandHandlerTest, AnswersWhateverFails) {
  EXPECT_CALL(target_, Resume()).WillOnce(Throw(Error(504, "Cannot load json")));
  Json::Value answer = Ask(R"({"type":"resume"})");
  EXPECT_EQ(504, answer["error"]["code"].asInt());
  EXPECT_EQ("Cannot load json", answer["error"]["msg"].asString());
  EXPECT_CALL(target_, Resume()).WillOnce(Throw(std::runtime_error("no threads left")));
  answer = Ask(R"({"type":"resume"})");
  EXPECT_FALSE(answer["success"].asBool());
  EXPECT_EQ(502, answer["error"]["code"].asInt());
  EXPECT_EQ("no threads left", answer["error"]["msg"].asString());
}

}  // namespace
}  // namespace quarry::fileindexd
