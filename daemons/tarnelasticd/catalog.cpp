#include "daemons/tarnelasticd/catalog.h"

#include <utility>

#include "daemons/common/log.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/index_files.h"

namespace quarry::engine {

Catalog::Catalog(const std::string& registry_path, WriterLimits limits,
                 std::function<void()> on_lost)
    : limits_(limits), on_lost_(std::move(on_lost)), registry_(registry_path) {
  const std::map<std::string, IndexRecord> records = registry_.records();
  for (const auto& [id, record] : records) {
    if (!record.moving_from.empty()) FinishMove(record);
    indexes_[id] = MakeIndex(record);
    indexes_[id]->Open();
  }
}

std::shared_ptr<Index> Catalog::MakeIndex(const IndexRecord& record) const {
  return std::make_shared<Index>(record.path, record.paused, limits_, on_lost_);
}

// Ends a move that a crash has cut off. Failing here must not keep the other indexes from working.
void Catalog::FinishMove(IndexRecord record) {
  try {
    if (HasDatabase(record.moving_from) || HasDatabase(record.path)) {
      MoveDatabase(record.moving_from, record.path);
    }
    record.moving_from.clear();
    registry_.Put(record);
  } catch (const Error& error) {
    daemon::LogError("Cannot end the move of index " + record.id + ": " + error.reason());
  }
}

std::shared_ptr<Index> Catalog::FindOrNull(const std::string& id) const {
  const std::shared_lock<std::shared_mutex> lock(map_mutex_);
  const auto found = indexes_.find(id);
  return found == indexes_.end() ? nullptr : found->second;
}

std::shared_ptr<Index> Catalog::Find(const std::string& id) const {
  std::shared_ptr<Index> index = FindOrNull(id);
  if (!index) throw Error(kUnknownIndex, "There is no index " + id);
  return index;
}

std::map<std::string, std::shared_ptr<Index>> Catalog::All() const {
  const std::shared_lock<std::shared_mutex> lock(map_mutex_);
  return indexes_;
}

void Catalog::Create(const IndexRecord& record) {
  const std::lock_guard<std::mutex> lock(change_mutex_);
  if (registry_.IsPathTaken(record.path, record.id)) {
    throw Error(kIndexConflict, "Another index is in " + record.path);
  }
  const IndexRecord* known = registry_.Find(record.id);
  if (known == nullptr) {
    CreateNew(record);
  } else {
    if (!known->moving_from.empty()) FinishMove(*known);
    const IndexRecord old = *registry_.Find(record.id);
    Refresh(old, record);
  }
}

// What is sound stays, with these mappings; what is missing or damaged is made anew, empty.
void Catalog::MakeUsable(Index* index, const Schema& schema) {
  const bool exists = HasDatabase(index->directory());
  if (exists) index->Open();
  if (!exists || index->IsDamaged()) index->Recreate(schema);
  if (Index::Access(index).schema()->mappings() != schema.mappings()) index->Remap(schema);
}

// The database first: a list that names an index without one would call it damaged after a crash.
// One that is there already is what such a crash has left, and is taken over.
void Catalog::CreateNew(const IndexRecord& record) {
  const Schema schema(record.mappings);
  std::shared_ptr<Index> index = MakeIndex(record);
  MakeUsable(index.get(), schema);
  registry_.Put(record);
  const std::unique_lock<std::shared_mutex> lock(map_mutex_);
  indexes_[record.id] = std::move(index);
}

void Catalog::Refresh(const IndexRecord& old, IndexRecord record) {
  const Schema schema(record.mappings);
  record.paused = old.paused;
  record.moving_from = old.moving_from;
  if (record.path != old.path) Move(old, record);
  MakeUsable(Find(record.id).get(), schema);
  record.moving_from.clear();
  registry_.Put(record);
}

void Catalog::Delete(const std::string& id) {
  const std::lock_guard<std::mutex> lock(change_mutex_);
  const IndexRecord* record = registry_.Find(id);
  if (record == nullptr) return;
  // The files first: what is no longer in the list would be found by nobody.
  Find(id)->Remove();
  if (!record->moving_from.empty()) RemoveDatabase(record->moving_from);
  registry_.Remove(id);
  const std::unique_lock<std::shared_mutex> map_lock(map_mutex_);
  indexes_.erase(id);
}

void Catalog::SetPaused(const std::string& id, bool paused) {
  const std::lock_guard<std::mutex> lock(change_mutex_);
  const std::shared_ptr<Index> index = Find(id);
  IndexRecord record = *registry_.Find(id);
  // Writes stop before the list says so, and begin after it.
  if (paused) index->Pause();
  if (record.paused != paused) {
    record.paused = paused;
    registry_.Put(record);
  }
  if (!paused) index->Resume();
}

bool Catalog::Configure(const std::string& id, const std::optional<std::string>& new_id,
                        const std::optional<std::string>& new_path) {
  const std::lock_guard<std::mutex> lock(change_mutex_);
  const IndexRecord* known = registry_.Find(id);
  if (known == nullptr) return false;
  const IndexRecord old = *known;
  IndexRecord record = old;
  record.id = new_id.value_or(old.id);
  record.path = new_path.value_or(old.path);
  if (record.id != old.id && registry_.Find(record.id) != nullptr) {
    throw Error(kIndexConflict, "There is an index " + record.id + " already");
  }
  if (registry_.IsPathTaken(record.path, old.id)) {
    throw Error(kIndexConflict, "Another index is in " + record.path);
  }
  if (record.id == old.id && record.path == old.path) return true;
  Move(old, record);
  return true;
}

// The list says first where the database goes and where it comes from, so that whoever reads it
// after a crash finds the database in one of the two places.
void Catalog::Move(const IndexRecord& old, IndexRecord record) {
  const std::shared_ptr<Index> index = Find(old.id);
  const bool moves = record.path != old.path;
  // A database that no index of the list owns is a leftover; it must not be taken for ours.
  if (moves && HasDatabase(old.path) && HasDatabase(record.path)) RemoveDatabase(record.path);
  record.moving_from = moves ? old.path : "";
  index->Move(record.path, {[&] { registry_.Replace(old.id, record); },
                            [&] { registry_.Replace(record.id, old); },
                            [&] {
                              record.moving_from.clear();
                              if (moves) registry_.Put(record);
                            }});
  if (record.id == old.id) return;
  const std::unique_lock<std::shared_mutex> lock(map_mutex_);
  indexes_.erase(old.id);
  indexes_[record.id] = index;
}

}  // namespace quarry::engine
