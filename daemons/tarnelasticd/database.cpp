#include "daemons/tarnelasticd/database.h"

#include <cerrno>
#include <exception>
#include <utility>

#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {
namespace {

// Long enough for another connection to recover or checkpoint the log, which is all that can make
// a connection wait.
constexpr int kBusyTimeoutMs = 10000;

bool IsDiskFull(sqlite3* db, int result) {
  if ((result & 0xff) == SQLITE_FULL) return true;
  const int system_error = db == nullptr ? 0 : sqlite3_system_errno(db);
  return (result & 0xff) == SQLITE_IOERR && (system_error == ENOSPC || system_error == EDQUOT);
}

bool IsMissing(sqlite3* db, int result) {
  if ((result & 0xff) != SQLITE_CANTOPEN || db == nullptr) return false;
  const int system_error = sqlite3_system_errno(db);
  return system_error == ENOENT || system_error == ENOTDIR;
}

// Damage makes people lose their index, so only what is wrong with the file itself counts as such:
// a want of descriptors or of memory passes.
int CodeOf(sqlite3* db, int result) {
  if (IsDiskFull(db, result)) return kDiskFull;
  if (IsMissing(db, result)) return kDamagedIndex;
  if (result == SQLITE_IOERR_NOMEM) return kErrorEngineBusyMemory;
  switch (result & 0xff) {
    case SQLITE_NOMEM:
      return kErrorEngineBusyMemory;
    case SQLITE_CORRUPT:
    case SQLITE_NOTADB:
    // Rows that are there twice, or are not as they must be: in a sound database nobody makes such.
    case SQLITE_CONSTRAINT:
      return kDamagedIndex;
    case SQLITE_INTERRUPT:
      return kSearchTooLong;
    default:
      return kStorageFailed;
  }
}

sqlite3_stmt* PrepareStatement(sqlite3* db, const std::string& sql, unsigned int flags) {
  sqlite3_stmt* stmt = nullptr;
  const int result =
      sqlite3_prepare_v3(db, sql.c_str(), static_cast<int>(sql.size()), flags, &stmt, nullptr);
  if (result != SQLITE_OK) ThrowSqlite(db, result, "Cannot prepare a statement");
  return stmt;
}

// A null pointer would bind NULL instead of an empty text.
const char* BytesOf(std::string_view bytes) {
  return bytes.data() == nullptr ? "" : bytes.data();
}

}  // namespace

void ThrowSqlite(sqlite3* db, int result, const std::string& what) {
  const int code = CodeOf(db, result);
  const char* text = db == nullptr ? sqlite3_errstr(result) : sqlite3_errmsg(db);
  throw Error(code, what + ": " + text);
}

std::string QuoteSql(std::string_view name, char quote) {
  std::string quoted(1, quote);
  for (const char c : name) {
    if (c == quote) quoted += quote;
    quoted += c;
  }
  return quoted + quote;
}

Statement::Statement(sqlite3* db, const std::string& sql)
    : db_(db), stmt_(PrepareStatement(db, sql, 0)) {}

Statement::Statement(sqlite3* db, sqlite3_stmt* prepared, bool* busy)
    : db_(db), stmt_(prepared), busy_(busy) {
  *busy_ = true;
}

Statement::Statement(Statement&& other) noexcept
    : db_(other.db_),
      stmt_(std::exchange(other.stmt_, nullptr)),
      busy_(std::exchange(other.busy_, nullptr)) {}

Statement::~Statement() {
  if (stmt_ == nullptr) return;
  if (busy_ == nullptr) {
    sqlite3_finalize(stmt_);
    return;
  }
  sqlite3_reset(stmt_);
  sqlite3_clear_bindings(stmt_);
  *busy_ = false;
}

void Statement::Check(int result) {
  if (result != SQLITE_OK) ThrowSqlite(db_, result, "Cannot bind a parameter");
}

Statement& Statement::Bind(int index, std::int64_t value) {
  Check(sqlite3_bind_int64(stmt_, index, value));
  return *this;
}

Statement& Statement::Bind(int index, double value) {
  Check(sqlite3_bind_double(stmt_, index, value));
  return *this;
}

