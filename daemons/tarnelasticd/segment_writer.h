// Writing one segment of a full-text table; segment_reader.h says what it is.
//
// FTS5 finds it like one of its own: it merges it with others, and removes what is deleted from it.

#ifndef QUARRY_DAEMONS_TARNELASTICD_SEGMENT_WRITER_H_
#define QUARRY_DAEMONS_TARNELASTICD_SEGMENT_WRITER_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "daemons/tarnelasticd/database.h"

namespace quarry::engine {

// Works inside of the transaction that is open in the database. One thread at a time. All that
// fails throws Error as Database does.
class SegmentWriter {
 public:
  SegmentWriter(Database* db, const std::string& table, std::int64_t segment);

  // Words must come in order of their bytes; `key` has FTS5's mark of the main index before it, and
  // at most half as many bytes as a leaf. A list is as WordLists says.
  void Add(std::string_view key, std::string_view list);

  // Writes what is left. Returns how many leaves the segment has, numbered from 1.
  std::int64_t Finish();

  // Bytes of a leaf: what FTS5 fills one up to where nobody says otherwise.
  static constexpr std::size_t kLeafBytes = 4050;

 private:
  std::size_t Room() const;
  void AddKey(std::string_view key);
  void AddPositions(std::string_view positions);
  void AddPlace(std::string_view key);
  void EndLeaf();

  Statement leaves_;
  Statement places_;
  const std::int64_t segment_;
  std::int64_t leaf_ = 1;
  std::string contents_;  // of the leaf, with its header
  std::string words_;     // where words begin on it
  std::size_t last_word_ = 0;
  std::string key_;        // the last one
  bool has_word_ = false;  // whether a word begins on the leaf
  bool is_begun_ = false;  // whether a row id before its first word does
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_SEGMENT_WRITER_H_
