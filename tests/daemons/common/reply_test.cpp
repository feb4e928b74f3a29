#include "daemons/common/reply.h"

#include <gtest/gtest.h>

#include "common/json.h"

namespace quarry::daemon {
namespace {

TEST(ReplyTest, SuccessHasDataOnlyWhereThereIsSome) {
  EXPECT_EQ(R"({"success":true})", toString(SuccessReply()));
  EXPECT_EQ(R"({"data":"x","success":true})", toString(SuccessReply("x")));
  EXPECT_EQ(R"({"data":[],"success":true})", toString(SuccessReply(Json::arrayValue)));
}

TEST(ReplyTest, FailureHasItsCodeAndReason) {
  EXPECT_EQ(R"({"error":{"code":120,"msg":"wrong"},"success":false})",
            toString(FailureReply(120, "wrong")));
}

}  // namespace
}  // namespace quarry::daemon
