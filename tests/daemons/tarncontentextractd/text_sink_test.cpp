#include "daemons/tarncontentextractd/text_sink.h"

#include <gtest/gtest.h>

#include <random>

#include "daemons/tarncontentextractd/utf8.h"
#include "tests/daemons/tarncontentextractd/support/extract_support.h"

namespace quarry::extract {
namespace {

std::string Clean(std::string_view text, std::size_t limit = 1000) {
  TextSink sink(limit);
  sink.Append(text);
  return sink.Take();
}

TEST(TextSink, KeepsWordsAndCollapsesWhiteSpace) {
  EXPECT_EQ(Clean("  one \t two\xC2\xA0\xE3\x80\x80three  "), "one two three");
  EXPECT_EQ(Clean("\n\none \r\n \n two\fthree\n"), "one\ntwo\nthree");
  EXPECT_EQ(Clean("a\xE2\x80\xA8"
                  "b\xC2\x85"
                  "c"),
            "a\nb\nc");
  EXPECT_EQ(Clean(" \n\t "), "");
  EXPECT_EQ(Clean(""), "");
}

TEST(TextSink, MakesBlanksOfControlCharacters) {
  EXPECT_EQ(Clean(std::string_view("a\0b\x01"
                                   "c\x7F"
                                   "d\x1B[0m",
                                   12)),
            "a b c d [0m");
  EXPECT_EQ(Clean("a\xC2\x9B"
                  "b"),
            "a b");
}

TEST(TextSink, LeavesOutWhatIsNotSeen) {
  EXPECT_EQ(Clean("\xEF\xBB\xBF"
                  "co\xC2\xAD"
                  "operate\xE2\x80\x8F"),
            "cooperate");
  EXPECT_EQ(Clean("a\xEF\xBF\xBF"
                  "b\xEF\xB7\x90"
                  "c"),
            "abc");
  // Joiners decide how some scripts are read.
  EXPECT_EQ(Clean("a\xE2\x80\x8D"
                  "b"),
            "a\xE2\x80\x8D"
            "b");
}

TEST(TextSink, ReplacesWhatIsNoUtf8) {
  EXPECT_EQ(Clean("a\xFF"
                  "b"),
            "a\xEF\xBF\xBD"
            "b");
  EXPECT_EQ(Clean("\xE4\xB8"), "\xEF\xBF\xBD");
  EXPECT_EQ(Clean("\xED\xA0\x80"), "\xEF\xBF\xBD\xEF\xBF\xBD\xEF\xBF\xBD");
}

TEST(TextSink, KeepsPiecesApartOnlyWhereToldTo) {
  TextSink sink(100);
  sink.Space();
  sink.Append("a");
  sink.Append("b");
  sink.Space();
  sink.Append("c");
  sink.Space();
  sink.Break();
  sink.Space();
  sink.Append("d");
  sink.Break();
  EXPECT_EQ(sink.Take(), "ab c\nd");
  EXPECT_TRUE(sink.empty());
}

TEST(TextSink, HoldsNoMoreThanItsLimitAndNoHalfCharacter) {
  for (std::size_t limit = 0; limit < 12; ++limit) {
    const std::string text = Clean("ab \xE4\xB8\xAD\xF0\x9F\x98\x80 cd ef", limit);
    EXPECT_LE(text.size(), limit);
    EXPECT_TRUE(IsValidUtf8(text)) << limit;
  }
  EXPECT_EQ(Clean("abcdef", 4), "abcd");
  EXPECT_EQ(Clean("ab\xE4\xB8\xAD", 4), "ab");
  TextSink sink(3);
  EXPECT_TRUE(sink.Append("ab"));
  EXPECT_FALSE(sink.full());
  EXPECT_TRUE(sink.Append("c"));
  EXPECT_FALSE(sink.Append("d"));
  EXPECT_TRUE(sink.full());
  EXPECT_EQ(sink.text(), "abc");
}

TEST(TextSink, OneLineHasNoLineEnds) {
  EXPECT_EQ(OneLine(" one\n two\r\nthree ", 100), "one two three");
  EXPECT_EQ(OneLine("onetwo", 3), "one");
}

TEST(TextSink, MakesValidUtf8OfAnything) {
  std::mt19937 random(1);
  for (int round = 0; round < 2000; ++round) {
    std::string bytes(random() % 40, '\0');
    for (char& c : bytes)
      c = static_cast<char>(random() % 3 == 0 ? random() : 0x80 + random() % 64);
    const std::string text = Clean(bytes, random() % 60);
    ASSERT_TRUE(IsValidUtf8(text)) << ::testing::PrintToString(bytes);
    ASSERT_EQ(Clean(text), text);
  }
}

// Character by character, as the rules are written.
std::string CleanedSlowly(const std::string& utf8, std::size_t limit) {
  std::string text;
  char gap = 0;
  for (std::size_t at = 0; at < utf8.size();) {
    const std::size_t start = at;
    const std::int32_t c = NextCharacter(utf8, &at);
    if (c == '\n' || c == '\r' || c == 0x0B || c == 0x0C || c == 0x85 || c == 0x2028) {
      gap = '\n';
    } else if ((c >= 0 && c <= 0x20) || (c >= 0x7F && c <= 0xA0) || c == 0x3000) {
      gap = gap == 0 ? ' ' : gap;
    } else if (c != 0xAD) {
      std::string piece = c < 0 ? "\xEF\xBF\xBD" : utf8.substr(start, at - start);
      if (gap != 0 && !text.empty()) piece.insert(0, 1, gap);
      if (text.size() + piece.size() > limit) break;
      text += piece;
      gap = 0;
    }
  }
  return text;
}

TEST(TextSink, IsAsGoodAsASlowOneWhateverThePieces) {
  const std::vector<std::string> pieces{"word",
                                        "a",
                                        " ",
                                        "\n",
                                        "\t",
                                        "\r\n",
                                        "  ",
                                        "\xC3\xA9",
                                        "\xC2\xA0",
                                        "\xE4\xB8\xAD",
                                        "\xC2\xAD",
                                        "\x7F",
                                        "\x01",
                                        ".",
                                        "\xFF",
                                        "\xE3\x80\x80",
                                        "a b c d e f g h i j k l m n o p\nq"};
  std::mt19937 random(3);
  for (int round = 0; round < 5000; ++round) {
    TextSink whole(1 << 20);
    std::string all;
    for (auto count = random() % 12; count > 0; --count) {
      std::string text;
      for (auto parts = random() % 30; parts > 0; --parts) {
        // Most of it words and single blanks, as in life.
        const bool odd = random() % 8 == 0;
        text +=
            odd ? pieces[random() % pieces.size()] : "word" + std::string(1, " \n"[random() % 2]);
      }
      whole.Append(text);
      all += text;
    }
    ASSERT_EQ(whole.text(), CleanedSlowly(all, 1 << 20)) << ::testing::PrintToString(all);
    const std::size_t limit = random() % (all.size() + 2);
    ASSERT_EQ(Clean(all, limit), CleanedSlowly(all, limit)) << ::testing::PrintToString(all);
  }
}

TEST(TextSink, ALongRunIsCutAtTheLimit) {
  std::string words;
  while (words.size() < (std::size_t{8} << 20)) words += "word ";
  const std::size_t limit = words.size() / 2;
  EXPECT_TRUE(Clean(words, limit) == CleanedSlowly(words, limit));
}

// Against ICU's reading of every two bytes, and of every three and four that matter.
TEST(Utf8, TellsCharactersFromOtherBytes) {
  const auto check = [](const std::string& bytes) {
    std::size_t at = 0;
    bool valid = true;
    while (at < bytes.size()) valid = NextCharacter(bytes, &at) >= 0 && valid;
    ASSERT_EQ(at, bytes.size());
    ASSERT_EQ(valid, IsValidUtf8(bytes)) << ::testing::PrintToString(bytes);
    ASSERT_EQ(valid, IsUtf8(bytes)) << ::testing::PrintToString(bytes);
    ASSERT_EQ(valid, IsUtf8("12345678" + bytes + "12345678")) << ::testing::PrintToString(bytes);
  };
  for (int a = 1; a < 256; ++a) {
    for (int b = 1; b < 256; ++b) {
      std::string bytes{static_cast<char>(a), static_cast<char>(b)};
      check(bytes);
      for (const char c : {'\x7F', '\x80', '\x9F', '\xBF', '\xC0'}) {
        check(bytes + c);
        check(bytes + c + '\x80');
        check(bytes + c + 'x');
      }
    }
  }
}

TEST(Utf8, ReadsTheCharacters) {
  const std::string text = "a\xC3\xA9\xE4\xB8\xAD\xF0\x9F\x98\x80";
  std::size_t at = 0;
  EXPECT_EQ(NextCharacter(text, &at), 'a');
  EXPECT_EQ(NextCharacter(text, &at), 0xE9);
  EXPECT_EQ(NextCharacter(text, &at), 0x4E2D);
  EXPECT_EQ(NextCharacter(text, &at), 0x1F600);
  EXPECT_EQ(at, text.size());
}

}  // namespace
}  // namespace quarry::extract
