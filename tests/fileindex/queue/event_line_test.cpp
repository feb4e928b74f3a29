// The quick reader of queue lines against the JSON library: what it takes must come out the same.

#include "fileindex/queue/event_line.h"

#include <gtest/gtest.h>

#include <random>
#include <string>
#include <string_view>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/queue/event.h"
#include "tests/fake_platform/fixture.h"

namespace quarry::fileindex {
namespace {

// What the JSON library makes of a line, as one text; "refused" and why when it refuses it.
std::string BySlowReader(const std::string& line) {
  Json::Value json;
  if (!fromString(json, line)) return "refused";
  try {
    unsigned int op = 0;
    bool is_dir = false;
    std::string path;
    std::string path_old;
    Json::Value data;
    GetJsonValue(op, json, "event", true);
    GetJsonValue(is_dir, json, "is_dir", false);
    GetJsonValue(path, json, "path", true);
    GetJsonValue(path_old, json, "path_old", false);
    GetJsonValue(data, json, "data", false);
    return std::to_string(op) + (is_dir ? "d|" : "|") + path + "|" + path_old + "|" +
           toString(data);
  } catch (const Error& error) {
    return "refused: " + error.reason();
  }
}

std::string ByQuickReader(const EventLine& event) {
  return std::to_string(event.op) + (event.is_dir ? "d|" : "|") + std::string(event.path) + "|" +
         std::string(event.path_old) + "|null";
}

// The whole of an Event, whichever way it was read.
std::string ByEvent(const std::string& line) {
  try {
    const Event event(line);
    return std::to_string(event.op) + (event.is_dir ? "d|" : "|") + event.path + "|" +
           event.path_old + "|" + toString(event.data);
  } catch (const Error& error) {
    return error.code() == 906 ? "refused" : "refused: " + error.reason();
  }
}

bool IsTaken(std::string_view line) {
  EventLine event;
  return ReadEventLine(line, event);
}

// Whether the quick reader took it.
bool ExpectSame(const std::string& line) {
  EventLine event;
  const bool taken = ReadEventLine(line, event);
  if (IsPlain(line)) {
    EventLine plain;
    EXPECT_EQ(ReadEventLine(line, plain, true), taken) << line;
    if (taken) {
      EXPECT_EQ(ByQuickReader(plain), ByQuickReader(event)) << line;
    }
  }
  const std::string expected = BySlowReader(line);
  if (taken) {
    EXPECT_EQ(ByQuickReader(event), expected) << line;
  }
  EXPECT_EQ(ByEvent(line), expected) << line;
  return taken;
}

class EventLineTest : public fake::FakePlatformTest {};

TEST_F(EventLineTest, TakesWhatTheWritersWrite) {
  for (const char* line : {
           R"({"event":2,"path":"/s/a"})",
           R"({"event":64,"is_dir":true,"path":"/s/a"})",
           R"({"event":256,"is_dir":false,"path":"/s/b","path_old":"/s/a"})",
           R"({"data":null,"event":65536,"path":"/s","path_old":""})",
           R"({"path":"","event":4294967295})",
           "{\"event\":2,\"path\":\"/s/\xff\xfe caf\xc3\xa9 \xed\xa0\x80 \x01\x7f\"}",
           R"({"event":2,"path":"/s/ {[,:'//*comment*/ }"})",
       }) {
    EXPECT_TRUE(ExpectSame(line)) << line;
  }
}

TEST_F(EventLineTest, LeavesTheRestToTheLibrary) {
  const std::vector<std::string> lines = {
      "",
      "{",
      "{}",
      "null",
      "[]",
      R"({"event":2})",
      R"({"path":"/s"})",
      R"({"event":2,"path":"/s"} )",
      R"( {"event":2,"path":"/s"})",
      R"({"event": 2,"path":"/s"})",
      R"({"event":2,"path":"/s"}x)",
      R"({"event":2,"path":"/s"}{})",
      R"({"event":2,"path":"/s",})",
      R"({,"event":2,"path":"/s"})",
      R"({"event":2,,"path":"/s"})",
      R"({"event":2,"path":"/s")",
      R"({"event":2,"path":"/s)",
      R"({"event":2,"path":"/s"/**/})",
      R"({"event":2,"path":"/s"}//)",
      R"({"event":0,"path":"/s"})",
      R"({"event":02,"path":"/s"})",
      R"({"event":00,"path":"/s"})",
      R"({"event":-2,"path":"/s"})",
      R"({"event":+2,"path":"/s"})",
      R"({"event":,"path":"/s"})",
      R"({"event":2.0,"path":"/s"})",
      R"({"event":2.5,"path":"/s"})",
      R"({"event":2e1,"path":"/s"})",
      R"({"event":2x,"path":"/s"})",
      R"({"event":4294967296,"path":"/s"})",
      R"({"event":99999999999999999999,"path":"/s"})",
      R"({"event":"2","path":"/s"})",
      R"({"event":true,"path":"/s"})",
      R"({"event":2,"path":7})",
      R"({"event":2,"path":null})",
      R"({"event":2,"path":["/s"]})",
      R"({"event":2,"path":'/s'})",
      R"({'event':2,"path":"/s"})",
      R"({event:2,"path":"/s"})",
      R"({"event":2,"path":"/s","path":"/t"})",
      R"({"event":2,"event":4,"path":"/s"})",
      R"({"event":2,"path":"/s","is_dir":true,"is_dir":false})",
      R"({"event":2,"path":"/s","path_old":"/a","path_old":7})",
      R"({"event":2,"path":"/s","data":null,"data":{"audio":true}})",
      R"({"event":2,"path":"/s","is_dir":1})",
      R"({"event":2,"path":"/s","is_dir":truee})",
      R"({"event":2,"path":"/s","is_dir":True})",
      R"({"event":2,"path":"/s","is_dir":"true"})",
      R"({"event":2,"path":"/s","is_dir":null})",
      R"({"event":2,"path":"/s","data":{"audio":true}})",
      R"({"event":2,"path":"/s","data":nul})",
      R"({"event":2,"path":"/s","other":1})",
      R"({"event":2,"path":"/s","Path":"/t"})",
      R"({"event":2,"path":"/s","":0})",
      R"({"event":2,"path":"/s\"t"})",
      R"({"event":2,"path":"/s\\"})",
      R"({"event":2,"path":"/s\/t"})",
      R"({"event":2,"path":"/s\u0000t"})",
      R"({"event":2,"path":"/s\u00e9t"})",
      R"({"event":2,"path":"/s\ud83d\ude00"})",
      R"({"event":2,"path":"/s\ud83d"})",
      R"({"event":2,"path":"/s\ude00\ud83d"})",
      R"({"event":2,"path":"/s\x"})",
      R"({"event":2,"path":"/s\)",
      R"({"ev\u0065nt":2,"path":"/s"})",
      "\xef\xbb\xbf{\"event\":2,\"path\":\"/s\"}",
      std::string("{\"event\":2,\"path\":\"/s\0t\"}", 25),
      std::string("{\"event\":2,\"path\":\"/s\"}\0", 24),
      "{\"event\":2,\"path\":\"/s\"}\r",
      "{\"event\":2,\n\"path\":\"/s\"}",
  };
  for (const std::string& line : lines) EXPECT_FALSE(ExpectSame(line)) << line;
}

