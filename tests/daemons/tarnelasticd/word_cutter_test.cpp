#include "daemons/tarnelasticd/word_cutter.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <random>
#include <string>
#include <thread>

#include "daemons/tarnelasticd/fts_number.h"

namespace quarry::engine {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

// All that a text has been cut into, word by word.
std::vector<std::string> Contents(const CutText& cut) {
  std::vector<std::string> contents;
  std::size_t place = 0;
  for (const CutText::Word& word : cut.words) {
    contents.push_back(cut.letters.substr(word.begin, word.size) + ' ' + std::to_string(word.hash) +
                       ' ' + cut.places.substr(place, word.place_bytes));
    place += word.place_bytes;
  }
  EXPECT_EQ(place, cut.places.size());
  return contents;
}

TEST(WordCutterTest, CutsEachWordOnce) {
  WordCutters cutters;
  const CutText cut = cutters.Cut({"One two, one", "TWO"});
  EXPECT_THAT(cut.sizes, ElementsAre(3, 1));
  ASSERT_EQ(cut.words.size(), 2U);
  EXPECT_EQ(cut.letters, "onetwo");
  EXPECT_EQ(cut.places, "\x02\x04\x03\x01\x01\x02");
  EXPECT_EQ(cut.words[0].place_bytes, 2U);
}

TEST(WordCutterTest, PlacesMayBeFarFromEachOther) {
  constexpr std::size_t kBetween = std::size_t{1} << 21;
  std::string text = "far";
  for (std::size_t i = 0; i < kBetween; ++i) text += " a";
  text += " far";
  const CutText cut = WordCutters().Cut({"", text});
  std::string places = {1, 1};
  AppendVarint(&places, 2);
  AppendVarint(&places, kBetween + 1 + 2);
  ASSERT_EQ(cut.words.size(), 2U);
  EXPECT_EQ(cut.places.substr(0, cut.words[0].place_bytes), places);
  EXPECT_EQ(cut.words[1].place_bytes, 2 + kBetween);
  EXPECT_THAT(cut.sizes, ElementsAre(0, kBetween + 2));
}

TEST(WordCutterTest, KeepsNothingOfTheTextBefore) {
  WordCutters cutters;
  const std::string text = "a few words of a text";
  const std::vector<std::string> expected = Contents(cutters.Cut({text}));
  std::string large;
  for (int i = 0; i < 90000; ++i) large += "w" + std::to_string(i) + " ";
  const std::string too_long(WordCutter::kMaxText + 1, ' ');
  const std::string long_word = "x " + std::string(WordCutter::kMaxWord + 1, 'y');
  for (const std::string& other : {large, too_long, long_word, std::string("others")}) {
    cutters.Cut({other});
    EXPECT_EQ(Contents(cutters.Cut({text})), expected);
  }
  EXPECT_THAT(cutters.Cut({too_long}).sizes, IsEmpty());
  EXPECT_THAT(cutters.Cut({long_word}).sizes, IsEmpty());
  EXPECT_EQ(cutters.Cut({large}).words.size(), 90000U);
}

TEST(WordCutterTest, ManyThreadsCutTheSame) {
  std::mt19937_64 random(5);
  std::vector<std::string> texts(300);
  for (std::string& text : texts) {
    for (auto i = random() % 900; i > 0; --i) {
      text += "w" + std::to_string(random() % 500) + (random() % 9 == 0 ? "\xC3\x89 " : " ");
    }
  }
  WordCutters one;
  std::vector<std::vector<std::string>> expected;
  for (const std::string& text : texts) expected.push_back(Contents(one.Cut({text, "title"})));
  WordCutters many;
  std::vector<std::thread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([&] {
      for (std::size_t t = 0; t < texts.size(); ++t) {
        EXPECT_EQ(Contents(many.Cut({texts[t], "title"})), expected[t]);
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
}

}  // namespace
}  // namespace quarry::engine
