#include "tests/daemons/tarnelasticd/support/full_text.h"

#include <gtest/gtest.h>

#include <cmath>

namespace quarry::engine {

std::vector<std::string> Rows(Database* db, const std::string& sql) {
  std::vector<std::string> rows;
  Statement statement = db->Prepare(sql);
  while (statement.Step()) rows.emplace_back(statement.Text(0));
  return rows;
}

std::int64_t Number(Database* db, const std::string& sql) {
  Statement statement = db->Prepare(sql);
  EXPECT_TRUE(statement.Step()) << sql;
  return statement.Int(0);
}

void CreatePlaces(Database* db) {
  db->Execute("CREATE VIRTUAL TABLE temp.places USING fts5vocab(main,body,instance)");
}

void ExpectSameWords(Database* tested, Database* model) {
  tested->Execute("INSERT INTO body(body) VALUES('integrity-check')");
  for (const char* sql :
       {"SELECT term||' '||doc||' '||col||' '||offset FROM temp.places ORDER BY term,doc,col,"
        "offset",
        "SELECT id||' '||hex(sz) FROM body_docsize ORDER BY id",
        "SELECT hex(block) FROM body_data WHERE id=1"}) {
    EXPECT_EQ(Rows(tested, sql), Rows(model, sql)) << sql;
  }
}

std::string RandomWords(std::mt19937_64* random, std::size_t words, std::size_t vocabulary) {
  std::string text;
  for (std::size_t i = 0; i < words; ++i) {
    const auto number = static_cast<std::uint64_t>(
        std::pow(vocabulary, std::uniform_real_distribution<>(0, 1)(*random)));
    text += "w" + std::to_string(number * 2654435761U % 1000003) + " ";
  }
  return text;
}

}  // namespace quarry::engine
