#include "daemons/tarnelasticd/text_store.h"

#include <gtest/gtest.h>

#include <atomic>
#include <limits>
#include <map>
#include <memory>
#include <random>
#include <string>
#include <thread>
#include <vector>

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
  SideWork work_;
  TextStore store_{&db_, kTexts, &work_};
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

class TextStoreWorkTest : public TextStoreTest {
 protected:
  // Writes texts behind each other until so many rows are full.
  void Fill(std::int64_t rows) {
    for (std::int64_t id = 0; id <= 4 * rows; ++id) {
      texts_[id] = RandomText(&random_, kTexts.row_bytes / 4);
      store_.Write(id, texts_[id]);
    }
  }
  std::vector<std::string> Contents() {
    std::vector<std::string> contents;
    Statement rows = db_.Prepare("SELECT id||':'||hex(packed) FROM texts ORDER BY id");
    while (rows.Step()) contents.emplace_back(rows.Text(0));
    return contents;
  }

  std::mt19937 random_{5};
  std::map<std::int64_t, std::string> texts_;
};

TEST_F(TextStoreWorkTest, FullRowsAreReadWhileTheyAreCompressed) {
  Fill(3);
  EXPECT_EQ(Rows(), 0);
  ExpectTexts(texts_, 20);
  work_.RunAll();
  ExpectTexts(texts_, 20);
  EXPECT_EQ(Rows(), 0);
  store_.Write(100, "next");
  EXPECT_EQ(Rows(), 3);
  ExpectTexts(texts_, 20);
  store_.Flush();
  ExpectTexts(texts_, 20);
}

TEST_F(TextStoreWorkTest, WhatNobodyHasDoneIsDoneByFlush) {
  Fill(3);
  store_.Flush();
  EXPECT_EQ(Rows(), 4);
  ExpectTexts(texts_, 20);
}

TEST_F(TextStoreWorkTest, ARowMayChangeWhileItIsCompressedAndAfterwards) {
  Fill(3);
  texts_[1] = "changed before";
  store_.Write(1, texts_[1]);
  work_.RunAll();
  texts_[5] = "changed after";
  store_.Write(5, texts_[5]);
  texts_.erase(10);
  store_.Write(10, "");
  ExpectTexts(texts_, 20);
  store_.Flush();
  ExpectTexts(texts_, 20);
  for (const auto& [id, text] : texts_) ASSERT_EQ(ReadText(&db_, kTexts, id), text) << id;
}

TEST_F(TextStoreWorkTest, ARollbackForgetsWhatIsBeingCompressed) {
  store_.Write(0, "kept");
  store_.Flush();
  for (const bool is_done : {false, true}) {
    db_.Execute("BEGIN");
    Fill(3);
    if (is_done) work_.RunAll();
    store_.Clear();
    db_.Execute("ROLLBACK");
    work_.RunAll();
    store_.Flush();
    EXPECT_EQ(Rows(), 1);
    EXPECT_EQ(store_.Read(0), "kept");
    EXPECT_EQ(store_.Read(1), "");
  }
}

TEST_F(TextStoreWorkTest, AFullDiskIsToldByALaterWriteAndByFlush) {
  db_.Execute("PRAGMA max_page_count=100");
  for (const bool is_done : {false, true}) {
    db_.Execute("BEGIN");
    Fill(3);
    if (is_done) {
      work_.RunAll();
      EXPECT_THROW(store_.Write(100, "next"), Error);
    } else {
      EXPECT_THROW(store_.Flush(), Error);
    }
    store_.Clear();
    if (db_.InTransaction()) db_.Execute("ROLLBACK");
    EXPECT_EQ(Rows(), 0);
    EXPECT_EQ(store_.Read(1), "");
  }
}

// The rows are the same whoever compresses them, and whenever.
TEST_F(TextStoreWorkTest, OthersMakeTheSameRows) {
  std::vector<std::vector<std::string>> contents;
  for (const bool has_helpers : {false, true}) {
    db_.Execute("DELETE FROM texts");
    std::atomic<bool> is_over{!has_helpers};
    std::vector<std::thread> helpers;
    for (int i = 0; i < 2; ++i) {
      helpers.emplace_back([&] {
        while (!is_over) work_.RunAll();
      });
    }
    std::mt19937 random(6);
    for (std::int64_t id = 0; id < 2000; ++id) {
      store_.Write(id, RandomText(&random, random() % (id % 50 == 0 ? 500000 : 9000)));
      if (id % 600 == 0) store_.Flush();
    }
    store_.Flush();
    is_over = true;
    for (std::thread& helper : helpers) helper.join();
    contents.push_back(Contents());
  }
  EXPECT_GT(contents[0].size(), 40U);
  EXPECT_EQ(contents[0], contents[1]);
}

// As soon as it has come, and without anybody's help.
TEST_F(TextStoreWorkTest, ALargeTextIsCompressedAtOnce) {
  texts_[1] = "before";
  texts_[2] = std::string(SideWork::kLarge, 'x');
  texts_[3] = RandomText(&random_, 6 * SideWork::kLarge);
  for (const auto& [id, text] : texts_) store_.Write(id, text);
  for (std::int64_t id = 4; Rows() < 2; ++id) {
    texts_[id] = "behind";
    store_.Write(id, texts_[id]);
    std::this_thread::yield();
  }
  texts_[2] = "changed";
  store_.Write(2, texts_[2]);
  for (const auto& [id, text] : texts_) ASSERT_EQ(store_.Read(id), text) << id;
  store_.Flush();
  for (const auto& [id, text] : texts_) ASSERT_EQ(ReadText(&db_, kTexts, id), text) << id;
}

// So much at once that there is no waiting for helpers any more.
TEST_F(TextStoreWorkTest, HoldsNoMoreThanItMay) {
  for (std::int64_t id = 0; id < 100; ++id) {
    texts_[id] = RandomText(&random_, kTexts.row_bytes);
    store_.Write(id, texts_[id]);
  }
  EXPECT_GT(Rows(), 100 - 70);
  ExpectTexts(texts_, 100);
  store_.Flush();
  ExpectTexts(texts_, 100);
}

// Not even until the next one comes.
TEST_F(TextStoreWorkTest, HoldsNothingOfWhatIsTooLarge) {
  const std::string text(std::size_t{16} << 20, 'x');
  const auto shared = std::make_shared<const std::string>(text);
  store_.Write(1, shared);
  EXPECT_EQ(Rows(), 1);
  EXPECT_EQ(shared.use_count(), 1);
  EXPECT_EQ(store_.Read(1), text);
}

TEST(TextStoreEndTest, MayEndBeforeItsWork) {
  SideWork work;
  {
    Database db(":memory:");
    db.Execute(kTable);
    TextStore store(&db, kTexts, &work);
    store.Write(1, std::string(kTexts.row_bytes, 'x'));
    store.Write(2, "behind");
  }
  work.RunAll();
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
    if (random() % 4 == 0) work_.RunAll();
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
