#include "platform/linux/monitor_move.h"

#include <functional>
#include <vector>

#include "platform/include/monitor.h"
#include "platform/linux/monitor_registry.h"
#include "platform/linux/path_name.h"

namespace quarry::platform {
namespace {

using TARN::TARNOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION;
using TARN::TARNOTIFYD::MonitorQueue;

// Calls `action` for each registration for the queue, until one fails.
bool ForEachRegistration(const std::string& queue,
                         const std::function<bool(const Json::Value&)>& action) {
  std::vector<std::string> files;
  if (!ListRegistrationFiles(&files)) return false;
  for (const std::string& file : files) {
    Json::Value document;
    if (!ReadRegistrationFile(file, &document) || document["queue"] != queue) continue;
    if (!action(document)) return false;
  }
  return true;
}

std::string Moved(const std::string& path, const MonitorMove& move) {
  if (!IsSameOrBelow(path, move.old_path)) return path;
  return move.new_path + path.substr(move.old_path.size());
}

bool Copy(const Json::Value& document, const MonitorMove& move) {
  Json::Value registration;
  registration["queue"] = move.new_queue;
  registration["config"] = document["config"];
  for (Json::Value& entry : registration["config"]) {
    entry["path"] = Moved(entry["path"].asString(), move);
  }
  return MonitorQueue::Upsert(MonitorQueue(registration), document["application"].asString(),
                              MONITOR_QUEUE_TYPE_APPLICATION);
}

}  // namespace

bool CopyRegistrations(const MonitorMove& move) {
  return ForEachRegistration(move.old_queue,
                             [&](const Json::Value& document) { return Copy(document, move); });
}

bool RemoveRegistrations(const std::string& queue) {
  return ForEachRegistration(queue, [&](const Json::Value& document) {
    return MonitorQueue::Delete(queue, document["application"].asString(),
                                MONITOR_QUEUE_TYPE_APPLICATION);
  });
}

}  // namespace quarry::platform
