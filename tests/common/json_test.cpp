#include "common/json.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <functional>
#include <initializer_list>
#include <limits>
#include <random>
#include <string>
#include <vector>

#include "common/error.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/thrown.h"

namespace quarry {
namespace {

using test::FailureOf;

Json::Value Doc(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

template <typename T>
std::string Required(const std::string& text, const std::string& key = "a") {
  const Json::Value json = Doc(text);
  T out{};
  return FailureOf([&] { GetJsonValue<T>(out, json, key, true); });
}

// What an optional read leaves in a variable that held `before`.
template <typename T>
T Optional(const std::string& text, T before) {
  GetJsonValue<T>(before, Doc(text), "a", false);
  return before;
}

std::string Nested(int depth) {
  return std::string(static_cast<size_t>(depth), '[') +
         std::string(static_cast<size_t>(depth), ']');
}

class JsonTest : public fake::FakePlatformTest {};

// ---- Parsing

TEST_F(JsonTest, AnyRootValueIsAccepted) {
  EXPECT_EQ(Doc("{}"), Json::Value(Json::objectValue));
  EXPECT_EQ(Doc("[]"), Json::Value(Json::arrayValue));
  EXPECT_EQ(Doc("1"), Json::Value(1));
  EXPECT_EQ(Doc("-1.5"), Json::Value(-1.5));
  EXPECT_EQ(Doc("\"x\""), Json::Value("x"));
  EXPECT_EQ(Doc("true"), Json::Value(true));
  EXPECT_EQ(Doc("null"), Json::Value());
  EXPECT_EQ(Doc(" \t\r\n{\"a\": 1} \n"), Doc("{\"a\":1}"));
}

TEST_F(JsonTest, WhatIsNotOneValueIsRefusedAndLeavesNull) {
  const std::vector<std::string> refused = {
      "",       " ",           "{",         "}",       "{}x",     "{} {}", "[1]]",   "1 2",
      "[1,]",   "{\"a\":1,}",  "[,]",       "[1,,2]",  "//c\n1",  "1//c",  "/*c*/1", "[1/*c*/]",
      "{/**/}", "nul",         "True",      "{a:1}",   "{1:1}",   "'a'",   "\"a",    "NaN",
      "Inf",    "{\"a\":}",    "{\"a\" 1}", "[1 2]",   "\"\\x\"", "{,}",   "\xff{}", "{\"a\":1 ",
      "[[]",    "\"\\ud800\"", "1e",        "{}\n//c", "\"\\",    "\\1",
  };
  for (const std::string& text : refused) {
    Json::Value out = Doc("{\"old\":1}");
    EXPECT_FALSE(fromString(out, text)) << text;
    EXPECT_TRUE(out.isNull()) << text;
  }
}

TEST_F(JsonTest, NulBytesAreRefusedWhereverTheyStand) {
  for (const std::string& text :
       {std::string("{}\0", 3), std::string("{}\0x", 4), std::string("\0{}", 3),
        std::string("\"a\0b\"", 5), std::string("\"a\\\0b\"", 6)}) {
    Json::Value out(1);
    EXPECT_FALSE(fromString(out, text));
    EXPECT_TRUE(out.isNull());
  }
  EXPECT_EQ(Doc("\"a\\u0000b\"").asString(), std::string("a\0b", 3));
}

TEST_F(JsonTest, CommentsAreRefusedWhereverTheyStand) {
  const std::string text = R"({"a":[1,"/*x*/ //y \\"],"/\"/":null})";
  Doc(text);
  int refused = 0;
  for (size_t at = 0; at <= text.size(); ++at) {
    const std::string before = text.substr(0, at);
    Json::Value with_comment;
    Json::Value with_space;
    const bool accepted = fromString(with_comment, before + "/**/" + text.substr(at));
    fromString(with_space, before + " " + text.substr(at));
    // Where a comment is accepted it is part of a string, which white space would change too.
    if (accepted) {
      EXPECT_NE(with_space, Doc(text)) << at;
    } else {
      ++refused;
    }
  }
  EXPECT_GE(refused, 10);
}

TEST_F(JsonTest, NestingBeyondTheBoundIsRefusedWithoutAnException) {
  Json::Value out(1);
  EXPECT_TRUE(fromString(out, Nested(1000)));
  for (const int depth : {1001, 100000}) {
    out = 1;
    EXPECT_FALSE(fromString(out, Nested(depth))) << depth;
    EXPECT_TRUE(out.isNull());
  }
  std::string objects;
  for (int i = 0; i < 100000; ++i) objects += "{\"a\":";
  EXPECT_FALSE(fromString(out, objects));
  EXPECT_FALSE(fromString(out, std::string(100000, '[')));
}

TEST_F(JsonTest, LaterDuplicateKeyWins) {
  EXPECT_EQ(Doc("{\"a\":1,\"a\":2}"), Doc("{\"a\":2}"));
}

TEST_F(JsonTest, ParsingLeavesErrnoAlone) {
  Json::Value out;
  errno = ENOENT;
  EXPECT_FALSE(fromString(out, "1e99999"));
  EXPECT_EQ(errno, ENOENT);
  errno = 0;
  EXPECT_FALSE(fromString(out, "1e99999"));
  EXPECT_EQ(errno, 0);
}

TEST_F(JsonTest, ParsingIntoAPartOfTheSameDocumentIsSafe) {
  Json::Value document = Doc("{\"a\":{\"b\":1}}");
  EXPECT_TRUE(fromString(document["a"], "[2]"));
  EXPECT_EQ(document, Doc("{\"a\":[2]}"));
}

// ---- Writing

TEST_F(JsonTest, TextIsCompactWithoutANewline) {
  EXPECT_EQ(toString(Doc("{ \"b\" : [1, 2.5, true, null], \"a\" : {} }")),
            "{\"a\":{},\"b\":[1,2.5,true,null]}");
  EXPECT_EQ(toString(Json::Value()), "null");
  EXPECT_EQ(toString(Json::Value("x")), "\"x\"");
}

TEST_F(JsonTest, EveryByteOfAStringSurvives) {
  std::string every;
  for (int byte = 0; byte < 256; ++byte) every += static_cast<char>(byte);
  for (const std::string& text :
       {every, std::string("/share/\xc3\xa4\xe2\x82\xac\xf0\x9f\x98\x80"), std::string("\xff\xfe"),
        std::string("\xed\xa0\x80"), std::string("\xc3"), std::string("\xc0\xaf\"\\/")}) {
    Json::Value back;
    ASSERT_TRUE(fromString(back, toString(Json::Value(text))));
    EXPECT_EQ(back.asString(), text);
  }
}

TEST_F(JsonTest, Utf8AndInvalidBytesAreWrittenAsTheyAre) {
  EXPECT_EQ(toString(Json::Value("/\xc3\xa4/\xff\x80")), "\"/\xc3\xa4/\xff\x80\"");
}

TEST_F(JsonTest, LargeIntegersAreExact) {
  for (const std::string text :
       {"9223372036854775807", "-9223372036854775808", "18446744073709551615"}) {
    EXPECT_EQ(toString(Doc(text)), text);
  }
}

TEST_F(JsonTest, RandomDocumentsSurviveWritingAndParsing) {
  std::mt19937 random(7);
  const std::function<Json::Value(int)> make = [&](int depth) -> Json::Value {
    Json::Value value;
    switch (random() % (depth > 0 ? 7 : 5)) {
      case 0:
        return Json::Value();
      case 1:
        return Json::Value(static_cast<int>(random()));
      case 2:
        return Json::Value(static_cast<double>(random()) / 7.0);
      case 3:
        return Json::Value(random() % 2 == 0);
      case 4: {
        std::string text;
        for (size_t n = random() % 8; n > 0; --n) text += static_cast<char>(random());
        return Json::Value(text);
      }
      case 5:
        value = Json::Value(Json::arrayValue);
        for (size_t n = random() % 5; n > 0; --n) value.append(make(depth - 1));
        return value;
      default:
        value = Json::Value(Json::objectValue);
        for (size_t n = random() % 5; n > 0; --n) {
          value[std::to_string(random() % 9)] = make(depth - 1);
        }
        return value;
    }
  };
  for (int i = 0; i < 500; ++i) {
    const Json::Value value = make(5);
    EXPECT_EQ(Doc(toString(value)), value);
  }
}

TEST_F(JsonTest, AppendDataIsTheTextBehindAComma) {
  EXPECT_EQ(AppendData(Doc("{\"a\": 1}")), ", data={\"a\":1}");
  EXPECT_EQ(AppendData(Json::Value()), ", data=null");
}

// ---- Types

TEST_F(JsonTest, NullCountsAsAnObject) {
  EXPECT_TRUE(isObject(Json::Value()));
  EXPECT_TRUE(isObject(Doc("{}")));
  for (const std::string text : {"[]", "1", "1.5", "\"x\"", "true"}) {
    EXPECT_FALSE(isObject(Doc(text))) << text;
  }
}

TEST_F(JsonTest, ConvertibilityIsTheLibrarysOwn) {
  const std::vector<Json::Value> samples = {
      Doc("null"),         Doc("true"),       Doc("0"),          Doc("-1"),
      Doc("4294967295"),   Doc("4294967296"), Doc("2147483648"), Doc("18446744073709551615"),
      Doc("1.0"),          Doc("1.5"),        Doc("-0.5"),       Doc("1e10"),
      Doc("2147483647.5"), Doc("\"\""),       Doc("\"5\""),      Doc("\"x\""),
      Doc("[]"),           Doc("[1]"),        Doc("{}"),         Doc("{\"a\":1}")};
  for (const Json::Value& value : samples) {
    EXPECT_EQ(isJsonType<std::string>(value), value.isConvertibleTo(Json::stringValue)) << value;
    EXPECT_EQ(isJsonType<bool>(value), value.isConvertibleTo(Json::booleanValue)) << value;
    EXPECT_EQ(isJsonType<int>(value), value.isConvertibleTo(Json::intValue)) << value;
    EXPECT_EQ(isJsonType<unsigned int>(value), value.isConvertibleTo(Json::uintValue)) << value;
    EXPECT_EQ(isJsonType<double>(value), value.isConvertibleTo(Json::realValue)) << value;
    EXPECT_EQ(isJsonType<long long>(value),
              value.type() == Json::intValue || value.type() == Json::uintValue)
        << value;
  }
}

TEST_F(JsonTest, LongLongTakesStoredIntegersOnly) {
  EXPECT_TRUE(isJsonType<long long>(Doc("-5")));
  EXPECT_TRUE(isJsonType<long long>(Json::Value(Json::UInt(5))));
  for (const std::string text : {"1.0", "\"1\"", "true", "null", "[1]"}) {
    EXPECT_FALSE(isJsonType<long long>(Doc(text))) << text;
  }
}

TEST_F(JsonTest, ValuesAreConverted) {
  EXPECT_EQ(asJsonType<std::string>(Doc("5")), "5");
  EXPECT_EQ(asJsonType<std::string>(Doc("true")), "true");
  EXPECT_EQ(asJsonType<bool>(Doc("1")), true);
  EXPECT_EQ(asJsonType<int>(Doc("3.0")), 3);
  EXPECT_EQ(asJsonType<unsigned int>(Doc("4294967295")), 4294967295u);
  EXPECT_EQ(asJsonType<long long>(Doc("-9223372036854775808")),
            std::numeric_limits<long long>::min());
  EXPECT_EQ(asJsonType<double>(Doc("2")), 2.0);
}

TEST_F(JsonTest, LibraryExceptionsOfAConversionBecomeErrors) {
  const std::string reason = "120 Not a string, data=";
  EXPECT_EQ(FailureOf([] { asJsonType<std::string>(Doc("[1]")); }), reason + "[1]");
  EXPECT_EQ(FailureOf([] { asJsonType<bool>(Doc("\"x\"")); }), reason + "\"x\"");
  EXPECT_EQ(FailureOf([] { asJsonType<int>(Doc("1e10")); }), reason + "10000000000.0");
  EXPECT_EQ(FailureOf([] { asJsonType<unsigned int>(Doc("-1")); }), reason + "-1");
  EXPECT_EQ(FailureOf([] { asJsonType<long long>(Doc("18446744073709551615")); }),
            reason + "18446744073709551615");
  EXPECT_EQ(FailureOf([] { asJsonType<double>(Doc("{}")); }), reason + "{}");
}

// ---- GetJsonValue

TEST_F(JsonTest, MembersAreRead) {
  const Json::Value json =
      Doc(R"({"s":"x","b":true,"i":-3,"u":4,"l":5000000000,"d":1.5,"o":{"k":[1]}})");
  std::string s;
  bool b = false;
  int i = 0;
  unsigned int u = 0;
  long long l = 0;
  double d = 0;
  Json::Value o;
  GetJsonValue(s, json, "s", true);
  GetJsonValue(b, json, "b", true);
  GetJsonValue(i, json, "i", true);
  GetJsonValue(u, json, "u", true);
  GetJsonValue(l, json, "l", true);
  GetJsonValue(d, json, "d", true);
  GetJsonValue(o, json, "o", true);
  EXPECT_EQ(s, "x");
  EXPECT_TRUE(b);
  EXPECT_EQ(i, -3);
  EXPECT_EQ(u, 4u);
  EXPECT_EQ(l, 5000000000LL);
  EXPECT_EQ(d, 1.5);
  EXPECT_EQ(o, Doc("{\"k\":[1]}"));
}

template <typename T>
class GetJsonValueTest : public ::testing::Test {};
using Readable =
    ::testing::Types<Json::Value, std::string, bool, int, unsigned int, long long, double>;
TYPED_TEST_SUITE(GetJsonValueTest, Readable);

TYPED_TEST(GetJsonValueTest, NoObjectIsAnErrorEvenForAnOptionalKey) {
  for (const std::string text : {"[]", "[1]", "\"a\"", "7", "1.5", "true"}) {
    for (const bool required : {true, false}) {
      TypeParam out{};
      const Json::Value json = Doc(text);
      EXPECT_EQ(FailureOf([&] { GetJsonValue<TypeParam>(out, json, "a", required); }),
                "120 Not an object, data=" + text);
    }
  }
}

TYPED_TEST(GetJsonValueTest, AbsentKeyIsAnErrorOnlyWhenRequired) {
  for (const std::string text : {"{}", "null", "{\"b\":1}"}) {
    EXPECT_EQ(Required<TypeParam>(text), "120 Missing property: a, data=" + text);
    TypeParam out{};
    const TypeParam before = out;
    const Json::Value json = Doc(text);
    EXPECT_EQ(FailureOf([&] { GetJsonValue<TypeParam>(out, json, "a", false); }), "");
    EXPECT_EQ(out, before);
  }
}

TEST_F(JsonTest, WrongTypeReportsOneMessageForAllTypes) {
  const std::string reason = "120 Not a string, data=";
  for (const std::string value : {"[1]", "{}"}) {
    const std::string text = "{\"a\":" + value + "}";
    EXPECT_EQ(Required<std::string>(text), reason + text);
    EXPECT_EQ(Required<bool>(text), reason + text);
    EXPECT_EQ(Required<int>(text), reason + text);
    EXPECT_EQ(Required<unsigned int>(text), reason + text);
    EXPECT_EQ(Required<long long>(text), reason + text);
    EXPECT_EQ(Required<double>(text), reason + text);
    EXPECT_EQ(Required<Json::Value>(text), "");
  }
  EXPECT_EQ(Required<int>("{\"a\":\"5\"}"), reason + "{\"a\":\"5\"}");
  EXPECT_EQ(Required<bool>("{\"a\":\"true\"}"), reason + "{\"a\":\"true\"}");
}

TEST_F(JsonTest, OptionalValueOfAWrongTypeCountsAsAbsent) {
  EXPECT_EQ(Optional<int>("{\"a\":\"5\"}", 9), 9);
  EXPECT_EQ(Optional<std::string>("{\"a\":[1]}", "old"), "old");
  EXPECT_EQ(Optional<std::string>("{\"a\":{}}", "old"), "old");
  EXPECT_EQ(Optional<bool>("{\"a\":\"x\"}", true), true);
  EXPECT_EQ(Optional<unsigned int>("{\"a\":-1}", 8u), 8u);
  EXPECT_EQ(Optional<double>("{\"a\":\"1.5\"}", 0.5), 0.5);
  EXPECT_EQ(Optional<long long>("{\"a\":1.0}", 3), 3);
}

TEST_F(JsonTest, WholeRealIsAnIntButNoLongLong) {
  EXPECT_EQ(Optional<int>("{\"a\":1.0}", 9), 1);
  EXPECT_EQ(Required<long long>("{\"a\":1.0}"), "120 Not a string, data={\"a\":1.0}");
}

TEST_F(JsonTest, IntegerBeyondLongLongIsAnErrorThatShowsTheDocument) {
  const std::string text = "{\"a\":18446744073709551615}";
  EXPECT_EQ(Required<long long>(text), "120 Not a string, data=" + text);
  long long out = 3;
  EXPECT_EQ(FailureOf([&] { GetJsonValue(out, Doc(text), "a", false); }),
            "120 Not a string, data=" + text);
  EXPECT_EQ(out, 3);
}

TEST_F(JsonTest, AnyKindIsReadAsADocument) {
  for (const std::string text : {"null", "1", "\"x\"", "[1,2]", "{\"b\":{}}"}) {
    Json::Value out("old");
    GetJsonValue(out, Doc("{\"a\":" + text + "}"), "a", true);
    EXPECT_EQ(toString(out), text);
  }
}

TEST_F(JsonTest, DocumentMayBeReadIntoItself) {
  Json::Value json = Doc("{\"a\":{\"b\":[1,2]}}");
  GetJsonValue(json, json, "a", true);
  EXPECT_EQ(json, Doc("{\"b\":[1,2]}"));
}

TEST_F(JsonTest, KeysAreComparedWhole) {
  Json::Value json;
  json["a"] = 1;
  int out = 0;
  GetJsonValue(out, json, std::string("a\0b", 3), false);
  EXPECT_EQ(out, 0);
}

TEST_F(JsonTest, NothingIsLogged) {
  EXPECT_EQ(Required<int>("{}"), "120 Missing property: a, data={}");
  EXPECT_EQ(Required<int>("[]"), "120 Not an object, data=[]");
  EXPECT_TRUE(fake::Logs().empty());
}

// ---- Merging

std::string Merged(const std::string& target, const std::string& changes) {
  Json::Value value = Doc(target);
  const std::string failure = FailureOf([&] { JsonApplyChanges(value, Doc(changes)); });
  return failure.empty() ? toString(value) : failure;
}

TEST_F(JsonTest, ChangesAreMerged) {
  EXPECT_EQ(Merged(R"({"a":1,"b":{"c":2,"d":3}})", R"({"a":null,"b":{"c":null,"e":4},"f":[1]})"),
            R"({"b":{"d":3,"e":4},"f":[1]})");
}

TEST_F(JsonTest, ArraysAreReplacedWhole) {
  EXPECT_EQ(Merged("{\"a\":[1,2,3]}", "{\"a\":[4]}"), "{\"a\":[4]}");
  EXPECT_EQ(Merged("{\"a\":{\"b\":1}}", "{\"a\":[]}"), "{\"a\":[]}");
}

TEST_F(JsonTest, RemovingAMissingKeyIsNoError) {
  EXPECT_EQ(Merged("{\"a\":1}", "{\"b\":null}"), "{\"a\":1}");
  EXPECT_EQ(Merged("null", "{\"b\":null}"), "null");
}

TEST_F(JsonTest, KeysAreRemovedWhole) {
  EXPECT_EQ(Merged(R"({"a":1,"a\u0000b":2})", R"({"a\u0000b":null})"), R"({"a":1})");
  EXPECT_EQ(Merged(R"({"a":1})", R"({"a\u0000b":null})"), R"({"a":1})");
}

TEST_F(JsonTest, MissingObjectsAreMade) {
  EXPECT_EQ(Merged("null", "{\"a\":{\"b\":{\"c\":1}}}"), "{\"a\":{\"b\":{\"c\":1}}}");
  EXPECT_EQ(Merged("{}", "{\"a\":{}}"), "{\"a\":null}");
}

TEST_F(JsonTest, ChangesThatAreNoObjectChangeNothing) {
  for (const std::string changes : {"null", "1", "[1]", "\"x\"", "true", "{}"}) {
    EXPECT_EQ(Merged("{\"a\":1}", changes), "{\"a\":1}");
    EXPECT_EQ(Merged("[1]", changes), "[1]");
  }
}

TEST_F(JsonTest, MergingIntoWhatIsNoObjectIsAnError) {
  EXPECT_EQ(Merged("[1]", "{\"a\":1}"), "120 Not an object, data=[1]");
  EXPECT_EQ(Merged("[1]", "{\"a\":null}"), "120 Not an object, data=[1]");
  EXPECT_EQ(Merged("\"x\"", "{\"a\":{\"b\":1}}"), "120 Not an object, data=\"x\"");
  EXPECT_EQ(Merged("{\"a\":5}", "{\"a\":{\"b\":1}}"), "120 Not an object, data=5");
  EXPECT_EQ(Merged("{\"a\":5}", "{\"a\":{}}"), "{\"a\":5}");
}

// The rule as it is written down, recursively.
void NaiveMerge(Json::Value& target, const Json::Value& changes) {
  if (!changes.isObject()) return;
  for (const std::string& key : changes.getMemberNames()) {
    if (changes[key].isNull()) {
      target.removeMember(key);
    } else if (changes[key].isObject()) {
      NaiveMerge(target[key], changes[key]);
    } else {
      target[key] = changes[key];
    }
  }
}

TEST_F(JsonTest, MergingEqualsTheNaiveRuleOnRandomDocuments) {
  std::mt19937 random(11);
  const std::function<Json::Value(int)> make = [&](int depth) {
    Json::Value value(Json::objectValue);
    for (size_t n = random() % 4; n > 0; --n) {
      Json::Value& member = value[std::string(1, static_cast<char>('a' + random() % 4))];
      switch (random() % 4) {
        case 0:
          member = Json::Value();
          break;
        case 1:
          member = static_cast<int>(random() % 10);
          break;
        case 2:
          member = Json::Value(Json::arrayValue);
          member.append(static_cast<int>(random() % 10));
          break;
        default:
          member = depth > 0 ? make(depth - 1) : Json::Value("leaf");
      }
    }
    return value;
  };
  int merged = 0;
  for (int i = 0; i < 3000; ++i) {
    const Json::Value before = make(3);
    const Json::Value changes = make(3);
    Json::Value expected = before;
    Json::Value actual = before;
    bool naive_fails = false;
    try {
      NaiveMerge(expected, changes);
    } catch (const Json::Exception&) {
      naive_fails = true;
    }
    EXPECT_EQ(FailureOf([&] { JsonApplyChanges(actual, changes); }) != "", naive_fails);
    EXPECT_EQ(actual, expected) << before << changes;
    if (!naive_fails) ++merged;
  }
  EXPECT_GT(merged, 500);
}

TEST_F(JsonTest, MergingDoesNotRecurseWithTheDepthOfTheChanges) {
  // As deep as a document can be parsed.
  std::string text;
  for (int i = 0; i < 999; ++i) text += "{\"a\":";
  text += "1" + std::string(999, '}');
  EXPECT_EQ(Merged("{}", text), text);
}

// ---- Lists

TEST_F(JsonTest, StringsBecomeAnArrayInOrder) {
  EXPECT_EQ(toString(Vec2JsonArr<std::string>({"b", "a", ""})), "[\"b\",\"a\",\"\"]");
  EXPECT_EQ(toString(Vec2JsonArr<std::string>({})), "[]");
}

TEST_F(JsonTest, ArrayBecomesStringsAndSkipsWhatIsNone) {
  using Strings = std::vector<std::string>;
  EXPECT_EQ(JsonArr2Vec<std::string>(Doc("[\"x\",{},[\"y\"]]")), Strings({"x"}));
  EXPECT_EQ(JsonArr2Vec<std::string>(Doc("[5,true,null,\"z\",1.5]")),
            Strings({"5", "true", "", "z", "1.5"}));
  EXPECT_EQ(JsonArr2Vec<std::string>(Doc("[]")), Strings());
  EXPECT_EQ(JsonArr2Vec<std::string>(Doc("null")), Strings());
  EXPECT_EQ(JsonArr2Vec<std::string>(Doc("\"x\"")), Strings());
  EXPECT_EQ(JsonArr2Vec<std::string>(Doc("{\"b\":\"x\",\"a\":[],\"c\":\"y\"}")),
            Strings({"x", "y"}));
}

TEST_F(JsonTest, ListsSurviveBothWays) {
  const std::vector<std::string> values = {"/\xff", "", std::string("a\0b", 3)};
  EXPECT_EQ(JsonArr2Vec<std::string>(Vec2JsonArr<std::string>(values)), values);
}

}  // namespace
}  // namespace quarry
