// Changing one index.

#ifndef QUARRY_DAEMONS_TARNELASTICD_INDEX_WRITER_H_
#define QUARRY_DAEMONS_TARNELASTICD_INDEX_WRITER_H_

#include <json/json.h>

#include <atomic>
#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/document.h"
#include "daemons/tarnelasticd/fts_buffer.h"
#include "daemons/tarnelasticd/schema.h"
#include "daemons/tarnelasticd/selection.h"
#include "daemons/tarnelasticd/side_work.h"
#include "daemons/tarnelasticd/text_sharing.h"
#include "daemons/tarnelasticd/text_store.h"
#include "daemons/tarnelasticd/text_tokenizer.h"

namespace quarry::engine {

// When work is written out without being asked. What a peer sends is thus bounded in memory, and
// what a crash can undo is bounded in time.
struct WriterLimits {
  // Changes of full text are handed to FTS5 when they take so much memory.
  std::size_t flush_bytes = std::size_t{8} << 20;
  // The words of new texts wait for that outside of memory when they take so much of it.
  std::size_t list_bytes = std::size_t{16} << 20;
  // A transaction ends when it has taken so much text, or has been open so long.
  std::size_t commit_bytes = std::size_t{256} << 20;
  std::chrono::steady_clock::duration commit_age = std::chrono::seconds(3);
};

// The one connection that changes an index. Changes collect in a transaction: this object's own
// questions see them at once, searches after Commit(). A change that fails, whatever for, takes all
// that was not committed with it, and a question may where memory or the disk fails; TakeLost()
// tells. Throws Error as Database does. One thread at a time, but for documents(), HasUncommitted()
// and RunSideWork().
class IndexWriter {
 public:
  // Opens the database of an index that exists. `schema` is the one that it was made with.
  IndexWriter(const std::string& database_path, std::shared_ptr<const Schema> schema,
              const WriterLimits& limits);
  ~IndexWriter();

  // Stores a document in place of the one with its path.
  void Upsert(StoredDocument document);
  // Changes fields of the document at `path`; null removes one. With a new path the document moves
  // there, in place of the one that is there. Returns whether there is such a document. Throws
  // kMalformedRequest for a path that is none.
  bool Set(std::string_view path, const Json::Value& changes);
  // Returns whether there was such a document.
  bool Delete(std::string_view path);
  // Returns how many documents there were.
  std::int64_t DeleteSelected(const Selection& selection);
  // The selected documents, as an array of objects. Throws kMalformedRequest when these would be
  // more than kMaxFound, or more than one with more text than kMaxFoundText together.
  Json::Value Find(const Selection& selection);

  // Makes the words to suggest anew with the next commit, if they are others by then.
  void RequestTerms();
  // Makes all changes durable and visible. Blocks for the disk.
  void Commit();
  // Commits when the transaction has been open too long.
  void CommitIfOld();
  // Does what changes have left to be done beside the writer. Any thread, while others change the
  // index; to be called after each change by whoever made it, or commits have all of it to do.
  void RunSideWork() noexcept { side_work_.RunAll(); }

  // Documents, uncommitted ones included, and whether there is anything to commit. Any thread.
  std::int64_t documents() const { return documents_; }
  bool HasUncommitted() const { return uncommitted_; }
  // Whether the database's file is where it was opened.
  bool IsInPlace() const { return !db_.HasMoved(); }
  // Whether changes that were not committed have been undone since the last call.
  bool TakeLost();

  static constexpr std::int64_t kMaxFound = 1000000;
  static constexpr std::size_t kMaxFoundText = std::size_t{64} << 20;

 private:
  struct Found {
    std::int64_t id;
    Labels labels;
  };

  template <typename Action>
  auto Change(Action action);
  void Begin();
  void Rollback() noexcept;
  void Undo();
  void CommitNow();
  void LoadCounters();
  void KeepWithinLimits();
  bool IsOld() const;

  std::optional<Found> FindByPath(std::string_view path);
  std::vector<Found> TakeSelected(std::int64_t limit, Selection* rest);
  void Insert(StoredDocument document);
  void Replace(const Found& old, StoredDocument document);
  void Remove(const Found& old);
  void ChangeLabels(const Found& old, const Labels& now);
  std::string ReadTextOf(std::int64_t doc);
  void ChangeText(std::int64_t doc, std::string body);
  void DropText(std::int64_t doc, std::int64_t text, std::string old);
  void AddText(std::int64_t doc, std::string body);
  std::int64_t NewId();
  DocumentRow Unpack(const Statement& row);
  void WriteRow(const std::string& sql, std::int64_t id, const DocumentRow& row);
  bool SetLocked(std::string_view path, const Json::Value& changes);
  Json::Value FindAll(const Selection& selection);

  std::shared_ptr<const Schema> schema_;
  WriterLimits limits_;
  Database db_;
  TextTokenizer tokenizer_;
  SideWork side_work_;
  FtsBuffer buffer_;
  TextStore texts_;
  TextStore attributes_;
  TextSharing sharing_;
  std::string insert_sql_;
  std::string update_sql_;
  std::string select_row_sql_;
  std::int64_t next_id_ = 1;
  std::int64_t collected_id_ = 1;  // the next one when words were collected last
  std::atomic<std::int64_t> documents_{0};
  std::atomic<bool> uncommitted_{false};
  bool lost_ = false;
  bool must_undo_ = false;  // what is lost is in the database or the counters still
  bool terms_requested_ = false;
  bool words_changed_ = false;  // in the open transaction
  std::size_t transaction_bytes_ = 0;
  std::chrono::steady_clock::time_point transaction_start_{};
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_INDEX_WRITER_H_
