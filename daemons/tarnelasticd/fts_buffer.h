// Changes of the full text that have not reached its tables yet.
//
// FTS5 writes a whole segment each time row ids do not ascend, so changes in arbitrary order would
// cost one segment each. They are collected here and applied in order of row ids; a row that
// changes several times is written once.

#ifndef QUARRY_DAEMONS_TARNELASTICD_FTS_BUFFER_H_
#define QUARRY_DAEMONS_TARNELASTICD_FTS_BUFFER_H_

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/document.h"
#include "daemons/tarnelasticd/schema.h"
#include "daemons/tarnelasticd/text_tokenizer.h"

namespace quarry::engine {

// One thread at a time.
class FtsBuffer {
 public:
  // The full text of a row changes from `old` (compressed, as stored) to `now` (packed); nothing
  // stands for a row without full text.
  void ChangeBody(std::int64_t id, std::optional<std::string> old, std::optional<std::string> now);
  void ChangeLabels(std::int64_t id, std::optional<Labels> old, std::optional<Labels> now);

  // Roughly the memory that is held.
  std::size_t bytes() const { return bytes_; }

  // Applies everything through `db`, inside the transaction that is open there, and is empty then.
  // After a failure that transaction must be rolled back and the buffer cleared.
  void Flush(const Schema& schema, Database* db, const TextTokenizer& tokenizer);
  void Clear();

 private:
  // The first old state counts, and the last new one.
  template <typename Old, typename Now>
  struct Change {
    std::optional<Old> old;
    std::optional<Now> now;
  };

  std::map<std::int64_t, Change<std::string, std::string>> bodies_;
  std::map<std::int64_t, Change<Labels, Labels>> labels_;
  std::size_t bytes_ = 0;
};

// The text under which a file name stands in "names": folded, between marks that no other text
// holds, so that a whole name can be told from a part of one.
std::string MarkedName(const TextTokenizer& tokenizer, std::string_view name);

constexpr char kNameBegin = '\x02';
constexpr char kNameEnd = '\x03';

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_FTS_BUFFER_H_
