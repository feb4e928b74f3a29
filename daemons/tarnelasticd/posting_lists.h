// Which documents have a word, and how often: read from the tables behind FTS5, see
// segment_reader.h.

#ifndef QUARRY_DAEMONS_TARNELASTICD_POSTING_LISTS_H_
#define QUARRY_DAEMONS_TARNELASTICD_POSTING_LISTS_H_

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/segment_reader.h"

namespace quarry::engine {

// How often a document has a word, each place counted with the weight of its column.
struct Posting {
  std::int64_t id = 0;
  float frequency = 0;
};

// The lists of one full-text table as they stand in the transaction at hand. Belongs to its
// connection, one thread at a time. All that fails throws Error as Database does.
class PostingLists {
 public:
  // `table` is an FTS5 table with positions. No row of it has a number above `last_id`: a list that
  // has one says so of a row that is gone, or is damaged. Columns without a weight weigh 1. `check`
  // is called now and then, and may throw to end the work.
  PostingLists(Database* db, std::string table, std::int64_t last_id, std::vector<double> weights,
               std::function<void()> check);

  // Whether the tables are of the form that is understood here. Where they are not, as those of a
  // library to come may be, FTS5 must be asked.
  bool IsReadable() const { return is_readable_; }

  // Whether the table is small, and so much of it lies outside of its few largest segments that
  // making one of all saves noticeable room.
  bool IsWorthMerging() const;
  // How many leaves the segments have.
  std::int64_t leaves() const;

  // Calls `visit` with the documents that have `word`, or a word that begins with it; no document
  // twice with one word, in no certain order. `word` is one that the table's tokenizer makes.
  using Visitor = std::function<void(const std::vector<Posting>& some)>;
  void ForEach(std::string_view word, bool prefix, const Visitor& visit);

  // Calls visit(word, rows) with each word of the table, and the sum of count_of(id) over the rows
  // that have it.
  void CountWords(const std::function<std::int64_t(std::int64_t id)>& count_of,
                  const std::function<void(std::string_view word, std::int64_t rows)>& visit);

 private:
  class Gatherer;

  void GatherWord(const std::string& key, Gatherer* gatherer);
  // Calls word_end(key) behind each word that any row has.
  template <typename WordEnd>
  void GatherBeginning(const std::string& key, Gatherer* gatherer, WordEnd word_end);

  Database* db_;
  const std::string table_;
  const std::int64_t last_id_;
  const std::vector<double> weights_;
  const std::function<void()> check_;
  bool is_readable_ = false;
  std::vector<Segment> segments_;  // the newest first
};

// The sum of the weights of the columns that the positions of an entry lie in.
double WeighPositions(std::string_view positions, const std::vector<double>& weights);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_POSTING_LISTS_H_
