// Where the full texts of documents are kept.
//
// Short texts compress badly by themselves, and rows that are cut into pages waste part of the last
// one. So the texts of neighbouring documents share a row of "texts", compressed together: its id
// is that of the first of these documents, and it reaches to the next row. In it stand, in order of
// the documents, for each the distance of its id from the one before, the size of its text, and the
// text. A document without text is not in it.

#ifndef QUARRY_DAEMONS_TARNELASTICD_TEXT_STORE_H_
#define QUARRY_DAEMONS_TARNELASTICD_TEXT_STORE_H_

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>

#include "daemons/tarnelasticd/database.h"

namespace quarry::engine {

// The text of the document, empty when it has none. Throws Error kDamagedIndex when it is broken.
std::string ReadText(Database* db, std::int64_t id);

// Changes texts inside of the transaction that is open in a database. Rows that change stay open,
// so that changes of neighbours cost one row. One thread at a time.
class TextStore {
 public:
  // `db` must outlive the store.
  explicit TextStore(Database* db) : db_(db) {}

  // As ReadText(), with all changes.
  std::string Read(std::int64_t id);
  // Replaces the document's text; an empty one is none. May write out what is open.
  void Write(std::int64_t id, std::string text);

  // Writes everything out. To be called before a commit.
  void Flush();
  // Forgets what is open. To be called after the transaction was rolled back.
  void Clear();

  // A row takes further documents while its texts take fewer bytes than this.
  static constexpr std::size_t kRowBytes = std::size_t{128} << 10;

 private:
  using Texts = std::map<std::int64_t, std::string>;
  struct Row {
    bool stored = false;    // whether the table has it, under its key in rows_
    std::int64_t end = 0;   // the first id that is not its own
    std::size_t bytes = 0;  // what its texts take in memory
    Texts texts;
  };
  using Rows = std::map<std::int64_t, Row>;

  Rows::iterator FindOpen(std::int64_t id);
  std::int64_t EndBehind(std::int64_t id);
  Rows::iterator Open(std::int64_t id);
  Rows::iterator Load(std::int64_t id);
  void WriteOut(std::int64_t key, const Row& row);

  Database* db_;
  Rows rows_;  // by the first id that is their own; they never meet
  std::size_t open_bytes_ = 0;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_TEXT_STORE_H_
