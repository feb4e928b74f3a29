// Source code and other text with a grammar: whatever stands in it is found, as it stands.

#include <gtest/gtest.h>

#include "tests/daemons/tarncontentextractd/support/extract_support.h"

namespace quarry::extract {
namespace {

struct Code {
  const char* extension;
  const char* text;
};

// No line begins or ends with a blank, and no two follow each other: text that is kept as it is.
constexpr Code kCodes[] = {
    {"c", "/* caf\xC3\xA9 */\n#include <stdio.h>\nint main(void) { return a<b>c; }"},
    {"cpp", "template <typename T>\nclass A : B<T> { R\"(<html>)\"; };"},
    {"h", "#ifndef A_H\n#define A_H \"<!doctype>\""},
    {"py", "#!/usr/bin/env python3\n# -*- coding: latin-1 -*-\ndef f(x): return '<b>' + x"},
    {"sh", "#!/bin/sh\ncat <<EOF\n<a>\nEOF"},
    {"js", "const a = `<p>${b}</p>`; // <!-- c -->"},
    {"css", "@charset \"utf-8\";\np > a { color: #fff }"},
    {"json", "{\"key\": [1, 2.5, \"v\\u0041lue\"]}"},
    {"yml", "---\ntitle: not front matter here\n---\nkey: [a, b]"},
    {"sql", "SELECT * FROM t WHERE a <> 'b' AND c < d;"},
    {"tex", "\\documentclass{article}\n\\title{A \\emph{title}}"},
    {"php", "<?php echo \"<b>$a</b>\"; ?>"},
    {"rs", "fn main<'a>(x: &'a str) -> Option<&'a str> { Some(x) }"},
    {"go", "package main\nfunc f(a <-chan int) {}"},
    {"hs", "module Main where\nmain = print $ x <> y"},
    {"ini", "[section]\nkey = value ; comment"},
    {"csv", "a,b;c\n1,\"2 \"\"quoted\"\"\",3"},
    {"diff", "--- a/x\n+++ b/x\n@@ -1 +1 @@\n-old\n+new"},
    {"log", "2020-01-01 00:00:00 [error] <none> it failed"},
    {"srt", "1\n00:00:01,000 --> 00:00:02,000\n<i>words</i>"},
    {"eml", "Subject: =?utf-8?q?x?=\nTo: <a@b.example>\nbody"},
    {"unheard-of", "words"},
    {"", "all: main.o\n\tcc -o main main.o"}};

std::string WithoutTabs(std::string text) {
  for (std::size_t at; (at = text.find('\t')) != std::string::npos;) text.erase(at, 1);
  return text;
}

class SourceCode : public ::testing::TestWithParam<Code> {};

TEST_P(SourceCode, IsTextAsItStands) {
  EXPECT_EQ(ExtractBytes(GetParam().text, GetParam().extension),
            (Fields{{"TARNMDTextContent", WithoutTabs(GetParam().text)}}))
      << GetParam().extension;
}

INSTANTIATE_TEST_SUITE_P(Languages, SourceCode, ::testing::ValuesIn(kCodes), [](const auto& code) {
  const std::string extension = code.param.extension;
  return extension == "unheard-of" ? "unknown" : extension.empty() ? "none" : extension;
});

TEST(SourceCodeInOldEncodings, IsDecoded) {
  const std::string text =
      "// Bewirkt, da\xC3\x9F gr\xC3\xB6\xC3\x9F"
      "ere Dateien \xC3\xBC"
      "bersprungen werden\nint a;";
  for (const char* charset : {"windows-1252", "UTF-16LE", "UTF-16BE"}) {
    EXPECT_EQ(TextOf(Encode(text, charset), "c"), text) << charset;
  }
}

}  // namespace
}  // namespace quarry::extract
