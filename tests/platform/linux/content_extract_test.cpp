#include "platform/include/content_extract.h"

#include <gtest/gtest.h>

#include <memory>
#include <stdexcept>
#include <thread>

#include "common/json.h"
#include "tests/platform/linux/fake_daemon.h"
#include "tests/support/root.h"

namespace quarry::platform {
namespace {

using test::FakeDaemon;

class ContentExtractTest : public ::testing::Test {
 protected:
  ContentExtractTest() { test::ResetTestRoot(); }

  std::unique_ptr<FakeDaemon> Serve(FakeDaemon::Answer answer) const {
    return std::make_unique<FakeDaemon>(test::TestRoot() + "/var/run/tarncontentextractd.sock",
                                        std::move(answer));
  }
  std::unique_ptr<FakeDaemon> ServeText(const std::string& reply) const {
    return Serve([reply](const std::string&) { return FakeDaemon::Frame(reply); });
  }

  // What the call throws; "" when it succeeds. Each call in a thread of its own, because a thread
  // keeps its connection.
  static std::string ErrorOf(const std::string& path = "/v/a") {
    std::string what;
    std::thread([&] {
      Json::Value document;
      document["kept"] = 1;
      try {
        TARN_CONTENT_EXTRACT_ParseFile(path, Json::Value(), document);
      } catch (const std::runtime_error& error) {
        what = error.what();
        EXPECT_EQ(document["kept"].asInt(), 1) << "a failure leaves the document alone";
      }
    }).join();
    return what;
  }
};

TEST_F(ContentExtractTest, SendsPathAndOptionsAndReturnsTheDocument) {
  const auto daemon = ServeText("{\"success\":true,\"data\":{\"TARNMDPath\":\"/v/a\"}}");
  std::thread([] {
    Json::Value options;
    options["need_meta"] = true;
    Json::Value document;
    document["old"] = 1;
    TARN_CONTENT_EXTRACT_ParseFile("/v/a \xff", options, document);
    EXPECT_EQ(toString(document), "{\"TARNMDPath\":\"/v/a\"}");
  }).join();
  EXPECT_EQ(daemon->Requests().at(0),
            "{\"command\":\"parse\",\"data\":{\"options\":{\"need_meta\":true},\"path\":\"/v/a "
            "\xff\"}}");
}

TEST_F(ContentExtractTest, AThreadKeepsItsConnection) {
  const auto daemon = ServeText("{\"success\":true,\"data\":{}}");
  std::thread([] {
    Json::Value document;
    for (int i = 0; i < 10; ++i) TARN_CONTENT_EXTRACT_ParseFile("/v/a", Json::Value(), document);
  }).join();
  EXPECT_EQ(daemon->Connections(), 1);
  EXPECT_EQ(daemon->Requests().size(), 10u);
}

TEST_F(ContentExtractTest, SurvivesARestartOfTheDaemon) {
  auto daemon = ServeText("{\"success\":true,\"data\":{\"life\":1}}");
  std::thread([&] {
    Json::Value document;
    TARN_CONTENT_EXTRACT_ParseFile("/v/a", Json::Value(), document);
    EXPECT_EQ(document["life"].asInt(), 1);
    daemon.reset();
    EXPECT_THROW(TARN_CONTENT_EXTRACT_ParseFile("/v/a", Json::Value(), document),
                 std::runtime_error);
    daemon = ServeText("{\"success\":true,\"data\":{\"life\":2}}");
    TARN_CONTENT_EXTRACT_ParseFile("/v/a", Json::Value(), document);
    EXPECT_EQ(document["life"].asInt(), 2);
    daemon.reset();
    daemon = ServeText("{\"success\":true,\"data\":{\"life\":3}}");
    TARN_CONTENT_EXTRACT_ParseFile("/v/a", Json::Value(), document);
    EXPECT_EQ(document["life"].asInt(), 3) << "a stale connection is renewed";
  }).join();
}

TEST_F(ContentExtractTest, ReportsADaemonThatIsNotThereOrHangsUp) {
  EXPECT_EQ(ErrorOf(), "tarncontentextractd does not run");
  const auto daemon = Serve([](const std::string&) { return std::string(); });
  EXPECT_EQ(ErrorOf(), "tarncontentextractd did not answer");
}

TEST_F(ContentExtractTest, ReportsWhatTheDaemonReports) {
  const auto daemon =
      ServeText("{\"success\":false,\"error\":{\"code\":2,\"msg\":\"no such file\"}}");
  EXPECT_EQ(ErrorOf(), "tarncontentextractd: no such file");
}

TEST_F(ContentExtractTest, ReportsAnswersThatAreNone) {
  for (const char* reply :
       {"", "nonsense", "[]", "null", "{}", "{\"success\":1}", "{\"success\":false}",
        "{\"success\":false,\"error\":[]}", "{\"success\":false,\"error\":{\"msg\":7}}",
        "{\"success\":true}", "{\"success\":true,\"data\":[]}"}) {
    const auto daemon = ServeText(reply);
    EXPECT_EQ(ErrorOf(), "tarncontentextractd: malformed answer") << reply;
  }
}

TEST_F(ContentExtractTest, RefusesAPathWithANulByte) {
  EXPECT_EQ(ErrorOf(std::string("/v/\0a", 5)), "the path has a NUL byte");
}

TEST_F(ContentExtractTest, ThreadsAskSideBySide) {
  const auto daemon = Serve([](const std::string& request) {
    Json::Value value;
    fromString(value, request);
    Json::Value reply;
    reply["success"] = true;
    reply["data"]["path"] = value["data"]["path"];
    return FakeDaemon::Frame(toString(reply));
  });
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([t] {
      const std::string path = "/v/" + std::to_string(t);
      Json::Value document;
      for (int i = 0; i < 20; ++i) {
        TARN_CONTENT_EXTRACT_ParseFile(path, Json::Value(), document);
        EXPECT_EQ(document["path"].asString(), path);
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(daemon->Requests().size(), 80u);
}

}  // namespace
}  // namespace quarry::platform
