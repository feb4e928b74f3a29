#include <gtest/gtest.h>

#include "daemons/tarncontentextractd/extractor.h"
#include "daemons/tarncontentextractd/markup.h"
#include "tests/daemons/tarncontentextractd/support/extract_support.h"

namespace quarry::extract {
namespace {

TEST(Html, TitleAndDescriptionsBecomeFields) {
  const Fields fields = ExtractBytes(
      "<!DOCTYPE html><html><head><title>A &amp; B\n</title>"
      "<meta name='Author' content='First Person'><meta name=author content='Second Person'>"
      "<meta name=description content='About things'><meta name=keywords content='one, two'>"
      "<meta name=generator content='An Editor 1.0'></head><body><p>Words</p></body></html>",
      "html");
  EXPECT_EQ(fields, (Fields{{"TARNMDTitle", "A & B"},
                            {"TARNMDAuthors", "First Person, Second Person"},
                            {"TARNMDDescription", "About things"},
                            {"TARNMDKeywords", "one, two"},
                            {"TARNMDCreator", "An Editor 1.0"},
                            {"TARNMDTextContent", "Words"}}));
}

TEST(Html, TheSocialTitleStandsInForAMissingOne) {
  EXPECT_EQ(ExtractBytes("<meta property='og:title' content='T'><p>x", "html")["TARNMDTitle"], "T");
  EXPECT_EQ(
      ExtractBytes("<meta property='og:title' content='T'><title>U</title>", "html")["TARNMDTitle"],
      "U");
}

TEST(Html, ScriptsAndStylesAreNoText) {
  EXPECT_EQ(TextOf("<html><style>p { color: red }</style><script>var a = '<p>no</p>';</script>"
                   "<p>yes<!-- not this --><script src=x></script></p><template>no</template>",
                   "html"),
            "yes");
}

TEST(Html, BlocksEndLinesAndWordsWithinOneDoNot) {
  EXPECT_EQ(
      TextOf("<p>one <b>t</b>wo<p>three<br>four<div>five</div>six<ul><li>a<li>b</ul>", "html"),
      "one two\nthree\nfour\nfive\nsix\na\nb");
  EXPECT_EQ(TextOf("<table><tr><td>a<td>b<tr><td>c<td>d</table>", "html"), "a b\nc d");
}

TEST(Html, EntitiesAndAlternativeTextsAreRead) {
  EXPECT_EQ(
      TextOf("<p>caf&eacute; &#8364; &lt;b&gt; &copy; <img src=x alt='a picture'>end", "html"),
      "caf\xC3\xA9 \xE2\x82\xAC <b> \xC2\xA9 a picture end");
}

TEST(Html, DeclaredEncodingsAreDecoded) {
  const std::string russian = "\xD0\x94\xD0\xB0";
  for (const char* charset : {"windows-1251", "KOI8-R", "ISO-8859-5"}) {
    const std::string text =
        "<html><meta http-equiv=content-type content='text/html; charset=" + std::string(charset) +
        "'><title>" + russian + "</title>" + russian;
    const Fields fields = ExtractBytes(Encode(text, charset), "html");
    EXPECT_EQ(fields.at("TARNMDTitle"), russian) << charset;
    EXPECT_EQ(fields.at("TARNMDTextContent"), russian) << charset;
  }
  const std::string japanese = "\xE6\x97\xA5\xE6\x9C\xAC\xE8\xAA\x9E";
  for (const char* charset : {"Shift_JIS", "EUC-JP", "ISO-2022-JP", "UTF-8"}) {
    const std::string text = "<meta charset=\"" + std::string(charset) + "\"><p>" + japanese;
    EXPECT_EQ(TextOf(Encode(text, charset), "html"), japanese) << charset;
  }
  EXPECT_EQ(
      TextOf(Encode("\xEF\xBB\xBF<html><meta charset=windows-1252><p>" + japanese, "UTF-16LE"),
             "html"),
      japanese);
}

TEST(Html, XhtmlIsReadAsHtml) {
  EXPECT_EQ(TextOf("<?xml version=\"1.0\" encoding=\"windows-1252\"?>\n<!DOCTYPE html PUBLIC \"x\" "
                   "\"y\">\n<html xmlns=\"http://www.w3.org/1999/xhtml\"><body>\n"
                   "<p>Gr\xFC\xDF"
                   "e&nbsp;x</p><br/></body></html>",
                   "xml"),
            "Gr\xC3\xBC\xC3\x9F"
            "e x");
}

TEST(Html, BrokenMarkupGivesWhatThereIs) {
  EXPECT_EQ(TextOf("<p>one<b>two</i></p></div>three<", "html"), "onetwo\nthree<");
  EXPECT_EQ(TextOf("<p>one<p class='x>two", "html"), "one");
  EXPECT_EQ(TextOf(std::string("<html><p>one\0two</p>", 20), "html"), "");
  EXPECT_EQ(TextOf("words alone", "html"), "words alone");
}

TEST(Html, TitlesWithinDrawingsAreText) {
  const Fields fields =
      ExtractBytes("<title>Page</title><p>x<svg><title>Icon</title></svg>", "html");
  EXPECT_EQ(fields.at("TARNMDTitle"), "Page");
  EXPECT_EQ(fields.at("TARNMDTextContent"), "x\nIcon");
}

TEST(Html, DepthCostsNoStack) {
  std::string deep = "<html>";
  for (int i = 0; i < 20000; ++i) deep += "<div><b>";
  EXPECT_EQ(TextOf(deep + "word", "html"), "word");
}

TEST(Html, TextEndsAtItsBound) {
  std::string bytes = "<html>";
  while (bytes.size() < kMaxTextBytes + (1u << 20)) bytes += "some words in a row ";
  const std::string text = TextOf(bytes, "html");
  EXPECT_LE(text.size(), kMaxTextBytes);
  EXPECT_GT(text.size(), kMaxTextBytes - 100);
}

TEST(Markup, DeclaredCharset) {
  EXPECT_EQ(DeclaredCharset("<?xml version='1.0' encoding='koi8-r'?>"), "koi8-r");
  EXPECT_EQ(DeclaredCharset("<meta CHARSET = \"Shift_JIS\">"), "Shift_JIS");
  EXPECT_EQ(DeclaredCharset("the charset is; charset=x"), "x");
  EXPECT_EQ(DeclaredCharset("charset="), "");
  EXPECT_EQ(DeclaredCharset("charset"), "");
  EXPECT_EQ(DeclaredCharset(std::string(5000, ' ') + "charset=x"), "");
}

TEST(Markup, DecodeEntity) {
  EXPECT_EQ(DecodeEntity("amp"), "&");
  EXPECT_EQ(DecodeEntity("apos"), "'");
  EXPECT_EQ(DecodeEntity("#65"), "A");
  EXPECT_EQ(DecodeEntity("#x20AC"), "\xE2\x82\xAC");
  for (const char* bad :
       {"", "#", "#x", "#0", "#xD800", "#x110000", "#99999999999", "#6a", "zzz"}) {
    EXPECT_EQ(DecodeEntity(bad), "") << bad;
  }
}

TEST(Markup, DecodeReferences) {
  EXPECT_EQ(DecodeReferences("a &amp;&lt;b&#38; &no; & &;&"), "a &<b& &no; & &;&");
  EXPECT_EQ(DecodeReferences(""), "");
  EXPECT_EQ(DecodeReferences("&" + std::string(100, 'x') + ";"), "&" + std::string(100, 'x') + ";");
}

}  // namespace
}  // namespace quarry::extract
