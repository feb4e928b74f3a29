// The index of one long list of a segment: which of its leaves begins with which row.
//
// FTS5 skips leaves by it where it looks for one row of a list, as it does in a phrase of a rare
// word and a common one. It is a tree in rows of TABLE_data beside the segment's leaves. Its lowest
// nodes have the number of the first leaf behind that of the word, the first row id on it, and for
// each further leaf the difference of its first row id from the one before, or 0 where none begins
// on it; those above have the same of the nodes below. Before that stands whether a node lies
// above.

#ifndef QUARRY_DAEMONS_TARNELASTICD_DOCLIST_INDEX_H_
#define QUARRY_DAEMONS_TARNELASTICD_DOCLIST_INDEX_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/database.h"

namespace quarry::engine {

// Made list after list while a segment is written. As SegmentWriter otherwise.
class DoclistIndex {
 public:
  DoclistIndex(Database* db, const std::string& table, std::int64_t segment);

  // A word begins on this leaf, the list of which may go on behind it.
  void Begin(std::int64_t leaf) { first_node_ = leaf; }
  // The list goes on at the beginning of this leaf with that row.
  void AddRow(std::int64_t leaf, std::int64_t row);
  // No word begins on a leaf that has been written, and perhaps no row.
  void AddLeaf(bool has_row);
  // The list is at its end. Returns whether it was so long that it has an index now.
  bool Finish();

 private:
  struct Node {
    std::int64_t number = 0;
    std::string bytes;
    std::int64_t last_row = 0;
  };

  void Write(std::size_t height, const Node& node);
  void MoveOn(std::size_t height);

  Statement insert_;
  const std::int64_t segment_;
  std::int64_t first_node_ = 0;
  std::size_t leaves_ = 0;   // on which no word begins
  std::vector<Node> nodes_;  // one of each height, the lowest first
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_DOCLIST_INDEX_H_
