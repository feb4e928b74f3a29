// What is registered with the file-change monitor: one file for each application and queue in
// RootedPath("/var/lib/quarry/monitor"), named after both, ending in ".json":
//
//   {"application": "fileindex", "type": 1, "queue": file,
//    "config": [{"path": directory, "mask": bits, "ignore": [name, ...]}, ...]}
//
// Files are only ever replaced whole and removed, so any process may read them at any time.

#ifndef QUARRY_PLATFORM_LINUX_MONITOR_REGISTRY_H_
#define QUARRY_PLATFORM_LINUX_MONITOR_REGISTRY_H_

#include <json/json.h>

#include <cstdint>
#include <string>
#include <vector>

#include "common/export.h"

namespace quarry::platform {

struct WatchedPlace {
  std::string path;                 // a directory
  std::uint32_t mask = 0;           // bits of the events that are wanted
  std::vector<std::string> ignore;  // names that are left out at any depth

  bool operator==(const WatchedPlace&) const = default;
};

struct MonitorRegistration {
  std::string application;
  std::string queue;  // the file that takes the events
  std::vector<WatchedPlace> places;

  bool operator==(const MonitorRegistration&) const = default;
};

// The directory of the files. It need not exist.
QUARRY_EXPORT const std::string& MonitorDirectory();

// The full paths of all files of registrations, in no order. False, with errno set, when they
// cannot be listed. A missing directory has none.
QUARRY_EXPORT bool ListRegistrationFiles(std::vector<std::string>* files);

// Reads a file of the directory. False, with errno set, when there is none, or it holds no
// registration (EINVAL).
QUARRY_EXPORT bool ReadRegistrationFile(const std::string& file, Json::Value* document);

// Takes apart a document as it is described above. False when it is none.
QUARRY_EXPORT bool ParseRegistration(const Json::Value& document,
                                     MonitorRegistration* registration);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_MONITOR_REGISTRY_H_
