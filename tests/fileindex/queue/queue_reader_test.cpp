#include "fileindex/queue/queue_reader.h"

#include <gtest/gtest.h>

#include <random>
#include <sstream>
#include <string>
#include <string_view>
#include <vector>

#include "fileindex/queue/event_line.h"
#include "tests/fileindex/queue/queue_lines.h"

namespace quarry::fileindex {
namespace {

using Strings = std::vector<std::string>;

Strings Read(const std::string& text) {
  const QueueFile queue(text);
  QueueReader reader(queue.path());
  Strings lines;
  std::string_view line;
  while (reader.Next(line)) lines.emplace_back(line);
  EXPECT_FALSE(reader.failed());
  return lines;
}

Strings Expected(const std::string& text) {
  std::istringstream stream(text);
  Strings lines;
  for (std::string line; std::getline(stream, line);) lines.push_back(line);
  return lines;
}

TEST(QueueReaderTest, LinesAreHandedOutWithoutTheirEnds) {
  EXPECT_EQ(Read(""), Strings());
  EXPECT_EQ(Read("\n"), Strings{""});
  EXPECT_EQ(Read("a\n\nb\n"), (Strings{"a", "", "b"}));
  EXPECT_EQ(Read("a\nb"), (Strings{"a", "b"}));
  EXPECT_EQ(Read(std::string("a\0b\nc", 5)), (Strings{std::string("a\0b", 3), "c"}));
}

TEST(QueueReaderTest, LinesOfAnyLengthAcrossTheBuffer) {
  std::mt19937 random(1);
  for (const std::size_t longest : {10u, 1'000u, 70'000u, 300'000u}) {
    std::string text;
    while (text.size() < 1'000'000) {
      text.append(random() % longest, static_cast<char>('a' + random() % 26)) += '\n';
    }
    EXPECT_TRUE(Read(text) == Expected(text)) << longest;
    EXPECT_TRUE(Read(text + "rest") == Expected(text + "rest")) << longest;
  }
}

TEST(QueueReaderTest, LinesStayWhileMoreAreAtHand) {
  std::string text;
  for (int i = 0; i < 100'000; ++i) text += std::to_string(i) + "\n";
  const QueueFile queue(text);
  QueueReader reader(queue.path());
  std::vector<std::string_view> batch;
  int next = 0;
  for (std::string_view line; reader.Next(line);) {
    batch.push_back(line);
    if (reader.has_line()) continue;
    for (const std::string_view one : batch) ASSERT_EQ(one, std::to_string(next++));
    batch.clear();
  }
  EXPECT_EQ(next, 100'000);
}

TEST(QueueReaderTest, TellsWhetherALineWasEnded) {
  const QueueFile queue("a\nb");
  QueueReader reader(queue.path());
  std::string_view line;
  ASSERT_TRUE(reader.Next(line));
  EXPECT_TRUE(reader.line_ended());
  ASSERT_TRUE(reader.Next(line));
  EXPECT_FALSE(reader.line_ended());
  EXPECT_FALSE(reader.Next(line));
  EXPECT_FALSE(reader.failed());
}

// What it calls plain is; and it does so of all lines where none has such bytes.
TEST(QueueReaderTest, TellsWhichLinesArePlain) {
  std::string text;
  for (int i = 0; i < 50'000; ++i) {
    text += std::to_string(i);
    if (i % 20'011 == 20'010) text += i % 2 == 0 ? '\\' : '\0';
    text += '\n';
  }
  const QueueFile queue(text);
  QueueReader reader(queue.path());
  int plain = 0;
  for (std::string_view line; reader.Next(line);) {
    if (!reader.is_plain()) continue;
    ++plain;
    ASSERT_TRUE(IsPlain(line)) << line;
  }
  EXPECT_GT(plain, 20'000);  // three buffers of five
  EXPECT_LT(plain, 49'998);
}

TEST(QueueReaderTest, LinesArePlainAgainBehindAnEndedBuffer) {
  const std::string filler(64 * 1024 - 3, 'f');
  const QueueFile queue("\\" + filler + "\n\nplain\n");
  QueueReader reader(queue.path());
  std::string_view line;
  ASSERT_TRUE(reader.Next(line));
  EXPECT_FALSE(reader.is_plain());
  ASSERT_TRUE(reader.Next(line));
  EXPECT_EQ(line, "");
  ASSERT_TRUE(reader.Next(line));
  EXPECT_EQ(line, "plain");
  EXPECT_TRUE(reader.is_plain());
}

TEST(QueueReaderTest, AHalfLineThatIsNotPlainStaysSo) {
  const QueueFile queue("\\" + std::string(100'000, 'f') + "\n");
  QueueReader reader(queue.path());
  std::string_view line;
  ASSERT_TRUE(reader.Next(line));
  EXPECT_EQ(line.size(), 100'001u);
  EXPECT_FALSE(reader.is_plain());
}

TEST(QueueReaderTest, WhatCannotBeReadFails) {
  QueueReader missing("/nonexistent/queue");
  std::string_view line;
  EXPECT_TRUE(missing.failed());
  EXPECT_FALSE(missing.Next(line));
  QueueReader directory("/");
  EXPECT_FALSE(directory.Next(line));
  EXPECT_TRUE(directory.failed());
}

}  // namespace
}  // namespace quarry::fileindex
