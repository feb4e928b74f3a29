#include "daemons/tarnelasticd/index.h"

#include <new>
#include <utility>

#include "daemons/common/log.h"
#include "daemons/tarnelasticd/attributes.h"
#include "daemons/tarnelasticd/document.h"
#include "daemons/tarnelasticd/index_files.h"
#include "daemons/tarnelasticd/terms.h"
#include "daemons/tarnelasticd/text_sharing.h"
#include "daemons/tarnelasticd/text_store.h"

namespace quarry::engine {

Index::Index(std::string directory, bool paused, WriterLimits limits, std::function<void()> on_lost)
    : limits_(limits),
      on_lost_(std::move(on_lost)),
      paused_(paused),
      directory_(std::move(directory)) {}

Index::Access::Access(Index* index, bool wait)
    : index_(index), lock_(index->gate_, std::defer_lock) {
  Lock(wait);
  if (index_->store_) return;
  if (!HasCode(index_->ProblemOr(kStorageFailed), kDamagedIndex)) {
    lock_.unlock();
    index_->Open();
    Lock(wait);
  }
  if (!index_->store_) throw index_->ProblemOr(kDamagedIndex);
}

void Index::Access::Lock(bool wait) {
  if (wait) {
    lock_.lock();
  } else if (!lock_.try_lock()) {
    throw Error(kMovingIndex, "The index is being moved");
  }
}

const std::shared_ptr<const Schema>& Index::Access::schema() const {
  return index_->store_->schema;
}

ReaderPool::Lease Index::Access::TakeReader() {
  return index_->store_->readers->Take();
}

void Index::CheckLost() {
  if (store_->writer->TakeLost()) on_lost_();
}

// However replacing the database ends, what is there then is opened.
struct Index::Reopen {
  Index* index;
  ~Reopen() {
    try {
      index->OpenLocked();
    } catch (const std::bad_alloc&) {
      // The next use of the index tries again.
    }
  }
};

void Index::OpenLocked() {
  if (store_) return;
  try {
    auto store = std::make_unique<Store>();
    store->schema = LoadSchema(directory_);
    store->writer = std::make_unique<IndexWriter>(DatabasePath(directory_), store->schema, limits_);
    store->readers = std::make_unique<ReaderPool>(DatabasePath(directory_));
    store_ = std::move(store);
    SetProblem(std::nullopt);
  } catch (const Error& error) {
    SetProblem(error);
  } catch (const std::bad_alloc&) {
    SetProblem(Error(kErrorEngineBusyMemory, "Out of memory"));
  }
}

void Index::Open() {
  const std::unique_lock<std::shared_mutex> lock(gate_);
  OpenLocked();
}

bool Index::IsDamaged() {
  const std::optional<Error> problem = Problem();
  if (problem) return HasCode(*problem, kDamagedIndex);
  const std::shared_lock<std::shared_mutex> lock(gate_);
  if (!store_) return false;
  const std::lock_guard<std::mutex> writer_lock(writer_mutex_);
  return !store_->writer->IsInPlace();
}

void Index::NoteDamage(const Error& error) {
  if (HasCode(error, kDamagedIndex)) SetProblem(error);
}

void Index::SetProblem(std::optional<Error> problem) {
  const std::lock_guard<std::mutex> lock(problem_mutex_);
  const bool is_news = problem && (!problem_ || problem_->reason() != problem->reason());
  problem_ = std::move(problem);
  if (is_news) daemon::LogError("An index cannot be used: " + problem_->reason());
}

std::optional<Error> Index::Problem() {
  const std::lock_guard<std::mutex> lock(problem_mutex_);
  return problem_;
}

Error Index::ProblemOr(int code) {
  return Problem().value_or(Error(code, "The index has not been opened"));
}

std::string Index::directory() {
  const std::shared_lock<std::shared_mutex> lock(gate_);
  return directory_;
}

std::int64_t Index::documents() {
  // Whoever asks how things stand must not wait for a database that is being moved.
  const std::shared_lock<std::shared_mutex> lock(gate_, std::try_to_lock);
  return lock.owns_lock() && store_ ? store_->writer->documents() : 0;
}

void Index::Recreate(const Schema& schema) {
  const std::unique_lock<std::shared_mutex> lock(gate_);
  const Reopen reopen{this};
  if (store_ && store_->writer->HasUncommitted()) on_lost_();
  store_.reset();
  CreateDatabase(directory_, schema);
}

void Index::CopyDocuments(const Schema& schema, const std::string& database_path) {
  IndexWriter writer(database_path, std::make_shared<const Schema>(schema), limits_);
  const ReaderPool::Lease reader = store_->readers->Take();
  const Schema& old = *store_->schema;
  Database* db = &reader->db();
  TextReader attributes(db, kAttributes);
  TextReader texts(db, kTexts);
  Statement rows = db->Prepare("SELECT " + DocsColumns(old) + " FROM docs ORDER BY id");
  while (rows.Step()) {
    const std::int64_t id = rows.Int(0);
    const DocumentRow row = UnpackRow(old, rows, attributes.Read(id));
    Json::Value document = ReadRow(old, row, nullptr);
    AddTexts(old, texts.Read(TextOf(db, id)), nullptr, &document);
    writer.Upsert(MakeDocument(schema, row.path, document));
  }
  if (HasTerms(db)) writer.RequestTerms();
  writer.Commit();
}

void Index::Remap(const Schema& schema) {
  const std::unique_lock<std::shared_mutex> lock(gate_);
  if (!store_) throw ProblemOr(kDamagedIndex);
  const Reopen reopen{this};
  {
    const ReportLost report{this};
    store_->writer->Commit();
  }
  try {
    CopyDocuments(schema, CreateSpareDatabase(directory_, schema));
  } catch (...) {
    // A full disk must not stay full of what could not be finished.
    RemoveSpareDatabase(directory_);
    throw;
  }
  store_.reset();
  PlaceSpareDatabase(directory_);
}

void Index::Remove() {
  const std::unique_lock<std::shared_mutex> lock(gate_);
  store_.reset();
  {
    const std::lock_guard<std::mutex> problem_lock(problem_mutex_);
    problem_ = Error(kDamagedIndex, "The index has been deleted");
  }
  RemoveDatabase(directory_);
}

void Index::CloseCommitted() {
  if (!store_) return;
  try {
    const ReportLost report{this};
    store_->writer->Commit();
  } catch (const Error& error) {
    // A database that is gone or broken has nothing that could be kept.
    if (!HasCode(error, kDamagedIndex)) throw;
  }
  store_.reset();
}

void Index::Move(const std::string& to, const MoveSteps& steps) {
  const std::unique_lock<std::shared_mutex> lock(gate_);
  const Reopen reopen{this};
  CloseCommitted();
  const bool has_database = HasDatabase(directory_) || HasDatabase(to);
  steps.begin();
  if (has_database && directory_ != to) {
    try {
      MoveDatabase(directory_, to);
    } catch (const Error&) {
      // Once the new place has it, the rest is tidying up.
      if (!HasDatabase(to)) {
        steps.abandon();
        throw;
      }
    }
  }
  directory_ = to;
  steps.end();
}

void Index::Commit() {
  Access(this).UseWriter([](IndexWriter& writer) { writer.Commit(); });
}

void Index::CommitIfOld() {
  const std::shared_lock<std::shared_mutex> lock(gate_, std::try_to_lock);
  if (!lock.owns_lock() || !store_ || !store_->writer->HasUncommitted()) return;
  const std::unique_lock<std::mutex> writer_lock(writer_mutex_, std::try_to_lock);
  if (!writer_lock.owns_lock()) return;
  try {
    const ReportLost report{this};
    store_->writer->CommitIfOld();
  } catch (const Error& error) {
    daemon::LogError("An index lost uncommitted work: " + error.reason());
    NoteDamage(error);
  } catch (const std::bad_alloc&) {
    daemon::LogError("An index lost uncommitted work: Out of memory");
  }
}

void Index::Pause() {
  const std::shared_lock<std::shared_mutex> lock(gate_);
  if (!store_) {
    paused_ = true;
    return;
  }
  UseWriter(/*paused_too=*/true, [this](IndexWriter& writer) {
    writer.Commit();
    paused_ = true;
  });
}

}  // namespace quarry::engine
