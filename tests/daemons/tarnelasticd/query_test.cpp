// What is typed, and what it is taken for.

#include "daemons/tarnelasticd/query.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "common/error.h"
#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::engine {
namespace {

std::string Show(const QueryTerm& term) {
  std::string text = term.negated ? "-" : "";
  switch (term.kind) {
    case QueryTerm::Kind::kName:
      text += "name:";
      break;
    case QueryTerm::Kind::kExtension:
      text += "ext:";
      break;
    case QueryTerm::Kind::kType:
      text += "type:";
      break;
    case QueryTerm::Kind::kInside:
      text += "in:";
      break;
    default:
      break;
  }
  if (term.values.empty()) text += '<' + term.text + '>';
  for (const std::string& value : term.values) text += '<' + value + '>';
  return text + (term.prefix ? "*" : "");
}

// Groups apart by " & ", terms of a group by " | "; or the sentence of the error.
std::string Parsed(const std::string& text) {
  try {
    std::string shown;
    for (const auto& group : ParseQuery(text).groups) {
      if (!shown.empty()) shown += " & ";
      for (std::size_t i = 0; i < group.size(); ++i) shown += (i > 0 ? " | " : "") + Show(group[i]);
    }
    return shown;
  } catch (const Error& error) {
    EXPECT_TRUE(HasCode(error, kQuerySyntax));
    return error.reason();
  }
}

TEST(QueryTest, ReadsWordsPhrasesAndSigns) {
  EXPECT_EQ(Parsed("one"), "<one>");
  EXPECT_EQ(Parsed("  one\ttwo\n"), "<one> & <two>");
  EXPECT_EQ(Parsed("\"one two\" three"), "<one two> & <three>");
  EXPECT_EQ(Parsed("begin*"), "<begin>*");
  EXPECT_EQ(Parsed("begin***"), "<begin>*");
  EXPECT_EQ(Parsed("\"one tw\"*"), "<one tw>*");
  EXPECT_EQ(Parsed("*"), "<>*");
  EXPECT_EQ(Parsed("a*b"), "<a*b>");
  EXPECT_EQ(Parsed("-not -\"these two\" -begin*"), "-<not> & -<these two> & -<begin>*");
  EXPECT_EQ(Parsed("- -"), "<-> & <->");
  EXPECT_EQ(Parsed("--x"), "-<-x>");
  EXPECT_EQ(Parsed("well-known"), "<well-known>");
  EXPECT_EQ(Parsed("\"one\"two"), "<one> & <two>");
  EXPECT_EQ(Parsed("5\" disk\""), "<5\"> & <disk\">");
}

TEST(QueryTest, ReadsOr) {
  EXPECT_EQ(Parsed("a OR b"), "<a> | <b>");
  EXPECT_EQ(Parsed("a b OR c d"), "<a> & <b> | <c> & <d>");
  EXPECT_EQ(Parsed("a OR b OR c"), "<a> | <b> | <c>");
  EXPECT_EQ(Parsed("a OR -b"), "<a> | -<b>");
  EXPECT_EQ(Parsed("a OR ext:pdf"), "<a> | ext:<pdf>");
  EXPECT_EQ(Parsed("a or b"), "<a> & <or> & <b>");
  EXPECT_EQ(Parsed("a \"OR\" b"), "<a> & <OR> & <b>");
  EXPECT_EQ(Parsed("a -OR b"), "<a> & -<OR> & <b>");
  EXPECT_EQ(Parsed("ORDER ORs"), "<ORDER> & <ORs>");
  EXPECT_EQ(Parsed("a OR* b"), "<a> & <OR>* & <b>");
  EXPECT_EQ(Parsed("AND NOT NEAR(a)"), "<AND> & <NOT> & <NEAR(a)>");
  const std::string both = "OR needs something on both sides.";
  for (const char* text : {"OR", "OR a", "a OR", "a OR ", "a OR OR b", " OR OR "}) {
    EXPECT_EQ(Parsed(text), both) << text;
  }
}

TEST(QueryTest, ReadsFilters) {
  EXPECT_EQ(Parsed("type:document"), "type:<document>");
  EXPECT_EQ(Parsed("TYPE:Audio,VIDEO,,photo"), "type:<audio><video><photo>");
  EXPECT_EQ(Parsed("-type:\"audio\""), "-type:<audio>");
  EXPECT_EQ(Parsed("ext:PDF,.txt,."), "ext:<pdf><txt><.>");
  EXPECT_EQ(Parsed("in:/a/b/ x"), "in:</a/b> & <x>");
  EXPECT_EQ(Parsed("in:\"/a b/c\"x"), "in:</a b/c> & <x>");
  EXPECT_EQ(Parsed("in:/ in:///"), "in:</> & in:</>");
  EXPECT_EQ(Parsed("name:re*port.PDF"), "name:<re*port.PDF>");
  EXPECT_EQ(Parsed("name:-x"), "name:<-x>");
  EXPECT_EQ(Parsed("size:5 http://x"), "<size:5> & <http://x>");
  EXPECT_EQ(Parsed("\"type:x\""), "<type:x>");
  const std::string value = "A filter needs a value behind its colon.";
  for (const char* text : {"type:", "ext:", "in:", "name:", "name: x", "type:\"\"", "ext:,,"}) {
    EXPECT_EQ(Parsed(text), value) << text;
  }
  EXPECT_EQ(Parsed("in:photos"), "in: needs a full path, which begins with /.");
  EXPECT_EQ(Parsed("type:music"), "There is no type music, only document, audio, video and photo.");
}

TEST(QueryTest, RefusesWhatCannotBeMeant) {
  const std::string nothing = "There is nothing to search for.";
  EXPECT_EQ(Parsed(""), nothing);
  EXPECT_EQ(Parsed(" \t\r\n\v\f"), nothing);
  EXPECT_EQ(Parsed("\""), "The quote at character 1 is not closed.");
  EXPECT_EQ(Parsed("ab \"cd"), "The quote at character 4 is not closed.");
  EXPECT_EQ(Parsed("name:\"cd"), "The quote at character 6 is not closed.");
  EXPECT_EQ(Parsed(std::string("a\0b", 3)), "The query has a NUL byte.");
}

TEST(QueryTest, BoundsItsLengthAndItsWords) {
  EXPECT_EQ(Parsed(std::string(kMaxQueryBytes, 'x')), '<' + std::string(kMaxQueryBytes, 'x') + '>');
  EXPECT_EQ(Parsed(std::string(kMaxQueryBytes + 1, 'x')), "The query is longer than 4096 bytes.");
  std::string words;
  for (std::size_t i = 0; i < kMaxQueryTerms; ++i) words += "x ";
  EXPECT_EQ(ParseQuery(words).groups.size(), kMaxQueryTerms);
  EXPECT_EQ(Parsed(words + "x"), "There are more than 64 words.");
}

// Resolving needs the words of the index.
class ResolveTest : public testing::Test {
 protected:
  ResolveTest() {
    test::WriteFile(dir_ / "db", "");
    db_ = std::make_unique<Database>(dir_ / "db");
    tokenizer_ = std::make_unique<TextTokenizer>(db_->handle());
  }
  Query Resolved(const std::string& text) {
    Query query = ParseQuery(text);
    Resolve(*tokenizer_, &query);
    return query;
  }

