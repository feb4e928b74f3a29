#include "daemons/tarncontentextractd/charset.h"

#include <gtest/gtest.h>

#include <random>

#include "tests/daemons/tarncontentextractd/support/extract_support.h"

namespace quarry::extract {
namespace {

constexpr char kGerman[] =
    "Der Vertrag \xC3\xBC"
    "ber die Lieferung der Ger\xC3\xA4te wurde am Montag "
    "unterzeichnet. Die Gr\xC3\xB6\xC3\x9F"
    "e der Pakete \xC3\xA4ndert sich nicht, und die "
    "Rechnung f\xC3\xBCr M\xC3\xA4rz liegt bei.\n";
constexpr char kRussian[] =
    "\xD0\x94\xD0\xBE\xD0\xB3\xD0\xBE\xD0\xB2\xD0\xBE\xD1\x80 \xD0\xBE "
    "\xD0\xBF\xD0\xBE\xD1\x81\xD1\x82\xD0\xB0\xD0\xB2\xD0\xBA\xD0\xB5 "
    "\xD0\xBE\xD0\xB1\xD0\xBE\xD1\x80\xD1\x83\xD0\xB4\xD0\xBE\xD0\xB2\xD0\xB0\xD0\xBD\xD0\xB8\xD1"
    "\x8F \xD0\xBF\xD0\xBE\xD0\xB4\xD0\xBF\xD0\xB8\xD1\x81\xD0\xB0\xD0\xBD "
    "\xD0\xB2\xD1\x87\xD0\xB5\xD1\x80\xD0\xB0 \xD0\xB2 "
    "\xD0\x9C\xD0\xBE\xD1\x81\xD0\xBA\xD0\xB2\xD0\xB5.\n";
constexpr char kJapanese[] =
    "\xE5\xA5\x91\xE7\xB4\x84\xE6\x9B\xB8\xE3\x81\xAF\xE6\x9C\x88\xE6\x9B\x9C\xE6\x97\xA5\xE3\x81"
    "\xAB\xE7\xBD\xB2\xE5\x90\x8D\xE3\x81\x95\xE3\x82\x8C\xE3\x81\xBE\xE3\x81\x97\xE3\x81\x9F\xE3"
    "\x80\x82\xE3\x81\x93\xE3\x82\x8C\xE3\x81\xAF\xE3\x83\x86\xE3\x82\xB9\xE3\x83\x88\xE3\x81\xA7"
    "\xE3\x81\x99\xE3\x80\x82\n";
constexpr char kChinese[] =
    "\xE5\x90\x88\xE5\x90\x8C\xE5\xB7\xB2\xE4\xBA\x8E\xE6\x98\x9F\xE6\x9C\x9F\xE4\xB8\x80\xE7\xAD"
    "\xBE\xE7\xBD\xB2\xEF\xBC\x8C\xE6\x88\x91\xE4\xBB\xAC\xE7\x9A\x84\xE5\x85\xAC\xE5\x8F\xB8\xE5"
    "\xB0\x86\xE5\x9C\xA8\xE4\xB8\x8B\xE4\xB8\xAA\xE6\x9C\x88\xE4\xBA\xA4\xE4\xBB\x98\xE8\xAE\xBE"
    "\xE5\xA4\x87\xE3\x80\x82\n";
constexpr char kKorean[] =
    "\xEA\xB3\x84\xEC\x95\xBD\xEC\x84\x9C\xEB\x8A\x94 \xEC\x9B\x94\xEC\x9A\x94\xEC\x9D\xBC\xEC\x97"
    "\x90 \xEC\x84\x9C\xEB\xAA\x85\xEB\x90\x98\xEC\x97\x88\xEC\x8A\xB5\xEB\x8B\x88\xEB\x8B\xA4.\n";

std::string Repeat(const std::string& text, int times) {
  std::string out;
  for (int i = 0; i < times; ++i) out += text;
  return out;
}

struct Case {
  const char* text;
  const char* charset;
  const char* mark;
  std::size_t mark_size;
};

void PrintTo(const Case& each, std::ostream* out) {
  *out << each.charset << ": " << each.text;
}

class Encodings : public ::testing::TestWithParam<Case> {};

TEST_P(Encodings, AreFoundAndDecoded) {
  const Case& param = GetParam();
  const std::string text = Repeat(param.text, 4);
  const std::string bytes = std::string(param.mark, param.mark_size) + Encode(text, param.charset);
  const auto decoded = DecodeText(bytes);
  ASSERT_TRUE(decoded.has_value());
  EXPECT_EQ(decoded->utf8, text) << decoded->charset;
  EXPECT_TRUE(LooksLikeText(bytes));
}

INSTANTIATE_TEST_SUITE_P(Marked, Encodings,
                         ::testing::Values(Case{kGerman, "UTF-8", "\xEF\xBB\xBF", 3},
                                           Case{kGerman, "UTF-16LE", "\xFF\xFE", 2},
                                           Case{kChinese, "UTF-16BE", "\xFE\xFF", 2},
                                           Case{kGerman, "UTF-32LE", "\xFF\xFE\0\0", 4},
                                           Case{kKorean, "UTF-32BE", "\0\0\xFE\xFF", 4}));

INSTANTIATE_TEST_SUITE_P(
    Unmarked, Encodings,
    ::testing::Values(Case{kGerman, "UTF-8", "", 0}, Case{kJapanese, "UTF-8", "", 0},
                      Case{kGerman, "UTF-16LE", "", 0}, Case{kGerman, "UTF-16BE", "", 0},
                      Case{kRussian, "UTF-16LE", "", 0}, Case{kRussian, "UTF-16BE", "", 0},
                      Case{kJapanese, "UTF-16LE", "", 0}, Case{kChinese, "UTF-16BE", "", 0},
                      Case{kGerman, "UTF-32LE", "", 0}, Case{kGerman, "UTF-32BE", "", 0},
                      Case{kJapanese, "UTF-32LE", "", 0}, Case{kRussian, "UTF-32BE", "", 0}));

INSTANTIATE_TEST_SUITE_P(
    Legacy, Encodings,
    ::testing::Values(Case{kGerman, "windows-1252", "", 0}, Case{kGerman, "ISO-8859-1", "", 0},
                      Case{kRussian, "windows-1251", "", 0}, Case{kRussian, "KOI8-R", "", 0},
                      Case{kRussian, "ISO-8859-5", "", 0}, Case{kRussian, "IBM866", "", 0},
                      Case{kJapanese, "Shift_JIS", "", 0}, Case{kJapanese, "EUC-JP", "", 0},
                      Case{kJapanese, "ISO-2022-JP", "", 0}, Case{kChinese, "GB18030", "", 0},
                      Case{kChinese, "GB2312", "", 0}, Case{kKorean, "EUC-KR", "", 0},
                      Case{kKorean, "windows-949", "", 0}));

TEST(Charset, PlainAsciiIsUtf8) {
  const auto decoded = DecodeText("int main() { return 0; }\n");
  ASSERT_TRUE(decoded.has_value());
  EXPECT_EQ(decoded->charset, "UTF-8");
  EXPECT_EQ(decoded->utf8, "int main() { return 0; }\n");
}

TEST(Charset, NothingIsText) {
  EXPECT_TRUE(LooksLikeText(""));
  ASSERT_TRUE(DecodeText("").has_value());
  EXPECT_EQ(DecodeText("")->utf8, "");
  EXPECT_EQ(DecodeText("\xEF\xBB\xBF")->utf8, "");
  EXPECT_EQ(DecodeText("\xFF\xFE")->utf8, "");
}

TEST(Charset, ShortPairsOfAsciiAreNotTakenForChinese) {
  EXPECT_EQ(DecodeText("bush hid the facts")->utf8, "bush hid the facts");
}

TEST(Charset, ShortWideTextIsFound) {
  EXPECT_EQ(DecodeText(std::string_view("h\0i\0", 4))->utf8, "hi");
  EXPECT_EQ(DecodeText(std::string_view("\0h\0i", 4))->utf8, "hi");
}

TEST(Charset, TheNameThatATextGivesIsUsedWhereItFits) {
  const std::string bytes = Encode(kRussian, "KOI8-R");
  EXPECT_EQ(DecodeText(bytes, "koi8-r")->utf8, kRussian);
  // Two characters are no frequencies to judge by.
  EXPECT_EQ(DecodeText("\xC4\xE0", "windows-1251")->utf8, "\xD0\x94\xD0\xB0");
  EXPECT_EQ(DecodeText("\xC4\xE0", "windows-1252")->utf8, "\xC3\x84\xC3\xA0");
}

TEST(Charset, AWrongNameIsPassedOver) {
  EXPECT_EQ(DecodeText(kGerman, "windows-1252")->utf8, kGerman);
  EXPECT_EQ(DecodeText(Encode(kGerman, "windows-1252"), "no-such-charset")->utf8, kGerman);
  EXPECT_EQ(DecodeText(Encode(kGerman, "windows-1252"), "UTF-16")->utf8, kGerman);
  EXPECT_EQ(DecodeText(Encode(kGerman, "windows-1252"), "UTF-8")->utf8, kGerman);
}

TEST(Charset, DamagedUtf8StaysUtf8) {
  const std::string bytes = Repeat(kGerman, 5) + "\xFF broken \xE4\n";
  const auto decoded = DecodeText(bytes);
  ASSERT_TRUE(decoded.has_value());
  EXPECT_EQ(decoded->charset, "UTF-8");
  EXPECT_EQ(decoded->utf8, bytes);
}

TEST(Charset, UpToACutInTheLastCharacter) {
  const std::string text = Repeat(kJapanese, 3);
  for (std::size_t cut = 1; cut <= 6; ++cut) {
    const auto decoded = DecodeText(std::string_view(text).substr(0, text.size() - cut));
    ASSERT_TRUE(decoded.has_value());
    EXPECT_EQ(decoded->charset, "UTF-8") << cut;
  }
}

TEST(Charset, TextFarBehindPlainAsciiIsFound) {
  const std::string bytes = Repeat("A licence in plain English, of which there is much.\n", 4000) +
                            Repeat(Encode(kRussian, "windows-1251"), 5);
  const auto decoded = DecodeText(bytes);
  ASSERT_TRUE(decoded.has_value());
  EXPECT_NE(decoded->utf8.find(kRussian), std::string::npos) << decoded->charset;
}

TEST(Charset, BinaryDataIsNoText) {
  std::mt19937 random(7);
  for (int round = 0; round < 200; ++round) {
    std::string bytes(200 + random() % 2000, '\0');
    for (char& c : bytes) c = static_cast<char>(random());
    EXPECT_FALSE(LooksLikeText(bytes)) << round;
    EXPECT_FALSE(DecodeText(bytes).has_value()) << round;
  }
}

TEST(Charset, BinaryDataThatBeginsLikeAMarkIsNoText) {
  std::mt19937 random(9);
  for (const char* mark : {"\xFF\xFE", "\xFE\xFF"}) {
    std::string bytes = mark;
    for (int i = 0; i < 4000; ++i) bytes.push_back(static_cast<char>(random()));
    EXPECT_FALSE(LooksLikeText(bytes));
    EXPECT_FALSE(DecodeText(bytes).has_value());
  }
}

TEST(Charset, RecordsOfSmallNumbersAreNoText) {
  std::string bytes;
  for (int i = 0; i < 500; ++i) bytes += std::string("\x01\0\x02\0", 4);
  EXPECT_FALSE(LooksLikeText(bytes));
  EXPECT_FALSE(DecodeText(bytes).has_value());
}

TEST(Charset, TextInFrontOfBinaryDataIsRead) {
  const std::string script = Repeat("echo unpacking the archive\n", 400);
  const auto decoded = DecodeText(script + std::string("\0\1\2\3", 4) + script);
  ASSERT_TRUE(decoded.has_value());
  EXPECT_EQ(decoded->utf8, script);
  EXPECT_FALSE(DecodeText("echo" + std::string("\0\1\2\3", 4) + script).has_value());
}

TEST(Charset, OverstruckAndColouredTextIsText) {
  EXPECT_TRUE(LooksLikeText("N\bNA\bAM\bME\bE\n"));
  EXPECT_EQ(DecodeText("\x1B[31mred\x1B[0m\x1B(B\n")->utf8, "\x1B[31mred\x1B[0m\x1B(B\n");
}

TEST(Charset, ConversionReplacesWhatTheEncodingDoesNotHave) {
  EXPECT_EQ(*ConvertToUtf8("a\xFF"
                           "b",
                           "UTF-8"),
            "a\xEF\xBF\xBD"
            "b");
  EXPECT_FALSE(ConvertToUtf8("a", "no-such-charset").has_value());
  EXPECT_EQ(*ConvertToUtf8("", "UTF-16LE"), "");
  const std::string much = Repeat(kJapanese, 3000);
  EXPECT_EQ(*ConvertToUtf8(Encode(much, "Shift_JIS"), "Shift_JIS"), much);
}

}  // namespace
}  // namespace quarry::extract
