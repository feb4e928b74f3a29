#include "cli/monitor_status.h"

#include <algorithm>
#include <fstream>
#include <string>

#include "cli/output.h"
#include "daemons/common/status_file.h"

namespace quarry::cli {
namespace {

constexpr char kLimit[] = "fs.inotify.max_user_watches";

// Twice what it is, and at least what a large share needs.
std::string HigherLimit() {
  std::uint64_t limit = 0;
  std::ifstream("/proc/sys/fs/inotify/max_user_watches") >> limit;
  return std::string(kLimit) + "=" +
         std::to_string(
             std::max(std::uint64_t{1'000'000}, 2 * std::min(limit, std::uint64_t{1} << 30)));
}

std::uint64_t Overflows(const Json::Value& monitor) {
  std::uint64_t sum = 0;
  for (const Json::Value& queue : monitor["queues"]) sum += queue["overflows"].asUInt64();
  return sum;
}

std::string Count(std::uint64_t number, const std::string& one, const std::string& many) {
  return std::to_string(number) + " " + (number == 1 ? one : many);
}

std::string InWords(const Json::Value& monitor) {
  const std::uint64_t file_systems = monitor["file_systems"].asUInt64();
  std::string text = monitor["source"].asString() + " watches ";
  if (file_systems > 0) text += Count(file_systems, "file system", "file systems") + " and ";
  text += Count(monitor["directories"].asUInt64(), "directory", "directories") + " for " +
          Count(monitor["queues"].size(), "queue", "queues");
  return text + ", " + Count(Overflows(monitor), "overflow", "overflows") + " since the start";
}

}  // namespace

Json::Value MonitorStatus() {
  Json::Value status = daemon::ReadStatusFile("tarnotifyd");
  const bool is_running = !status.isNull();
  status["running"] = is_running;
  if (!status.isMember("unwatched")) return status;
  for (Json::Value& place : status["unwatched"]) {
    if (place["reason"].asString().find(kLimit) != std::string::npos) {
      place["sysctl"] = HigherLimit();
    }
  }
  return status;
}

void PrintMonitor(std::ostream& out, const Json::Value& monitor) {
  if (!monitor["running"].asBool()) {
    out << "Changes are not followed, since tarnotifyd does not run; they are found when it "
           "does.\n";
    return;
  }
  if (!monitor.isMember("source")) {
    out << "Changes: tarnotifyd starts.\n";
    return;
  }
  out << "Changes: " << InWords(monitor) << ".\n";
  for (const Json::Value& place : monitor["unwatched"]) {
    out << "  Not all in " << Printable(place["path"].asString())
        << " can be watched: " << Printable(place["reason"].asString())
        << ". Changes there are found within ten minutes.\n";
    if (place.isMember("sysctl")) {
      out << "  Raise the limit with: sysctl " << place["sysctl"].asString() << "\n";
    }
  }
  for (const Json::Value& queue : monitor["queues"]) {
    if (queue["problem"].asString().empty()) continue;
    out << "  The queue " << Printable(queue["queue"].asString())
        << " cannot be written: " << Printable(queue["problem"].asString()) << ".\n";
  }
}

}  // namespace quarry::cli
