// A disk below SQLite that runs full, fails to read or sync, and forgets what was not synced.

#ifndef QUARRY_TESTS_DAEMONS_TARNELASTICD_SUPPORT_FAULT_DISK_H_
#define QUARRY_TESTS_DAEMONS_TARNELASTICD_SUPPORT_FAULT_DISK_H_

#include <cstdint>
#include <map>
#include <string>

namespace quarry::engine {

// Stands between SQLite and the system for all databases that are opened while it lives; these must
// be closed before its end. One at a time.
class FaultDisk {
 public:
  FaultDisk();
  ~FaultDisk();
  FaultDisk(const FaultDisk&) = delete;
  FaultDisk& operator=(const FaultDisk&) = delete;

  // From now on so many bytes can be written before the disk is full.
  void SetRoom(std::int64_t bytes);
  void SetUnlimitedRoom();
  // Whether reading, or syncing, fails.
  void FailReads(bool fail);
  void FailSyncs(bool fail);

  // What the files of `directory` hold now counts as safe on the disk; after that only what is
  // synced does.
  void BeginTracking(const std::string& directory);
  // What a loss of power at this moment would leave: content by path.
  std::map<std::string, std::string> Durable() const;
};

}  // namespace quarry::engine

#endif  // QUARRY_TESTS_DAEMONS_TARNELASTICD_SUPPORT_FAULT_DISK_H_
