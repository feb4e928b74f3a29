#include "daemons/tarnotifyd/directory_scan.h"

#include <dirent.h>
#include <fcntl.h>
#include <linux/limits.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <memory>
#include <utility>

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

int Open(int dir, const char* path, int flags, std::uint64_t resolve) {
  open_how how{};
  how.flags = static_cast<std::uint64_t>(flags | O_DIRECTORY | O_CLOEXEC);
  how.resolve = resolve;
  return static_cast<int>(syscall(SYS_openat2, dir, path, &how, sizeof(how)));
}

// The system's calls take only so much of a path at a time.
UniqueFd OpenInPieces(int start, const std::string& path, int flags, std::uint64_t resolve) {
  constexpr std::size_t kPiece = PATH_MAX - 1;
  UniqueFd dir;
  const auto at = [&] { return dir.valid() ? dir.get() : start; };
  std::size_t from = 0;
  while (path.size() - from > kPiece) {
    const std::size_t end = path.rfind('/', from + kPiece);
    if (end == std::string::npos || end <= from) {
      errno = ENAMETOOLONG;
      return UniqueFd();
    }
    UniqueFd next(Open(at(), path.substr(from, end - from).c_str(), O_PATH, resolve));
    if (!next.valid()) return next;
    dir = std::move(next);
    from = end + 1;
  }
  return UniqueFd(Open(at(), path.c_str() + from, flags, resolve));
}

}  // namespace

bool IsGone(int error) {
  return error == ENOENT || error == ENOTDIR || error == ELOOP;
}

UniqueFd OpenDirectory(const std::string& path) {
  return OpenInPieces(AT_FDCWD, path, O_PATH | O_NOFOLLOW, 0);
}

UniqueFd OpenBelow(const std::string& top, const std::string& path, bool to_read) {
  const int flags = (to_read ? O_RDONLY : O_PATH) | O_NOFOLLOW;
  UniqueFd dir = OpenDirectory(top);
  if (!dir.valid()) return dir;
  const std::string below = path.size() > top.size() ? path.substr(top.size() + 1) : ".";
  return OpenInPieces(dir.get(), below, flags, RESOLVE_NO_SYMLINKS);
}

bool Identify(int fd, DirectoryId* id) {
  struct statx status {};
  constexpr unsigned kWanted = STATX_BASIC_STATS | STATX_MNT_ID;
  if (statx(fd, "", AT_EMPTY_PATH, kWanted, &status) != 0) return false;
  id->device = makedev(status.stx_dev_major, status.stx_dev_minor);
  id->inode = status.stx_ino;
  id->is_mount = (status.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
  id->mount = (status.stx_mask & STATX_MNT_ID) != 0 ? status.stx_mnt_id : 0;
  return true;
}

bool ForEachSubdirectory(UniqueFd fd, const std::function<void(const char* name)>& action) {
  const std::unique_ptr<DIR, CloseDir> stream(fdopendir(fd.get()));
  if (!stream) return false;
  fd.Release();
  while (true) {
    errno = 0;
    const dirent* entry = readdir(stream.get());
    if (entry == nullptr) return errno == 0;
    if (!IsSelfOrParent(entry->d_name) && IsDirectory(dirfd(stream.get()), *entry)) {
      action(entry->d_name);
    }
  }
}

}  // namespace quarry::notify
