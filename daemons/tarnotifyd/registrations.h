// What is registered with the monitor, followed as it changes.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_REGISTRATIONS_H_
#define QUARRY_DAEMONS_TARNOTIFYD_REGISTRATIONS_H_

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "common/unique_fd.h"
#include "platform/linux/monitor_registry.h"

namespace quarry::notify {

// What each queue file takes, by its path: all that is registered for it, by whatever application.
using QueuePlaces = std::map<std::string, std::vector<platform::WatchedPlace>>;

// Reads the directory of registrations. A file that holds none is logged, once, and passed over;
// the others hold. One thread.
class Registrations {
 public:
  Registrations() = default;

  // Readable when a registration may have changed, until Refresh(). -1 while there is no directory
  // to watch; then, and in any case, Refresh() is to be called every second.
  int Descriptor() const { return watch_.get(); }

  // Looks at all files and reads those that are new. Returns whether Queues() has changed. While
  // the directory cannot be listed everything holds that did before.
  bool Refresh();

  const QueuePlaces& Queues() const { return queues_; }

  // Whether a registration for the queue that was there at the last Refresh() still is.
  bool IsStillThere(const std::string& queue) const;

 private:
  struct File {
    std::string version;  // tells two contents of one name apart
    std::optional<platform::MonitorRegistration> registration;
    bool failed = false;  // it could not be read the last time, though it may be next time
  };

  void Watch();
  static void Load(const std::string& name, std::string version, File* file);
  void Collect();

  UniqueFd watch_;
  std::string watched_;  // which directory the watch is on
  bool list_failed_ = false;
  std::map<std::string, File> files_;
  QueuePlaces queues_;
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_REGISTRATIONS_H_
