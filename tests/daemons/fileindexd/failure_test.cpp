#include "daemons/fileindexd/failure.h"

#include <gtest/gtest.h>

#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::fileindexd {
namespace {

TEST(FailureTest, TellsWhoseFaultItIs) {
  EXPECT_EQ(Failure::kDocument, Classify(Error(914, "")));
  EXPECT_EQ(Failure::kDocument, Classify(Error(120, "")));
  EXPECT_EQ(Failure::kDocument, Classify(Error(engine::kMalformedRequest, "")));
  EXPECT_EQ(Failure::kChannel, Classify(Error(913, "")));
  EXPECT_EQ(Failure::kIndexMissing, Classify(Error(engine::kUnknownIndex, "")));
  EXPECT_EQ(Failure::kIndexMissing, Classify(Error(engine::kDamagedIndex, "")));
  for (const int code :
       {121, 502, 503, 504, 505, 506, 800, 801, 1003, 1400, 1401, 1406, 1407, 1415}) {
    EXPECT_EQ(Failure::kPass, Classify(Error(code, ""))) << code;
  }
  for (const int code : {916, 1408, 1413, 1414, 9999, -7}) {
    EXPECT_EQ(Failure::kPlace, Classify(Error(code, ""))) << code;
  }
}

TEST(FailureTest, IsDescribedForPeople) {
  EXPECT_EQ("The disk is full (code 1407)", Describe(Error(1407, "The disk is full")));
  EXPECT_EQ("code 900", Describe(Error(900, "")));
}

}  // namespace
}  // namespace quarry::fileindexd