  test::TempDir dir_;
  std::unique_ptr<Database> db_;
  std::unique_ptr<TextTokenizer> tokenizer_;
};

TEST_F(ResolveTest, FoldsWordsAndKeepsWhatStandsBetween) {
  const QueryTerm term = Resolved("\"R\xC3\xA9sum\xC3\xA9 -- 2019.PDF\"").groups[0][0];
  EXPECT_THAT(term.words, testing::ElementsAre("resume", "2019", "pdf"));
  EXPECT_EQ(term.part, "resume -- 2019.pdf");
}

TEST_F(ResolveTest, DropsWhatCannotBeFound) {
  EXPECT_EQ(Resolved("a . b").groups.size(), 2U);
  EXPECT_EQ(Resolved("a OR -").groups[0].size(), 1U);
  EXPECT_EQ(Resolved("a name:** *").groups.size(), 1U);
  EXPECT_EQ(Resolved("...").groups.size(), 1U) << "a file name may have three dots";
  for (const char* text : {".", "..", "- ?", "\"\"", "*", "\"\" OR \"!\"", "name:*", "name:***"}) {
    EXPECT_THROW(Resolved(text), Error) << text;
  }
}

TEST_F(ResolveTest, SplitsNamesAtStars) {
  EXPECT_THAT(Resolved("name:*Report**.pdf*").groups[0][0].values,
              testing::ElementsAre("report", ".pdf"));
}

}  // namespace
}  // namespace quarry::engine
