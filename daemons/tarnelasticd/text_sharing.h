// Which documents share a text.
//
// Many files are copies of others. A text that several documents have is kept and cut into words
// once. A text has the number of the document that it came with, unless another document still uses
// the text of that number: then it gets one that no document has. The table "text_copies" tells
// where the number of a document's text is not its own: 0 stands for none, where there is a text of
// that number, which others use, but no such document, or one without text.

#ifndef QUARRY_DAEMONS_TARNELASTICD_TEXT_SHARING_H_
#define QUARRY_DAEMONS_TARNELASTICD_TEXT_SHARING_H_

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/frequencies.h"

namespace quarry::engine {

// The statements that make the tables of an empty database.
std::string CreateSharingTables();

// The number of the document's text, or 0: then it has none. There need not be a text of that
// number. Throws Error as Database does.
std::int64_t TextOf(Database* db, std::int64_t doc);

// The largest number that a document or a text has; 0 where there is neither. Throws Error
// kDamagedIndex when it is one that cannot be.
std::int64_t LastId(Database* db);

// One row of the table. Numbers fit; see kMaxId.
struct TextCopy {
  std::uint32_t doc = 0;
  std::uint32_t text = 0;
};

// The whole table. Throws Error kDamagedIndex for numbers that cannot be.
std::vector<TextCopy> ReadTextCopies(Database* db);

// From how often each text has a word to how often each document has it.
void SpreadToDocuments(const std::vector<TextCopy>& copies, Frequencies* frequencies);

// Keeps the tables inside of the transaction that is open in a database. All that is known is in
// the database, so nothing need be undone here with the transaction. One thread at a time.
class TextSharing {
 public:
  // `db` must outlive the object.
  explicit TextSharing(Database* db);

  struct Use {
    std::int64_t text = 0;
    bool is_first = false;  // whether nobody had it: it has to be kept
  };
  // Gives the document, which has no text, the text with these bytes, which are not none. `new_id`
  // is asked for a number that neither a document nor a text has.
  Use Join(std::int64_t doc, std::string_view bytes, const std::function<std::int64_t()>& new_id);
  // Takes away the document's text, whose number and bytes these are. Returns whether it was the
  // last that had it: the text is not to be kept.
  bool Leave(std::int64_t doc, std::int64_t text, std::string_view bytes);

 private:
  const std::string& Key();
  bool HasOtherUsers(std::int64_t doc, std::int64_t text);
  bool IsTaken(std::int64_t doc);
  void SetCopy(std::int64_t doc, std::int64_t text);
  void DropCopy(std::int64_t doc);

  Database* db_;
  std::string key_;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_TEXT_SHARING_H_
