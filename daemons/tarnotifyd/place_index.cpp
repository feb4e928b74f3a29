#include "daemons/tarnotifyd/place_index.h"

#include <algorithm>

namespace quarry::notify {
namespace {

using platform::WatchedPlace;

// Whether a component of `below`, which is empty or begins with "/", is one of the names.
bool HasComponent(std::string_view below, const std::vector<std::string>& names) {
  while (!names.empty() && !below.empty()) {
    below.remove_prefix(1);
    const std::size_t end = std::min(below.find('/'), below.size());
    const std::string_view component = below.substr(0, end);
    if (std::find(names.begin(), names.end(), component) != names.end()) return true;
    below.remove_prefix(end);
  }
  return false;
}

void Merge(std::size_t queue, std::uint32_t mask, PlaceIndex::Wanted* wanted) {
  const auto place =
      std::lower_bound(wanted->begin(), wanted->end(), queue,
                       [](const auto& entry, std::size_t q) { return entry.first < q; });
  if (place != wanted->end() && place->first == queue) {
    place->second |= mask;
  } else {
    wanted->insert(place, {queue, mask});
  }
}

}  // namespace

PlaceIndex::PlaceIndex(const QueuePlaces& queues) {
  std::size_t queue = 0;
  for (const auto& [path, places] : queues) {
    for (const WatchedPlace& place : places) {
      by_path_[place.path].push_back({queue, place});
      sorted_.emplace(place.path, queue);
    }
    ++queue;
  }
}

void PlaceIndex::ForEachHolding(std::string_view path,
                                const std::function<void(const Entry& entry)>& action) const {
  std::size_t end = path.size();
  while (end != std::string_view::npos && end > 0) {
    const auto found = by_path_.find(path.substr(0, end));
    if (found != by_path_.end()) {
      for (const Entry& entry : found->second) {
        if (!HasComponent(path.substr(end), entry.place.ignore)) action(entry);
      }
    }
    end = path.rfind('/', end - 1);
  }
}

void PlaceIndex::Find(const std::string& path, Wanted* wanted) const {
  wanted->clear();
  ForEachHolding(path, [&](const Entry& entry) { Merge(entry.queue, entry.place.mask, wanted); });
}

void PlaceIndex::ForEachBelow(const std::string& directory, const PlaceAction& action) const {
  const std::string prefix = directory == "/" ? "/" : directory + "/";
  for (auto place = sorted_.lower_bound(prefix);
       place != sorted_.end() && place->first.compare(0, prefix.size(), prefix) == 0; ++place) {
    action(place->second, place->first);
  }
}

void PlaceIndex::ForEachTouching(const std::string& directory, const PlaceAction& action) const {
  ForEachBelow(directory, action);
  ForEachHolding(directory, [&](const Entry& entry) { action(entry.queue, entry.place.path); });
}

}  // namespace quarry::notify
