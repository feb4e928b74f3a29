#include "fileindex/config/folder.h"

#include <ctime>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "common/sdk/share.h"
#include "fileindex/config/status_mgr.h"
#include "fileindex/queue/queue_mgr.h"
#include "fileindex/util/util.h"

namespace quarry::fileindex {
namespace {

constexpr char kPath[] = "path";
constexpr char kName[] = "name";
constexpr char kDocumentSwitch[] = "document";
constexpr char kAudioSwitch[] = "audio";
constexpr char kVideoSwitch[] = "video";
constexpr char kPhotoSwitch[] = "photo";
constexpr char kPrivileged[] = "privileged";
constexpr char kPaused[] = "paused";
constexpr char kVolumeToBeClean[] = "volume_to_be_clean";
constexpr char kAdditional[] = "additional";
constexpr char kStatus[] = "status";

void RequireObject(const Json::Value& value) {
  if (!isObject(value)) throw Error(kErrorBadParameter, "Not an object" + AppendData(value));
}

// A pause that is stored stays stored when its end passes; whoever reads it looks at the clock.
bool IsPauseInForce(long long pause_end) {
  return pause_end == 0 || pause_end > static_cast<long long>(time(nullptr));
}

}  // namespace

Folder::Folder(const std::string& path, const std::string& name, bool document, bool audio,
               bool video, bool photo, bool privileged, bool paused)
    : path_(path),
      name_(name),
      document_(document),
      audio_(audio),
      video_(video),
      photo_(photo),
      privileged_(privileged),
      paused_(paused) {}

Folder::Folder(const Json::Value& json) {
  GetJsonValue(path_, json, kPath, true);
  GetJsonValue(name_, json, kName, true);
  GetJsonValue(document_, json, kDocumentSwitch, true);
  GetJsonValue(audio_, json, kAudioSwitch, true);
  GetJsonValue(video_, json, kVideoSwitch, true);
  GetJsonValue(photo_, json, kPhotoSwitch, true);
  GetJsonValue(privileged_, json, kPrivileged, false);
  GetJsonValue(paused_, json, kPaused, false);
  GetJsonValue(volume_to_be_clean_, json, kVolumeToBeClean, false);
}

void Folder::SetPath(const std::string& path) {
  path_ = path;
  derived_ = Derived();
}

std::string Folder::GetShare() const {
  return Share();
}

void Folder::SetShare(const std::string& new_share) {
  path_ = ReplacePathShare(path_, new_share, Share());
  derived_.share = new_share;
}

std::string Folder::GetFullPath() const {
  return FullPath();
}

Json::Value Folder::GetData() const {
  Json::Value data = GetIndexCfg();
  data[kPath] = path_;
  data[kName] = name_;
  data[kPaused] = paused_;
  data[kPrivileged] = privileged_;
  data[kVolumeToBeClean] = volume_to_be_clean_;
  return data;
}

Json::Value Folder::GetIndexCfg() const {
  Json::Value cfg(Json::objectValue);
  cfg[kDocumentSwitch] = document_;
  cfg[kAudioSwitch] = audio_;
  cfg[kVideoSwitch] = video_;
  cfg[kPhotoSwitch] = photo_;
  return cfg;
}

bool Folder::IsIndexing() const {
  const sdk::SDKShare share(Share());
  QueueMgr queue(share.GetQueuePath());
  return queue.IsFullPathProcessing(FullPath());
}

void Folder::GetStatus(Json::Value& out) const {
  RequireObject(out);
  const StatusMgr status;
  if (!CanPathBeIndexed(path_)) {
    out["text"] = "error";
    out["desc"] = "invalid_path";
  } else if ((status.GetShareStatus(Share()) & kShareNeedReindex) != 0) {
    out["text"] = "need_reindex";
  } else if (!IsIndexing()) {
    out["text"] = "finished";
  } else {
    out["text"] = IsPauseInForce(status.GetPauseInfo()) ? "paused" : "processing";
  }
}

Json::Value Folder::GetDataWithAdditional(const Json::Value& additional) const {
  Json::Value data = GetData();
  if (!additional.isArray()) {
    Fail(QUARRY_SITE_AT("folder", 46), "!addiitionals.isArray()", kErrorBadParameter,
         toString(additional));
  }
  for (const Json::Value& it : additional) {
    if (!it.isString()) {
      Fail(QUARRY_SITE_AT("folder", 49), "!it.isString()", kErrorBadParameter, toString(it));
    }
    if (it.asString() != kStatus) {
      throw Error(kErrorBadParameter, "Unknown additioal: " + it.asString());
    }
    GetStatus(data[kAdditional][kStatus]);
  }
  return data;
}

const std::string& Folder::Share() const {
  if (derived_.share.empty()) derived_.share = GetShareNameByPath(path_);
  return derived_.share;
}

const std::string& Folder::FullPath() const {
  if (derived_.full_path.empty()) derived_.full_path = fileindex::GetFullPath(path_);
  return derived_.full_path;
}

bool Folder::Covers(const std::string& full_path) const {
  const std::string& own = FullPath();
  if (full_path.size() < own.size()) return false;
  // The end of the prefix tells neighbours apart sooner than its beginning, which they share.
  if (full_path.size() > own.size() && full_path[own.size()] != '/') return false;
  return full_path.compare(0, own.size(), own) == 0;
}

}  // namespace quarry::fileindex
