// Everything is compared with the JSON library, which says what is right.

#include "common/json_text.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <memory>
#include <random>
#include <string>

namespace quarry {
namespace {

bool ReadByLibrary(const std::string& text, Json::Value* out) {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  builder["collectComments"] = false;
  builder["strictRoot"] = false;
  builder["rejectDupKeys"] = false;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  return reader->parse(text.data(), text.data() + text.size(), out, nullptr);
}

std::string WrittenByLibrary(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["commentStyle"] = "None";
  builder["emitUTF8"] = true;
  return Json::writeString(builder, value);
}

// What is understood must be what the library understands. Returns whether it was.
bool ExpectSame(const std::string& text) {
  Json::Value value("before");
  if (!ReadPlainJson(text, &value)) {
    EXPECT_EQ(value, Json::Value("before")) << text;
    return false;
  }
  Json::Value expected;
  EXPECT_TRUE(ReadByLibrary(text, &expected)) << text;
  EXPECT_EQ(value, expected) << text;
  EXPECT_EQ(value.type(), expected.type()) << text;
  EXPECT_EQ(WriteJson(value), WrittenByLibrary(expected));
  return true;
}

TEST(ReadPlainJsonTest, ReadsWhatTheLibraryReads) {
  for (const char* text : {"null",
                           "true",
                           "false",
                           " [ ] ",
                           "{}",
                           "\"\"",
                           "[null,true,false]",
                           "{\"a\":{\"b\":[1]}}",
                           "[[],[[]],{},{\"a\":{}}]",
                           "{\"a\":1,\"a\":2}",
                           "{\"a\":{\"x\":1},\"a\":{\"y\":2}}",
                           "\t{\r\n\"a\" : [ 1 , 2 ] } \n",
                           "{\"\":\"\"}",
                           "\"\\u0000\\u00e4\\u20ac\\ud7ff\"",
                           "\"\\\"\\\\\\/\\b\\f\\n\\r\\t\"",
                           "\"\x7f \xff\xc3\x28 \xe2\x82\xac\"",
                           "{\"a\\u0000b\":\"c\\u0000d\"}",
                           "0",
                           "-0",
                           "-",
                           "7",
                           "-7",
                           "999999999999999999",
                           "1000000000000000000",
                           "9223372036854775807",
                           "9223372036854775808",
                           "-9223372036854775808",
                           "18446744073709551615",
                           "18446744073709551616",
                           "1.5",
                           "-0.0",
                           "1e3",
                           "1E-3",
                           "1.7976931348623157e308",
                           "5e-324",
                           "[1.1,2.2]",
                           "{\"score\":3.25}"}) {
    EXPECT_TRUE(ExpectSame(text)) << text;
  }
}

TEST(ReadPlainJsonTest, RefusesWhatIsNoJson) {
  for (const std::string text :
       {"",           " ",         "[",         "]",           "{",           "}",
        "[1",         "[1,",       "[1,]",      "[,1]",        "{\"a\"",      "{\"a\":",
        "{\"a\":1,}", "{\"a\" 1}", "{a:1}",     "{1:1}",       "\"",          "\"a",
        "\"\\",       "\"\\x\"",   "\"\\u12\"", "\"\\u12g4\"", "\"\\u+123\"", "tru",
        "truex",      "nul",       "[1 2]",     "1 2",         "[1]x",        "'a'",
        "+",          ".",         "e",         "1-2",         "--1",         "[1.2.3]",
        "/**/1",      "1//",       "NaN",       "Infinity",    "\v1",         "\"a\nb"}) {
    EXPECT_FALSE(ExpectSame(text)) << text;
  }
  EXPECT_FALSE(ExpectSame(std::string("1\0", 2)));
  EXPECT_FALSE(ExpectSame(std::string("\"a\0b\"", 5)));
}

TEST(ReadPlainJsonTest, LeavesRareKindsToTheLibrary) {
  EXPECT_FALSE(ExpectSame("\"\\ud83d\\ude00\""));
  EXPECT_FALSE(ExpectSame("\"\\ud83d\""));
  EXPECT_FALSE(ExpectSame(std::string(500, '[') + std::string(500, ']')));
  EXPECT_TRUE(ExpectSame(std::string(100, '[') + std::string(100, ']')));
}

TEST(ReadPlainJsonTest, UnderstandsNoCutOfAText) {
  const std::string text = R"({"a":[1,-2.5,"x\n\u00e4",true,null],"b":{"c":"d"}})";
  ASSERT_TRUE(ExpectSame(text));
  for (std::size_t size = 0; size < text.size(); ++size) {
    EXPECT_FALSE(ExpectSame(text.substr(0, size))) << size;
  }
}

TEST(WriteJsonTest, WritesWhatTheLibraryWrites) {
  Json::Value value;
  for (int c = 0; c < 256; ++c) {
    value["strings"].append(std::string(1, static_cast<char>(c)) + "x");
    value[std::string("k") + static_cast<char>(c)] = c;
  }
  value["empty"] = "";
  value["no pointer"] = Json::Value(Json::stringValue);
  value["list"] = Json::Value(Json::arrayValue);
  value["object"] = Json::Value(Json::objectValue);
  value["gap"][3] = 1;
  for (const double number : {0.0, -0.0, 0.1, 1e300, 3.0, std::numeric_limits<double>::infinity(),
                              std::numeric_limits<double>::quiet_NaN()}) {
    value["numbers"].append(number);
  }
  value["numbers"].append(std::numeric_limits<Json::Int64>::min());
  value["numbers"].append(std::numeric_limits<Json::UInt64>::max());
  EXPECT_EQ(WriteJson(value), WrittenByLibrary(value));
  for (const Json::Value& leaf : {Json::Value(), Json::Value(true), Json::Value("a\tb")}) {
    EXPECT_EQ(WriteJson(leaf), WrittenByLibrary(leaf));
  }
}

Json::Value RandomValue(std::mt19937* random, int depth) {
  Json::Value value;
  switch ((*random)() % (depth > 0 ? 7 : 5)) {
    case 0:
      return (*random)() % 2 == 0;
    case 1:
      return Json::Int64((*random)()) - (1 << 30);
    case 2:
      return std::ldexp((*random)(), static_cast<int>((*random)() % 200) - 100);
    case 3:
    case 4: {
      std::string text((*random)() % 20, '\0');
      for (char& c : text) c = static_cast<char>((*random)());
      return text;
    }
    case 5:
      value = Json::Value(Json::arrayValue);
      for (auto i = (*random)() % 5; i > 0; --i) value.append(RandomValue(random, depth - 1));
      return value;
    default:
      value = Json::Value(Json::objectValue);
      for (auto i = (*random)() % 5; i > 0; --i) {
        value[std::to_string((*random)() % 9)] = RandomValue(random, depth - 1);
      }
      return value;
  }
}

TEST(AppendJsonStringTest, AddsWhatTheLibraryWritesAndReadsBack) {
  std::string all = "before";
  std::string text;
  const auto expect_same = [&] {
    const std::string written =
        WrittenByLibrary(Json::Value(text.data(), text.data() + text.size()));
    std::string out = all;
    AppendJsonString(&out, text);
    EXPECT_EQ(out, all + written);
    Json::Value read;
    ASSERT_TRUE(ReadByLibrary(written, &read)) << written;
    EXPECT_EQ(read.asString(), text);
  };
  expect_same();
  // Any byte behind any other: what is no UTF-8 stays as it is, NUL is written as a number.
  for (int first = 0; first < 256; ++first) {
    text.clear();
    for (int second = 0; second < 256; ++second) {
      text += static_cast<char>(first);
      text += static_cast<char>(second);
    }
    expect_same();
  }
  text = "\xE2\x80\xA8\xE2\x80\xA9\xEF\xBB\xBF\xED\xA0\x80\xF4\x90\x80\x80</script>\\u0041";
  expect_same();
}

TEST(JsonTextTest, AgreesWithTheLibraryOnRandomDocuments) {
  std::mt19937 random(1);
  for (int i = 0; i < 1000; ++i) {
    const std::string text = WrittenByLibrary(RandomValue(&random, 4));
    ASSERT_TRUE(ExpectSame(text)) << text;
  }
}

TEST(JsonTextTest, AgreesWithTheLibraryOnMangledDocuments) {
  constexpr std::string_view kBytes = "{}[]\",:\\untrue0129-+.eE /*\x01\xff";
  std::mt19937 random(2);
  for (int i = 0; i < 5000; ++i) {
    std::string text = WrittenByLibrary(RandomValue(&random, 3));
    for (auto changes = 1 + random() % 3; changes > 0; --changes) {
      const std::size_t at = random() % text.size();
      const char byte = kBytes[random() % kBytes.size()];
      if (random() % 3 == 0) {
        text.insert(at, 1, byte);
      } else {
        text[at] = byte;
      }
    }
    ExpectSame(text);
  }
}

}  // namespace
}  // namespace quarry