TEST_F(EventLineTest, EveryCutOfALineIsRefused) {
  const std::string line =
      R"({"data":null,"event":256,"is_dir":true,"path":"/s/b","path_old":"/s/a"})";
  for (std::size_t length = 0; length < line.size(); ++length) {
    EXPECT_FALSE(ExpectSame(line.substr(0, length)));
  }
  EXPECT_TRUE(ExpectSame(line));
}

TEST_F(EventLineTest, NothingIsKeptOfALineBefore) {
  EventLine event;
  ASSERT_TRUE(ReadEventLine(R"({"event":256,"is_dir":true,"path":"/b","path_old":"/a"})", event));
  ASSERT_TRUE(ReadEventLine(R"({"event":2,"path":"/c"})", event));
  EXPECT_EQ(ByQuickReader(event), "2|/c||null");
}

TEST_F(EventLineTest, LongLinesAreTaken) {
  const std::string name(1'000'000, 'n');
  EXPECT_TRUE(IsTaken("{\"event\":2,\"path\":\"/" + name + "\"}"));
  EXPECT_FALSE(IsTaken("{\"event\":2,\"path\":\"/" + name));
}

class Generator {
 public:
  std::string Line() {
    std::string line = Pick(20) == 0 ? " {" : "{";
    for (int left = 1 + Pick(6); left > 0; --left) {
      line += Member();
      if (left > 1 || Pick(30) == 0) line += Pick(40) == 0 ? ", " : ",";
    }
    return line + "}";
  }