Statement& Statement::Bind(int index, std::string_view text) {
  Check(sqlite3_bind_text64(stmt_, index, BytesOf(text), text.size(), SQLITE_STATIC, SQLITE_UTF8));
  return *this;
}

Statement& Statement::BindBlob(int index, std::string_view bytes) {
  Check(sqlite3_bind_blob64(stmt_, index, BytesOf(bytes), bytes.size(), SQLITE_STATIC));
  return *this;
}

Statement& Statement::BindNull(int index) {
  Check(sqlite3_bind_null(stmt_, index));
  return *this;
}

bool Statement::Step() {
  const int result = sqlite3_step(stmt_);
  if (result == SQLITE_ROW) return true;
  if (result == SQLITE_DONE) return false;
  ThrowSqlite(db_, result, "The index's database failed");
}

void Statement::Run() {
  while (Step()) {
  }
  Reset();
}

void Statement::Reset() {
  sqlite3_reset(stmt_);
}

std::string_view Statement::Text(int column) const {
  return View(reinterpret_cast<const char*>(sqlite3_column_text(stmt_, column)), column);
}

std::string_view Statement::Blob(int column) const {
  return View(static_cast<const char*>(sqlite3_column_blob(stmt_, column)), column);
}

// SQLite gives null for NULL, for what is empty, and also when it has no memory for a copy: what
// could not be read must not be taken for nothing, and written back so.
std::string_view Statement::View(const char* bytes, int column) const {
  if (bytes != nullptr) {
    return {bytes, static_cast<std::size_t>(sqlite3_column_bytes(stmt_, column))};
  }
  const int result = sqlite3_errcode(db_);
  if ((result & 0xff) == SQLITE_NOMEM) ThrowSqlite(db_, result, "A value cannot be read");
  return {};
}

Database::Database(const std::string& path) {
  sqlite3* db = nullptr;
  constexpr int kFlags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX;
  const int result = sqlite3_open_v2(path.c_str(), &db, kFlags, nullptr);
  db_.reset(db);
  if (result != SQLITE_OK) ThrowSqlite(db, result, "Cannot open " + path);
  sqlite3_extended_result_codes(db, 1);
  sqlite3_busy_timeout(db, kBusyTimeoutMs);
}

Database::~Database() {
  for (auto& [sql, prepared] : statements_) sqlite3_finalize(prepared.stmt);
}

Statement Database::Prepare(const std::string& sql) {
  Prepared& prepared = statements_[sql];
  if (prepared.busy) return Statement(handle(), sql);
  if (prepared.stmt == nullptr) {
    prepared.stmt = PrepareStatement(handle(), sql, SQLITE_PREPARE_PERSISTENT);
  }
  return Statement(handle(), prepared.stmt, &prepared.busy);
}

void Database::Execute(const std::string& sql) {
  const int result = sqlite3_exec(handle(), sql.c_str(), nullptr, nullptr, nullptr);
  if (result != SQLITE_OK) ThrowSqlite(handle(), result, "The index's database failed");
}

void Database::EmptyLog() noexcept {
  sqlite3_busy_timeout(handle(), 0);
  sqlite3_wal_checkpoint_v2(handle(), "main", SQLITE_CHECKPOINT_TRUNCATE, nullptr, nullptr);
  sqlite3_busy_timeout(handle(), kBusyTimeoutMs);
}

void Database::GiveBackFreePages() noexcept {
  constexpr std::int64_t kFewOf = 128;
  try {
    Statement free = Prepare("PRAGMA freelist_count");
    Statement all = Prepare("PRAGMA page_count");
    if (!free.Step() || !all.Step() || free.Int(0) * kFewOf <= all.Int(0)) return;
  } catch (const std::exception&) {
    return;
  }
  sqlite3_exec(handle(), "PRAGMA incremental_vacuum", nullptr, nullptr, nullptr);
}

bool Database::HasMoved() const {
  int moved = 0;
  sqlite3_file_control(handle(), "main", SQLITE_FCNTL_HAS_MOVED, &moved);
  return moved != 0;
}

}  // namespace quarry::engine
