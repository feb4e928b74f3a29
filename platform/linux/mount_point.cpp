#include "platform/linux/mount_point.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <vector>

#include "common/error.h"
#include "platform/include/filesystem.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/keep_errno.h"
#include "platform/linux/last_error.h"
#include "platform/linux/mount_info.h"
#include "platform/linux/share_store.h"

namespace quarry::platform {
namespace {

constexpr char kSnapshotName[] = "#snapshot";

// Whether a share begins at `path`. Shares that cannot be read make no difference here.
bool IsShareRoot(const std::string& path) {
  const KeepErrno keep;
  try {
    const ShareList shares = LoadShares();
    return std::any_of(shares->begin(), shares->end(),
                       [&](const ShareRecord& share) { return share.path == path; });
  } catch (const Error&) {
    return false;
  }
}

// Where mounts are listed by place; otherwise a directory on another device than its parent's is
// one, though a subvolume then passes for a mount.
bool IsMountByList(const std::string& path, const struct stat& info) {
  const std::vector<Mount> mounts = ReadMounts();
  if (!mounts.empty()) {
    return std::any_of(mounts.begin(), mounts.end(),
                       [&](const Mount& mount) { return mount.point == path; });
  }
  struct stat parent {};
  if (stat((path + "/..").c_str(), &parent) != 0) return false;
  return parent.st_dev != info.st_dev || parent.st_ino == info.st_ino;
}

// The end of the first component called "#snapshot" at or behind `begin`, or npos.
std::size_t EndOfSnapshotName(const std::string& path, std::size_t begin) {
  const std::string name = std::string("/") + kSnapshotName;
  while ((begin = path.find(name, begin)) != std::string::npos) {
    const std::size_t end = begin + name.size();
    if (end == path.size() || path[end] == '/') return end;
    begin = end;
  }
  return std::string::npos;
}

// Whether a directory called "#snapshot", or one on the way from it to the end of `path`, is on
// another device than the directory that holds it: every snapshot is a file system or a subvolume
// of its own, a folder of that name is not. False also when the path ends on the way.
bool EntersSnapshot(const std::string& path, std::size_t end) {
  const KeepErrno keep;
  struct stat above {};
  if (stat(ParentDirectory(path.substr(0, end)).c_str(), &above) != 0) return false;
  while (true) {
    struct stat here {};
    if (stat(path.substr(0, end).c_str(), &here) != 0) return false;
    if (here.st_dev != above.st_dev) return true;
    if (end >= path.size()) return false;
    end = std::min(path.find('/', end + 1), path.size());
  }
}

}  // namespace

int IsMountRoot(const std::string& path, bool ask_kernel) {
  struct statx info {};
  constexpr int kFlags = AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT;
  if (ask_kernel && statx(AT_FDCWD, path.c_str(), kFlags, STATX_BASIC_STATS, &info) == 0 &&
      (info.stx_attributes_mask & STATX_ATTR_MOUNT_ROOT) != 0) {
    return (info.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0 ? 1 : 0;
  }
  struct stat status {};
  if (lstat(path.c_str(), &status) != 0) return -1;
  return IsMountByList(path, status) ? 1 : 0;
}

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" {

int TARNFSDirIsMntPoint(const char* path) {
  if (path == nullptr || *path == '\0') return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  const int before = errno;
  const int mounted = IsMountRoot(path);
  if (mounted < 0) return QUARRY_PLATFORM_FAIL(kErrSystem);
  errno = before;
  return mounted == 1 && !IsShareRoot(path) ? 1 : 0;
}

int HLIBFhsPathInSnapshot(const char* path, int* in_snapshot) {
  if (path == nullptr || *path == '\0' || in_snapshot == nullptr) {
    return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  }
  *in_snapshot = 0;
  struct stat info {};
  if (lstat(path, &info) != 0) return QUARRY_PLATFORM_FAIL(kErrSystem);
  const std::string text = path;
  for (std::size_t end = EndOfSnapshotName(text, 0); end != std::string::npos;
       end = EndOfSnapshotName(text, end)) {
    if (EntersSnapshot(text, end)) {
      *in_snapshot = 1;
      break;
    }
  }
  return 0;
}

}  // extern "C"
