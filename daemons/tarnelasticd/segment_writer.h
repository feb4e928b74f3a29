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
#include "daemons/tarnelasticd/doclist_index.h"
#include "daemons/tarnelasticd/segment_reader.h"

namespace quarry::engine {

// Works inside of the transaction that is open in the database. One thread at a time. All that
// fails throws Error as Database does.
class SegmentWriter {
 public:
  SegmentWriter(Database* db, const std::string& table, std::int64_t segment);

  // Words must come in order of their bytes; `key` has FTS5's mark of the main index before it, and
  // at most kMaxKey bytes, or Error kDamagedIndex is thrown.
  void BeginWord(std::string_view key);
  // Documents must ascend. Each word must have one.
  void AddEntry(const Entry& entry);
  // The same with all documents of a list, which is as WordLists says.
  void AddList(std::string_view list);

  // Writes what is left. Returns how many leaves the segment has, numbered from 1.
  std::int64_t Finish();

  // Bytes of a leaf: what FTS5 fills one up to where nobody says otherwise.
  static constexpr std::size_t kLeafBytes = 4050;
  // No word of FTS5's is longer.
  static constexpr std::size_t kMaxKey = 40000;

 private:
  std::size_t Used() const { return static_cast<std::size_t>(at_ - leaf_bytes_.data()); }
  std::size_t Room() const;
  void Put(std::uint64_t number);
  void Put(std::string_view bytes);
  void AddPositions(std::string_view positions);
  void BeginPlace(std::string_view key);
  void EndPlace();
  void BeginLeaf();
  void EndLeaf();

  Statement leaves_;
  Statement places_;
  DoclistIndex doclist_index_;
  const std::int64_t segment_;
  std::int64_t leaf_ = 1;
  std::string leaf_bytes_;  // with room for any
  char* at_ = nullptr;      // where the contents end
  std::string words_;       // where words begin on the leaf
  std::size_t last_word_ = 0;
  std::string key_;                // the last one
  std::string place_;              // what leads to place_leaf_
  std::int64_t place_leaf_ = 1;    // the last one on which a word begins
  std::int64_t last_row_ = 0;      // of the list at hand
  bool has_word_ = false;          // whether a word begins on the leaf
  bool is_begun_ = false;          // whether a row id before its first word does
  bool is_next_row_whole_ = true;  // as the first ones of a list and of a leaf are
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_SEGMENT_WRITER_H_
