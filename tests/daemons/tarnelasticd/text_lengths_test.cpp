// The lengths of documents' texts, through the writer that keeps them.

#include "daemons/tarnelasticd/text_lengths.h"

#include <map>
#include <random>

#include "daemons/tarnelasticd/index_files.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"

namespace quarry::engine {
namespace {

class TextLengthsTest : public EngineTest {
 protected:
  TextLengthsTest() { Create(); }

  static std::string PathOf(std::size_t number) { return "/s/" + std::to_string(number); }
  void Store(std::size_t number, std::size_t words) {
    std::string text;
    for (std::size_t i = 0; i < words; ++i) text += "word ";
    Upsert(FileDocument(PathOf(number), text));
    model_[number] = words;
  }
  void Drop(std::size_t number) {
    Json::Value data;
    data["id"] = "a";
    data["doc_id"] = PathOf(number);
    Ask("document_del_by_id", data);
    model_.erase(number);
  }
  void Compare() {
    Commit();
    Database db(DatabasePath(DirectoryOf("a")));
    TextLengths lengths(&db);
    double documents = 0;
    double all = 0;
    for (const auto& [number, words] : model_) {
      const std::string path = PathOf(number);
      Statement row = db.Prepare("SELECT id FROM docs WHERE path=?1");
      ASSERT_TRUE(row.Bind(1, std::string_view(path)).Step());
      ASSERT_EQ(lengths.Of(row.Int(0)), words);
      if (words > 0) ++documents;
      all += static_cast<double>(words);
    }
    ASSERT_DOUBLE_EQ(lengths.Average(), all > 0 ? all / documents : 1);
  }

  std::map<std::size_t, std::size_t> model_;
};

TEST_F(TextLengthsTest, OfNothingAreAverage) {
  ASSERT_NO_FATAL_FAILURE(Compare());
  Store(1, 0);
  ASSERT_NO_FATAL_FAILURE(Compare());
}

TEST_F(TextLengthsTest, CountTextsWithoutWords) {
  Store(1, 4);
  Upsert(FileDocument(PathOf(2), "-"));
  Commit();
  Database db(DatabasePath(DirectoryOf("a")));
  EXPECT_EQ(TextLengths(&db).Average(), 2);
}

TEST_F(TextLengthsTest, AreThoseOfTheModel) {
  std::mt19937 random(11);
  for (int round = 0; round < 12; ++round) {
    for (int i = 0; i < 60; ++i) {
      // Few lengths, so that texts are shared.
      const std::size_t number = random() % 400;
      if (random() % 4 == 0) {
        Drop(number);
      } else {
        Store(number, random() % 9);
      }
    }
    ASSERT_NO_FATAL_FAILURE(Compare());
    if (round % 4 == 0) Restart();
  }
}

}  // namespace
}  // namespace quarry::engine
