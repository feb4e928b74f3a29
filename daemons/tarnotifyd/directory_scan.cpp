#include "daemons/tarnotifyd/directory_scan.h"

#include <dirent.h>
#include <fcntl.h>
#include <linux/limits.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <cerrno>
#include <cstring>
#include <memory>

namespace quarry::notify {
namespace {

struct CloseDir {
  void operator()(DIR* dir) const { closedir(dir); }
};

bool IsDirectory(int dir, const dirent& entry) {
  if (entry.d_type != DT_UNKNOWN) return entry.d_type == DT_DIR;
  struct stat status {};
  return fstatat(dir, entry.d_name, &status, AT_SYMLINK_NOFOLLOW) == 0 && S_ISDIR(status.st_mode);
}

bool IsSelfOrParent(const char* name) {
  return std::strcmp(name, ".") == 0 || std::strcmp(name, "..") == 0;
}

}  // namespace

UniqueFd OpenDirectory(const std::string& path, bool to_read) {
  constexpr std::size_t kPiece = PATH_MAX - 1;
  constexpr int kWay = O_PATH | O_DIRECTORY | O_CLOEXEC;
  const int last = (to_read ? O_RDONLY : O_PATH) | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
  UniqueFd dir;
  std::size_t from = 0;
  // The system's calls take only so much of a path at a time.
  while (path.size() - from > kPiece) {
    const std::size_t end = path.rfind('/', from + kPiece);
    if (end == std::string::npos || end <= from) {
      errno = ENAMETOOLONG;
      return UniqueFd();
    }
    const std::string piece = path.substr(from, end - from);
    UniqueFd next(openat(dir.valid() ? dir.get() : AT_FDCWD, piece.c_str(), kWay));
    if (!next.valid()) return next;
    dir = std::move(next);
    from = end + 1;
  }
  return UniqueFd(
      openat(dir.valid() ? dir.get() : AT_FDCWD, path.c_str() + from, last | O_NONBLOCK));
}

bool Identify(int fd, DirectoryId* id) {
  struct statx status {};
  if (statx(fd, "", AT_EMPTY_PATH, STATX_BASIC_STATS, &status) != 0) return false;
  id->device = makedev(status.stx_dev_major, status.stx_dev_minor);
  id->inode = status.stx_ino;
  id->is_mount = (status.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
  return true;
}

void ForEachSubdirectory(UniqueFd fd, const std::function<void(const char* name)>& action) {
  const std::unique_ptr<DIR, CloseDir> stream(fdopendir(fd.get()));
  if (!stream) return;
  fd.Release();
  while (const dirent* entry = readdir(stream.get())) {
    if (!IsSelfOrParent(entry->d_name) && IsDirectory(dirfd(stream.get()), *entry)) {
      action(entry->d_name);
    }
  }
}

}  // namespace quarry::notify
