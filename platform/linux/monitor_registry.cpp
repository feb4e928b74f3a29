#include "platform/linux/monitor_registry.h"

#include <cerrno>
#include <cstddef>
#include <filesystem>
#include <system_error>

#include "common/json.h"
#include "common/paths.h"
#include "platform/linux/durable_file.h"

namespace quarry::platform {
namespace {

// A share's list of folders is bounded, and so is what is registered of them.
constexpr std::size_t kMaxFileBytes = std::size_t{16} << 20;

// No names are an empty list.
bool ParseNames(const Json::Value& names, std::vector<std::string>* out) {
  if (names.isNull()) return true;
  if (!names.isArray()) return false;
  for (const Json::Value& name : names) {
    if (!name.isString()) return false;
    out->push_back(name.asString());
  }
  return true;
}

bool ParsePlace(const Json::Value& entry, WatchedPlace* place) {
  if (!entry.isObject() || !entry["path"].isString() || !entry["mask"].isIntegral()) return false;
  place->path = entry["path"].asString();
  // Bits beyond those of a mask mean nothing.
  place->mask = static_cast<std::uint32_t>(entry["mask"].isUInt64() ? entry["mask"].asUInt64() : 0);
  return ParseNames(entry["ignore"], &place->ignore);
}

}  // namespace

const std::string& MonitorDirectory() {
  static const std::string directory = RootedPath("/var/lib/quarry/monitor");
  return directory;
}

bool ListRegistrationFiles(std::vector<std::string>* files) {
  std::error_code failure;
  std::filesystem::directory_iterator entry(MonitorDirectory(), failure);
  if (failure == std::errc::no_such_file_or_directory) return true;
  for (const std::filesystem::directory_iterator end; !failure && entry != end;
       entry.increment(failure)) {
    if (entry->path().extension() == ".json") files->push_back(entry->path());
  }
  if (failure) errno = failure.value();
  return !failure;
}

bool ReadRegistrationFile(const std::string& file, Json::Value* document) {
  std::string text;
  if (!ReadWholeFile(file, kMaxFileBytes, &text)) return false;
  MonitorRegistration registration;
  if (fromString(*document, text) && ParseRegistration(*document, &registration)) return true;
  errno = EINVAL;
  return false;
}

bool ParseRegistration(const Json::Value& document, MonitorRegistration* registration) {
  if (!document.isObject() || !document["application"].isString() ||
      !document["queue"].isString() || !document["config"].isArray()) {
    return false;
  }
  registration->application = document["application"].asString();
  registration->queue = document["queue"].asString();
  registration->places.clear();
  for (const Json::Value& entry : document["config"]) {
    if (!ParsePlace(entry, &registration->places.emplace_back())) return false;
  }
  return true;
}

}  // namespace quarry::platform
