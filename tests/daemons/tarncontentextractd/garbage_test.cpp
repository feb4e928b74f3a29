// Every parser on what no program wrote on purpose.

#include <gtest/gtest.h>

#include <random>

#include "daemons/tarncontentextractd/extractor.h"
#include "tests/daemons/tarncontentextractd/support/extract_support.h"

namespace quarry::extract {
namespace {

struct Sample {
  const char* extension;
  const char* text;
};

constexpr Sample kSamples[] = {
    {"html",
     "<!DOCTYPE html><html lang=en><head><meta charset=utf-8><title>T&amp;t</title>"
     "<script>if (a < b) c();</script></head><body><p class='x'>caf\xC3\xA9 &eacute; <b>b</b>"
     "<table><tr><td>1</table><!-- c --><img alt='p'></body></html>"},
    {"xml",
     "<?xml version='1.0' encoding='UTF-8'?><!DOCTYPE a [<!ENTITY e 'x'><!ATTLIST a b CDATA 'c'>]>"
     "<a xmlns:d='http://purl.org/dc/elements/1.1/'><d:creator>caf\xC3\xA9</d:creator>"
     "<![CDATA[ ]] ]]>&e;&#65;<b/></a>"},
    {"md",
     "---\ntitle: T\ntags: [a, b]\n---\n# H\n\n* a\n  1. b\n\n```c\ncode\n```\n\n> q\n\n| a | b |\n"
     "|---|:-:|\n| c | `d|` |\n\n[l]: http://x.example \"t\"\n[l] ![i](j) <b>x</b> &amp; "
     "caf\xC3\xA9 "
     "**a _b_ c** ~~d~~\n\n<div>\nz\n</div>\n"},
    {"txt", "plain caf\xC3\xA9 \xE4\xB8\xAD\xE6\x96\x87 words\r\n\ttab\n"}};

void CheckClean(const std::string& bytes, const std::string& extension) {
  for (const auto& [name, value] : ExtractBytes(bytes, extension)) {
    ASSERT_TRUE(IsValidUtf8(value)) << extension << " " << ::testing::PrintToString(bytes);
    ASSERT_EQ(value.find('\0'), std::string::npos);
    ASSERT_LE(value.size(), kMaxTextBytes);
  }
}

class Garbage : public ::testing::TestWithParam<Sample> {};

TEST_P(Garbage, CutAtEveryByte) {
  const std::string text = GetParam().text;
  for (std::size_t size = 0; size <= text.size(); ++size) {
    CheckClean(text.substr(0, size), GetParam().extension);
    CheckClean(text.substr(size), GetParam().extension);
  }
}

TEST_P(Garbage, BytesChangedAtRandom) {
  std::mt19937 random(3);
  for (int round = 0; round < 1500; ++round) {
    std::string text = GetParam().text;
    for (auto changes = 1 + random() % 5; changes > 0; --changes) {
      text[random() % text.size()] = static_cast<char>(random());
    }
    CheckClean(text, GetParam().extension);
  }
}

TEST_P(Garbage, PiecesRepeatedAndMoved) {
  std::mt19937 random(4);
  for (int round = 0; round < 500; ++round) {
    const std::string text = GetParam().text;
    std::string shuffled = text.substr(0, random() % 20);
    for (int piece = 0; piece < 20; ++piece) {
      shuffled += text.substr(random() % text.size(), random() % 30);
    }
    CheckClean(shuffled, GetParam().extension);
  }
}

TEST_P(Garbage, NoiseWithoutEnd) {
  std::mt19937 random(5);
  for (const bool printable : {false, true}) {
    std::string noise(std::size_t{1} << 20, '\0');
    const std::string marks = "<>/&;#*[]()`!-=\n \"'ax";
    for (char& c : noise) {
      c = printable ? marks[random() % marks.size()] : static_cast<char>(random());
    }
    CheckClean(noise, GetParam().extension);
    CheckClean(std::string(GetParam().text) + noise, GetParam().extension);
  }
}

INSTANTIATE_TEST_SUITE_P(AllFormats, Garbage, ::testing::ValuesIn(kSamples),
                         [](const auto& sample) { return std::string(sample.param.extension); });

}  // namespace
}  // namespace quarry::extract
