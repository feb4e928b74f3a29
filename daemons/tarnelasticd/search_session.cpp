#include "daemons/tarnelasticd/search_session.h"

#include <utility>

#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {
namespace {

// Whether an index, and not the query, may be at fault.
bool IsFaultOfAnIndex(const Error& error) {
  return HasCode(error, kDamagedIndex) || HasCode(error, kStorageFailed);
}

}  // namespace

SearchSession::Part::Part(std::string name, std::shared_ptr<Index> shared,
                          std::chrono::steady_clock::time_point deadline)
    : id(std::move(name)),
      index(std::move(shared)),
      access(index.get(), /*wait=*/false),
      reader(access.TakeReader()) {
  reader->Begin(deadline);
}

void SearchSession::Add(const std::string& id, const std::shared_ptr<Index>& index) {
  try {
    parts_.push_back(std::make_unique<Part>(id, index, deadline_));
  } catch (const Error& error) {
    index->NoteDamage(error);
    Skip(id, error);
  }
}

void SearchSession::Skip(const std::string& id, const Error& why) {
  skipped_.emplace_back(id, why);
}

Json::Value SearchSession::AskParts(const Question& question) const {
  std::vector<SearchedIndex> indexes;
  for (const auto& part : parts_) indexes.push_back(part->Searched());
  return question(indexes);
}

// Which index it is that fails is found out by asking each alone.
bool SearchSession::DropBroken(const Question& question) {
  const std::size_t before = parts_.size();
  std::vector<std::unique_ptr<Part>> sound;
  for (auto& part : parts_) {
    try {
      question({part->Searched()});
      sound.push_back(std::move(part));
    } catch (const Error& error) {
      if (!IsFaultOfAnIndex(error)) throw;
      part->index->NoteDamage(error);
      Skip(part->id, error);
    }
  }
  parts_ = std::move(sound);
  return parts_.size() < before;
}

Json::Value SearchSession::Ask(const Question& question) {
  Json::Value found;
  for (bool done = false; !done;) {
    if (parts_.empty() && !skipped_.empty()) throw Error(skipped_.front().second);
    try {
      found = AskParts(question);
      done = true;
    } catch (const Error& error) {
      if (!IsFaultOfAnIndex(error) || !DropBroken(question)) throw;
    }
  }
  for (const auto& [id, error] : skipped_) {
    Json::Value entry;
    entry["id"] = id;
    entry["code"] = static_cast<int>(error.code());
    entry["msg"] = error.reason();
    found["skipped"].append(std::move(entry));
  }
  return found;
}

}  // namespace quarry::engine
