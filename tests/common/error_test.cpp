#include "common/error.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <stdexcept>
#include <type_traits>

namespace quarry {
namespace {

TEST(ErrorTest, MessageHoldsCodeAndReason) {
  EXPECT_STREQ(Error(kErrorMalformedEvent, "x").what(), "Quarry error, code=906, reason=[x]");
}

TEST(ErrorTest, MessageOfAnEmptyReasonHasNoReasonPart) {
  EXPECT_STREQ(Error(kErrorSystem).what(), "Quarry error, code=502");
  EXPECT_STREQ(Error(kErrorSystem, "").what(), "Quarry error, code=502");
}

TEST(ErrorTest, ReasonIsNotEscaped) {
  EXPECT_STREQ(Error(120, "a]b").what(), "Quarry error, code=120, reason=[a]b]");
}

TEST(ErrorTest, CodeAndReasonAreReadBack) {
  const Error error(kErrorTooManyFolders, "full");
  EXPECT_EQ(error.code(), 900);
  EXPECT_EQ(error.reason(), "full");
  EXPECT_EQ(Error(kErrorTooManyFolders).reason(), "");
}

TEST(ErrorTest, CodesFromOutsideAreCarriedUnchanged) {
  const Error error(-7, "engine");
  EXPECT_EQ(error.code(), -7);
  EXPECT_STREQ(error.what(), "Quarry error, code=-7, reason=[engine]");
  EXPECT_STREQ(Error(1400).what(), "Quarry error, code=1400");
}

TEST(ErrorTest, CopyKeepsMessageCodeAndReason) {
  Error copy(kErrorSystem);
  {
    const Error original(kErrorLock, "taken");
    copy = original;
  }
  EXPECT_EQ(copy.code(), 506);
  EXPECT_EQ(copy.reason(), "taken");
  EXPECT_STREQ(copy.what(), "Quarry error, code=506, reason=[taken]");
}

TEST(ErrorTest, IsThrownAndCaughtAsACopyThatOutlivesIt) {
  const auto caught = [] {
    try {
      throw Error(kErrorMalformedEvent, "line");
    } catch (const Error& error) {
      return Error(error);
    }
  }();
  EXPECT_EQ(caught.code(), 906);
  EXPECT_EQ(caught.reason(), "line");
  EXPECT_STREQ(caught.what(), "Quarry error, code=906, reason=[line]");
}

TEST(ErrorTest, IsARuntimeErrorWithA32BitCode) {
  EXPECT_TRUE((std::is_base_of_v<std::runtime_error, Error>));
  EXPECT_TRUE((std::is_same_v<std::underlying_type_t<ErrorCode>, std::int32_t>));
  EXPECT_THROW(throw Error(kErrorSystem), std::runtime_error);
}

TEST(ErrorTest, CodesAreTheNumbersThatCallersKnow) {
  EXPECT_EQ(kErrorBadParameter, 120);
  EXPECT_EQ(kErrorShareEnum, 121);
  EXPECT_EQ(kErrorSystem, 502);
  EXPECT_EQ(kErrorCredentials, 503);
  EXPECT_EQ(kErrorLoadFile, 504);
  EXPECT_EQ(kErrorSaveFile, 505);
  EXPECT_EQ(kErrorLock, 506);
  EXPECT_EQ(kErrorShareNotFound, 800);
  EXPECT_EQ(kErrorServiceAccount, 801);
  EXPECT_EQ(kErrorTooManyFolders, 900);
  EXPECT_EQ(kErrorFolderExists, 901);
  EXPECT_EQ(kErrorFolderNotFound, 902);
  EXPECT_EQ(kErrorPathNotIndexable, 903);
  EXPECT_EQ(kErrorMalformedEvent, 906);
  EXPECT_EQ(kErrorEngineRequest, 913);
  EXPECT_EQ(kErrorParseDocument, 914);
  EXPECT_EQ(kErrorEngineQuery, 916);
  EXPECT_EQ(kErrorNoSpace, 1003);
  EXPECT_EQ(kErrorEngineBusy, 1400);
  EXPECT_EQ(kErrorEngineBusyMemory, 1401);
  EXPECT_EQ(kErrorTreePath, 9999);
}

TEST(LogLevelTest, IsASigned32BitNumberThatStartsAt7) {
  EXPECT_TRUE((std::is_same_v<decltype(fileindex::log_level), std::int32_t>));
  EXPECT_EQ(fileindex::log_level, 7);
}

}  // namespace
}  // namespace quarry
