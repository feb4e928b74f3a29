#include "daemons/tarnelasticd/registry.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <utility>

#include "common/error.h"
#include "common/json.h"
#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {
namespace {

constexpr int kVersion = 1;

Json::Value ToJson(const IndexRecord& record) {
  Json::Value json;
  json["id"] = record.id;
  json["path"] = record.path;
  if (!record.moving_from.empty()) json["moving_from"] = record.moving_from;
  json["paused"] = record.paused;
  json["settings"] = record.settings;
  json["mappings"] = record.mappings;
  json["event_handler"] = record.event_handler;
  return json;
}

[[noreturn]] void FailLoad(const std::string& path) {
  throw Error(kErrorLoadFile, "The list of indexes cannot be read: " + path);
}

IndexRecord FromJson(const Json::Value& json, const std::string& path) {
  IndexRecord record;
  try {
    GetJsonValue<std::string>(record.id, json, "id", true);
    GetJsonValue<std::string>(record.path, json, "path", true);
    GetJsonValue<std::string>(record.moving_from, json, "moving_from", false);
    GetJsonValue<bool>(record.paused, json, "paused", true);
  } catch (const Error&) {
    FailLoad(path);
  }
  record.settings = json["settings"];
  record.mappings = json["mappings"];
  record.event_handler = json["event_handler"];
  return record;
}

bool IsMissing(const std::string& path) {
  struct stat info {};
  return lstat(path.c_str(), &info) != 0 && errno == ENOENT;
}

}  // namespace

Registry::Registry(std::string path) : path_(std::move(path)) {
  if (IsMissing(path_)) return;
  Json::Value root;
  // Starting with an empty list instead would make all indexes unknown for good.
  if (!fromFile(root, path_) || !root.isObject() || !root["indexes"].isArray() ||
      root["version"] != Json::Value(kVersion)) {
    FailLoad(path_);
  }
  for (const Json::Value& json : root["indexes"]) {
    IndexRecord record = FromJson(json, path_);
    records_[record.id] = std::move(record);
  }
}

const IndexRecord* Registry::Find(const std::string& id) const {
  const auto found = records_.find(id);
  return found == records_.end() ? nullptr : &found->second;
}

bool Registry::IsPathTaken(const std::string& path, const std::string& id) const {
  for (const auto& [other, record] : records_) {
    if (other != id && (record.path == path || record.moving_from == path)) return true;
  }
  return false;
}

void Registry::Put(const IndexRecord& record) {
  Replace(record.id, record);
}

void Registry::Remove(const std::string& id) {
  std::map<std::string, IndexRecord> records = records_;
  records.erase(id);
  Save(std::move(records));
}

void Registry::Replace(const std::string& id, const IndexRecord& record) {
  std::map<std::string, IndexRecord> records = records_;
  records.erase(id);
  records[record.id] = record;
  Save(std::move(records));
}

void Registry::Save(std::map<std::string, IndexRecord> records) {
  Json::Value root;
  root["version"] = kVersion;
  root["indexes"] = Json::Value(Json::arrayValue);
  for (const auto& [id, record] : records) root["indexes"].append(ToJson(record));
  std::error_code failure;
  std::filesystem::create_directories(std::filesystem::path(path_).parent_path(), failure);
  if (!toFile(root, path_)) {
    const int saved = errno;
    const int code = saved == ENOSPC || saved == EDQUOT ? kDiskFull : kStorageFailed;
    throw Error(code, "Cannot write " + path_ + ": " + strerror(saved));
  }
  records_ = std::move(records);
}

}  // namespace quarry::engine
