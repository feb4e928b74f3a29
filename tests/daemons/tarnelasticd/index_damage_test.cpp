// Bytes of an index's tables that are not what they were: answers may be wrong or refused, but
// nothing may crash, hang or take any amount of memory, and an index made anew is sound.

#include <gmock/gmock.h>

#include <random>

#include "daemons/tarnelasticd/index_files.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"
#include "tests/support/files.h"

namespace quarry::engine {
namespace {

struct Cell {
  const char* table;
  const char* column;
  bool is_met;  // whether some of the damage is bound to be noticed
};

std::ostream& operator<<(std::ostream& out, const Cell& cell) {
  return out << cell.table << '.' << cell.column;
}

class IndexDamageTest : public EngineTest, public testing::WithParamInterface<Cell> {
 protected:
  IndexDamageTest() {
    Create();
    for (int i = 0; i < 400; ++i) {
      const std::string number = std::to_string(i);
      Json::Value document = FileDocument("/s/" + number, "alpha beta" + std::to_string(i / 2));
      if (i % 3 == 0) document["Remark"] = "gamma" + number;
      Upsert(document);
    }
    CollectTerms();
    engine_.reset();
    content_ = test::ReadFile(database_);
  }

  int CollectTerms() {
    Json::Value data;
    data["id"] = data["db_name"] = "a";
    data["doc_id_field"] = "TARNMDPath";
    const int code = AskError("update_term_suggestion", data);
    return code != 0 ? code : AskError("commit", data);
  }
  // One value of the table, with a few bytes or bits changed, cut off, or of another type.
  void Damage() {
    test::WriteFile(database_, content_);
    Database db(database_);
    const std::string table = GetParam().table;
    const std::string column = GetParam().column;
    Statement row =
        db.Prepare("SELECT rowid," + column + " FROM " + table +
                   " ORDER BY rowid LIMIT 1 OFFSET ?1 % (SELECT count(*) FROM " + table + ")");
    row.Bind(1, static_cast<std::int64_t>(random_() % 10000));
    ASSERT_TRUE(row.Step());
    Statement change =
        db.Prepare("UPDATE " + table + " SET " + column + "=?2 WHERE rowid=" + Number(row.Int(0)));
    const std::string bytes = Changed(std::string(row.Blob(1)));
    if (row.Type(1) == SQLITE_INTEGER) {
      change.Bind(2, static_cast<std::int64_t>(std::uint64_t{random_()} << random_() % 40));
    } else if (random_() % 10 == 0) {
      change.Bind(2, static_cast<std::int64_t>(random_()));
    } else {
      change.BindBlob(2, bytes);
    }
    row.Reset();
    change.Run();
  }
  static std::string Number(std::int64_t number) { return std::to_string(number); }
  std::string Changed(std::string bytes) {
    if (random_() % 6 == 0) bytes.resize(random_() % (bytes.size() + 1));
    for (std::size_t left = 1 + random_() % 3; left > 0 && !bytes.empty(); --left) {
      bytes[random_() % bytes.size()] ^= static_cast<char>(1 << random_() % 8);
    }
    return bytes;
  }

  void Note(int code) {
    EXPECT_THAT(code, testing::AnyOf(0, kDamagedIndex)) << code;
    if (code == kDamagedIndex) ++refused_;
  }
  // Most of what can be asked, while the damage is as it is.
  void UseAll() {
    for (const char* query : {"alpha", "beta7", "alpha -beta3", "gamm*", "name:3", "bta17"}) {
      Note(SearchError(query));
    }
    Json::Value data;
    data["id"] = "a";
    data["query"]["qsl"]["term"]["TARNMDParent"] = "/s";
    for (const char* field : {"TARNMDTextContent", "Remark"}) {
      data["query"]["load_field"].append(field);
    }
    Note(AskError("document_get_by_query", data));
    Note(CollectTerms());
    for (int i = 0; i < 400; i += 7) {
      const Json::Value document = FileDocument("/s/" + Number(i), "alpha new" + Number(i / 21));
      Note(AskError("document_upsert_by_id", UpsertRequest("a", document)["data"]));
    }
    Note(AskError("document_del_by_query", data));
    Note(AskError("commit", data));
  }

  const std::string database_ = DatabasePath(DirectoryOf("a"));
  std::string content_;
  std::mt19937 random_{7};
  int refused_ = 0;
};

TEST_P(IndexDamageTest, IsWithstood) {
  for (int round = 0; round < 11; ++round) {
    ASSERT_NO_FATAL_FAILURE(Damage());
    engine_ = std::make_unique<Engine>(options_);
    UseAll();
    if (refused_ > 0) Ask("index_create", CreateRequest("a", DirectoryOf("a"))["data"]);
    engine_.reset();
    if (HasFailure()) FAIL() << GetParam() << ' ' << round;
  }
  EXPECT_TRUE(refused_ > 0 || !GetParam().is_met);
}

INSTANTIATE_TEST_SUITE_P(
    Tables, IndexDamageTest,
    testing::Values(Cell{"attributes", "packed", true}, Cell{"attributes", "id", false},
                    Cell{"texts", "packed", true}, Cell{"texts", "id", false},
                    Cell{"text_copies", "text", true}, Cell{"text_copies", "doc", true},
                    Cell{"text_lengths", "words", false}, Cell{"text_lengths", "block", false},
                    Cell{"terms", "words", false}, Cell{"terms", "first", false},
                    Cell{"docs", "odd_parent", false}, Cell{"docs", "id", true},
                    Cell{"body_docsize", "sz", false}, Cell{"body_data", "block", true}));

}  // namespace
}  // namespace quarry::engine
