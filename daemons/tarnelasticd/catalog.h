// All indexes by their ids, and what creates, deletes, renames and moves them.

#ifndef QUARRY_DAEMONS_TARNELASTICD_CATALOG_H_
#define QUARRY_DAEMONS_TARNELASTICD_CATALOG_H_

#include <json/json.h>

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <shared_mutex>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/index.h"
#include "daemons/tarnelasticd/registry.h"

namespace quarry::engine {

// Any thread. What changes the list of indexes runs one at a time; finding an index never waits for
// it. After a crash in the middle of any change the next start, or the same command again, ends it.
class Catalog {
 public:
  // Opens all indexes of the list at `registry_path`. One that cannot be opened is reported in the
  // log and answers errors; the others work. Throws as Registry does. `on_lost` as Index says.
  Catalog(const std::string& registry_path, WriterLimits limits, std::function<void()> on_lost);

  // The index of that id; throws Error kUnknownIndex without one. It stays usable after it has been
  // deleted: it answers kDamagedIndex then.
  std::shared_ptr<Index> Find(const std::string& id) const;
  // All indexes, by ids.
  std::map<std::string, std::shared_ptr<Index>> All() const;

  // Each throws Error as the protocol says.

  // Makes sure that there is such an index: one that exists stays as it is, but for mappings and
  // directory, which become those of the record; one that is damaged is made anew, empty.
  void Create(const IndexRecord& record);
  // Removes an index and its files. Without such an index nothing happens.
  void Delete(const std::string& id);
  void SetPaused(const std::string& id, bool paused);
  // Gives an index another id or directory, or both. Returns whether there was anything to change:
  // without such an index nothing happens, since whoever repeats a change may have succeeded
  // before.
  bool Configure(const std::string& id, const std::optional<std::string>& new_id,
                 const std::optional<std::string>& new_path);

 private:
  std::shared_ptr<Index> FindOrNull(const std::string& id) const;
  void FinishMove(IndexRecord record);
  std::shared_ptr<Index> MakeIndex(const IndexRecord& record) const;
  static void MakeUsable(Index* index, const Schema& schema);
  void CreateNew(const IndexRecord& record);
  void Refresh(const IndexRecord& old, IndexRecord record);
  void Move(const IndexRecord& old, IndexRecord record);

  const WriterLimits limits_;
  const std::function<void()> on_lost_;
  std::mutex change_mutex_;  // held through every change; taken before map_mutex_
  Registry registry_;        // guarded by change_mutex_
  mutable std::shared_mutex map_mutex_;
  std::map<std::string, std::shared_ptr<Index>> indexes_;  // guarded by map_mutex_
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_CATALOG_H_
