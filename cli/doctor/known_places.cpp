#include "cli/doctor/known_places.h"

#include <algorithm>
#include <filesystem>
#include <system_error>

#include "cli/doctor/state_text.h"
#include "cli/problem.h"
#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
#include "common/paths.h"

namespace quarry::cli {
namespace {

constexpr char kIndexPrefix[] = "fileindex_";

// The byte of two hexadecimal digits, or -1.
int Byte(const std::string& digits) {
  if (digits.size() != 2 || digits.find_first_not_of("0123456789ABCDEF") != std::string::npos) {
    return -1;
  }
  return std::stoi(digits, nullptr, 16);
}

// The full path that a queue or an index directory is named after, "" when that does not tell.
std::string PathOfName(const std::string& name) {
  std::string path = "/";
  for (std::size_t i = 0; i < name.size(); ++i) {
    if (name[i] == '~') return "";  // only a hash of the path follows
    if (name[i] == '%') {
      const int byte = Byte(name.substr(i + 1, 2));
      if (byte <= 0) return "";
      path += static_cast<char>(byte);
      i += 2;
    } else {
      path += name[i] == '+' ? '/' : name[i];
    }
  }
  return path;
}

Registration ReadRegistration(const std::string& file) {
  Registration registration;
  registration.file = file;
  Json::Value document;
  if (!fromString(document, ReadStateText(file).text)) return registration;
  try {
    Json::Value config;
    GetJsonValue<std::string>(registration.queue, document, "queue", true);
    GetJsonValue<Json::Value>(config, document, "config", true);
    if (!config.isArray()) return registration;
    for (const Json::Value& entry : config) {
      GetJsonValue<std::string>(registration.places.emplace_back(), entry, "path", true);
      unsigned int mask = 0;
      GetJsonValue<unsigned int>(mask, entry, "mask", true);
    }
    registration.whole = true;
  } catch (const Error&) {
    registration.places.clear();
  }
  return registration;
}

}  // namespace

const std::string& EngineListPath() {
  static const std::string path = RootedPath("/var/lib/quarry/engine/indexes.json");
  return path;
}

const std::string& MonitorDirectory() {
  static const std::string path = RootedPath("/var/lib/quarry/monitor");
  return path;
}

std::map<std::string, std::string> SharesWithIndex() {
  std::map<std::string, std::string> shares;
  for (const Json::Value& index : WholeObjects(ReadStateText(EngineListPath()).text)) {
    if (!index["id"].isString() || !index["path"].isString()) continue;
    const std::string id = index["id"].asString();
    if (!StringStartWith(id, kIndexPrefix)) continue;
    const std::string name = id.substr(sizeof(kIndexPrefix) - 1);
    const std::string path = PathOfName(Basename(index["path"].asString()));
    if (!name.empty() && Basename(path) == name) shares[name] = path;
  }
  return shares;
}

std::vector<Registration> Registrations() {
  std::vector<Registration> registrations;
  std::error_code failure;
  std::filesystem::directory_iterator entry(MonitorDirectory(), failure);
  if (failure == std::errc::no_such_file_or_directory) return registrations;
  for (const std::filesystem::directory_iterator end; !failure && entry != end;
       entry.increment(failure)) {
    const std::string name = entry->path().filename();
    if (entry->path().extension() != ".json" || !StringStartWith(name, "fileindex-")) continue;
    registrations.push_back(ReadRegistration(entry->path()));
  }
  if (failure) throw Problem("Cannot list " + MonitorDirectory() + ": " + failure.message());
  std::sort(registrations.begin(), registrations.end(),
            [](const Registration& a, const Registration& b) { return a.file < b.file; });
  return registrations;
}

}  // namespace quarry::cli
