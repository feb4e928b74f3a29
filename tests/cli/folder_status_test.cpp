#include "cli/folder_status.h"

#include <gtest/gtest.h>

#include "common/json.h"

namespace quarry::cli {
namespace {

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

TEST(WorkSetAsideTest, NamesTheShareOfEach) {
  const Json::Value report =
      Parse(R"({"shares":[{"share":"s","set_aside":[{"path":"/v/s/a","error":"no"},)"
            R"({"path":"/v/s/d/","error":"never"}]},{"share":"t","set_aside":[]}]})");
  EXPECT_EQ(Parse(R"([{"share":"s","path":"/v/s/a","error":"no"},)"
                  R"({"share":"s","path":"/v/s/d/","error":"never"}])"),
            WorkSetAside(report));
}

TEST(WorkSetAsideTest, WithoutADaemonThereIsNone) {
  EXPECT_EQ(Json::Value(Json::arrayValue), WorkSetAside(Json::Value()));
}

}  // namespace
}  // namespace quarry::cli
