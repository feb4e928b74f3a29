#include "daemons/tarnelasticd/index_reader.h"

#include <utility>

#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kMaxIdle = 4;
constexpr int kProgressSteps = 20000;

}  // namespace

// Opened for writing although it never writes: a reader must be able to tend the log's index.
IndexReader::IndexReader(const std::string& database_path)
    : db_(database_path), tokenizer_(db_.handle()) {
  db_.Execute("PRAGMA query_only=ON;PRAGMA cache_size=-8192;");
  RegisterCounting(db_.handle(), &count_context_);
  sqlite3_progress_handler(db_.handle(), kProgressSteps, &OnProgress, this);
}

int IndexReader::OnProgress(void* self) {
  return static_cast<const IndexReader*>(self)->IsLate() ? 1 : 0;
}

bool IndexReader::IsLate() const {
  return std::chrono::steady_clock::now() > deadline_;
}

void IndexReader::Begin(std::chrono::steady_clock::time_point deadline) {
  deadline_ = deadline;
  db_.Execute("BEGIN");
}

void IndexReader::CheckDeadline() const {
  if (IsLate()) throw Error(kSearchTooLong, "The search took too long");
}

// Reading them for each search would cost as much as a search for a rare word does.
const std::vector<TextCopy>& IndexReader::TextCopies() {
  Statement version = db_.Prepare("PRAGMA data_version");
  const std::int64_t now = version.Step() ? version.Int(0) : -1;
  if (now != copies_version_ || now < 0) {
    copies_version_ = -1;
    copies_ = ReadTextCopies(&db_);
    copies_version_ = now;
  }
  return copies_;
}

void IndexReader::End() noexcept {
  deadline_ = std::chrono::steady_clock::time_point::max();
  if (db_.InTransaction()) sqlite3_exec(db_.handle(), "ROLLBACK", nullptr, nullptr, nullptr);
}

// Giving a reader back must not need memory.
ReaderPool::ReaderPool(std::string database_path) : path_(std::move(database_path)) {
  idle_.reserve(kMaxIdle);
}

ReaderPool::Lease::~Lease() {
  if (reader_) pool_->Return(std::move(reader_));
}

ReaderPool::Lease ReaderPool::Take() {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (!idle_.empty()) {
      std::unique_ptr<IndexReader> reader = std::move(idle_.back());
      idle_.pop_back();
      return {this, std::move(reader)};
    }
  }
  return {this, std::make_unique<IndexReader>(path_)};
}

void ReaderPool::Return(std::unique_ptr<IndexReader> reader) {
  reader->End();
  const std::lock_guard<std::mutex> lock(mutex_);
  if (idle_.size() < kMaxIdle) idle_.push_back(std::move(reader));
}

}  // namespace quarry::engine
