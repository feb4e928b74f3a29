#include "comm/comm.h"

#include <gmock/gmock.h>

#include <cstring>
#include <thread>

#include "common/error.h"
#include "common/json.h"
#include "common/paths.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"

namespace quarry::fileindex::elastic {
namespace {

using std::chrono::minutes;
using std::chrono::seconds;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

std::string SocketPath() {
  return RootedPath("/var/run/tarnelasticd.sock");
}

class CommTest : public fake::FakePlatformTest {
 protected:
  CommTest() { test::WriteFile(SocketPath(), ""); }

  // What SendRequestImpl throws for `reply`.
  static Error Refusal(const std::string& reply, const std::string& request = "{}") {
    fake::QueueReply(reply);
    Json::Value response;
    try {
      SendRequestImpl(response, Parse(request));
    } catch (const Error& error) {
      return error;
    }
    ADD_FAILURE() << "nothing thrown for " << reply;
    return Error(0);
  }

  static std::string Site(int line) { return fake::LogHead("comm", line, "SendRequestImpl"); }
};

constexpr char kRecvCondition[] =
    "Failed [!conn.Recv(resp_raw) || !res.fromString(resp_raw) || !res.isMember(\"success\") || "
    "!res[\"success\"].isBool()], reason: Recv failed, res=";

TEST_F(CommTest, HandsOutTheWholeResponse) {
  fake::QueueReply(std::string(R"( {"success": true, "data": [1, {"a": "ä"}], "other": null} )"));
  Json::Value response;
  SendRequestImpl(response, Parse(R"({"command": "commit", "data": {"id": "fileindex_photo"}})"));
  EXPECT_EQ(toString(response), R"({"data":[1,{"a":"ä"}],"other":null,"success":true})");
  EXPECT_THAT(fake::Requests(),
              ElementsAre(R"({"command":"commit","data":{"id":"fileindex_photo"}})"));
  EXPECT_THAT(fake::Logs(), IsEmpty());
  EXPECT_THAT(fake::Sleeps(), IsEmpty());
}

TEST_F(CommTest, ForgetsAnEarlierResponse) {
  fake::QueueReply(std::string(R"({"success":true})"));
  Json::Value response = Parse(R"({"data":["old"],"success":false})");
  SendRequestImpl(response, Json::Value());
  EXPECT_EQ(toString(response), R"({"success":true})");
}

TEST_F(CommTest, UsesOneConnectionPerRequest) {
  Json::Value response;
  SendRequestImpl(response, Json::Value());
  SendRequestImpl(response, Json::Value());
  EXPECT_THAT(fake::CallsOf("DomainSockConnection::Connect"),
              ElementsAre(HasSubstr(SocketPath()), HasSubstr(SocketPath())));
  EXPECT_EQ(fake::Outstanding(), 0);
}

// ---- Waiting for the socket

class CommWaitTest : public CommTest {
 protected:
  CommWaitTest() { EXPECT_EQ(unlink(SocketPath().c_str()), 0); }
};

TEST_F(CommWaitTest, WaitsFifteenTimesThenTriesAnyway) {
  Json::Value response;
  SendRequestImpl(response, Json::Value());
  std::vector<std::string> logs;
  for (int i = 1; i <= 15; ++i) {
    logs.push_back("comm.cpp:14 elastic socket is not ready, retry ... " + std::to_string(i));
  }
  EXPECT_EQ(fake::Logs(), logs);
  EXPECT_EQ(fake::LogRecords().front().priority, 3);
  EXPECT_EQ(fake::Sleeps(), std::vector<std::chrono::microseconds>(15, seconds(1)));
  EXPECT_THAT(fake::CallsOf("DomainSockConnection::Connect"), SizeIs(1));
}

TEST_F(CommWaitTest, GoesOnWhenTheSocketAppears) {
  fake::OnSleep([](std::chrono::microseconds) {
    if (fake::Sleeps().size() == 3) test::WriteFile(SocketPath(), "");
  });
  Json::Value response;
  SendRequestImpl(response, Json::Value());
  EXPECT_THAT(fake::Logs(), SizeIs(3));
  EXPECT_THAT(fake::Sleeps(), SizeIs(3));
}

TEST_F(CommWaitTest, ALaterFailureDoesNotBlameTheMissingFile) {
  fake::OnSleep([](std::chrono::microseconds) { test::WriteFile(SocketPath(), ""); });
  Refusal("{}");
  EXPECT_EQ(fake::Logs().back(), Site(29) + kRecvCondition + "{}");
}

TEST_F(CommWaitTest, NeitherDoesItForgetWhatErrnoHeld) {
  fake::OnSleep([](std::chrono::microseconds) { test::WriteFile(SocketPath(), ""); });
  errno = EIO;
  Refusal("{}");
  EXPECT_EQ(fake::Logs().back(), Site(29) + kRecvCondition + "{} [err: " + strerror(EIO) + "]");
  EXPECT_EQ(errno, 0);
}

// ---- Failures of the exchange

TEST_F(CommTest, ConnectFailure) {
  fake::FailCall("DomainSockConnection::Connect", 1, {-1, ECONNREFUSED, 0});
  const Error error = Refusal("unused");
  EXPECT_EQ(error.code(), 913);
  EXPECT_EQ(error.reason(), "Connect failed");
  EXPECT_THAT(fake::Logs(),
              ElementsAre(Site(24) + "Failed [!conn.Connect()], reason: Connect failed [err: " +
                          strerror(ECONNREFUSED) + "]"));
  EXPECT_EQ(errno, 0);
}

TEST_F(CommTest, ConnectFailureWithoutErrno) {
  fake::FailCall("DomainSockConnection::Connect");
  Refusal("unused");
  EXPECT_THAT(fake::Logs(),
              ElementsAre(Site(24) + "Failed [!conn.Connect()], reason: Connect failed"));
}

TEST_F(CommTest, FailureLeavesNoOldResponse) {
  fake::FailCall("DomainSockConnection::Connect");
  Json::Value response = Parse(R"({"success":true})");
  EXPECT_THROW(SendRequestImpl(response, Json::Value()), Error);
  EXPECT_TRUE(response.isNull());
}

TEST_F(CommTest, SendFailure) {
  fake::FailCall("SockConnection::Send", 1, {-1, EPIPE, 0});
  const Error error = Refusal("unused");
  EXPECT_EQ(error.code(), 913);
  EXPECT_EQ(error.reason(), "Send failed");
  EXPECT_THAT(
      fake::Logs(),
      ElementsAre(Site(26) + "Failed [!conn.Send(req.toString())], reason: Send failed [err: " +
                  strerror(EPIPE) + "]"));
}

TEST_F(CommTest, RecvFailure) {
  fake::FailCall("SockConnection::Recv", 1, {-1, ECONNRESET, 0});
  Json::Value response = Parse(R"({"success":true})");
  try {
    SendRequestImpl(response, Json::Value());
    FAIL();
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), 913);
    EXPECT_EQ(error.reason(), "Recv failed, res=null");
  }
  EXPECT_THAT(fake::Logs(),
              ElementsAre(Site(29) + kRecvCondition + "null [err: " + strerror(ECONNRESET) + "]"));
}

