#include "daemons/tarnelasticd/text_store.h"

#include <gtest/gtest.h>

#include <limits>
#include <map>
#include <random>
#include <string>

#include "daemons/tarnelasticd/compression.h"
#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {
namespace {

constexpr char kTable[] = "CREATE TABLE texts(id INTEGER PRIMARY KEY, packed BLOB NOT NULL)";

// Does not compress, so that sizes are what they seem.
std::string RandomText(std::mt19937* random, std::size_t size) {
  std::string text(size, '\0');
  for (char& c : text) c = static_cast<char>((*random)());
  return text;
}

class TextStoreTest : public testing::Test {
 protected:
  TextStoreTest() { db_.Execute(kTable); }

  std::int64_t Rows() {
    Statement count = db_.Prepare("SELECT count(*) FROM texts");
    count.Step();
    return count.Int(0);
  }
  void ExpectTexts(const std::map<std::int64_t, std::string>& expected, std::int64_t end) {
    for (std::int64_t id = 0; id < end; ++id) {
      const auto text = expected.find(id);
      const std::string wanted = text == expected.end() ? std::string() : text->second;
      ASSERT_EQ(store_.Read(id), wanted) << id;
    }
  }

  Database db_{":memory:"};
  TextStore store_{&db_, kTexts};
};

TEST_F(TextStoreTest, HasNoTextOfUnknownDocuments) {
  EXPECT_EQ(store_.Read(1), "");
  store_.Write(5, "five");
  EXPECT_EQ(store_.Read(4), "");
  EXPECT_EQ(store_.Read(6), "");
  store_.Flush();
  EXPECT_EQ(ReadText(&db_, kTexts, 4), "");
  EXPECT_EQ(ReadText(&db_, kTexts, 6), "");
  EXPECT_EQ(ReadText(&db_, kTexts, std::numeric_limits<std::int64_t>::max()), "");
}

TEST_F(TextStoreTest, ReadsWhatWasWrittenBeforeAndAfterFlush) {
  store_.Write(1, std::string("a\0b", 3));
  store_.Write(3, "three");
  EXPECT_EQ(store_.Read(1), std::string("a\0b", 3));
  EXPECT_EQ(Rows(), 0);
  store_.Flush();
  EXPECT_EQ(store_.Read(3), "three");
  EXPECT_EQ(ReadText(&db_, kTexts, 1), std::string("a\0b", 3));
  EXPECT_EQ(ReadText(&db_, kTexts, 3), "three");
}

TEST_F(TextStoreTest, NeighboursShareARow) {
  for (std::int64_t id = 1; id <= 100; ++id) store_.Write(id, "short");
  store_.Flush();
  EXPECT_EQ(Rows(), 1);
  store_.Write(101, "also after a flush");
  store_.Flush();
  EXPECT_EQ(Rows(), 1);
}

TEST_F(TextStoreTest, AFullRowTakesNoMoreDocuments) {
  std::mt19937 random(1);
  const std::string large = RandomText(&random, kTexts.row_bytes);
  store_.Write(1, large);
  store_.Write(2, "small");
  store_.Flush();
  EXPECT_EQ(Rows(), 2);
  store_.Write(3, large);
  store_.Write(4, "small");
  store_.Flush();
  EXPECT_EQ(Rows(), 4);
  EXPECT_EQ(ReadText(&db_, kTexts, 1), large);
  EXPECT_EQ(ReadText(&db_, kTexts, 2), "small");
  EXPECT_EQ(ReadText(&db_, kTexts, 3), large);
  EXPECT_EQ(ReadText(&db_, kTexts, 4), "small");
}

TEST_F(TextStoreTest, ARowThatGrowsBecomesSeveral) {
  std::mt19937 random(2);
  std::map<std::int64_t, std::string> expected;
  for (std::int64_t id = 0; id < 10; ++id) store_.Write(id, "x");
  store_.Flush();
  EXPECT_EQ(Rows(), 1);
  for (std::int64_t id = 0; id < 10; ++id) {
    expected[id] = RandomText(&random, kTexts.row_bytes / 2);
    store_.Write(id, expected[id]);
  }
  store_.Flush();
  EXPECT_GT(Rows(), 3);
  ExpectTexts(expected, 12);
}

TEST_F(TextStoreTest, ARowWithoutTextsIsGone) {
  store_.Write(7, "seven");
  store_.Write(8, "eight");
  store_.Flush();
  store_.Write(7, "");
  EXPECT_EQ(store_.Read(7), "");
  store_.Flush();
  EXPECT_EQ(ReadText(&db_, kTexts, 7), "");
  EXPECT_EQ(ReadText(&db_, kTexts, 8), "eight");
  store_.Write(8, "");
  store_.Flush();
  EXPECT_EQ(Rows(), 0);
}

TEST_F(TextStoreTest, ForgetsWhatIsClearedAfterRollback) {
  store_.Write(1, "kept");
  store_.Flush();
  db_.Execute("BEGIN");
  store_.Write(1, "changed");
  store_.Write(2, "new");
  store_.Flush();
  store_.Write(3, "newer");
  db_.Execute("ROLLBACK");
  store_.Clear();
  EXPECT_EQ(store_.Read(1), "kept");
  EXPECT_EQ(store_.Read(2), "");
  EXPECT_EQ(store_.Read(3), "");
}

TEST_F(TextStoreTest, DamageIsTold) {
  const std::string cut = Compress(std::string("\0\x7fshort", 7));
  db_.Prepare("INSERT INTO texts(id,packed) VALUES(1,?1)").BindBlob(1, cut).Run();
  db_.Execute("INSERT INTO texts(id,packed) VALUES(5,x'00')");
  EXPECT_THROW(ReadText(&db_, kTexts, 1), Error);
  EXPECT_THROW(ReadText(&db_, kTexts, 5), Error);
  EXPECT_THROW(store_.Write(1, "x"), Error);
}

TEST_F(TextStoreTest, ARowBeforeTheFirstNumberIsDamage) {
  const std::string row = Compress(std::string("\0\1a", 3));
  db_.Prepare("INSERT INTO texts(id,packed) VALUES(?1,?2)")
      .Bind(1, std::numeric_limits<std::int64_t>::min())
      .BindBlob(2, row)
      .Run();
  EXPECT_THROW(ReadText(&db_, kTexts, 1), Error);
  EXPECT_THROW(store_.Write(1, "x"), Error);
}

TEST_F(TextStoreTest, ATextThatFillsARowHasOneOfItsOwn) {
  const std::string large(kTexts.row_bytes, 'x');
  store_.Write(1, "before");
  store_.Write(2, large);
  store_.Write(3, "behind");
  store_.Flush();
  EXPECT_EQ(Rows(), 3);
  EXPECT_EQ(ReadText(&db_, kTexts, 1), "before");
  EXPECT_EQ(ReadText(&db_, kTexts, 2), large);
  EXPECT_EQ(ReadText(&db_, kTexts, 3), "behind");
}

// Two texts of one document, or of one that another row has, could not all be kept.
TEST_F(TextStoreTest, TextsInTheWrongPlaceAreDamage) {
  const auto insert = [this](std::int64_t id, const std::string& bytes) {
    const std::string packed = Compress(bytes);
    db_.Prepare("INSERT INTO texts(id,packed) VALUES(?1,?2)").Bind(1, id).BindBlob(2, packed).Run();
  };
  insert(1, std::string("\x00\x01"
                        "a"
                        "\x00\x01"
                        "b",
                        6));
  insert(10, std::string("\x00\x01"
                         "a"
                         "\x0a\x01"
                         "b",
                         6));
  insert(20, std::string("\x01\x01"
                         "a",
                         3));
  insert(30, std::string("\x00\x01"
                         "a",
                         3) +
                 std::string(8, '\xff') +
                 std::string("\x7f\x01"
                             "b",
                             3));
  for (const std::int64_t id : {2, 11, 21, 31}) {
    EXPECT_THROW(store_.Write(id, "x"), Error) << id;
  }
}

// However often texts change, no more is kept than there is.
TEST_F(TextStoreTest, KeepsNothingOfWhatWasReplaced) {
  std::mt19937 random(4);
  const auto bytes = [this] {
    Statement sum = db_.Prepare("SELECT sum(length(packed)) FROM texts");
    sum.Step();
    return sum.Int(0);
  };
  for (int round = 0; round < 30; ++round) {
    for (std::int64_t id = 1; id <= 200; ++id) {
      store_.Write((id * 77) % 200 + 1, RandomText(&random, random() % 4000));
      if (id % 50 == 0) store_.Flush();
    }
    store_.Flush();
    EXPECT_LT(bytes(), 200 * 4000);
  }
  for (std::int64_t id = 1; id <= 200; ++id) store_.Write(id, id == 100 ? "last" : "");
  store_.Flush();
  EXPECT_EQ(Rows(), 1);
  EXPECT_LT(bytes(), 50);
}

// What is open is bounded, so much of this goes through the table.
TEST_F(TextStoreTest, BehavesLikeAMap) {
  constexpr std::int64_t kIds = 300;
  std::mt19937 random(3);
  std::map<std::int64_t, std::string> expected;
  for (int step = 0; step < 3000; ++step) {
    const std::int64_t id = random() % kIds;
    switch (random() % 10) {
      case 0:
        store_.Write(id, "");
        expected.erase(id);
        break;
      case 1:
        store_.Flush();
        break;
      default:
        expected[id] = RandomText(&random, 1 + random() % (random() % 8 == 0 ? 90000 : 900));
        store_.Write(id, expected[id]);
        break;
    }
    const std::int64_t other = random() % kIds;
    const auto text = expected.find(other);
    ASSERT_EQ(store_.Read(other), text == expected.end() ? std::string() : text->second) << step;
  }
  ExpectTexts(expected, kIds);
  store_.Flush();
  ExpectTexts(expected, kIds);
  for (std::int64_t id = 0; id < kIds; ++id) ASSERT_EQ(ReadText(&db_, kTexts, id), store_.Read(id));
}

}  // namespace
}  // namespace quarry::engine
