// Which indexes there are, across restarts.

#ifndef QUARRY_DAEMONS_TARNELASTICD_REGISTRY_H_
#define QUARRY_DAEMONS_TARNELASTICD_REGISTRY_H_

#include <json/json.h>

#include <map>
#include <string>

namespace quarry::engine {

struct IndexRecord {
  std::string id;
  std::string path;         // its directory
  std::string moving_from;  // the directory that a move under way takes it from, else empty
  bool paused = false;
  Json::Value settings;
  Json::Value mappings;
  // Kept for who asks, never loaded.
  Json::Value event_handler;
};

// The list of indexes, on disk. Every change is durable when the call returns. One thread at a
// time.
class Registry {
 public:
  // Loads the list; a missing file is an empty list. Throws Error kErrorLoadFile when the file is
  // not as this class writes it.
  explicit Registry(std::string path);

  const std::map<std::string, IndexRecord>& records() const { return records_; }
  // The record of that index, or null. Valid until the next change.
  const IndexRecord* Find(const std::string& id) const;
  // Whether an index other than `id` has `path` as its directory, or is being moved from there.
  bool IsPathTaken(const std::string& path, const std::string& id) const;

  // Each throws Error kDiskFull or kStorageFailed when the list cannot be written; it is unchanged
  // then.
  void Put(const IndexRecord& record);
  void Remove(const std::string& id);
  // Exchanges the record of `id` for one that may have another id.
  void Replace(const std::string& id, const IndexRecord& record);

 private:
  void Save(std::map<std::string, IndexRecord> records);

  std::string path_;
  std::map<std::string, IndexRecord> records_;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_REGISTRY_H_
