#include "fileindex/queue/event.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <string>

#include "common/error.h"
#include "tests/fake_platform/fixture.h"

namespace quarry::fileindex {
namespace {

class EventTest : public fake::FakePlatformTest {};

// The error that a line is refused with.
Error Refusal(const std::string& line) {
  try {
    const Event event(line);
  } catch (const Error& error) {
    return error;
  }
  ADD_FAILURE() << "accepted: " << line;
  return Error(0);
}

TEST_F(EventTest, KindsHaveTheBitsOfTheQueueFormat) {
  EXPECT_EQ(EVENT_MODIFY, 0x2u);
  EXPECT_EQ(EVENT_ATTR, 0x4u);
  EXPECT_EQ(EVENT_CREATE, 0x40u);
  EXPECT_EQ(EVENT_DELETE, 0x80u);
  EXPECT_EQ(EVENT_RENAME, 0x100u);
  EXPECT_EQ(EVENT_OVERFLOW, 0x200u);
  EXPECT_EQ(EVENT_REINDEX, 0x10000u);
  EXPECT_EQ(EVENT_UPDATE_CFG, 0x20000u);
}

TEST_F(EventTest, OptionalKeysHaveDefaults) {
  const Event event(R"({"event":2,"path":"/volume1/share/a.txt"})");
  EXPECT_EQ(event.op, 2u);
  EXPECT_FALSE(event.is_dir);
  EXPECT_EQ(event.path, "/volume1/share/a.txt");
  EXPECT_EQ(event.path_old, "");
  EXPECT_TRUE(event.data.isNull());
  EXPECT_TRUE(fake::Logs().empty());
}

TEST_F(EventTest, AllKeysAreRead) {
  const Event event(
      R"({"data":{"audio":true},"event":256,"is_dir":true,"path":"/s/b","path_old":"/s/a","x":1})");
  EXPECT_EQ(event.op, 256u);
  EXPECT_TRUE(event.is_dir);
  EXPECT_EQ(event.path, "/s/b");
  EXPECT_EQ(event.path_old, "/s/a");
  ASSERT_TRUE(event.data.isObject());
  EXPECT_TRUE(event.data["audio"].asBool());
}

TEST_F(EventTest, SeveralBitsAndUnknownOnesAreKept) {
  EXPECT_EQ(Event(R"({"event":4294967295,"path":"/x"})").op, 0xffffffffu);
}

TEST_F(EventTest, DataMayBeOfAnyKind) {
  EXPECT_EQ(Event(R"({"event":1,"path":"/x","data":[1,2]})").data.size(), 2u);
  EXPECT_EQ(Event(R"({"event":1,"path":"/x","data":"text"})").data.asString(), "text");
}

TEST_F(EventTest, OptionalKeysOfTheWrongTypeCountAsAbsent) {
  const Event event(R"({"event":2,"path":"/x","is_dir":"yes","path_old":[1]})");
  EXPECT_FALSE(event.is_dir);
  EXPECT_EQ(event.path_old, "");
}

TEST_F(EventTest, WhatConvertsIsReadAsTheJsonLibraryConvertsIt) {
  const Event event(R"({"event":2.0,"path":7,"is_dir":1})");
  EXPECT_EQ(event.op, 2u);
  EXPECT_EQ(event.path, "7");
  EXPECT_TRUE(event.is_dir);
}

TEST_F(EventTest, BytesOfAPathAreKept) {
  const std::string path = "/s/\xff\xfe caf\xc3\xa9";
  EXPECT_EQ(Event("{\"event\":2,\"path\":\"" + path + "\"}").path, path);
}

TEST_F(EventTest, EmptyLineIsMalformed) {
  const Error error = Refusal("");
  EXPECT_EQ(error.code(), 906);
  EXPECT_EQ(error.reason(), "Malformed event_raw: ");
}

TEST_F(EventTest, MalformedLineIsLogged) {
  const Error error = Refusal("{\"event\":2");
  EXPECT_EQ(error.code(), 906);
  EXPECT_EQ(error.reason(), "Malformed event_raw: {\"event\":2");
  ASSERT_EQ(fake::Logs().size(), 1u);
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("optree", 1, "Event")) +
                "Failed [!data.fromString(event_raw)], reason: Malformed event_raw: {\"event\":2");
}

TEST_F(EventTest, MalformedLineIsLoggedWithErrnoWhichIsCleared) {
  errno = ENOENT;
  Refusal("x");
  EXPECT_EQ(errno, 0);
  ASSERT_EQ(fake::Logs().size(), 1u);
  EXPECT_EQ(fake::AnyLine(fake::Logs()[0]),
            fake::AnyLine(fake::LogHead("optree", 1, "Event")) +
                "Failed [!data.fromString(event_raw)], reason: Malformed event_raw: x "
                "[err: No such file or directory]");
}

TEST_F(EventTest, MissingOrWrongRequiredKeysAreRefusedWithoutALogLine) {
  struct Case {
    const char* line;
    const char* reason;
  };
  const Case cases[] = {
      {R"({"path":"/x"})", R"(Missing property: event, data={"path":"/x"})"},
      {R"({"event":"2","path":"/x"})", R"(Not a string, data={"event":"2","path":"/x"})"},
      {R"({"event":-1,"path":"/x"})", R"(Not a string, data={"event":-1,"path":"/x"})"},
      {R"({"event":4294967296,"path":"/x"})",
       R"(Not a string, data={"event":4294967296,"path":"/x"})"},
      {R"({"event":2})", R"(Missing property: path, data={"event":2})"},
      {R"({"event":2,"path":[]})", R"(Not a string, data={"event":2,"path":[]})"},
      {R"([1])", R"(Not an object, data=[1])"},
      {R"("text")", R"(Not an object, data="text")"},
      {R"(null)", R"(Missing property: event, data=null)"},
  };
  for (const Case& one : cases) {
    const Error error = Refusal(one.line);
    EXPECT_EQ(error.code(), 120) << one.line;
    EXPECT_EQ(error.reason(), one.reason) << one.line;
  }
  EXPECT_TRUE(fake::Logs().empty());
}

TEST_F(EventTest, NestingTooDeepIsAnErrorAndNoCrash) {
  const std::string line = "{\"event\":2,\"path\":\"/x\",\"data\":" + std::string(100000, '[') +
                           std::string(100000, ']') + "}";
  EXPECT_EQ(Refusal(line).code(), 906);
}

}  // namespace
}  // namespace quarry::fileindex
