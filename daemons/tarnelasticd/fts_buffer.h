// Changes of the full text on their way to its tables.
//
// FTS5 writes a whole segment each time row ids do not ascend, so changes in arbitrary order would
// cost one segment each. They are collected here and applied in order of row ids; a row that
// changes several times is written once. New rows, whose ids ascend by themselves, do not wait:
// cutting them into words is most of the work of a first index, and is left as side work while
// others go on. The words of their full texts make up segments of our own, see word_lists.h.

#ifndef QUARRY_DAEMONS_TARNELASTICD_FTS_BUFFER_H_
#define QUARRY_DAEMONS_TARNELASTICD_FTS_BUFFER_H_

#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/document.h"
#include "daemons/tarnelasticd/fts_structure.h"
#include "daemons/tarnelasticd/schema.h"
#include "daemons/tarnelasticd/segment_writer.h"
#include "daemons/tarnelasticd/side_work.h"
#include "daemons/tarnelasticd/text_tokenizer.h"
#include "daemons/tarnelasticd/word_cutter.h"
#include "daemons/tarnelasticd/word_lists.h"
#include "daemons/tarnelasticd/word_runs.h"

namespace quarry::engine {

// Works inside of the transaction that is open in a database. Whatever fails, that transaction must
// be rolled back and the buffer cleared. One thread at a time.
class FtsBuffer {
 public:
  // What is given must outlive the buffer.
  FtsBuffer(const Schema& schema, Database* db, const TextTokenizer& tokenizer, SideWork* work);
  ~FtsBuffer();
  FtsBuffer(const FtsBuffer&) = delete;
  FtsBuffer& operator=(const FtsBuffer&) = delete;

  // Put in what has a number above all others'. A full text is packed, and not empty. Throws also
  // what has made side work fail, as Flush() does.
  void InsertLabels(std::int64_t doc, const Labels& labels);
  void InsertBody(std::int64_t text, const std::shared_ptr<const std::string>& body);
  // A full text changes from `old` to `now` (both packed); empty stands for none.
  void ChangeBody(std::int64_t text, std::string old, std::string now);
  // To be called for each document that gets a full text, loses one or gets another.
  void NoteText(std::int64_t doc);
  void ChangeLabels(std::int64_t id, std::optional<Labels> old, std::optional<Labels> now);

  // Roughly the memory that changes hold, and that the words of new texts do.
  std::size_t bytes() const { return bytes_; }
  std::size_t list_bytes() const { return lists_.bytes(); }

  // Keeps the words of new texts elsewhere than in memory, until Flush(). Now and then they are
  // written as a segment.
  void SaveLists();
  // Applies everything, and is empty then.
  void Flush();
  void Clear();

 private:
  // The first old state counts, and the last new one.
  template <typename State>
  struct Change {
    State old;
    State now;
  };
  // The statements that change rows of one table.
  struct Table {
    std::string remove;
    std::string insert;
  };
  static Table MakeTable(const std::string& name, const std::string& columns, std::size_t count);

  void Run(const std::string& sql, std::int64_t id, const std::vector<std::string_view>& texts);
  void RunBody(const std::string& sql, std::int64_t id, std::string_view body);
  // A new text, and its words once the task is done.
  struct NewText {
    std::shared_ptr<const std::string> body;
    std::vector<std::string_view> columns;  // in body
    CutText words;
  };
  struct Cutting {
    std::int64_t id;
    std::shared_ptr<NewText> text;
    std::shared_ptr<SideWork::Task> task;
  };
  void LeaveToCut(std::int64_t id, const std::shared_ptr<const std::string>& body);
  void TakeCut(bool all);
  void AddToLists(std::int64_t id, const CutText& words);
  void FlushLists();
  std::int64_t WriteSegment(FtsStructure* structure);
  void WriteWords(SegmentWriter* writer);
  void MergeSegments(const FtsStructure& structure, std::int64_t written);
  void MergeAfterChanges();
  void ClearLists();
  void FlushLabels(std::int64_t id, const Change<std::optional<Labels>>& change);
  void FlushLengths();

  const Schema& schema_;
  Database* db_;
  const TextTokenizer& tokenizer_;
  const Table body_;
  const Table label_;
  const Table name_;
  std::map<std::int64_t, Change<std::string>> bodies_;
  std::map<std::int64_t, Change<std::optional<Labels>>> labels_;
  std::vector<std::int64_t> noted_;  // documents with another full text than before
  std::size_t bytes_ = 0;

  const bool has_own_segments_;  // whether the tables behind FTS5 are understood
  SideWork* const work_;
  const std::shared_ptr<WordCutters> cutters_;
  std::deque<Cutting> cutting_;  // on their way to lists_
  std::size_t cutting_bytes_ = 0;
  WordRuns runs_;  // before lists_
  WordLists lists_;
  std::int64_t last_listed_ = 0;             // also of those on their way
  std::uint64_t listed_ = 0;                 // rows in runs_ and lists_
  std::vector<std::uint64_t> listed_words_;  // by columns
};

// The text under which a file name stands in "names": folded, between marks that no other text
// holds, so that a whole name can be told from a part of one.
std::string MarkedName(const TextTokenizer& tokenizer, std::string_view name);

constexpr char kNameBegin = '\x02';
constexpr char kNameEnd = '\x03';

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_FTS_BUFFER_H_