struct BadReply {
  const char* reply;
  const char* shown;  // how the reason shows it
};

void PrintTo(const BadReply& bad, std::ostream* out) {
  *out << bad.reply;
}

class CommBadReplyTest : public CommTest, public ::testing::WithParamInterface<BadReply> {};

TEST_P(CommBadReplyTest, IsATransportFailure) {
  const Error error = Refusal(GetParam().reply);
  EXPECT_EQ(error.code(), 913);
  EXPECT_EQ(error.reason(), std::string("Recv failed, res=") + GetParam().shown);
  EXPECT_THAT(fake::Logs(), ElementsAre(Site(29) + kRecvCondition + GetParam().shown));
}

INSTANTIATE_TEST_SUITE_P(Shapes, CommBadReplyTest,
                         ::testing::Values(BadReply{"", "null"}, BadReply{"not JSON", "null"},
                                           BadReply{R"({"success":true} x)", "null"},
                                           BadReply{"{}", "{}"},
                                           BadReply{R"({"success":"yes"})", R"({"success":"yes"})"},
                                           BadReply{R"({"success":1})", R"({"success":1})"},
                                           BadReply{R"({"success":null})", R"({"success":null})"},
                                           BadReply{"null", "null"}, BadReply{"true", "true"},
                                           BadReply{"7", "7"},
                                           BadReply{R"("success")", R"("success")"},
                                           BadReply{R"(["success"])", R"(["success"])"}));

