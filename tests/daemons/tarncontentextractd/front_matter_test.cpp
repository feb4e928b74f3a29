#include "daemons/tarncontentextractd/front_matter.h"

#include <gtest/gtest.h>

#include "tests/daemons/tarncontentextractd/support/extract_support.h"

namespace quarry::extract {
namespace {

struct Split {
  Fields fields;
  std::string rest;
};

Split Take(const std::string& text) {
  Extraction extraction;
  const std::string rest(TakeFrontMatter(text, extraction));
  return {ToMap(extraction.Take()), rest};
}

// The fields that these lines give.
Fields FieldsOf(const std::string& lines) {
  const Split split = Take("---\n" + lines + "---\nrest\n");
  EXPECT_EQ(split.rest, "rest\n") << lines;
  return split.fields;
}

TEST(FrontMatter, SetsTheFieldsThatItNames) {
  EXPECT_EQ(FieldsOf("title: A title: with colon\n"
                     "author: One\n"
                     "description: \"What it is\"\n"
                     "tags: [a, 'b c', \"d\"]\n"
                     "date: 2020-01-01\n"),
            (Fields{{"TARNMDTitle", "A title: with colon"},
                    {"TARNMDAuthors", "One"},
                    {"TARNMDDescription", "What it is"},
                    {"TARNMDKeywords", "a, b c, d"}}));
}

TEST(FrontMatter, KnowsOtherNamesOfTheSame) {
  EXPECT_EQ(FieldsOf("TITLE: 'x'\nauthors: One, Two\nsummary: s\nkeywords: k\n"),
            (Fields{{"TARNMDTitle", "x"},
                    {"TARNMDAuthors", "One, Two"},
                    {"TARNMDDescription", "s"},
                    {"TARNMDKeywords", "k"}}));
}

TEST(FrontMatter, ListsMayTakeALineEach) {
  EXPECT_EQ(FieldsOf("authors:\n  - One\n- \"Two\"\ntags:\n- t\nother:\n- not this\n"),
            (Fields{{"TARNMDAuthors", "One, Two"}, {"TARNMDKeywords", "t"}}));
}

TEST(FrontMatter, OtherLinesSayNothing) {
  EXPECT_EQ(FieldsOf(""), Fields());
  EXPECT_EQ(FieldsOf("# comment\n\nno colon\n  title: indented\ntitle:\n: x\n- x\ntags: []\n"),
            Fields());
}

TEST(FrontMatter, EndsInEitherMark) {
  EXPECT_EQ(Take("---\r\ntitle: x\r\n...\r\nrest").rest, "rest");
  EXPECT_EQ(Take("---\r\ntitle: x\r\n...\r\nrest").fields, (Fields{{"TARNMDTitle", "x"}}));
  EXPECT_EQ(Take("---  \ntitle: x\n---").rest, "");
}

TEST(FrontMatter, IsNoneWithoutBothMarksAtTheirPlace) {
  for (const char* text :
       {"", "---", "---\n", "---\ntitle: x\n", "\n---\ntitle: x\n---\n", " ---\ntitle: x\n---\n",
        "----\ntitle: x\n---\n", "title: x\n---\n", "---\ntitle: x\n ---\n"}) {
    const Split split = Take(text);
    EXPECT_EQ(split.rest, text);
    EXPECT_EQ(split.fields, Fields()) << text;
  }
}

TEST(FrontMatter, IsOfBoundedLength) {
  const std::string fits = "---\n" + std::string(60000, 'x') + "\n---\nrest";
  EXPECT_EQ(Take(fits).rest, "rest");
  const std::string longer = "---\n" + std::string(70000, 'x') + "\n---\nrest";
  EXPECT_EQ(Take(longer).rest, longer);
}

}  // namespace
}  // namespace quarry::extract
