#include <gtest/gtest.h>

#include <random>
#include <string>
#include <vector>

#include "platform/include/filesystem.h"

namespace quarry::platform {
namespace {

int Sign(int value) {
  return value < 0 ? -1 : value > 0 ? 1 : 0;
}

int Compare(const std::string& a, const std::string& b) {
  return Sign(HLIBCUnicodeUTF8StrCaseCmp(a.c_str(), b.c_str()));
}

TEST(TextCompareTest, DisregardsCase) {
  EXPECT_EQ(Compare("", ""), 0);
  EXPECT_EQ(Compare("Photo", "pHOTO"), 0);
  EXPECT_EQ(Compare("\xc3\x84pfel", "\xc3\xa4PFEL"), 0);          // A with diaeresis
  EXPECT_EQ(Compare("\xd0\x96", "\xd0\xb6"), 0);                  // Cyrillic
  EXPECT_EQ(Compare("\xce\xa3", "\xcf\x82"), 0);                  // sigma, final sigma
  EXPECT_EQ(Compare("\xf0\x90\x90\x80", "\xf0\x90\x90\xa8"), 0);  // beyond 16 bits
}

TEST(TextCompareTest, OrdersTexts) {
  EXPECT_EQ(Compare("a", "B"), -1);
  EXPECT_EQ(Compare("B", "a"), 1);
  EXPECT_EQ(Compare("a", "ab"), -1);
  EXPECT_EQ(Compare("ab", "a"), 1);
  EXPECT_EQ(Compare("", "a"), -1);
  EXPECT_EQ(Compare("z", "\xc3\xa4"), -1);
  EXPECT_EQ(Compare("\xff", "\xf4\x8f\xbf\xbf"), 1) << "invalid bytes come after all characters";
}

TEST(TextCompareTest, BytesThatAreNoTextCompareAsTheyAre) {
  EXPECT_EQ(Compare("\xff", "\xff"), 0);
  EXPECT_EQ(Compare("\xfe", "\xff"), -1);
  EXPECT_EQ(Compare("A\xff"
                    "b",
                    "a\xff"
                    "B"),
            0);
  EXPECT_NE(Compare("\xc3", "\xe3"), 0) << "cut short";
  EXPECT_NE(Compare("\xc1\x81", "A"), 0) << "overlong";
  EXPECT_NE(Compare("\xed\xa0\x80", "\xed\xa0\x81"), 0) << "surrogates";
}

TEST(TextCompareTest, TakesNullForAnEmptyText) {
  EXPECT_EQ(HLIBCUnicodeUTF8StrCaseCmp(nullptr, nullptr), 0);
  EXPECT_EQ(HLIBCUnicodeUTF8StrCaseCmp(nullptr, ""), 0);
  EXPECT_LT(HLIBCUnicodeUTF8StrCaseCmp(nullptr, "a"), 0);
}

TEST(TextCompareTest, IsAnOrderOnAnyBytes) {
  std::mt19937 random(9);
  const std::string bytes = "aAbB\xc3\xa4\x84\xff\xe2\x82\xac\xf0";
  std::vector<std::string> texts;
  for (int i = 0; i < 120; ++i) {
    std::string text;
    while (text.size() < random() % 6) text += bytes[random() % bytes.size()];
    texts.push_back(text);
  }
  for (const std::string& a : texts) {
    EXPECT_EQ(Compare(a, a), 0);
    for (const std::string& b : texts) {
      ASSERT_EQ(Compare(a, b), -Compare(b, a));
      if (Compare(a, b) > 0) continue;
      for (const std::string& c : texts) {
        if (Compare(b, c) > 0) continue;
        ASSERT_LE(Compare(a, c), 0);
        if (Compare(a, b) < 0 || Compare(b, c) < 0) {
          ASSERT_LT(Compare(a, c), 0);
        }
      }
    }
  }
}

}  // namespace
}  // namespace quarry::platform