TEST_F(CommTest, ADeeplyNestedReplyIsATransportFailure) {
  EXPECT_EQ(Refusal(std::string(100000, '[')).code(), 913);
}

// ---- Refusals of the engine

TEST_F(CommTest, TheEnginesCodePassesThrough) {
  const Error error = Refusal(R"({"success":false,"error":{"code":1234,"msg":"no such index"}})");
  EXPECT_EQ(error.code(), 1234);
  EXPECT_EQ(error.reason(), "Request failed, msg=no such index");
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

struct BadRefusal {
  const char* reply;
  const char* reason;
};

void PrintTo(const BadRefusal& bad, std::ostream* out) {
  *out << bad.reply;
}

class CommBadRefusalTest : public CommTest, public ::testing::WithParamInterface<BadRefusal> {};

TEST_P(CommBadRefusalTest, IsABadParameter) {
  const Error error = Refusal(GetParam().reply);
  EXPECT_EQ(error.code(), 120);
  EXPECT_EQ(error.reason(), GetParam().reason);
}

INSTANTIATE_TEST_SUITE_P(
    Shapes, CommBadRefusalTest,
    ::testing::Values(BadRefusal{R"({"success":false})", "Missing property: code, data=null"},
                      BadRefusal{R"({"success":false,"error":null})",
                                 "Missing property: code, data=null"},
                      BadRefusal{R"({"success":false,"error":"x"})", R"(Not an object, data="x")"},
                      BadRefusal{R"({"success":false,"error":[1]})", "Not an object, data=[1]"},
                      BadRefusal{R"({"success":false,"error":{"code":5}})",
                                 R"(Missing property: msg, data={"code":5})"},
                      BadRefusal{R"({"success":false,"error":{"code":"5","msg":""}})",
                                 R"(Not a string, data={"code":"5","msg":""})"},
                      BadRefusal{R"({"success":false,"error":{"code":5,"msg":[]}})",
                                 R"(Not a string, data={"code":5,"msg":[]})"}));

// ---- Batches

constexpr char kBatch[] =
    R"({"compound":[{"command":"a"},{"command":"b"},{"command":"c"},{"command":"d"}]})";

TEST_F(CommTest, AFailedElementIsLoggedAndLeft) {
  fake::QueueReply(std::string(R"({"success":true,"has_fail":true,"data":[{"success":true},)"
                               R"({"success":false,"error":{"code":500,"msg":"bad"}}]})"));
  Json::Value response;
  SendRequestImpl(response, Parse(kBatch));
  EXPECT_THAT(fake::Logs(),
              ElementsAre(Site(49) + R"(Compound failed: {"command":"b"} (500) bad)"));
  EXPECT_TRUE(response["has_fail"].asBool());
}

TEST_F(CommTest, AFailedElementIsLoggedWithErrno) {
  fake::OnRequest([](const Json::Value&) {
    errno = EAGAIN;
    return std::string(R"({"success":true,"has_fail":true,"data":[)"
                       R"({"success":false,"error":{"code":500,"msg":"bad"}},)"
                       R"({"success":false,"error":{"code":501,"msg":"worse"}}]})");
  });
  Json::Value response;
  SendRequestImpl(response, Parse(kBatch));
  EXPECT_THAT(fake::Logs(),
              ElementsAre(Site(49) + R"(Compound failed: {"command":"a"} (500) bad [err: )" +
                              strerror(EAGAIN) + "]",
                          Site(49) + R"(Compound failed: {"command":"b"} (501) worse)"));
}

TEST_F(CommTest, AnElementThatDoesNotSayWhyItFailedIsLoggedToo) {
  fake::QueueReply(
      std::string(R"({"success":true,"has_fail":true,"data":[{"success":false},{}]})"));
  Json::Value response;
  SendRequestImpl(response, Parse(kBatch));
  EXPECT_THAT(fake::Logs(), ElementsAre(Site(49) + R"(Compound failed: {"command":"a"} (0) )",
                                        Site(49) + R"(Compound failed: {"command":"b"} (0) )"));
}

TEST_F(CommTest, ABusyElementFailsTheBatch) {
  for (const int code : {1400, 1401}) {
    fake::ClearLogs();
    const Error error = Refusal(
        R"({"success":true,"has_fail":true,"data":[{"success":false,"error":{"code":500,"msg":"x"}},)"
        R"({"success":true},{"success":false,"error":{"code":)" +
            std::to_string(code) +
            R"(,"msg":"busy"}},{"success":false,"error":{"code":501,"msg":"later"}}]})",
        kBatch);
    EXPECT_EQ(error.code(), code);
    EXPECT_EQ(error.reason(), "busy");
    EXPECT_THAT(fake::Logs(),
                ElementsAre(Site(49) + R"(Compound failed: {"command":"a"} (500) x)"));
  }
}

TEST_F(CommTest, ARefusedBatchIsARefusal) {
  const Error error = Refusal(R"({"success":false,"error":{"code":7,"msg":"no"},"has_fail":true,)"
                              R"("data":[{"success":false,"error":{"code":1400,"msg":"busy"}}]})",
                              kBatch);
  EXPECT_EQ(error.code(), 7);
  EXPECT_EQ(error.reason(), "Request failed, msg=no");
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(CommTest, NeighboursOfTheBusyCodesAreOrdinary) {
  fake::QueueReply(std::string(R"({"success":true,"has_fail":true,"data":[)"
                               R"({"success":false,"error":{"code":1399,"msg":"p"}},)"
                               R"({"success":false,"error":{"code":1402,"msg":"q"}}]})"));
  Json::Value response;
  SendRequestImpl(response, Parse(kBatch));
  EXPECT_THAT(fake::Logs(), SizeIs(2));
}

class CommUnreadBatchTest : public CommTest, public ::testing::WithParamInterface<const char*> {};

// Elements are looked at only in the answer to a batch that says that some failed.
TEST_P(CommUnreadBatchTest, IsAccepted) {
  fake::QueueReply(std::string(GetParam()));
  Json::Value response;
  SendRequestImpl(response, Parse(kBatch));
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

INSTANTIATE_TEST_SUITE_P(
    Shapes, CommUnreadBatchTest,
    ::testing::Values(
        R"({"success":true,"data":[{"success":false,"error":{"code":1400,"msg":"x"}}]})",
        R"({"success":true,"has_fail":false,"data":[{"success":false}]})",
        R"({"success":true,"has_fail":null,"data":7})", R"({"success":true,"has_fail":true})",
        R"({"success":true,"has_fail":true,"data":[]})"));

TEST_F(CommTest, WithoutCompoundElementsAreNotLookedAt) {
  fake::QueueReply(std::string(R"({"success":true,"has_fail":true,"data":[{"success":false,)"
                               R"("error":{"code":1400,"msg":"x"}}]})"));
  Json::Value response;
  SendRequestImpl(response, Parse(R"({"command":"a"})"));
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

class CommBadBatchTest : public CommTest, public ::testing::WithParamInterface<const char*> {};

TEST_P(CommBadBatchTest, IsATransportFailure) {
  const Error error = Refusal(GetParam(), kBatch);
  EXPECT_EQ(error.code(), 913);
  EXPECT_EQ(error.reason(), "Malformed batch response, data=" + toString(Parse(GetParam())));
}

INSTANTIATE_TEST_SUITE_P(
    Shapes, CommBadBatchTest,
    ::testing::Values(
        R"({"success":true,"has_fail":"yes","data":[]})",
        R"({"success":true,"has_fail":true,"data":{"a":1}})",
        R"({"success":true,"has_fail":true,"data":[7]})",
        R"({"success":true,"has_fail":true,"data":["x"]})",
        R"({"success":true,"has_fail":true,"data":[[1]]})",
        R"({"success":true,"has_fail":true,"data":[{"success":"no"}]})",
        R"({"success":true,"has_fail":true,"data":[{"success":false,"error":7}]})",
        R"({"success":true,"has_fail":true,"data":[{"success":false,"error":{"code":"x"}}]})",
        R"({"success":true,"has_fail":true,"data":[{"success":false,)"
        R"("error":{"code":1400,"msg":{}}}]})"));

TEST_F(CommTest, MoreAnswersThanRequests) {
  fake::QueueReply(std::string(R"({"success":true,"has_fail":true,"data":[{"success":true},)"
                               R"({"success":false,"error":{"code":3,"msg":"m"}}]})"));
  Json::Value response;
  SendRequestImpl(response, Parse(R"({"compound":[{}]})"));
  EXPECT_THAT(fake::Logs(), ElementsAre(Site(49) + "Compound failed: null (3) m"));
}

// ---- Busy engine

constexpr char kBusy[] = R"({"success":false,"error":{"code":1400,"msg":"busy"}})";

std::vector<std::string> NotifyCalls() {
  return fake::CallsOf("HLIBCExecl");
}

TEST_F(CommTest, SendRequestReturnsTheResponse) {
  fake::QueueReply(std::string(R"({"success":true,"data":3})"));
  Json::Value response;
  SendRequest(response, Parse(R"({"command":"x"})"));
  EXPECT_EQ(response["data"].asInt(), 3);
  EXPECT_THAT(fake::Sleeps(), IsEmpty());
}

TEST_F(CommTest, SendRequestRetriesWhileBusy) {
  fake::QueueReply(std::string(kBusy));
  fake::QueueReply(std::string(R"({"success":false,"error":{"code":1401,"msg":"busy"}})"));
  Json::Value response;
  SendRequest(response, Parse(R"({"command":"commit","data":{"id":"fileindex_photo"}})"));
  EXPECT_EQ(toString(response), R"({"success":true})");
  const std::string request = R"({"command":"commit","data":{"id":"fileindex_photo"}})";
  EXPECT_THAT(fake::Requests(), ElementsAre(request, request, request));
  const std::string tail = "] since tarnelasticd is busy. Command: commit, db: fileindex_photo";
  EXPECT_THAT(fake::Logs(), ElementsAre("elastic_control.cpp:40 Retry[0" + tail,
                                        "elastic_control.cpp:40 Retry[1" + tail));
  EXPECT_THAT(NotifyCalls(), IsEmpty());
}

TEST_F(CommTest, WhoWantsToWaitOtherwiseIsAsked) {
  for (int i = 0; i < 4; ++i) fake::QueueReply(std::string(kBusy));
  std::vector<unsigned int> waits;
  const BusyWait::Function note = [&](unsigned int waited) { waits.push_back(waited); };
  const BusyWait::Function give_up = [](unsigned int) { throw Error(7, "enough"); };
  Json::Value response;
  {
    const BusyWait outer(note);
    {
      const BusyWait inner(give_up);
      EXPECT_THROW(SendRequest(response, Json::Value()), Error);
    }
    SendRequest(response, Json::Value());
    EXPECT_THAT(waits, ElementsAre(0, 1, 2));
    EXPECT_THAT(fake::Logs(), SizeIs(4));
    EXPECT_THAT(fake::Sleeps(), IsEmpty());
    // Another thread waits in its own way.
    std::thread([] {
      fake::QueueReply(std::string(kBusy));
      Json::Value other;
      SendRequest(other, Json::Value());
    }).join();
    EXPECT_THAT(waits, SizeIs(3));
    EXPECT_THAT(fake::Sleeps(), SizeIs(1));
  }
  fake::QueueReply(std::string(kBusy));
  SendRequest(response, Json::Value());
  EXPECT_THAT(waits, SizeIs(3));
  EXPECT_THAT(fake::Sleeps(), SizeIs(2));
}

TEST_F(CommTest, SendRequestRetriesABusyBatch) {
  fake::QueueReply(std::string(R"({"success":true,"has_fail":true,"data":[{"success":false,)"
                               R"("error":{"code":1401,"msg":"busy"}}]})"));
  Json::Value response;
  SendRequest(response, Parse(kBatch));
  EXPECT_THAT(fake::Requests(), SizeIs(2));
  EXPECT_THAT(fake::Logs(), ElementsAre("elastic_control.cpp:40 Retry[0] since tarnelasticd is "
                                        "busy. Command: , db: "));
}

TEST_F(CommTest, TheRetryLineSurvivesAnyRequest) {
  for (const char* request :
       {"null", "7", "[]", R"({"command":[],"data":"x"})", R"({"command":{},"data":{"id":{}}})"}) {
    fake::ClearLogs();
    fake::QueueReply(std::string(kBusy));
    Json::Value response;
    SendRequest(response, Parse(request));
    EXPECT_THAT(fake::Logs(), ElementsAre("elastic_control.cpp:40 Retry[0] since tarnelasticd is "
                                          "busy. Command: , db: "))
        << request;
  }
}

TEST_F(CommTest, PausesAreFifteenToNineteenWholeMinutes) {
  constexpr int kBusyAnswers = 200;
  for (int i = 0; i < kBusyAnswers; ++i) fake::QueueReply(std::string(kBusy));
  Json::Value response;
  SendRequest(response, Json::Value());
  ASSERT_THAT(fake::Sleeps(), SizeIs(kBusyAnswers));
  for (const auto sleep : fake::Sleeps()) {
    EXPECT_GE(sleep, minutes(15));
    EXPECT_LE(sleep, minutes(19));
    EXPECT_EQ(sleep % minutes(1), std::chrono::microseconds(0));
  }
}

TEST_F(CommTest, NotifiesOnceAfterMoreThanTenRetries) {
  for (int i = 0; i < 10; ++i) fake::QueueReply(std::string(kBusy));
  Json::Value response;
  SendRequest(response, Json::Value());
  EXPECT_THAT(NotifyCalls(), IsEmpty());

  for (int i = 0; i < 30; ++i) fake::QueueReply(std::string(kBusy));
  std::vector<size_t> notices_at_sleep;
  fake::OnSleep(
      [&](std::chrono::microseconds) { notices_at_sleep.push_back(NotifyCalls().size()); });
  SendRequest(response, Json::Value());
  ASSERT_THAT(NotifyCalls(), SizeIs(1));
  EXPECT_THAT(NotifyCalls().front(), HasSubstr("error:lack_of_memory"));
  ASSERT_THAT(notices_at_sleep, SizeIs(30));
  EXPECT_EQ(notices_at_sleep[9], 0u);
  EXPECT_EQ(notices_at_sleep[10], 1u);
}

TEST_F(CommTest, AFailingNotificationIsHarmless) {
  fake::FailEveryCall("HLIBCExecl");
  for (int i = 0; i < 12; ++i) fake::QueueReply(std::string(kBusy));
  Json::Value response;
  SendRequest(response, Json::Value());
  EXPECT_THAT(NotifyCalls(), SizeIs(1));
}

TEST_F(CommTest, SendRequestThrowsWhatIsNotBusy) {
  for (const int code : {1399, 1402, 913, 1}) {
    fake::QueueReply(R"({"success":false,"error":{"code":)" + std::to_string(code) +
                     R"(,"msg":"m"}})");
    Json::Value response;
    try {
      SendRequest(response, Json::Value());
      ADD_FAILURE();
    } catch (const Error& error) {
      EXPECT_EQ(error.code(), code);
      EXPECT_EQ(error.reason(), "Request failed, msg=m");
    }
  }
  EXPECT_THAT(fake::Sleeps(), IsEmpty());
}

TEST_F(CommTest, ThreadsDoNotDisturbEachOther) {
  fake::OnRequest([](const Json::Value& request) {
    return std::optional<std::string>(R"({"success":true,"data":)" + toString(request["data"]) +
                                      "}");
  });
  std::vector<std::thread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([i] {
      for (int k = 0; k < 50; ++k) {
        Json::Value request;
        request["data"] = i * 1000 + k;
        Json::Value response;
        SendRequest(response, request);
        EXPECT_EQ(response["data"].asInt(), i * 1000 + k);
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
}

}  // namespace
}  // namespace quarry::fileindex::elastic
