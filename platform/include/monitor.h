// Registering with the file-change monitor the places to watch and the queues to write.

#ifndef QUARRY_PLATFORM_INCLUDE_MONITOR_H_
#define QUARRY_PLATFORM_INCLUDE_MONITOR_H_

#include <json/json.h>

#include <string>

#include "common/export.h"

namespace TARN::TARNOTIFYD {

enum MonitorQueueType { MONITOR_QUEUE_TYPE_APPLICATION = 1 };

// May be called from any thread; blocks until the configuration is on disk.
//
// One queue's configuration: {"queue": file, "config": [{"path", "mask", "ignore": [name, ...]}]}.
class QUARRY_EXPORT MonitorQueue {
 public:
  explicit MonitorQueue(const Json::Value& config) : config_(config) {}

  const Json::Value& Config() const { return config_; }

  // Registers `queue` for the application, in place of what was registered for the same queue
  // file. Durable when it returns true. False, with errno set and nothing changed, on failure.
  static bool Upsert(const MonitorQueue& queue, const std::string& application,
                     MonitorQueueType type);

  // Withdraws what the application registered for the queue file. True also when there was
  // nothing; false, with errno set and nothing changed, on failure.
  static bool Delete(const std::string& queue_path, const std::string& application,
                     MonitorQueueType type);

 private:
  Json::Value config_;
};

}  // namespace TARN::TARNOTIFYD

#endif  // QUARRY_PLATFORM_INCLUDE_MONITOR_H_
