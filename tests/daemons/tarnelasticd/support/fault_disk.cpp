#include "tests/daemons/tarnelasticd/support/fault_disk.h"

#include <sqlite3.h>

#include <mutex>
#include <stdexcept>

#include "tests/support/files.h"

namespace quarry::engine {
namespace {

struct State {
  std::mutex mutex;
  bool limited = false;
  std::int64_t room = 0;
  bool fail_reads = false;
  bool fail_syncs = false;
  bool tracking = false;
  std::map<std::string, std::string> durable;
};

State& TheState() {
  static State state;
  return state;
}

sqlite3_vfs* base_vfs = nullptr;

// The system's own file lies behind it in memory.
struct File {
  sqlite3_file base;
  const char* path;
};

sqlite3_file* Inner(sqlite3_file* file) {
  return reinterpret_cast<sqlite3_file*>(reinterpret_cast<File*>(file) + 1);
}

int Close(sqlite3_file* file) {
  return Inner(file)->pMethods->xClose(Inner(file));
}
int Read(sqlite3_file* file, void* to, int size, sqlite3_int64 offset) {
  {
    State& state = TheState();
    const std::lock_guard<std::mutex> lock(state.mutex);
    if (state.fail_reads) return SQLITE_IOERR_READ;
  }
  return Inner(file)->pMethods->xRead(Inner(file), to, size, offset);
}
int Write(sqlite3_file* file, const void* from, int size, sqlite3_int64 offset) {
  {
    State& state = TheState();
    const std::lock_guard<std::mutex> lock(state.mutex);
    if (state.limited && state.room < size) return SQLITE_FULL;
    state.room -= size;
  }
  return Inner(file)->pMethods->xWrite(Inner(file), from, size, offset);
}
int Truncate(sqlite3_file* file, sqlite3_int64 size) {
  return Inner(file)->pMethods->xTruncate(Inner(file), size);
}
int Sync(sqlite3_file* file, int flags) {
  State& state = TheState();
  const std::lock_guard<std::mutex> lock(state.mutex);
  if (state.fail_syncs) return SQLITE_IOERR_FSYNC;
  const char* path = reinterpret_cast<File*>(file)->path;
  if (state.tracking && path != nullptr) state.durable[path] = test::ReadFile(path);
  return Inner(file)->pMethods->xSync(Inner(file), flags);
}
int FileSize(sqlite3_file* file, sqlite3_int64* size) {
  return Inner(file)->pMethods->xFileSize(Inner(file), size);
}
int Lock(sqlite3_file* file, int level) {
  return Inner(file)->pMethods->xLock(Inner(file), level);
}
int Unlock(sqlite3_file* file, int level) {
  return Inner(file)->pMethods->xUnlock(Inner(file), level);
}
int CheckReservedLock(sqlite3_file* file, int* result) {
  return Inner(file)->pMethods->xCheckReservedLock(Inner(file), result);
}
int FileControl(sqlite3_file* file, int operation, void* argument) {
  return Inner(file)->pMethods->xFileControl(Inner(file), operation, argument);
}
int SectorSize(sqlite3_file* file) {
  return Inner(file)->pMethods->xSectorSize(Inner(file));
}
int DeviceCharacteristics(sqlite3_file* file) {
  return Inner(file)->pMethods->xDeviceCharacteristics(Inner(file));
}
int ShmMap(sqlite3_file* file, int page, int size, int extend, void volatile** to) {
  return Inner(file)->pMethods->xShmMap(Inner(file), page, size, extend, to);
}
int ShmLock(sqlite3_file* file, int offset, int count, int flags) {
  return Inner(file)->pMethods->xShmLock(Inner(file), offset, count, flags);
}
void ShmBarrier(sqlite3_file* file) {
  Inner(file)->pMethods->xShmBarrier(Inner(file));
}
int ShmUnmap(sqlite3_file* file, int remove) {
  return Inner(file)->pMethods->xShmUnmap(Inner(file), remove);
}

const sqlite3_io_methods kMethods = {2,
                                     Close,
                                     Read,
                                     Write,
                                     Truncate,
                                     Sync,
                                     FileSize,
                                     Lock,
                                     Unlock,
                                     CheckReservedLock,
                                     FileControl,
                                     SectorSize,
                                     DeviceCharacteristics,
                                     ShmMap,
                                     ShmLock,
                                     ShmBarrier,
                                     ShmUnmap,
                                     nullptr,
                                     nullptr};

int Open(sqlite3_vfs* /*vfs*/, const char* path, sqlite3_file* file, int flags, int* out_flags) {
  auto* outer = reinterpret_cast<File*>(file);
  outer->path = path;
  outer->base.pMethods = nullptr;
  const int result = base_vfs->xOpen(base_vfs, path, Inner(file), flags, out_flags);
  if (result == SQLITE_OK) outer->base.pMethods = &kMethods;
  return result;
}

int Delete(sqlite3_vfs* /*vfs*/, const char* path, int sync_directory) {
  State& state = TheState();
  const std::lock_guard<std::mutex> lock(state.mutex);
  if (state.tracking && sync_directory != 0) state.durable.erase(path);
  return base_vfs->xDelete(base_vfs, path, sync_directory);
}

sqlite3_vfs* Shim() {
  static sqlite3_vfs shim = [] {
    sqlite3_vfs vfs = *base_vfs;
    vfs.szOsFile = static_cast<int>(sizeof(File)) + base_vfs->szOsFile;
    vfs.pNext = nullptr;
    vfs.zName = "fault";
    vfs.xOpen = Open;
    vfs.xDelete = Delete;
    return vfs;
  }();
  return &shim;
}

}  // namespace

FaultDisk::FaultDisk() {
  if (base_vfs == nullptr) base_vfs = sqlite3_vfs_find(nullptr);
  if (sqlite3_vfs_register(Shim(), 1) != SQLITE_OK)
    throw std::runtime_error("sqlite3_vfs_register");
}

FaultDisk::~FaultDisk() {
  sqlite3_vfs_unregister(Shim());
  State& state = TheState();
  const std::lock_guard<std::mutex> lock(state.mutex);
  state.limited = false;
  state.fail_reads = false;
  state.fail_syncs = false;
  state.tracking = false;
  state.durable.clear();
}

void FaultDisk::SetRoom(std::int64_t bytes) {
  State& state = TheState();
  const std::lock_guard<std::mutex> lock(state.mutex);
  state.limited = true;
  state.room = bytes;
}

void FaultDisk::SetUnlimitedRoom() {
  State& state = TheState();
  const std::lock_guard<std::mutex> lock(state.mutex);
  state.limited = false;
}

void FaultDisk::FailReads(bool fail) {
  State& state = TheState();
  const std::lock_guard<std::mutex> lock(state.mutex);
  state.fail_reads = fail;
}

void FaultDisk::FailSyncs(bool fail) {
  State& state = TheState();
  const std::lock_guard<std::mutex> lock(state.mutex);
  state.fail_syncs = fail;
}

void FaultDisk::BeginTracking(const std::string& directory) {
  State& state = TheState();
  const std::lock_guard<std::mutex> lock(state.mutex);
  state.tracking = true;
  for (const std::string& name : test::ListDir(directory)) {
    const std::string path = directory + '/' + name;
    state.durable[path] = test::ReadFile(path);
  }
}

std::map<std::string, std::string> FaultDisk::Durable() const {
  State& state = TheState();
  const std::lock_guard<std::mutex> lock(state.mutex);
  return state.durable;
}

}  // namespace quarry::engine
