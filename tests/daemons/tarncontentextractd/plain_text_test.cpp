#include <gtest/gtest.h>

#include "daemons/tarncontentextractd/extractor.h"
#include "tests/daemons/tarncontentextractd/support/extract_support.h"

namespace quarry::extract {
namespace {

TEST(PlainText, IsReadWhateverTheExtension) {
  for (const char* extension : {"txt", "", "log", "c", "py", "ts", "unheard-of", "mp3"}) {
    EXPECT_EQ(TextOf("some words\n", extension), "some words") << extension;
  }
}

TEST(PlainText, SourceCodeIsReadAsItStands) {
  EXPECT_EQ(TextOf("#include <a.h>\n\nint main() {\n\treturn 0;  // done\n}\n", "c"),
            "#include <a.h>\nint main() {\nreturn 0; // done\n}");
}

TEST(PlainText, HasNoTitle) {
  const Fields fields = ExtractBytes("First line\nsecond line\n", "txt");
  EXPECT_EQ(fields, (Fields{{"TARNMDTextContent", "First line\nsecond line"}}));
}

TEST(PlainText, EncodingsAreDecoded) {
  const std::string text =
      "Gr\xC3\xBC\xC3\x9F"
      "e aus M\xC3\xBCnchen, sch\xC3\xB6nes Wetter";
  for (const char* charset : {"UTF-8", "UTF-16LE", "UTF-16BE", "UTF-32LE", "windows-1252"}) {
    EXPECT_EQ(TextOf(Encode(text, charset), "txt"), text) << charset;
  }
}

TEST(PlainText, OtherDataHasNoFields) {
  EXPECT_EQ(ExtractBytes(std::string("\x7F"
                                     "ELF\0\1\2\3\0\0\0\0",
                                     12),
                         "txt"),
            Fields());
  EXPECT_EQ(ExtractBytes("", "txt"), Fields());
  EXPECT_EQ(ExtractBytes(" \n\t\n", "txt"), Fields());
}

TEST(PlainText, FormatsThatOnlyLookLikeTextHaveNone) {
  EXPECT_EQ(ExtractBytes("%PDF-1.4\n1 0 obj\n<< /Type /Catalog >>\n", "txt"), Fields());
  EXPECT_EQ(ExtractBytes("%!PS-Adobe-3.0\n/Times findfont\n", "ps"), Fields());
  EXPECT_EQ(ExtractBytes("{\\rtf1\\ansi words}", "rtf"), Fields());
}

TEST(PlainText, IsCutAtItsBoundBetweenCharacters) {
  std::string bytes;
  while (bytes.size() < kMaxTextBytes + 100) bytes += "\xE4\xB8\xAD\xE6\x96\x87 ";
  const std::string text = TextOf(bytes, "txt");
  EXPECT_LE(text.size(), kMaxTextBytes);
  EXPECT_GT(text.size(), kMaxTextBytes - 8);
  EXPECT_TRUE(IsValidUtf8(text));
}

TEST(Registry, ContentGoesBeforeExtension) {
  EXPECT_EQ(TextOf("<!DOCTYPE html><p>one<p>two", "txt"), "one\ntwo");
  EXPECT_EQ(TextOf("\xEF\xBB\xBF \n<HTML><p>one<p>two", ""), "one\ntwo");
  EXPECT_EQ(TextOf("<?xml version='1.0'?><a><b>one</b><b>two</b></a>", "txt"), "one\ntwo");
  EXPECT_EQ(TextOf(Encode("<!doctype html><p>one", "UTF-16LE"), "txt"), "one");
  EXPECT_EQ(TextOf(Encode("\xEF\xBB\xBF<?xml version='1.0'?><a>one</a>", "UTF-16BE"), "x"), "one");
  EXPECT_EQ(TextOf("%PDF-1.4", "html"), "");
}

TEST(Registry, ExtensionDecidesWhereContentDoesNot) {
  EXPECT_EQ(TextOf("<p>one</p>", "html"), "one");
  EXPECT_EQ(TextOf("<p>one</p>", "xml"), "one");
  EXPECT_EQ(TextOf("*one*", "md"), "one");
  EXPECT_EQ(TextOf("<p>*one*</p>", "txt"), "<p>*one*</p>");
}

TEST(Registry, KnowsNothingWithoutFormats) {
  Source source = Source::OfBytes("text", "txt");
  EXPECT_EQ(Registry().Find(source), nullptr);
  EXPECT_STREQ(StandardRegistry().Find(source)->Name(), "text");
}

TEST(Extraction, KeepsTheFirstValueAndJoinsLists) {
  Extraction extraction;
  extraction.Set("TARNMDTitle", " \n ");
  extraction.Set("TARNMDTitle", " first\n title ");
  extraction.Set("TARNMDTitle", "second");
  extraction.Add("TARNMDAuthors", "one");
  extraction.Add("TARNMDAuthors", "");
  extraction.Add("TARNMDAuthors", "two");
  extraction.Set("TARNMDRecordingYear", std::int64_t{1999});
  extraction.Add("TARNMDRecordingYear", "x");
  extraction.Set("TARNMDDurationSecond", 1.5);
  EXPECT_EQ(ToMap(extraction.Take()), (Fields{{"TARNMDTitle", "first title"},
                                              {"TARNMDAuthors", "one, two"},
                                              {"TARNMDRecordingYear", "1999"},
                                              {"TARNMDDurationSecond", "1.500000"}}));
  EXPECT_TRUE(extraction.Take().empty());
}

TEST(Extraction, IsBounded) {
  Extraction extraction;
  for (std::size_t i = 0; i < 2 * kMaxFields; ++i) {
    extraction.Set("TARNMDField" + std::string(i, 'x'), std::int64_t{1});
  }
  EXPECT_EQ(extraction.Take().size(), kMaxFields);
  for (std::size_t i = 0; i < kMaxFieldBytes; ++i) extraction.Add("TARNMDKeywords", "word");
  extraction.Set("TARNMDTitle", std::string(2 * kMaxFieldBytes, 'x'));
  for (const auto& [name, value] : ToMap(extraction.Take())) {
    EXPECT_LE(value.size(), kMaxFieldBytes) << name;
  }
}

}  // namespace
}  // namespace quarry::extract
