// Connections that search one index while it is being changed.

#ifndef QUARRY_DAEMONS_TARNELASTICD_INDEX_READER_H_
#define QUARRY_DAEMONS_TARNELASTICD_INDEX_READER_H_

#include <chrono>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/ranking.h"
#include "daemons/tarnelasticd/text_sharing.h"
#include "daemons/tarnelasticd/text_tokenizer.h"

namespace quarry::engine {

// One connection that reads what is committed. One thread at a time.
class IndexReader {
 public:
  explicit IndexReader(const std::string& database_path);
  IndexReader(const IndexReader&) = delete;
  IndexReader& operator=(const IndexReader&) = delete;

  // From Begin() to End() the index stands still for this reader, and whatever runs past the
  // deadline fails with Error kSearchTooLong.
  void Begin(std::chrono::steady_clock::time_point deadline);
  void End() noexcept;
  // Throws that error when the deadline is over: for work between statements.
  void CheckDeadline() const;

  Database& db() { return db_; }
  const TextTokenizer& tokenizer() const { return tokenizer_; }
  // The documents that share texts, as the index stands. Valid until End().
  const std::vector<TextCopy>& TextCopies();

  // Lets quarry_count write to `context` as long as it lives.
  class Counting {
   public:
    Counting(IndexReader* reader, CountContext* context) : reader_(reader) {
      reader->count_context_ = context;
    }
    ~Counting() { reader_->count_context_ = nullptr; }
    Counting(const Counting&) = delete;
    Counting& operator=(const Counting&) = delete;

   private:
    IndexReader* reader_;
  };

 private:
  static int OnProgress(void* self);
  bool IsLate() const;

  Database db_;
  TextTokenizer tokenizer_;
  CountContext* count_context_ = nullptr;
  std::vector<TextCopy> copies_;
  std::int64_t copies_version_ = -1;  // of the database, when they were read
  std::chrono::steady_clock::time_point deadline_ = std::chrono::steady_clock::time_point::max();
};

// Readers to be used again. Any thread.
class ReaderPool {
 public:
  explicit ReaderPool(std::string database_path);

  // Gives its reader back at the end of its life.
  class Lease {
   public:
    Lease(ReaderPool* pool, std::unique_ptr<IndexReader> reader)
        : pool_(pool), reader_(std::move(reader)) {}
    Lease(Lease&&) = default;
    Lease& operator=(Lease&&) = delete;
    ~Lease();
    IndexReader& operator*() const { return *reader_; }
    IndexReader* operator->() const { return reader_.get(); }

   private:
    ReaderPool* pool_;
    std::unique_ptr<IndexReader> reader_;
  };

  // An idle reader, or a new one. Throws Error as Database does.
  Lease Take();

 private:
  void Return(std::unique_ptr<IndexReader> reader);

  std::string path_;
  std::mutex mutex_;
  std::vector<std::unique_ptr<IndexReader>> idle_;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_INDEX_READER_H_
