// SQLite behind objects that own what they open and throw what goes wrong.

#ifndef QUARRY_DAEMONS_TARNELASTICD_DATABASE_H_
#define QUARRY_DAEMONS_TARNELASTICD_DATABASE_H_

#include <sqlite3.h>

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>

namespace quarry::engine {

// One use of a prepared statement. Columns and parameters hold bytes: text need not be UTF-8. Every
// failure is thrown as Database says. Text and blobs that are bound are not copied: they must stay
// as they are until the statement is done.
class Statement {
 public:
  // Prepares a statement of its own, which the object owns.
  Statement(sqlite3* db, const std::string& sql);
  // Uses `prepared`, which stays the caller's and is reset at the end.
  Statement(sqlite3* db, sqlite3_stmt* prepared, bool* busy);
  Statement(Statement&& other) noexcept;
  Statement(const Statement&) = delete;
  Statement& operator=(const Statement&) = delete;
  ~Statement();

  // Parameters are numbered from 1.
  Statement& Bind(int index, std::int64_t value);
  Statement& Bind(int index, double value);
  Statement& Bind(int index, std::string_view text);
  Statement& BindBlob(int index, std::string_view bytes);
  Statement& BindNull(int index);

  // Moves to the next row; false when there is none.
  bool Step();
  // Runs to the end, and makes the statement ready to be run again with other parameters.
  void Run();
  // Makes the statement ready to be run again; parameters are kept.
  void Reset();

  // Columns are numbered from 0. Views are valid until the next step.
  int Type(int column) const { return sqlite3_column_type(stmt_, column); }
  bool IsNull(int column) const { return Type(column) == SQLITE_NULL; }
  std::int64_t Int(int column) const { return sqlite3_column_int64(stmt_, column); }
  double Double(int column) const { return sqlite3_column_double(stmt_, column); }
  std::string_view Text(int column) const;
  std::string_view Blob(int column) const;

 private:
  void Check(int result);
  std::string_view View(const char* bytes, int column) const;

  sqlite3* db_;
  sqlite3_stmt* stmt_ = nullptr;
  bool* busy_ = nullptr;  // set while a shared statement is in use; null for one of our own
};

// One connection. One thread at a time. Failures are thrown as Error: kDamagedIndex for a file that
// is missing or is no sound database, kDiskFull, kErrorEngineBusyMemory without memory,
// kSearchTooLong when interrupted, else kStorageFailed.
class Database {
 public:
  // Opens a file that exists, for reading and writing; an empty one is an empty database.
  explicit Database(const std::string& path);
  ~Database();
  Database(const Database&) = delete;
  Database& operator=(const Database&) = delete;

  // Prepares `sql` once, and gives it out again on later calls.
  Statement Prepare(const std::string& sql);
  // Runs statements without parameters or rows.
  void Execute(const std::string& sql);
  // Whether a transaction is open. SQLite ends one by itself after some failures.
  bool InTransaction() const { return sqlite3_get_autocommit(db_.get()) == 0; }
  // Writes the log back into the database and cuts it to nothing, if nobody reads just now. Never
  // waits; a failure is left to the next commit.
  void EmptyLog() noexcept;
  // Takes free pages out of the database when they are more than a few of all. No transaction may
  // be open. Never waits; a failure is left to the next commit.
  void GiveBackFreePages() noexcept;
  // Whether the file that is open is no longer the one at its path.
  bool HasMoved() const;

  sqlite3* handle() const { return db_.get(); }

 private:
  struct Closer {
    void operator()(sqlite3* db) const { sqlite3_close_v2(db); }
  };
  struct Prepared {
    sqlite3_stmt* stmt = nullptr;
    bool busy = false;
  };

  std::unique_ptr<sqlite3, Closer> db_;
  std::map<std::string, Prepared, std::less<>> statements_;
};

// Throws the Error for a failed call on `db`, which may be null. `what` begins the message.
[[noreturn]] void ThrowSqlite(sqlite3* db, int result, const std::string& what);

// `name` as an identifier or text literal of SQL, quoted with `quote`.
std::string QuoteSql(std::string_view name, char quote);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_DATABASE_H_
