// One segment of a full-text table: a run of words in order, each with the documents that have it.
//
// This and posting_lists.h read the tables behind FTS5 themselves. Its own queries look at
// documents one by one through several layers, which costs ten times as much where a word is in
// most of them.
//
// A segment is a run of leaves, rows of TABLE_data. A leaf begins with two numbers of 16 bits:
// where on it the first row id of a list lies that has begun on an earlier leaf (0: nowhere), and
// where its contents end. Behind these are the places of the words that begin on it. A list is row
// ids, the first one on each leaf whole and the others as differences, each with its positions'
// length (doubled, and odd where the row was deleted before) and the positions. Whatever an older
// segment has of the same word and row no longer holds. What is not so is damage.

#ifndef QUARRY_DAEMONS_TARNELASTICD_SEGMENT_READER_H_
#define QUARRY_DAEMONS_TARNELASTICD_SEGMENT_READER_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "daemons/tarnelasticd/database.h"

namespace quarry::engine {

// Where a segment's leaves are.
struct Segment {
  std::int64_t id = 0;
  std::int64_t first_leaf = 0;
  std::int64_t last_leaf = 0;
};

// In the id of a segment's row in TABLE_data the segment's number stands before so many bits, which
// are the number of a leaf, with what marks other kinds of rows.
constexpr int kLeafBits = 37;

// One document in a word's list.
struct Entry {
  std::int64_t id = 0;
  std::string_view positions;  // empty when the document no longer has the word
  bool is_marked = false;      // whether the row was deleted before
};

// What TakeVarint() does where the number has several bytes, or none is left.
std::uint64_t TakeLongVarint(const char** at, const char* end);

// Numbers of up to nine bytes, seven bits in each of the first eight, the highest first. Throws
// Error kDamagedIndex when `bytes` end within the number.
inline std::uint64_t TakeVarint(const char** at, const char* end) {
  if (*at < end && static_cast<unsigned char>(**at) < 0x80) {
    return static_cast<unsigned char>(*(*at)++);
  }
  return TakeLongVarint(at, end);
}

// Goes through a segment's words once. One thread at a time, as its database. All that fails throws
// Error as Database does.
class SegmentReader {
 public:
  // `check` is called now and then, and may throw to end the work. Nothing is read yet.
  SegmentReader(Database* db, const std::string& table, const Segment& segment,
                std::function<void()> check);

  // Moves to the first word that is not before `key`; false when there is none. To be called once.
  bool Seek(std::string_view key);
  // Moves to the next word, behind a list that has been read; false when there is none.
  bool Next();
  // The word, with FTS5's mark of the main index before it.
  const std::string& key() const { return key_; }

  // Calls visit(Entry) with each document in the word's list, ascending. Views are valid during the
  // call.
  template <typename Visit>
  void ReadList(Visit visit) {
    Entry entry;
    while (TakeEntry(&entry)) visit(entry);
  }
  // The same one by one: false behind the last one. Views are valid until the next call.
  bool TakeEntry(Entry* entry);

  // The leaf at hand. Those before it are not read again.
  std::int64_t leaf() const { return next_leaf_ - 1 - (segment_.id << kLeafBits); }

 private:
  std::int64_t FindLeaf(std::string_view key);
  bool NextLeaf();
  void CheckAllRead() const;
  void ReadKey();
  std::string_view TakePositions(std::uint64_t size);
  const char* Limit() const;
  std::uint64_t TakeNumber() { return TakeVarint(&at_, Limit()); }

  Database* db_;
  const std::string table_;
  Statement leaves_;
  const Segment segment_;
  const std::function<void()> check_;
  std::int64_t next_leaf_ = 0;  // the row id that it is to have
  std::size_t leaves_read_ = 0;
  bool is_at_end_ = false;

  std::string_view leaf_;
  const char* at_ = nullptr;
  const char* contents_end_ = nullptr;
  std::vector<std::size_t> words_;  // where words begin on the leaf
  std::size_t next_word_ = 0;       // in words_
  std::string key_;
  std::int64_t row_ = 0;
  bool is_first_ = true;   // whether the next row id is whole
  std::string positions_;  // those that lie on several leaves
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_SEGMENT_READER_H_
