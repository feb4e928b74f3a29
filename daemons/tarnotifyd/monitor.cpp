#include "daemons/tarnotifyd/monitor.h"

#include <poll.h>

#include <algorithm>
#include <exception>
#include <iterator>
#include <set>
#include <utility>

#include "daemons/common/log.h"
#include "fileindex/queue/event.h"

namespace quarry::notify {
namespace {

using namespace fileindex;
using platform::WatchedPlace;

constexpr std::chrono::milliseconds kRefresh{1'000};

template <typename Action>
void ForEachPlace(const QueuePlaces& queues, const Action& action) {
  for (const auto& [queue, places] : queues) {
    for (const WatchedPlace& place : places) action(place);
  }
}

std::vector<std::string> Directories(const QueuePlaces& queues) {
  std::set<std::string> paths;
  ForEachPlace(queues, [&](const WatchedPlace& place) { paths.insert(place.path); });
  return {paths.begin(), paths.end()};
}

// The names that nobody wants to hear of.
std::vector<std::string> CommonIgnored(const QueuePlaces& queues) {
  std::set<std::string> common;
  bool first = true;
  ForEachPlace(queues, [&](const WatchedPlace& place) {
    std::set<std::string> names(place.ignore.begin(), place.ignore.end());
    if (!first) {
      std::set<std::string> both;
      std::set_intersection(names.begin(), names.end(), common.begin(), common.end(),
                            std::inserter(both, both.end()));
      names = std::move(both);
    }
    common = std::move(names);
    first = false;
  });
  return {common.begin(), common.end()};
}

bool IsNewPlace(const WatchedPlace& place, const std::vector<WatchedPlace>* before) {
  return before == nullptr || std::find(before->begin(), before->end(), place) == before->end();
}

Change HalfOf(const Change& rename, std::uint32_t kind, const std::string& path) {
  return {kind, rename.is_dir, false, path, ""};
}

}  // namespace

Monitor::Monitor(std::unique_ptr<ChangeSource> source, Now now)
    : now_(std::move(now)), source_(std::move(source)) {}

void Monitor::Step(int timeout_ms) {
  const bool may_read = now_() >= next_read_;
  const Ready ready = Wait(MillisecondsToDo(timeout_ms, may_read), may_read);
  const bool refresh = now_() >= next_refresh_;
  if (refresh) next_refresh_ = now_() + kRefresh;
  if (ready.registrations || refresh) FollowRegistrations();
  if (refresh) Guarded([this] { source_->Refresh(*this); });
  if (ready.source) {
    Guarded([this] { source_->Read(*this); });
    next_read_ = now_() + kBetweenReads;
  }
  for (const auto& feed : feeds_) feed->Step(now_());
  if (refresh) report_(Status());
}

Json::Value Monitor::Status() const {
  SourceReport source;
  source_->Report(&source);
  Json::Value status(Json::objectValue);
  status["source"] = source.kind;
  status["file_systems"] = Json::UInt64{source.file_systems};
  status["directories"] = Json::UInt64{source.directories};
  Json::Value& unwatched = status["unwatched"] = Json::Value(Json::arrayValue);
  for (const auto& [path, reason] : source.unwatched) {
    Json::Value& entry = unwatched.append(Json::Value(Json::objectValue));
    entry["path"] = path;
    entry["reason"] = reason;
  }
  Json::Value& queues = status["queues"] = Json::Value(Json::arrayValue);
  auto feed = feeds_.begin();
  for (const auto& [queue, places] : queues_) {
    Json::Value& entry = queues.append(Json::Value(Json::objectValue));
    entry["queue"] = queue;
    entry["places"] = Json::UInt64{places.size()};
    entry["overflows"] = Json::UInt64{(*feed)->Overflows()};
    entry["problem"] = (*feed++)->Problem();
  }
  return status;
}

void Monitor::Finish() {
  for (const auto& feed : feeds_) feed->Finish(now_());
}

// How long nothing is due.
int Monitor::MillisecondsToDo(int at_most, bool may_read) const {
  Clock::time_point due = may_read ? next_refresh_ : std::min(next_refresh_, next_read_);
  for (const auto& feed : feeds_) {
    if (const auto feed_due = feed->Due()) due = std::min(due, *feed_due);
  }
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(due - now_()).count();
  if (left <= 0) return 0;
  return at_most < 0 || left < at_most ? static_cast<int>(left) : at_most;
}

// A negative descriptor is passed over.
Monitor::Ready Monitor::Wait(int timeout_ms, bool may_read) const {
  pollfd polled[] = {{may_read ? source_->Descriptor() : -1, POLLIN, 0},
                     {registrations_.Descriptor(), POLLIN, 0},
                     {wake_fd_, POLLIN, 0}};
  if (poll(polled, std::size(polled), timeout_ms) <= 0) return {};
  return {polled[0].revents != 0, polled[1].revents != 0};
}

// A source that fails in the middle may have lost what it had in hand.
void Monitor::Guarded(const std::function<void()>& action) {
  try {
    action();
  } catch (const std::exception& error) {
    daemon::LogError(std::string("Changes may have been missed: ") + error.what());
    OnDoubt("/");
  }
}

void Monitor::FollowRegistrations() {
  if (registrations_.Refresh()) TakeOver(registrations_.Queues());
}

void Monitor::TakeOver(const QueuePlaces& queues) {
  std::vector<std::unique_ptr<QueueFeed>> feeds;
  for (const auto& [queue, places] : queues) {
    const auto known = queues_.find(queue);
    if (known == queues_.end()) {
      feeds.push_back(std::make_unique<QueueFeed>(
          queue, [this, name = queue] { return registrations_.IsStillThere(name); }));
    } else {
      feeds.push_back(
          std::move(feeds_[static_cast<std::size_t>(std::distance(queues_.begin(), known))]));
    }
  }
  feeds_ = std::move(feeds);
  index_ = PlaceIndex(queues);
  DoubtNewPlaces(queues);
  queues_ = queues;
  std::vector<std::string> directories = Directories(queues);
  std::vector<std::string> ignore = CommonIgnored(queues);
  daemon::LogInfo("Following " + std::to_string(directories.size()) + " directories for " +
                  std::to_string(queues.size()) + " queues");
  if (directories == directories_ && ignore == ignore_) return;
  directories_ = std::move(directories);
  ignore_ = std::move(ignore);
  Guarded([this] { source_->SetDirectories(directories_, ignore_, *this); });
}

// The source tells of directories that are new to it. Of one that was watched already for somebody
// else it does not.
void Monitor::DoubtNewPlaces(const QueuePlaces& queues) {
  std::size_t number = 0;
  for (const auto& [queue, places] : queues) {
    const auto known = queues_.find(queue);
    const auto* before = known == queues_.end() ? nullptr : &known->second;
    for (const WatchedPlace& place : places) {
      if (IsNewPlace(place, before) &&
          std::binary_search(directories_.begin(), directories_.end(), place.path)) {
        feeds_[number]->Doubt(place.path);
      }
    }
    ++number;
  }
}

void Monitor::OnDoubt(const std::string& directory) {
  index_.ForEachTouching(directory, [this](std::size_t queue, const std::string& place) {
    feeds_[queue]->Doubt(place);
  });
}

void Monitor::OnChange(const Change& change) {
  if (change.kind == EVENT_RENAME) return OnRename(change);
  index_.Find(change.path, &wanted_);
  for (const auto& [queue, mask] : wanted_) Tell(queue, mask, change);
  if (change.is_dir && (change.kind & (EVENT_CREATE | EVENT_DELETE)) != 0) DoubtBelow(change.path);
}

// For who knows only one of its places a rename is a creation or a deletion, as it is for who does
// not want renames.
void Monitor::OnRename(const Change& change) {
  index_.Find(change.path_old, &wanted_old_);
  index_.Find(change.path, &wanted_);
  for (const auto& [queue, mask] : wanted_old_) {
    const auto inside = [queue = queue](const auto& entry) { return entry.first == queue; };
    const auto found = std::find_if(wanted_.begin(), wanted_.end(), inside);
    if (found != wanted_.end() && (mask & found->second & EVENT_RENAME) != 0) {
      Tell(queue, EVENT_RENAME, change);
      wanted_.erase(found);
    } else {
      Tell(queue, mask, HalfOf(change, EVENT_DELETE, change.path_old));
    }
  }
  for (const auto& [queue, mask] : wanted_) {
    Tell(queue, mask, HalfOf(change, EVENT_CREATE, change.path));
  }
  if (!change.is_dir) return;
  DoubtBelow(change.path_old);
  DoubtBelow(change.path);
}

// A directory that comes or goes takes the places below it along. Whoever is told of the directory
// itself knows.
void Monitor::DoubtBelow(const std::string& directory) {
  index_.Find(directory, &wanted_);
  index_.ForEachBelow(directory, [&](std::size_t queue, const std::string& place) {
    const auto is_told = [queue](const auto& entry) { return entry.first == queue; };
    if (std::none_of(wanted_.begin(), wanted_.end(), is_told)) feeds_[queue]->Doubt(place);
  });
}

void Monitor::Tell(std::size_t queue, std::uint32_t wanted, const Change& change) {
  if ((wanted & change.kind) != 0) feeds_[queue]->Add(change, now_());
}

}  // namespace quarry::notify
