// How the change monitor does.

#ifndef QUARRY_CLI_MONITOR_STATUS_H_
#define QUARRY_CLI_MONITOR_STATUS_H_

#include <json/json.h>

#include <cstdint>
#include <ostream>

namespace quarry::cli {

// {"running"} and, while it runs, what tarnotifyd(8) says of itself: "pid" and, a moment after its
// start, "source", "file_systems", "directories", "unwatched" and "queues". An entry of "unwatched"
// for which the system's limit of watches is to be raised has "sysctl", the setting that does it.
Json::Value MonitorStatus();

// What a person wants to know of a MonitorStatus().
void PrintMonitor(std::ostream& out, const Json::Value& monitor);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_MONITOR_STATUS_H_
