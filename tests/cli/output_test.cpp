#include "cli/output.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <sstream>

namespace quarry::cli {
namespace {

TEST(PrintableTest, EscapesWhatSteersATerminal) {
  EXPECT_EQ(Printable("a\033[2Jb\n\x7f"), "a\\x1b[2Jb\\x0a\\x7f");
  EXPECT_EQ(Printable("a\xc2\x9b"
                      "2J\xc2\xa0"),
            "a\xc2\\x9b2J\xc2\xa0");
  EXPECT_EQ(Printable("gr\xc3\xbc\xc3\x9f\xff"), "gr\xc3\xbc\xc3\x9f\xff");
}

TEST(PrintTableTest, AlignsColumnsByCharacters) {
  std::ostringstream out;
  PrintTable(out, {{"A", "B"}, {"\xc3\xbc\xc3\xbc\xc3\xbc", "x"}, {"y", "z"}});
  EXPECT_EQ(out.str(), "A    B\n\xc3\xbc\xc3\xbc\xc3\xbc  x\ny    z\n");
}

TEST(PrintTableTest, PrintsNothingForNoRows) {
  std::ostringstream out;
  PrintTable(out, {});
  EXPECT_EQ(out.str(), "");
}

TEST(PrintJsonTest, WritesNumbersAsTheyWereMeant) {
  std::ostringstream out;
  Json::Value value(Json::arrayValue);
  value.append(0.9);
  value.append(1.4);
  PrintJson(out, value);
  EXPECT_EQ(out.str().find("0000"), std::string::npos) << out.str();
}

TEST(PrintJsonTest, KeepsBytesAndEndsTheLine) {
  std::ostringstream out;
  Json::Value value;
  value["name"] = "gr\xc3\xbc\xff";
  PrintJson(out, value);
  EXPECT_EQ(out.str(), "{\n  \"name\" : \"gr\xc3\xbc\xff\"\n}\n");
}

TEST(HumanSizeTest, ChoosesTheUnit) {
  EXPECT_EQ(HumanSize(0), "0 B");
  EXPECT_EQ(HumanSize(1023), "1023 B");
  EXPECT_EQ(HumanSize(1024), "1.0 KB");
  EXPECT_EQ(HumanSize(2150), "2.1 KB");
  EXPECT_EQ(HumanSize(1024 * 1024 - 1), "1.0 MB");
  EXPECT_EQ(HumanSize(~std::uint64_t{0}), "16384.0 PB");
}

TEST(HumanDurationTest, ChoosesTheUnit) {
  EXPECT_EQ(HumanDuration(0.84), "0.8 s");
  EXPECT_EQ(HumanDuration(9.96), "10 s");
  EXPECT_EQ(HumanDuration(59.4), "59 s");
  EXPECT_EQ(HumanDuration(200), "3 min 20 s");
  EXPECT_EQ(HumanDuration(7500), "2 h 5 min");
}

TEST(HumanTimeTest, IsLocalTime) {
  setenv("TZ", "UTC", 1);
  EXPECT_EQ(HumanTime(0), "1970-01-01 00:00");
  EXPECT_EQ(HumanTime(1577880000), "2020-01-01 12:00");
}

}  // namespace
}  // namespace quarry::cli
