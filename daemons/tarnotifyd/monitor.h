// The monitor as a whole.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_MONITOR_H_
#define QUARRY_DAEMONS_TARNOTIFYD_MONITOR_H_

#include <json/json.h>

#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "daemons/tarnotifyd/change_source.h"
#include "daemons/tarnotifyd/place_index.h"
#include "daemons/tarnotifyd/queue_feed.h"
#include "daemons/tarnotifyd/registrations.h"

namespace quarry::notify {

// Follows the registrations, and writes what a source tells into the queues that want it. A queue
// of which something may have been missed gets an overflow line. One thread; nothing here waits for
// other processes.
class Monitor : private ChangeSink {
 public:
  using Now = std::function<Clock::time_point()>;

  // Between two readings of what has happened: under load the kernel gathers it meanwhile, and
  // folds some of it. Short, since a file that is written is told of when the reading after shows
  // it closed.
  static constexpr std::chrono::milliseconds kBetweenReads{5};

  explicit Monitor(std::unique_ptr<ChangeSource> source, Now now = Clock::now);

  // Waits up to `timeout_ms` for something to do, and does it.
  void Step(int timeout_ms);

  // Calls with what Status() says, every second.
  void ReportTo(std::function<void(const Json::Value&)> report) { report_ = std::move(report); }
  // How the monitor does: {"source", "file_systems", "directories", "unwatched": [{"path",
  // "reason"}], "queues": [{"queue", "places", "overflows", "problem"}]}.
  Json::Value Status() const;

  // Step() returns as soon as `fd` is readable.
  void WakeOn(int fd) { wake_fd_ = fd; }

  // Writes what is held back. Nothing else may be called afterwards.
  void Finish();

 private:
  void OnChange(const Change& change) override;
  void OnDoubt(const std::string& directory) override;

  struct Ready {
    bool source = false;
    bool registrations = false;
  };
  Ready Wait(int timeout_ms, bool may_read) const;
  int MillisecondsToDo(int at_most, bool may_read) const;
  void Guarded(const std::function<void()>& action);
  void FollowRegistrations();
  void TakeOver(const QueuePlaces& queues);
  void DoubtNewPlaces(const QueuePlaces& queues);
  void OnRename(const Change& change);
  void DoubtBelow(const std::string& directory);
  void Tell(std::size_t queue, std::uint32_t wanted, const Change& change);

  Now now_;
  std::unique_ptr<ChangeSource> source_;
  Registrations registrations_;
  QueuePlaces queues_;                             // as they are followed now, and
  std::vector<std::unique_ptr<QueueFeed>> feeds_;  // what belongs to each, in the same order
  PlaceIndex index_;
  std::vector<std::string> directories_;  // as the source was told, sorted
  std::vector<std::string> ignore_;
  PlaceIndex::Wanted wanted_, wanted_old_;  // kept for their memory
  Clock::time_point next_refresh_{};
  Clock::time_point next_read_{};
  int wake_fd_ = -1;
  std::function<void(const Json::Value&)> report_ = [](const Json::Value&) {};
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_MONITOR_H_
