#include <gtest/gtest.h>

#include "daemons/tarncontentextractd/extractor.h"
#include "daemons/tarncontentextractd/front_matter.h"
#include "tests/daemons/tarncontentextractd/support/extract_support.h"

namespace quarry::extract {
namespace {

TEST(Markdown, MarksAreNoText) {
  EXPECT_EQ(TextOf("Some *slanted*, **strong** and `fixed` words, a [link](http://x.example/y)\n"
                   "and ![a picture](z.png).\n\n- one\n- two\n\n> quoted\n\n    code here\n",
                   "md"),
            "Some slanted, strong and fixed words, a link\nand a picture.\none\ntwo\nquoted\n"
            "code here");
}

TEST(Markdown, TheFirstHeadingIsTheTitle) {
  EXPECT_EQ(ExtractBytes("intro\n\n## The *first* one\n\n# Another\n", "md")["TARNMDTitle"],
            "The first one");
  EXPECT_EQ(ExtractBytes("Under\nlined\n=====\n", "markdown")["TARNMDTitle"], "Under lined");
  EXPECT_EQ(ExtractBytes("#\n\n# Not empty\n", "md")["TARNMDTitle"], "Not empty");
  EXPECT_EQ(ExtractBytes("no heading\n", "md").count("TARNMDTitle"), 0u);
}

TEST(Markdown, HeadingsAreTextToo) {
  EXPECT_EQ(TextOf("# Title\nwords\n", "md"), "Title\nwords");
}

TEST(Markdown, TablesAndEntities) {
  EXPECT_EQ(
      TextOf("| a | b |\n|---|---|\n| c | d |\n\nfish &amp; chips &copy; &unknown; &#65;\n", "md"),
      "a b\nc d\nfish & chips \xC2\xA9 &unknown; A");
}

TEST(Markdown, HtmlWithinIsReadAsSuch) {
  EXPECT_EQ(TextOf("<p align=\"center\">centred <b>words</b></p>\n\nsome <i>inline</i> tags\n\n"
                   "<!-- a comment -->\n\n<script>\nno\n</script>\n",
                   "md"),
            "centred words\nsome inline tags");
}

TEST(Markdown, EncodingsAreDecoded) {
  const std::string text =
      "# \xC3\x9C"
      "berschrift f\xC3\xBCr M\xC3\xA4rz\n";
  for (const char* charset : {"UTF-8", "UTF-16LE", "windows-1252"}) {
    EXPECT_EQ(ExtractBytes(Encode(text, charset), "md")["TARNMDTitle"],
              "\xC3\x9C"
              "berschrift f\xC3\xBCr M\xC3\xA4rz")
        << charset;
  }
}

TEST(Markdown, FrontMatterBecomesFields) {
  const Fields fields = ExtractBytes(
      "---\r\ntitle: \"A title\"\r\nauthor: One Person\r\ntags: [first, 'second']\r\n"
      "description: What it is: words\r\nlayout: post\r\n---\r\n# Heading\r\nwords\r\n",
      "md");
  EXPECT_EQ(fields, (Fields{{"TARNMDTitle", "A title"},
                            {"TARNMDAuthors", "One Person"},
                            {"TARNMDKeywords", "first, second"},
                            {"TARNMDDescription", "What it is: words"},
                            {"TARNMDTextContent", "Heading\nwords"}}));
}

TEST(Markdown, FrontMatterListsMayTakeLines) {
  const Fields fields = ExtractBytes(
      "---\nkeywords:\n  - one\n  - \"two\"\nother:\n  - no\nauthors:\n- A\n- B\n...\nwords\n",
      "md");
  EXPECT_EQ(fields, (Fields{{"TARNMDKeywords", "one, two"},
                            {"TARNMDAuthors", "A, B"},
                            {"TARNMDTextContent", "words"}}));
}

TEST(Markdown, ALineIsNoFrontMatter) {
  EXPECT_EQ(TextOf("---\nwords\n", "md"), "words");
  Extraction out;
  EXPECT_EQ(TakeFrontMatter("--- \ntitle: x", out), "--- \ntitle: x");
  EXPECT_EQ(TakeFrontMatter("----\ntitle: x\n----\n", out), "----\ntitle: x\n----\n");
  EXPECT_EQ(TakeFrontMatter("", out), "");
  EXPECT_EQ(TakeFrontMatter("---", out), "---");
  EXPECT_EQ(TakeFrontMatter("---\n---", out), "");
  const std::string much = "---\n" + std::string(100000, 'x') + "\n---\n";
  EXPECT_EQ(TakeFrontMatter(much, out), much);
  EXPECT_TRUE(out.Take().empty());
}

TEST(Markdown, TextEndsAtItsBound) {
  std::string bytes;
  while (bytes.size() < kMaxTextBytes + (1u << 20)) bytes += "some words in a row\n\n";
  const std::string text = TextOf(bytes, "md");
  EXPECT_LE(text.size(), kMaxTextBytes);
  EXPECT_GT(text.size(), kMaxTextBytes - 100);
}

TEST(Markdown, DepthCostsNoStack) {
  EXPECT_EQ(TextOf(std::string(20000, '>') + " word", "md"), "word");
  EXPECT_TRUE(
      IsValidUtf8(TextOf(std::string(50000, '[') + "word" + std::string(50000, ']'), "md")));
}

}  // namespace
}  // namespace quarry::extract
