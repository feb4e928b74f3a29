#include "cli/problem.h"

#include <gtest/gtest.h>

namespace quarry::cli {
namespace {

TEST(ExplainTest, SaysWhatToDoForEveryCode) {
  for (const int code : {kErrorBadParameter,
                         kErrorShareEnum,
                         kErrorSystem,
                         kErrorCredentials,
                         kErrorLoadFile,
                         kErrorSaveFile,
                         kErrorLock,
                         kErrorShareNotFound,
                         kErrorServiceAccount,
                         kErrorTooManyFolders,
                         kErrorFolderExists,
                         kErrorFolderNotFound,
                         kErrorPathNotIndexable,
                         kErrorMalformedEvent,
                         kErrorEngineRequest,
                         kErrorParseDocument,
                         kErrorEngineQuery,
                         kErrorNoSpace,
                         kErrorEngineBusy,
                         kErrorEngineBusyMemory}) {
    const std::string text = Explain(Error(static_cast<ErrorCode>(code), ""));
    EXPECT_EQ(text.find("The request failed"), std::string::npos) << code;
    EXPECT_NE(text.find(" (code " + std::to_string(code) + ")"), std::string::npos) << text;
  }
}

TEST(ExplainTest, AddsTheReason) {
  EXPECT_EQ(Explain(Error(kErrorFolderNotFound, "/Music/live")),
            "No such folder is indexed; \"quarry folder list\" names those there are: /Music/live "
            "(code 902)");
}

TEST(ExplainTest, LeavesTheEnginesOwnCodesToItsReason) {
  EXPECT_EQ(Explain(Error(1409, "The quote at character 1 is not closed.")),
            "The quote at character 1 is not closed. (code 1409)");
  EXPECT_EQ(Explain(Error(1409)), "The request failed (code 1409)");
}

}  // namespace
}  // namespace quarry::cli
