#include "comm/built_in.h"

#include <gmock/gmock.h>

#include "common/error.h"
#include "common/json.h"
#include "tests/fake_platform/fixture.h"

namespace quarry::fileindex::elastic {
namespace {

class BuiltInTest : public fake::FakePlatformTest {};

TEST_F(BuiltInTest, ReadsTheText) {
  const Json::Value document = ParseBuiltIn("{\"a\": [1]}", QUARRY_SITE("unit"), "condition");
  EXPECT_EQ(toString(document), R"({"a":[1]})");
  EXPECT_THAT(fake::Logs(), ::testing::IsEmpty());
}

TEST_F(BuiltInTest, ABrokenTextIsLoggedAndThrown) {
  try {
    ParseBuiltIn("{", LogSite{"elastic_control.cpp", 535, "GetFileIndexMappings"},
                 "!ret.fromString(mappings)");
    FAIL();
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), 502);
    EXPECT_EQ(error.reason(), "");
  }
  EXPECT_THAT(fake::Logs(),
              ::testing::ElementsAre(fake::LogHead("elastic_control", 535, "GetFileIndexMappings") +
                                     "Failed [!ret.fromString(mappings)], reason: "));
}

}  // namespace
}  // namespace quarry::fileindex::elastic
