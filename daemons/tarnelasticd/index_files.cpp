#include "daemons/tarnelasticd/index_files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <vector>

#include "common/json.h"
#include "common/unique_fd.h"
#include "daemons/common/log.h"
#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/request.h"
#include "daemons/tarnelasticd/text_hash.h"

namespace quarry::engine {
namespace {

constexpr const char* kDatabaseName = "/quarry.db";
constexpr const char* kSpareSuffix = ".new";
// What SQLite keeps beside a database.
constexpr const char* kOtherFiles[] = {"-wal", "-shm", "-journal"};
constexpr std::size_t kCopyBytes = std::size_t{1} << 20;

std::string SparePath(const std::string& directory) {
  return DatabasePath(directory) + kSpareSuffix;
}

[[noreturn]] void FailSystem(const std::string& what) {
  const int saved = errno;
  const int code = saved == ENOSPC || saved == EDQUOT ? kDiskFull : kStorageFailed;
  throw Error(code, what + ": " + strerror(saved));
}

void SyncDirectory(const std::string& directory) {
  const UniqueFd fd(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!fd.valid() || fsync(fd.get()) != 0) FailSystem("Cannot sync " + directory);
}

bool IsDirectory(const std::string& path) {
  struct stat info {};
  return stat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

void RenameFile(const std::string& from, const std::string& to) {
  if (rename(from.c_str(), to.c_str()) != 0) FailSystem("Cannot rename " + from);
}

// What cannot be the engine's must not be in its way, nor is it the engine's to remove.
void SetAside(const std::string& path) {
  const std::string aside = path + ".damaged-" + std::to_string(std::time(nullptr));
  RenameFile(path, aside);
  daemon::LogWarning(path + " was in the way of an index; it is kept as " + aside);
}

// Only the engine's own account may look into what it has read out of everybody's files.
void MakeDirectory(const std::string& directory) {
  std::error_code failure;
  const std::filesystem::path parent = std::filesystem::path(directory).parent_path();
  std::filesystem::create_directories(parent, failure);
  if (mkdir(directory.c_str(), 0700) == 0 || (errno == EEXIST && IsDirectory(directory))) return;
  if (errno == EEXIST) SetAside(directory);
  if (mkdir(directory.c_str(), 0700) != 0) FailSystem("Cannot make " + directory);
}

void RemoveFile(const std::string& path) {
  if (unlink(path.c_str()) == 0 || errno == ENOENT || errno == ENOTDIR) return;
  if (errno != EISDIR) FailSystem("Cannot remove " + path);
  SetAside(path);
}

void RemoveOtherFiles(const std::string& database) {
  for (const char* suffix : kOtherFiles) RemoveFile(database + suffix);
}

void RemoveFiles(const std::string& database) {
  RemoveFile(database);
  RemoveOtherFiles(database);
}

// The database's other files get the same mode from SQLite.
void MakePrivateFile(const std::string& path) {
  const UniqueFd fd(open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
  if (!fd.valid()) FailSystem("Cannot make " + path);
}

void WriteAll(int fd, const char* bytes, std::size_t size) {
  while (size > 0) {
    const ssize_t written = write(fd, bytes, size);
    if (written < 0) {
      if (errno == EINTR) continue;
      FailSystem("Cannot copy a database");
    }
    bytes += written;
    size -= static_cast<std::size_t>(written);
  }
}

void CopyContent(int from, int to) {
  std::vector<char> buffer(kCopyBytes);
  for (;;) {
    const ssize_t got = read(from, buffer.data(), buffer.size());
    if (got == 0) return;
    if (got < 0) {
      if (errno == EINTR) continue;
      FailSystem("Cannot copy a database");
    }
    WriteAll(to, buffer.data(), static_cast<std::size_t>(got));
  }
}

void CopyFile(const std::string& from, const std::string& to) {
  const UniqueFd source(open(from.c_str(), O_RDONLY | O_CLOEXEC));
  if (!source.valid()) FailSystem("Cannot open " + from);
  const UniqueFd target(open(to.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
  if (!target.valid()) FailSystem("Cannot make " + to);
  CopyContent(source.get(), target.get());
  if (fsync(target.get()) != 0) FailSystem("Cannot sync " + to);
}

// To another file system, where a rename cannot go.
void CopyDatabase(const std::string& from, const std::string& to) {
  try {
    CopyFile(DatabasePath(from), SparePath(to));
    RenameFile(SparePath(to), DatabasePath(to));
  } catch (const Error&) {
    RemoveSpareDatabase(to);
    throw;
  }
}

bool HasLog(const std::string& database) {
  struct stat info {};
  return lstat((database + "-wal").c_str(), &info) == 0 && info.st_size > 0;
}

// Brings what a database's log holds into the database itself, so that this file is all there is.
void FoldLog(const std::string& database) {
  if (!HasLog(database)) return;
  Database(database).Execute("PRAGMA wal_checkpoint(TRUNCATE)");
  if (HasLog(database)) throw Error(kStorageFailed, "Cannot write back the log of " + database);
}

// Small tables are flushed often anyway; the texts gain from larger pieces.
void FillDatabase(Database* db, const Schema& schema) {
  db->Execute(
      "PRAGMA auto_vacuum=INCREMENTAL;PRAGMA journal_mode=DELETE;PRAGMA synchronous=FULL;BEGIN "
      "IMMEDIATE");
  db->Execute(schema.CreateStatements());
  db->Execute("INSERT INTO body(body,rank) VALUES('hashsize',8388608)");
  Statement insert = db->Prepare("INSERT INTO meta(key,value) VALUES(?1,?2)");
  insert.Bind(1, std::string_view("layout")).Bind(2, std::int64_t{kLayoutVersion}).Run();
  const std::string mappings = toString(schema.mappings());
  const std::string hash_key = RandomHashKey();
  insert.Bind(1, std::string_view("hash_key")).BindBlob(2, hash_key).Run();
  insert.Bind(1, std::string_view("mappings")).Bind(2, std::string_view(mappings)).Run();
  insert.Bind(1, std::string_view("documents")).Bind(2, std::int64_t{0}).Run();
  db->Execute("COMMIT");
}

std::string ReadMeta(Database* db, const char* key) {
  Statement row = db->Prepare("SELECT value FROM meta WHERE key=?1");
  row.Bind(1, std::string_view(key));
  if (!row.Step()) throw Error(kDamagedIndex, "The index's database is incomplete");
  return std::string(row.Text(0));
}

bool HasMeta(Database* db) {
  Statement row = db->Prepare("SELECT 1 FROM sqlite_master WHERE name='meta' AND type='table'");
  return row.Step();
}

std::shared_ptr<const Schema> ReadSchema(Database* db) {
  if (ReadMeta(db, "layout") != std::to_string(kLayoutVersion)) {
    throw Error(kDamagedIndex, "The index's database is of another version");
  }
  Json::Value mappings;
  if (!fromString(mappings, ReadMeta(db, "mappings"))) {
    throw Error(kDamagedIndex, "The index's mappings cannot be read");
  }
  return std::make_shared<const Schema>(mappings);
}

}  // namespace

std::string DatabasePath(const std::string& directory) {
  return directory + kDatabaseName;
}

void CheckDirectory(const std::string& directory) {
  constexpr std::size_t kRoom = 32;
  if (directory.empty() || directory.front() != '/') {
    FailMalformed("The path of an index must be absolute: " + directory);
  }
  if (directory.size() + kRoom > PATH_MAX) FailMalformed("The path of an index is too long");
  if ((directory + '/').find("//") != std::string::npos) {
    FailMalformed("The path of an index must not have empty parts: " + directory);
  }
  for (const char* part : {"/./", "/../"}) {
    if ((directory + '/').find(part) != std::string::npos) {
      FailMalformed("The path of an index must be plain: " + directory);
    }
  }
}

bool HasDatabase(const std::string& directory) {
  struct stat info {};
  return lstat(DatabasePath(directory).c_str(), &info) == 0 && S_ISREG(info.st_mode);
}

std::string CreateSpareDatabase(const std::string& directory, const Schema& schema) {
  MakeDirectory(directory);
  const std::string path = SparePath(directory);
  RemoveFiles(path);
  MakePrivateFile(path);
  Database db(path);
  FillDatabase(&db, schema);
  return path;
}

void PlaceSpareDatabase(const std::string& directory) {
  FoldLog(SparePath(directory));
  // A log left behind would be taken for the new database's own.
  RemoveOtherFiles(DatabasePath(directory));
  if (!HasDatabase(directory)) RemoveFile(DatabasePath(directory));
  RenameFile(SparePath(directory), DatabasePath(directory));
  SyncDirectory(directory);
}

void CreateDatabase(const std::string& directory, const Schema& schema) {
  CreateSpareDatabase(directory, schema);
  PlaceSpareDatabase(directory);
}

std::shared_ptr<const Schema> LoadSchema(const std::string& directory) {
  if (!HasDatabase(directory)) {
    throw Error(kDamagedIndex, "The index's database is missing: " + DatabasePath(directory));
  }
  for (const char* suffix : kOtherFiles) {
    if (!IsDirectory(DatabasePath(directory) + suffix)) continue;
    throw Error(kDamagedIndex, DatabasePath(directory) + suffix + " is a directory");
  }
  Database db(DatabasePath(directory));
  if (!HasMeta(&db)) throw Error(kDamagedIndex, "The database is not one of this engine");
  try {
    return ReadSchema(&db);
  } catch (const Error& error) {
    // Whatever is wrong with what can be read, the file is not what this engine has written.
    if (HasCode(error, kBadMappings) || HasCode(error, kStorageFailed)) {
      throw Error(kDamagedIndex, error.reason());
    }
    throw;
  }
}

void RemoveDatabase(const std::string& directory) {
  RemoveFiles(DatabasePath(directory));
  RemoveFiles(SparePath(directory));
  rmdir(directory.c_str());
}

void RemoveSpareDatabase(const std::string& directory) noexcept {
  try {
    RemoveFiles(SparePath(directory));
  } catch (const Error&) {
    // Whoever makes the next one tries again.
  }
}

void MoveDatabase(const std::string& from, const std::string& to) {
  if (!HasDatabase(to)) {
    FoldLog(DatabasePath(from));
    MakeDirectory(to);
    RemoveFiles(SparePath(to));
    if (rename(DatabasePath(from).c_str(), DatabasePath(to).c_str()) != 0) {
      if (errno != EXDEV) FailSystem("Cannot move " + DatabasePath(from));
      CopyDatabase(from, to);
    }
    SyncDirectory(to);
  }
  RemoveDatabase(from);
}

}  // namespace quarry::engine
