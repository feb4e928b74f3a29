// How long the full text of each document is, in words.
//
// Ranking asks this of every document that it scores. FTS5 keeps it in a row per document, which
// takes longer to look up than all else that a score needs, and for each text, while a document
// counts also where it shares one; here many are kept together.

#ifndef QUARRY_DAEMONS_TARNELASTICD_TEXT_LENGTHS_H_
#define QUARRY_DAEMONS_TARNELASTICD_TEXT_LENGTHS_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/database.h"

namespace quarry::engine {

// The statements that make the table of an empty database.
std::string CreateLengthTable();

// Writes down the lengths of the texts of these documents, ascending, as FTS5 and text_sharing.h
// know them now. Throws Error as Database does.
void UpdateTextLengths(Database* db, const std::vector<std::int64_t>& docs);

// The lengths as they stand in the transaction at hand. One thread at a time.
class TextLengths {
 public:
  explicit TextLengths(Database* db);

  // In words; 0 without a text. Fastest in ascending order. Throws Error as Database does.
  std::size_t Of(std::int64_t doc);
  // How many words the documents that have a text have on average, at least 1.
  double Average();

 private:
  void Load(std::int64_t block);

  Statement row_;
  std::int64_t block_ = -1;
  std::string lengths_;  // of that block
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_TEXT_LENGTHS_H_
