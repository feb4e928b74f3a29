// The words of more texts than memory is for, on their way to one segment.
//
// Several small segments would have to be merged some time, and each be written twice, to the log
// and to the database. What WordLists holds is kept in a file without a name instead, as one run
// after the other, until the transaction needs it: nothing of it has to survive anything.

#ifndef QUARRY_DAEMONS_TARNELASTICD_WORD_RUNS_H_
#define QUARRY_DAEMONS_TARNELASTICD_WORD_RUNS_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "common/unique_fd.h"
#include "daemons/tarnelasticd/word_lists.h"

namespace quarry::engine {

// One thread at a time. All that fails throws Error kDiskFull or kStorageFailed; nothing but
// Clear() may be called then.
class WordRuns {
 public:
  // The file is made in `directory` when it is needed first.
  explicit WordRuns(std::string directory) : directory_(std::move(directory)) {}

  // Adds a run. Its texts have numbers above those of the runs before.
  void Add(const WordLists& lists);

  bool empty() const { return runs_.empty(); }
  // Whether the runs should be made a segment, as reading them takes memory and time.
  bool IsFull() const { return runs_.size() >= kMostRuns; }

  // Calls visit(word, lists) with each word, in order of their bytes, and its lists, the oldest
  // first. Both are valid during the call.
  using Visitor =
      std::function<void(std::string_view word, const std::vector<std::string_view>& lists)>;
  void ForEach(const Visitor& visit) const;

  void Clear();

  static constexpr std::size_t kMostRuns = 8;

 private:
  struct Run {
    std::int64_t begin;  // in the file
    std::int64_t end;
  };
  class Reader;

  void Open();
  void Write(std::string* bytes);

  const std::string directory_;
  UniqueFd file_;
  std::int64_t written_ = 0;
  std::vector<Run> runs_;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_WORD_RUNS_H_