  // Some bytes changed, left out, doubled, or taken from elsewhere in the line.
  std::string Mutated(std::string line) {
    for (int left = 1 + Pick(3); left > 0 && !line.empty(); --left) {
      const std::size_t at = static_cast<std::size_t>(Pick(static_cast<int>(line.size())));
      switch (Pick(4)) {
        case 0:
          line[at] = static_cast<char>(Pick(256));
          break;
        case 1:
          line.erase(at, static_cast<std::size_t>(1 + Pick(4)));
          break;
        case 2:
          line.insert(at, 1, kSigns[Pick(sizeof(kSigns) - 1)]);
          break;
        default:
          line.insert(at, line.substr(static_cast<std::size_t>(Pick(static_cast<int>(line.size()))),
                                      static_cast<std::size_t>(Pick(12))));
          break;
      }
    }
    return line;
  }

 private:
  static constexpr char kSigns[] = "\"\\{}[]:,/*0123456789-+.eE tfn\n\t\x01\xff";

  int Pick(int count) { return std::uniform_int_distribution<int>(0, count - 1)(random_); }

  std::string Member() {
    static const char* const kKeys[] = {"event",    "path", "event", "path",      "is_dir",
                                        "path_old", "data", "other", "pa\\u0074h"};
    return "\"" + std::string(kKeys[Pick(Pick(4) == 0 ? 9 : 7)]) + "\":" + Value();
  }

  std::string Value() {
    static const char* const kValues[] = {"2",
                                          "64",
                                          "256",
                                          "4294967295",
                                          "\"/s/a\"",
                                          "\"/s/b c\"",
                                          "\"\"",
                                          "true",
                                          "null",
                                          "false",
                                          "\"/\xff\xc3\"",
                                          "0",
                                          "4294967296",
                                          "2.0",
                                          "-1",
                                          "1e3",
                                          "{}",
                                          "[1]",
                                          "\"\\n\"",
                                          "\"\\u0000\"",
                                          "{\"audio\":true}",
                                          "007",
                                          "\"\\ud800\""};
    return kValues[Pick(Pick(5) == 0 ? 23 : 11)];
  }

  std::mt19937 random_{1};
};

TEST_F(EventLineTest, RandomAndMutatedLinesAreReadAlike) {
  Generator generator;
  int taken = 0;
  for (int i = 0; i < 20'000; ++i) {
    const std::string line = generator.Line();
    taken += ExpectSame(line) ? 1 : 0;
    taken += ExpectSame(generator.Mutated(line)) ? 1 : 0;
    taken += ExpectSame(generator.Mutated(
                 R"({"event":256,"is_dir":true,"path":"/s/b","path_old":"/s/a"})"))
                 ? 1
                 : 0;
    if (HasFailure()) return;
  }
  EXPECT_GT(taken, 1000);
}

}  // namespace
}  // namespace quarry::fileindex
