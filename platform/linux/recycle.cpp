#include "platform/include/recycle.h"

#include <string>

#include "platform/linux/last_error.h"
#include "platform/linux/path_name.h"
#include "platform/linux/share_store.h"

namespace quarry::platform {
namespace {

constexpr char kRecycleName[] = "#recycle";
constexpr char kHomesShare[] = "homes";
constexpr int kHomeRecycleKind = 11;

// Takes the first component off `*path`, which begins with "/" or is empty.
std::string TakeComponent(std::string* path) {
  if (path->empty()) return std::string();
  std::size_t end = path->find('/', 1);
  if (end == std::string::npos) end = path->size();
  std::string component = path->substr(1, end - 1);
  path->erase(0, end);
  return component;
}

// Finds the share that holds `full_path`, and where in it that is. False when none does.
bool SplitPath(const char* full_path, ShareRecord* share, std::string* rest) {
  if (full_path == nullptr || *full_path != '/') return false;
  const ShareList shares = TryLoadShares();
  if (shares == nullptr) return false;
  const std::string path = full_path;
  const ShareRecord* holder = ShareHolding(*shares, path);
  if (holder == nullptr) return false;
  *share = *holder;
  *rest = path.substr(share->path.size());
  return true;
}

}  // namespace

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" {

// Where the recycle bin is switched off, a directory of its name is one like any other.
int TARNShareIsShareRecycle(const char* full_path) {
  ShareRecord share;
  std::string rest;
  if (!SplitPath(full_path, &share, &rest)) return QUARRY_PLATFORM_FAIL(kErrNotFound);
  return share.recycle_bin && TakeComponent(&rest) == kRecycleName ? 1 : 0;
}

int TARNRecycleUserHomePathIsExist(const char* full_path, int kind) {
  ShareRecord share;
  std::string rest;
  if (kind != kHomeRecycleKind) return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  if (!SplitPath(full_path, &share, &rest)) return QUARRY_PLATFORM_FAIL(kErrNotFound);
  if (!share.recycle_bin || share.name != kHomesShare || TakeComponent(&rest).empty()) return 0;
  return TakeComponent(&rest) == kRecycleName ? 1 : 0;
}

}  // extern "C"
