#include "platform/linux/last_error.h"

#include <gtest/gtest.h>

#include <thread>

#include "platform/include/error.h"
#include "platform/include/share.h"

namespace quarry::platform {
namespace {

TEST(LastErrorTest, IsNothingInANewThread) {
  SetLastError(7, "other.cpp", 8);
  std::thread([] {
    EXPECT_EQ(HLIBCErrGet(), 0);
    EXPECT_STREQ(HLIBCErrorGetFile(), "");
    EXPECT_EQ(HLIBCErrorGetLine(), 0);
  }).join();
}

TEST(LastErrorTest, KeepsNumberFileAndLine) {
  EXPECT_EQ(SetLastError(kErrNotFound, "unit.cpp", 42), -1);
  EXPECT_EQ(HLIBCErrGet(), kErrNotFound);
  EXPECT_STREQ(HLIBCErrorGetFile(), "unit.cpp");
  EXPECT_EQ(HLIBCErrorGetLine(), 42);
}

TEST(LastErrorTest, IsSetByAFailingCallWithItsOwnPlace) {
  EXPECT_LT(TARNShareGet(nullptr, nullptr), 0);
  EXPECT_EQ(HLIBCErrGet(), kErrBadParameter);
  EXPECT_STREQ(HLIBCErrorGetFile(), "share.cpp");
  EXPECT_GT(HLIBCErrorGetLine(), 0);
}

}  // namespace
}  // namespace quarry::platform
