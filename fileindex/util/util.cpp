#include "fileindex/util/util.h"

#include <algorithm>
#include <climits>
#include <cstdlib>
#include <vector>

#include "common/error.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/sdk/share.h"
#include "platform/include/filesystem.h"
#include "platform/include/recycle.h"
#include "platform/include/share.h"

namespace quarry::fileindex {
namespace {

constexpr size_t kShareNameBytes = 492;
constexpr size_t kPathBytes = 4096;

// The kind of recycle bin that the platform is asked for.
constexpr int kHomeRecycleBin = 11;

const std::vector<std::string> kPreservedFileNames = {".TemporaryItems", ".TARNPPSDB", ".DS_Store"};

bool Contains(const std::string& text, const char* part) {
  return text.find(part) != std::string::npos;
}

// The platform takes C strings: behind a NUL byte it would not see the rest of a path.
bool HasNul(const std::string& path) {
  return path.find('\0') != std::string::npos;
}

bool IsInSnapshot(const std::string& full_path) {
  int in_snapshot = 0;
  return Contains(full_path, "#snapshot") &&
         HLIBFhsPathInSnapshot(full_path.c_str(), &in_snapshot) == 0 && in_snapshot == 1;
}

bool IsOnLocalFileSystem(const std::string& full_path) {
  const int type = TARNGetFSType(full_path.c_str(), 0);
  return type >= 0 && TARNFSIsRemoteFS(type) == 0 && TARNFSIsImageFS(type) == 0 &&
         type != kTARNFSTypeRefused;
}

// An encrypted share is mounted at its own path, which does not make it foreign.
bool IsForeignMountPoint(const std::string& full_path, const sdk::SDKShare& share) {
  return TARNFSDirIsMntPoint(full_path.c_str()) == 1 && !share.IsEncryption();
}

bool IsCanonical(const std::string& full_path) {
  char resolved[PATH_MAX] = {};
  return realpath(full_path.c_str(), resolved) != nullptr && full_path == resolved;
}

}  // namespace

void GetShareNameByPath(std::string& share_name, const std::string& share_path) {
  if (share_path.empty() || share_path.front() != '/') {
    Fail(QUARRY_SITE_AT("util", 800), "1 > share_path.size() || '/' != share_path.at(0)",
         kErrorBadParameter, share_path);
  }
  if (HasNul(share_path)) throw Error(kErrorBadParameter, share_path);
  share_name = share_path.substr(1, share_path.find('/', 1) - 1);
}

std::string GetShareNameByPath(const std::string& share_path) {
  std::string share_name;
  GetShareNameByPath(share_name, share_path);
  return share_name;
}

void GetFullPath(std::string& full_path, const std::string& share_path) {
  const sdk::SDKShare share(GetShareNameByPath(share_path));
  full_path = Dirname(share.GetPath()) + share_path;
}

std::string GetFullPath(const std::string& share_path) {
  std::string full_path;
  GetFullPath(full_path, share_path);
  return full_path;
}

void GetShareNamePathByFullPath(std::string& share_name, std::string& share_path,
                                const std::string& full_path) {
  char name[kShareNameBytes] = {};
  char path[kPathBytes] = {};
  int result = -1;
  if (!HasNul(full_path)) {
    const LockMutex lock(sdk::SDKMutex());
    result = TARNShareNamePathGet(full_path.c_str(), name, sizeof(name), path, sizeof(path));
  }
  if (result < 0) {
    Fail(QUARRY_SITE_AT("util", 789),
         "0 > TARNShareNamePathGet(full_path.c_str(), szShareName, sizeof(szShareName), "
         "szSharePath, sizeof(szSharePath))",
         kErrorSystem, "TARNShareNamePathGet failed, full_path=" + full_path);
  }
  share_name = name;
  share_path = path;
}

bool IsFullPathInRecycleBin(const std::string& full_path) {
  std::string share_name;
  std::string share_path;
  GetShareNamePathByFullPath(share_name, share_path, full_path);
  const LockMutex lock(sdk::SDKMutex());
  if (Contains(full_path, "#recycle") && TARNShareIsShareRecycle(full_path.c_str()) == 1) {
    return true;
  }
  // The recycle bin of a home need not be called by its usual name.
  return share_name == "homes" &&
         TARNRecycleUserHomePathIsExist(full_path.c_str(), kHomeRecycleBin) == 1;
}

bool CanFullPathBeIndexed(const std::string& full_path) {
  if (HasNul(full_path) || IsInSnapshot(full_path) || !IsOnLocalFileSystem(full_path)) return false;
  std::string share_name;
  std::string share_path;
  GetShareNamePathByFullPath(share_name, share_path, full_path);
  const sdk::SDKShare share(share_name);
  return share.CanBeIndexed() && !IsFullPathInRecycleBin(full_path) &&
         !IsForeignMountPoint(full_path, share) && IsCanonical(full_path);
}

bool CanPathBeIndexed(const std::string& share_path) {
  return CanFullPathBeIndexed(GetFullPath(share_path));
}

std::string ReplacePathShare(const std::string& path, const std::string& new_share,
                             const std::string& old_share) {
  const size_t pos = (path + "/").find("/" + old_share + "/");
  if (pos == std::string::npos) {
    Fail(QUARRY_SITE_AT("util", 993), "string::npos == pos", kErrorBadParameter,
         "Cannot find share: " + old_share);
  }
  return path.substr(0, pos + 1) + new_share + path.substr(pos + 1 + old_share.size());
}

bool IsSystemPreservedFileName(const std::string& name) {
  return TARNEAIsHiddenDir(name.c_str()) == 1 ||
         std::find(kPreservedFileNames.begin(), kPreservedFileNames.end(), name) !=
             kPreservedFileNames.end();
}

}  // namespace quarry::fileindex
