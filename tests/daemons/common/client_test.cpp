#include "daemons/common/client.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <memory>
#include <thread>

#include "common/error.h"
#include "common/unique_fd.h"
#include "daemons/common/frame.h"
#include "daemons/common/listener.h"
#include "tests/daemons/common/harness.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::daemon {
namespace {

using test::ServerThread;
using test::TempDir;

// What a failing request says.
std::string ReasonOf(Client& client, const Json::Value& request) {
  try {
    client.Request(request);
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), kErrorSystem);
    return error.reason();
  }
  return "no error";
}

Json::Value Question() {
  Json::Value value;
  value["command"] = "status";
  return value;
}

// A daemon that answers every connection with the same bytes, whatever it is asked, and hangs up.
class OneAnswer {
 public:
  OneAnswer(const std::string& path, std::string bytes) : listener_(path) {
    thread_ = std::thread([this, bytes = std::move(bytes)] {
      pollfd poll_fd{listener_.fd(), POLLIN, 0};
      if (poll(&poll_fd, 1, 20000) != 1) return;
      const UniqueFd fd = listener_.Accept();
      pollfd peer{fd.get(), POLLIN, 0};
      poll(&peer, 1, 20000);
      char request[4096];
      if (recv(fd.get(), request, sizeof(request), 0) <= 0) return;
      send(fd.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    });
  }
  ~OneAnswer() { thread_.join(); }

 private:
  Listener listener_;
  std::thread thread_;
};

TEST(ClientTest, SendsCompactJsonAndReturnsTheAnswer) {
  TempDir dir;
  std::string seen;
  ServerThread server(dir / "s", [&](const std::string& request, const Peer&) {
    seen = request;
    return std::string("{\"success\":true,\"data\":[1]}");
  });
  const Json::Value answer = Request("quarryd", dir / "s", Question());
  EXPECT_EQ(seen, "{\"command\":\"status\"}");
  EXPECT_TRUE(answer["success"].asBool());
  EXPECT_EQ(answer["data"][0].asInt(), 1);
}

TEST(ClientTest, KeepsItsConnectionAndSurvivesARestart) {
  TempDir dir;
  const auto handler = [](const std::string&, const Peer&) { return std::string("1"); };
  auto server = std::make_unique<ServerThread>(dir / "s", handler);
  Client client("quarryd", dir / "s");
  EXPECT_EQ(client.Request(Question()).asInt(), 1);
  EXPECT_EQ(client.Request(Question()).asInt(), 1);
  EXPECT_EQ(server->ConnectionCount(), 1u);
  server.reset();
  server = std::make_unique<ServerThread>(dir / "s", handler);
  EXPECT_EQ(client.Request(Question()).asInt(), 1);
}

TEST(ClientTest, CarriesLargeRequestsAndAnswers) {
  TempDir dir;
  ServerThread server(dir / "s", [](const std::string& request, const Peer&) { return request; });
  const Json::Value big(std::string(7'000'000, 'x'));
  EXPECT_TRUE(Request("quarryd", dir / "s", big) == big);
}

TEST(ClientTest, NamesTheDaemonThatDoesNotRun) {
  TempDir dir;
  Client client("quarryd", dir / "s");
  EXPECT_EQ(ReasonOf(client, Question()),
            "quarryd does not run: No such file or directory (socket " + (dir / "s") + ").");
  test::WriteFile(dir / "s", "");
  EXPECT_EQ(ReasonOf(client, Question()),
            "quarryd does not run: Connection refused (socket " + (dir / "s") + ").");
}

TEST(ClientTest, GivesUpOnADaemonThatIsSilent) {
  TempDir dir;
  Listener listener(dir / "s");
  ClientOptions options;
  options.timeout = std::chrono::milliseconds(20);
  Client client("quarryd", dir / "s", options);
  EXPECT_EQ(ReasonOf(client, Question()),
            "quarryd did not answer within 20 ms (socket " + (dir / "s") + ").");
  // Nor does one that does not even read hold the caller.
  EXPECT_EQ(ReasonOf(client, Json::Value(std::string(5'000'000, 'x'))),
            "quarryd did not answer within 20 ms (socket " + (dir / "s") + ").");
}

TEST(ClientTest, GivesUpOnADaemonWhoseQueueIsFull) {
  TempDir dir;
  Listener listener(dir / "s");
  ASSERT_EQ(listen(listener.fd(), 0), 0);
  test::RawPeer waiting(dir / "s");
  ClientOptions options;
  options.connect_timeout = std::chrono::milliseconds(20);
  options.timeout = std::chrono::milliseconds(20);
  Client client("quarryd", dir / "s", options);
  EXPECT_EQ(ReasonOf(client, Question()),
            "quarryd is too busy to accept a connection (socket " + (dir / "s") + ").");
  EXPECT_TRUE(IsListening(dir / "s"));
}

TEST(ClientTest, ReportsAnswersThatAreCutShort) {
  for (const std::string& bytes :
       {std::string(), std::string("\1"), MakeFrame("{\"a\":1}").substr(0, 8)}) {
    TempDir dir;
    OneAnswer server(dir / "s", bytes);
    Client client("quarryd", dir / "s");
    EXPECT_EQ(ReasonOf(client, Question()),
              "quarryd hung up without a full answer (socket " + (dir / "s") + ").");
  }
}

TEST(ClientTest, ReportsAnswersThatAreNoJson) {
  TempDir dir;
  OneAnswer server(dir / "s", MakeFrame("{nonsense"));
  Client client("quarryd", dir / "s");
  EXPECT_EQ(ReasonOf(client, Question()),
            "quarryd answered with something that is no JSON (socket " + (dir / "s") + ").");
}

TEST(ClientTest, RefusesAnAnswerThatIsTooLong) {
  TempDir dir;
  OneAnswer server(dir / "s", std::string("\xff\xff\xff\xff", 4));
  Client client("quarryd", dir / "s");
  EXPECT_EQ(ReasonOf(client, Question()),
            "quarryd answered with 4294967295 bytes, more than is accepted (socket " + (dir / "s") +
                ").");
}

TEST(ClientTest, RefusesAPathThatDoesNotFitAnAddress) {
  EXPECT_THROW(Client("quarryd", "/" + std::string(200, 'a')), Error);
}

TEST(ClientTest, LeaksNoDescriptor) {
  const std::size_t before = test::ListDir("/proc/self/fd").size();
  {
    TempDir dir;
    OneAnswer server(dir / "s", MakeFrame("{nonsense"));
    Client client("quarryd", dir / "s");
    ReasonOf(client, Question());
  }
  EXPECT_EQ(test::ListDir("/proc/self/fd").size(), before);
}

TEST(IsListeningTest, IsTrueOnlyWhileSomebodyListens) {
  TempDir dir;
  EXPECT_FALSE(IsListening(dir / "s"));
  {
    Listener listener(dir / "s");
    EXPECT_TRUE(IsListening(dir / "s"));
  }
  EXPECT_FALSE(IsListening(dir / "s"));
  EXPECT_FALSE(IsListening("/" + std::string(200, 'a')));
}

}  // namespace
}  // namespace quarry::daemon
