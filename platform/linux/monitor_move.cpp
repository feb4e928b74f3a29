#include "platform/linux/monitor_move.h"

#include <cerrno>
#include <filesystem>
#include <functional>
#include <system_error>
#include <vector>

#include "common/json.h"
#include "common/paths.h"
#include "platform/include/monitor.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/path_name.h"

namespace quarry::platform {
namespace {

using TARN::TARNOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION;
using TARN::TARNOTIFYD::MonitorQueue;

// A share's list of folders is bounded, and so is what is registered of them.
constexpr std::size_t kMaxFileBytes = std::size_t{16} << 20;

// Whether the file holds a registration for the queue. One that is no such document concerns no
// queue.
bool ReadRegistration(const std::string& file, const std::string& queue, Json::Value* document) {
  std::string text;
  return ReadWholeFile(file, kMaxFileBytes, &text) && fromString(*document, text) &&
         document->isObject() && (*document)["queue"] == queue &&
         (*document)["application"].isString() && (*document)["config"].isArray();
}

// The files of all registrations. False, with errno set, when they cannot be listed.
bool ListFiles(std::vector<std::string>* files) {
  std::error_code failure;
  std::filesystem::directory_iterator entry(RootedPath("/var/lib/quarry/monitor"), failure);
  if (failure == std::errc::no_such_file_or_directory) return true;
  for (const std::filesystem::directory_iterator end; !failure && entry != end;
       entry.increment(failure)) {
    if (entry->path().extension() == ".json") files->push_back(entry->path());
  }
  if (failure) errno = failure.value();
  return !failure;
}

// Calls `action` for each registration for the queue, until one fails.
bool ForEachRegistration(const std::string& queue,
                         const std::function<bool(const Json::Value&)>& action) {
  std::vector<std::string> files;
  if (!ListFiles(&files)) return false;
  for (const std::string& file : files) {
    Json::Value document;
    if (ReadRegistration(file, queue, &document) && !action(document)) return false;
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
    if (!entry.isObject() || !entry["path"].isString()) continue;  // Upsert refuses it
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
