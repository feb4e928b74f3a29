// Registering with the file-change monitor; monitor_registry.h describes the files.

#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <string>

#include "common/json.h"
#include "platform/include/monitor.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/monitor_registry.h"
#include "platform/linux/path_name.h"

namespace quarry::platform {
namespace {

bool IsApplicationName(const std::string& name) {
  return !name.empty() && name.size() <= 64 && name.front() != '.' &&
         name.find_first_not_of(
             "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789._") ==
             std::string::npos;
}

// The file of a registration, empty, with errno set, when it cannot be named. An application's name
// has no "-", so that no two pairs share a file.
std::string FileFor(const std::string& queue_path, const std::string& application) {
  // A root with a "//" or a "." in it is still the same root.
  const std::string queue = std::filesystem::path(queue_path).lexically_normal();
  if (!IsApplicationName(application) || queue.find('\0') != std::string::npos ||
      !IsPlainAbsolutePath(queue)) {
    errno = EINVAL;
    return std::string();
  }
  std::string name = application + "-" + NameForPath(queue);
  constexpr std::size_t kMaxNameBytes = 240;
  if (name.size() > kMaxNameBytes) {
    // The hash at the end of a long name is of the whole path, so the middle can go.
    const std::string end = NameForPath(queue + "/" + std::string(kMaxNameBytes, 'x'));
    name = application + "-" + end.substr(end.rfind('~'));
  }
  return MonitorDirectory() + "/" + name + ".json";
}

bool RemoveDurably(const std::string& file) {
  const int before = errno;
  if (unlink(file.c_str()) == 0) return SyncDirectory(MonitorDirectory());
  if (errno != ENOENT) return false;
  errno = before;
  return true;
}

}  // namespace
}  // namespace quarry::platform

namespace TARN::TARNOTIFYD {

using namespace quarry::platform;

bool MonitorQueue::Upsert(const MonitorQueue& queue, const std::string& application,
                          MonitorQueueType type) {
  const Json::Value& config = queue.Config();
  Json::Value document;
  document["application"] = application;
  document["type"] = static_cast<int>(type);
  if (config.isObject()) {
    document["queue"] = config["queue"];
    document["config"] = config["config"];
  }
  MonitorRegistration registration;
  if (!ParseRegistration(document, &registration)) {
    errno = EINVAL;
    return false;
  }
  const std::string file = FileFor(registration.queue, application);
  if (file.empty()) return false;
  // The monitor makes the directory, too, but nobody has been told yet that it will last.
  return MakeDirectories(MonitorDirectory(), 0750) &&
         SyncDirectory(ParentDirectory(MonitorDirectory())) &&
         WriteFileDurably(file, quarry::toString(document) + "\n");
}

bool MonitorQueue::Delete(const std::string& queue_path, const std::string& application,
                          MonitorQueueType) {
  const std::string file = FileFor(queue_path, application);
  return !file.empty() && RemoveDurably(file);
}

}  // namespace TARN::TARNOTIFYD
