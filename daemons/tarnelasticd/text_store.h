// Where the full texts, and what else is known of documents, are kept.
//
// Short texts compress badly by themselves, and rows that are cut into pages waste part of the last
// one. So texts with neighbouring ids share a row of a table, compressed together: its id is that
// of the first of these texts, and it reaches to the next row. In it stand, in order of their ids,
// for each text the distance of its id from the one before, its size, and its bytes. What has no
// text is not in it.

#ifndef QUARRY_DAEMONS_TARNELASTICD_TEXT_STORE_H_
#define QUARRY_DAEMONS_TARNELASTICD_TEXT_STORE_H_

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/side_work.h"

namespace quarry::engine {

// A table of that form: id INTEGER PRIMARY KEY, packed BLOB NOT NULL.
struct TextTable {
  const char* name;
  // A row takes further texts while those it has take fewer bytes.
  std::size_t row_bytes;
};
// Full texts: a row is read for each hit that shows some of its text, and written anew for each
// change of one. Twice as many bytes would be a fiftieth smaller.
constexpr TextTable kTexts = {"texts", std::size_t{256} << 10};
// Attributes: they are short, and often wanted of single documents.
constexpr TextTable kAttributes = {"attributes", std::size_t{16} << 10};

std::string CreateTextTable(const TextTable& table);

// Reads what is in a table. One thread at a time.
class TextReader {
 public:
  // `db` must outlive the reader.
  TextReader(Database* db, const TextTable& table);

  // The text with that id, empty when there is none. Rows that were read are kept for the texts
  // beside it, until Clear(). Throws Error kDamagedIndex when it is broken.
  std::string Read(std::int64_t id);
  // To be called when the table has changed.
  void Clear();

 private:
  const std::string& Row(std::int64_t key);

  Database* db_;
  const std::string find_sql_;
  const std::string load_sql_;
  std::map<std::int64_t, std::string> rows_;  // by their ids
  std::size_t kept_bytes_ = 0;
};

// The same for one text.
std::string ReadText(Database* db, const TextTable& table, std::int64_t id);

// Changes texts inside of the transaction that is open in a database. Rows that change stay open,
// so that changes of neighbours cost one row. A row that is full is left as side work to be
// compressed, and put into the table by a later call. Where a call throws, the transaction must be
// rolled back and the store cleared. One thread at a time.
class TextStore {
 public:
  // What is given must outlive the store.
  TextStore(Database* db, const TextTable& table, SideWork* work);
  ~TextStore();
  TextStore(const TextStore&) = delete;
  TextStore& operator=(const TextStore&) = delete;

  // As TextReader::Read(), with all changes.
  std::string Read(std::int64_t id);
  // Replaces a text; an empty one is none. May write out what is open. Throws also what has made
  // side work fail.
  void Write(std::int64_t id, std::string text);
  // The same for a text that others use as well.
  void Write(std::int64_t id, std::shared_ptr<const std::string> text);

  // Writes everything out. To be called before a commit. Throws as Write() does.
  void Flush();
  // Forgets what is open. To be called after the transaction was rolled back.
  void Clear();

 private:
  using Texts = std::map<std::int64_t, std::shared_ptr<const std::string>>;
  struct Packed {
    std::int64_t first;
    std::string bytes;
  };
  // A row that is being compressed. The texts are only read from then on.
  struct Sealed {
    Texts texts;
    std::vector<Packed> packed;  // once the task is done
  };
  struct Row {
    bool stored = false;    // whether the table has it, under its key in rows_
    std::int64_t end = 0;   // the first id that is not its own
    std::size_t bytes = 0;  // what its texts take in memory
    Texts texts;            // none while it is sealed
    std::shared_ptr<Sealed> sealed;
    std::shared_ptr<SideWork::Task> task;
  };
  using Rows = std::map<std::int64_t, Row>;

  static const Texts& TextsOf(const Row& row);
  static std::vector<Packed> Pack(const Texts& texts, std::size_t most_bytes,
                                  std::size_t row_bytes);

  Rows::iterator FindOpen(std::int64_t id);
  std::int64_t EndBehind(std::int64_t id);
  Rows::iterator Open(std::int64_t id);
  Rows::iterator Load(std::int64_t id);
  void Seal(std::int64_t key, Row* row);
  void Unseal(Row* row);
  void PlaceSealed();
  void WriteOut(std::int64_t key, const Row& row);

  Database* db_;
  SideWork* work_;
  const TextTable table_;
  const std::string select_sql_;
  const std::string next_sql_;
  const std::string delete_sql_;
  const std::string insert_sql_;
  TextReader reader_;
  Rows rows_;                         // by the first id that is their own; they never meet
  std::vector<std::int64_t> sealed_;  // keys of rows_ that may be sealed
  std::size_t open_bytes_ = 0;        // of all rows
  std::size_t sealed_bytes_ = 0;      // of these, of rows that are sealed
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_TEXT_STORE_H_
