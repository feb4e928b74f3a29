#include "daemons/common/json_pieces.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <random>
#include <string>

#include "common/json.h"

namespace quarry::daemon {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Pair;

TEST(JsonPiecesTest, TakesAnObjectApart) {
  const auto members = MembersOf(
      R"( { "a" : [1, {"b":"]}"}] ,"t":"x\"},\\","n":-1.5e3,"":null,"o":{ },"a":true } )");
  ASSERT_TRUE(members);
  EXPECT_THAT(*members,
              ElementsAre(Pair("", "null"), Pair("a", R"([1, {"b":"]}"}])"), Pair("n", "-1.5e3"),
                          Pair("o", "{ }"), Pair("t", R"("x\"},\\")")));
}

TEST(JsonPiecesTest, TakesAnArrayApart) {
  const auto elements = ElementsOf("[1,\n\"]\", [],{\"a\":[{}]},null ]\n");
  ASSERT_TRUE(elements);
  EXPECT_THAT(*elements, ElementsAre("1", "\"]\"", "[]", "{\"a\":[{}]}", "null"));
}

TEST(JsonPiecesTest, WhatIsEmptyHasNoPieces) {
  ASSERT_TRUE(MembersOf("{ }"));
  EXPECT_THAT(*MembersOf("{}"), IsEmpty());
  ASSERT_TRUE(ElementsOf(" [ ] "));
  EXPECT_THAT(*ElementsOf("[]"), IsEmpty());
}

TEST(JsonPiecesTest, WhatIsNeitherIsNotTaken) {
  for (const char* text :
       {"",     " ",    "1",   "\"\"", "[",        "]",     "[1",  "[1,", "[1,]", "[,]", "[1 2]",
        "[1]x", "[[}]", "[[]", "[\"]", "[\"\\\"]", "[{]}]", "[1}", "{",   "{}",   "[:]"}) {
    EXPECT_FALSE(ElementsOf(text)) << text;
  }
  for (const char* text :
       {"", "[]", "{", "{\"a\"}", "{\"a\":}", "{\"a\":1", "{\"a\":1,}", "{1:2}", "{a:1}",
        "{\"a\":1}}", "{\"a\" 1}", "{:1}", "{\"a\":1]", "{\"a\\\":1}"}) {
    EXPECT_FALSE(MembersOf(text)) << text;
  }
}

// Behind others, a piece must not be able to end what it is put into.
TEST(JsonPiecesTest, APieceEndsNothingButItself) {
  for (const char* piece : {"}", "1}", "{}}", "\"\"}", "{\"a\":\"\\\\\"}}", "1,2", "[1],{}"}) {
    const std::string text = "[" + std::string(piece) + "]";
    const auto elements = ElementsOf(text);
    EXPECT_TRUE(!elements || elements->size() > 1) << piece;
  }
}

TEST(JsonPiecesTest, DeepTextsTakeNoStack) {
  const std::string deep = std::string(1000000, '[') + std::string(1000000, ']');
  const auto elements = ElementsOf(deep);
  ASSERT_TRUE(elements);
  EXPECT_EQ(elements->front().size(), deep.size() - 2);
}

Json::Value RandomValue(std::mt19937& random, int depth) {
  const char* const texts[] = {"",         "\\",   "\"",       "a\\\"b", "]}",
                               "{\"x\":[", "\n,:", "\xC3\xA4", "\\\\"};
  switch (random() % (depth > 0 ? 6 : 4)) {
    case 0:
      return Json::Value(static_cast<int>(random() % 2000) - 1000);
    case 1:
      return Json::Value(random() % 2 == 0);
    case 2:
      return Json::Value();
    case 3:
      return Json::Value(std::string(texts[random() % 9]) + texts[random() % 9]);
    case 4: {
      Json::Value array(Json::arrayValue);
      for (auto i = random() % 4; i > 0; --i) array.append(RandomValue(random, depth - 1));
      return array;
    }
    default: {
      Json::Value object(Json::objectValue);
      for (auto i = random() % 4; i > 0; --i) {
        object["k" + std::to_string(i)] = RandomValue(random, depth - 1);
      }
      return object;
    }
  }
}

Json::Value Parsed(std::string_view text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, std::string(text))) << text;
  return value;
}

// Against the JSON library.
TEST(JsonPiecesTest, PiecesOfRandomTextsAreWhatTheLibraryReads) {
  std::mt19937 random(1);
  for (int round = 0; round < 5000; ++round) {
    const Json::Value value = RandomValue(random, 4);
    const std::string text = round % 2 == 0 ? toString(value) : value.toStyledString();
    const auto elements = ElementsOf(text);
    ASSERT_EQ(elements.has_value(), value.isArray()) << text;
    for (Json::ArrayIndex i = 0; elements && i < value.size(); ++i) {
      EXPECT_EQ(Parsed(elements->at(i)), value[i]);
    }
    const auto members = MembersOf(text);
    ASSERT_EQ(members.has_value(), value.isObject()) << text;
    if (!members) continue;
    EXPECT_EQ(members->size(), value.size());
    for (const std::string& name : value.getMemberNames()) {
      EXPECT_EQ(Parsed(members->at(name)), value[name]);
    }
  }
}

// What the library reads is taken apart; what is broken may be, but only into whole pieces.
TEST(JsonPiecesTest, BrokenTextsGiveWholePiecesOrNone) {
  std::mt19937 random(2);
  int taken = 0;
  for (int round = 0; round < 20000; ++round) {
    Json::Value array(Json::arrayValue);
    for (int i = 0; i < 3; ++i) array.append(RandomValue(random, 3));
    std::string text = toString(array);
    text[random() % text.size()] = "[]{}\",:\\x"[random() % 9];
    const auto elements = ElementsOf(text);
    Json::Value value;
    const bool is_array = fromString(value, text) && value.isArray();
    EXPECT_TRUE(elements || !is_array) << text;
    if (!elements) continue;
    ++taken;
    for (const std::string_view element : *elements) {
      const std::string alone = "[" + std::string(element) + "]";
      const auto again = ElementsOf(alone);
      ASSERT_TRUE(again) << element;
      EXPECT_THAT(*again, ElementsAre(element));
    }
  }
  EXPECT_GT(taken, 0);
}

}  // namespace
}  // namespace quarry::daemon
