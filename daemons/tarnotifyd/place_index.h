// Which queues a path concerns.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_PLACE_INDEX_H_
#define QUARRY_DAEMONS_TARNOTIFYD_PLACE_INDEX_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "daemons/tarnotifyd/registrations.h"
#include "platform/linux/monitor_registry.h"

namespace quarry::notify {

// The places of all queues, which are known by their number in the order of their paths. Paths are
// full paths of any bytes without a "/" at the end; "/" itself is every place's parent.
class PlaceIndex {
 public:
  // Queue number and the event bits that it wants.
  using Wanted = std::vector<std::pair<std::size_t, std::uint32_t>>;
  // Calls with a queue's number and the path of one of its places.
  using PlaceAction = std::function<void(std::size_t queue, const std::string& place)>;

  PlaceIndex() = default;
  explicit PlaceIndex(const QueuePlaces& queues);

  // The queues for which `path` lies in a place and below no name that the place leaves out, each
  // once, in order, with what any of its places wants. Costs as many look-ups as the path has
  // components.
  void Find(const std::string& path, Wanted* wanted) const;

  // The places below `directory`, which is none of them itself.
  void ForEachBelow(const std::string& directory, const PlaceAction& action) const;
  // Those and the places that hold `directory`.
  void ForEachTouching(const std::string& directory, const PlaceAction& action) const;

 private:
  struct Entry {
    std::size_t queue = 0;
    platform::WatchedPlace place;
  };
  struct TextHash {
    using is_transparent = void;
    std::size_t operator()(std::string_view text) const {
      return std::hash<std::string_view>()(text);
    }
  };

  // For each place that holds `path`.
  void ForEachHolding(std::string_view path,
                      const std::function<void(const Entry& entry)>& action) const;

  std::unordered_map<std::string, std::vector<Entry>, TextHash, std::equal_to<>> by_path_;
  std::multimap<std::string, std::size_t> sorted_;
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_PLACE_INDEX_H_
