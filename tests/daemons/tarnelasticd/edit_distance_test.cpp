#include "daemons/tarnelasticd/edit_distance.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <random>
#include <vector>

namespace quarry::engine {
namespace {

// The whole table, as it stands in textbooks.
std::size_t PlainDistance(const std::u32string& a, const std::u32string& b) {
  std::vector<std::vector<std::size_t>> d(a.size() + 1, std::vector<std::size_t>(b.size() + 1));
  for (std::size_t i = 0; i <= a.size(); ++i) d[i][0] = i;
  for (std::size_t j = 0; j <= b.size(); ++j) d[0][j] = j;
  for (std::size_t i = 1; i <= a.size(); ++i) {
    for (std::size_t j = 1; j <= b.size(); ++j) {
      const std::size_t cost = a[i - 1] == b[j - 1] ? 0 : 1;
      d[i][j] = std::min({d[i - 1][j] + 1, d[i][j - 1] + 1, d[i - 1][j - 1] + cost});
      if (i > 1 && j > 1 && a[i - 1] == b[j - 2] && a[i - 2] == b[j - 1]) {
        d[i][j] = std::min(d[i][j], d[i - 2][j - 2] + 1);
      }
    }
  }
  return d[a.size()][b.size()];
}

std::size_t Distance(const std::string& a, const std::string& b, std::size_t limit = 9) {
  return EditDistance(CodePoints(a), CodePoints(b), limit);
}

TEST(EditDistanceTest, CountsEachKindOfSlipOnce) {
  EXPECT_EQ(Distance("", ""), 0U);
  EXPECT_EQ(Distance("word", "word"), 0U);
  EXPECT_EQ(Distance("word", "words"), 1U);
  EXPECT_EQ(Distance("word", "wrd"), 1U);
  EXPECT_EQ(Distance("word", "ward"), 1U);
  EXPECT_EQ(Distance("word", "wrod"), 1U);
  EXPECT_EQ(Distance("", "abc"), 3U);
  EXPECT_EQ(Distance("badc", "abcd"), 2U);
  EXPECT_EQ(Distance("ca", "abc"), 3U);  // no letter is touched twice
}

TEST(EditDistanceTest, CountsLettersNotBytes) {
  EXPECT_EQ(Distance("\xD0\xBC\xD0\xB8\xD1\x80", "\xD0\xBC\xD0\xB5\xD1\x80"), 1U);
  EXPECT_EQ(Distance("\xE6\xBC\xA2\xE5\xAD\x97", "\xE5\xAD\x97\xE6\xBC\xA2"), 1U);
  EXPECT_EQ(Distance("a\xF0\x9F\x90\x9A", "a"), 1U);
}

TEST(EditDistanceTest, SaysOnlyThatItIsMoreThanTheLimit) {
  EXPECT_EQ(Distance("abcdef", "uvwxyz", 2), 3U);
  EXPECT_EQ(Distance("abc", "abcdefgh", 2), 3U);
  EXPECT_EQ(Distance("abc", "abd", 0), 1U);
}

TEST(EditDistanceTest, GivesUpOnVeryLongWords) {
  const std::string longest(kMaxComparedLetters, 'a');
  EXPECT_EQ(Distance(longest, longest, 1), 0U);
  EXPECT_EQ(Distance(longest + 'a', longest, 1), 2U);
  EXPECT_EQ(Distance(longest + 'a', longest + 'a', 1), 2U);
}

TEST(CodePointsTest, TakesBytesThatAreNoUtf8ForThemselves) {
  EXPECT_EQ(CodePoints("a\xC3\xA9\xE2\x82\xAC\xF0\x9F\x90\x9A"), U"a\u00e9\u20ac\U0001f41a");
  EXPECT_EQ(CodePoints("\xFF\xC3"), (std::u32string{0xff, 0xc3}));
  EXPECT_EQ(CodePoints(""), U"");
}

class RandomWordsTest : public testing::TestWithParam<unsigned int> {
 protected:
  std::u32string Word(std::size_t most) {
    static const std::u32string kLetters = U"abcz\u0430\u0431\u6f22";
    std::u32string word(random_() % (most + 1), U'a');
    for (char32_t& letter : word) letter = kLetters[random_() % kLetters.size()];
    return word;
  }
  // A word with a few slips.
  std::u32string Slip(std::u32string word) {
    for (std::size_t slips = random_() % 4; slips > 0 && !word.empty(); --slips) {
      const std::size_t at = random_() % word.size();
      const std::size_t kind = random_() % 4;
      if (kind == 0) word.erase(at, 1);
      if (kind == 1) word.insert(at, Word(1));
      if (kind == 2) word[at] = U'b';
      if (kind == 3 && at > 0) std::swap(word[at - 1], word[at]);
    }
    return word;
  }

  std::mt19937 random_{GetParam()};
};

TEST_P(RandomWordsTest, AreAsFarApartAsTheWholeTableSays) {
  for (int i = 0; i < 20000; ++i) {
    const std::u32string a = Word(10);
    const std::u32string b = i % 2 == 0 ? Word(10) : Slip(a);
    const std::size_t plain = PlainDistance(a, b);
    for (const std::size_t limit : {0U, 1U, 2U, 5U}) {
      ASSERT_EQ(EditDistance(a, b, limit), std::min(plain, limit + 1));
      ASSERT_TRUE(plain > limit || MayBeNear(LetterSet(a), LetterSet(b), limit));
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomWordsTest, testing::Range(1U, 4U));

TEST(LetterSetTest, IsTheSameForBothKindsOfText) {
  for (const char* word : {"", "harbour", "x2y9", "zzz"}) {
    EXPECT_EQ(LetterSetOfAscii(word), LetterSet(CodePoints(word))) << word;
  }
}

TEST(LetterSetTest, TellsFarWordsApart) {
  EXPECT_FALSE(MayBeNear(LetterSetOfAscii("harbour"), LetterSetOfAscii("pickled"), 2));
  EXPECT_FALSE(MayBeNear(LetterSetOfAscii("abcd"), LetterSetOfAscii("ab"), 1));
  EXPECT_TRUE(MayBeNear(LetterSetOfAscii("abcd"), LetterSetOfAscii("dcba"), 0));
}

}  // namespace
}  // namespace quarry::engine
