#include "daemons/fileindexd/stamps.h"

#include <gtest/gtest.h>

namespace quarry::fileindexd {
namespace {

TEST(StampsTest, AttributesAreTheSameOnAnotherDevice) {
  EXPECT_TRUE(SameAttributes("1:2:3:4:5", "1:2:3:4:5"));
  EXPECT_TRUE(SameAttributes("1:2:3:4:5", "9:2:3:4:5"));
  EXPECT_FALSE(SameAttributes("1:2:3:4:5", "1:9:3:4:5"));
  EXPECT_FALSE(SameAttributes("1:2:3:4:5", "1:2:9:4:5"));
  EXPECT_FALSE(SameAttributes("1:2:3:4:5", "1:2:3:9:5"));
  EXPECT_FALSE(SameAttributes("1:2:3:4:5", "1:2:3:4:9"));
}

TEST(StampsTest, InodesAreTheSameInAnyState) {
  EXPECT_TRUE(SameInode("1:2:3:4:5", "9:2:9:9:9"));
  EXPECT_FALSE(SameInode("1:2:3:4:5", "1:22:3:4:5"));
  EXPECT_FALSE(SameInode("1:22:3:4:5", "1:2:3:4:5"));
}

TEST(StampsTest, WhatIsNoStampIsTheSameAsNothing) {
  for (const char* text : {"", "7", ":", "1:"}) {
    EXPECT_FALSE(SameAttributes(text, text)) << text;
    EXPECT_FALSE(SameInode(text, text)) << text;
    EXPECT_FALSE(SameAttributes(text, "1:2:3:4:5")) << text;
    EXPECT_FALSE(SameInode("1:2:3:4:5", text)) << text;
  }
}

}  // namespace
}  // namespace quarry::fileindexd
