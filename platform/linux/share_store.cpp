#include "platform/linux/share_store.h"

#include <json/json.h>
#include <sys/stat.h>

#include <atomic>
#include <cerrno>
#include <cstring>
#include <mutex>
#include <set>

#include "common/error.h"
#include "common/json.h"
#include "common/paths.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/last_error.h"
#include "platform/linux/path_name.h"
#include "platform/linux/share_move.h"

namespace quarry::platform {
namespace {

constexpr std::size_t kMaxFileBytes = std::size_t{16} << 20;

[[noreturn]] void Bad(const std::string& what) {
  throw Error(kErrorLoadFile, "The share file " + ShareFilePath() + " " + what);
}

std::string TextOf(const Json::Value& share, const char* key) {
  if (!share[key].isString()) Bad(std::string("has a share without the text \"") + key + "\"");
  return share[key].asString();
}

bool FlagOf(const Json::Value& share, const char* key) {
  const Json::Value& value = share[key];
  if (value.isNull()) return false;
  if (!value.isBool()) Bad(std::string("has a share whose \"") + key + "\" is not true or false");
  return value.asBool();
}

ShareRecord RecordOf(const Json::Value& share) {
  if (!share.isObject()) Bad("has a share that is no object");
  ShareRecord record;
  record.name = TextOf(share, "name");
  record.path = TextOf(share, "path");
  record.encrypted = FlagOf(share, "encrypted");
  record.encryption = FlagOf(share, "encryption");
  record.read_only = FlagOf(share, "read_only");
  record.hide_unreadable = FlagOf(share, "hide_unreadable");
  record.recycle_bin = FlagOf(share, "recycle_bin");
  if (share.isMember("moved_from")) record.moved_from = TextOf(share, "moved_from");
  try {
    ValidateShare(record);
  } catch (const Error& error) {
    Bad("has a share that cannot be used: " + error.reason());
  }
  return record;
}

// Which file was read, and when it was last changed. The file is replaced, never written in place,
// so an unchanged stamp is an unchanged text.
struct Stamp {
  dev_t device = 0;
  ino_t inode = 0;
  off_t size = -1;
  timespec changed{};
};

bool operator==(const Stamp& a, const Stamp& b) {
  return a.device == b.device && a.inode == b.inode && a.size == b.size &&
         a.changed.tv_sec == b.changed.tv_sec && a.changed.tv_nsec == b.changed.tv_nsec;
}

// The stamp of the share file; false when there is none.
bool ReadStamp(Stamp* stamp) {
  struct stat info {};
  if (stat(ShareFilePath().c_str(), &info) != 0) {
    if (errno == ENOENT) return false;
    Bad(std::string("cannot be looked at: ") + std::strerror(errno));
  }
  *stamp = {info.st_dev, info.st_ino, info.st_size, info.st_ctim};
  return true;
}

ShareList ReadFromFile() {
  std::string text;
  if (!ReadWholeFile(ShareFilePath(), kMaxFileBytes, &text)) {
    if (errno == ENOENT) return std::make_shared<const std::vector<ShareRecord>>();
    Bad(std::string("cannot be read: ") + std::strerror(errno));
  }
  return std::make_shared<const std::vector<ShareRecord>>(ParseShares(text));
}

struct Cache {
  std::mutex mutex;
  Stamp stamp;
  ShareList shares;
};

std::atomic<bool> moving_shown{false};

Cache& TheCache() {
  static Cache& cache = *new Cache;  // outlives every thread
  return cache;
}

}  // namespace

const std::string& ShareFilePath() {
  static const std::string path = RootedPath("/etc/quarry/shares.json");
  return path;
}

std::vector<ShareRecord> ParseShares(const std::string& text) {
  Json::Value root;
  if (!fromString(root, text)) Bad("is no JSON document");
  if (!root.isObject() || !root["shares"].isArray()) Bad("has no list \"shares\"");
  std::vector<ShareRecord> shares;
  std::set<std::string> names;
  for (const Json::Value& share : root["shares"]) {
    shares.push_back(RecordOf(share));
    if (!names.insert(shares.back().name).second) {
      Bad("has two shares called \"" + shares.back().name + "\"");
    }
  }
  return shares;
}

ShareList LoadShares() {
  Cache& cache = TheCache();
  const std::lock_guard<std::mutex> lock(cache.mutex);
  Stamp stamp;
  if (!ReadStamp(&stamp)) {
    cache.shares = std::make_shared<const std::vector<ShareRecord>>();
    cache.stamp = Stamp();
  } else if (cache.shares == nullptr || !(stamp == cache.stamp)) {
    cache.shares = nullptr;
    cache.shares = ReadFromFile();
    // A stamp that is older than the text only makes the next call read once more.
    cache.stamp = stamp;
  }
  return cache.shares;
}

ShareList TryLoadShares() {
  try {
    const int before = errno;
    ShareList shares = LoadShares();
    errno = before;
    return shares;
  } catch (const Error&) {
    QUARRY_PLATFORM_FAIL(kErrShareFile);
    return nullptr;
  }
}

void ShowMovingShares(bool show) {
  moving_shown = show;
}

bool IsShown(const ShareRecord& share) {
  return share.moved_from.empty() || moving_shown;
}

const ShareRecord* ShareHolding(const std::vector<ShareRecord>& shares, const std::string& path) {
  const ShareRecord* deepest = nullptr;
  for (const ShareRecord& share : shares) {
    if (!IsSameOrBelow(path, share.path)) continue;
    if (deepest == nullptr || share.path.size() > deepest->path.size()) deepest = &share;
  }
  return deepest;
}

}  // namespace quarry::platform
