#include "platform/include/list.h"

#include <gtest/gtest.h>

#include <climits>
#include <string>

namespace {

TEST(ListTest, KeepsCopiesInOrder) {
  HLIBCSZLIST* list = HLIBCSzListAlloc(1);
  ASSERT_NE(list, nullptr);
  EXPECT_EQ(HLIBCSzListCount(list), 0);
  char text[] = "a0";
  for (int i = 0; i < 10; ++i) {
    text[1] = static_cast<char>('0' + i);
    ASSERT_EQ(HLIBCSzListPush(text, &list), 0);
  }
  text[0] = 'x';
  ASSERT_EQ(HLIBCSzListCount(list), 10);
  for (int i = 0; i < 10; ++i) EXPECT_EQ(HLIBCSzListGet(list, i), "a" + std::to_string(i));
  HLIBCSzListFree(list);
}

TEST(ListTest, HasNothingOutsideItsEntries) {
  HLIBCSZLIST* list = HLIBCSzListAlloc(0);
  ASSERT_EQ(HLIBCSzListPush("", &list), 0);
  EXPECT_STREQ(HLIBCSzListGet(list, 0), "");
  EXPECT_EQ(HLIBCSzListGet(list, 1), nullptr);
  EXPECT_EQ(HLIBCSzListGet(list, -1), nullptr);
  HLIBCSzListFree(list);
}

TEST(ListTest, TakesAnySizeAndNullPointers) {
  for (const int size : {INT_MIN, -1, 0, 8192, INT_MAX}) {
    HLIBCSZLIST* list = HLIBCSzListAlloc(size);
    ASSERT_NE(list, nullptr);
    HLIBCSzListFree(list);
  }
  HLIBCSZLIST* none = nullptr;
  HLIBCSzListFree(none);
  EXPECT_LT(HLIBCSzListPush("x", &none), 0);
  EXPECT_LT(HLIBCSzListPush("x", nullptr), 0);
  EXPECT_EQ(HLIBCSzListCount(none), 0);
  EXPECT_EQ(HLIBCSzListGet(none, 0), nullptr);
}

}  // namespace
