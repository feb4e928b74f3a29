#include "daemons/fileindexd/file_system.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <memory>

#include "common/file_util.h"
#include "common/unique_fd.h"
#include "daemons/tarncontentextractd/stamp.h"

namespace quarry::fileindexd {
namespace {

struct CloseDir {
  void operator()(DIR* dir) const { closedir(dir); }
};

// Whether the failure says that there is nothing, rather than that it cannot be told.
PlaceKind KindOfFailure(int error) {
  return error == ENOENT || error == ENOTDIR || error == ELOOP ? PlaceKind::kAbsent
                                                               : PlaceKind::kUnknown;
}

bool Status(int dir, const char* name, struct statx& status) {
  return statx(dir, name, AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, STATX_BASIC_STATS, &status) == 0;
}

bool IsMountRoot(const struct statx& status) {
  return (status.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
}

// The fields that stamps are made of.
struct stat ToStat(const struct statx& from) {
  struct stat to {};
  to.st_dev = makedev(from.stx_dev_major, from.stx_dev_minor);
  to.st_ino = from.stx_ino;
  to.st_size = static_cast<off_t>(from.stx_size);
  to.st_mtim = {from.stx_mtime.tv_sec, from.stx_mtime.tv_nsec};
  to.st_ctim = {from.stx_ctime.tv_sec, from.stx_ctime.tv_nsec};
  return to;
}

// `path` is asked for only where something is mounted. The kernel says so of bind mounts, too, but
// the platform knows which mounts are shares.
template <typename PathOf>
Place ToPlace(const struct statx& status, const PathOf& path_of) {
  Place place;
  if (!S_ISREG(status.stx_mode) && !S_ISDIR(status.stx_mode)) {
    place.kind = PlaceKind::kOther;
    return place;
  }
  if (IsMountRoot(status) && IsMountPoint(path_of())) {
    place.kind = PlaceKind::kForeign;
    return place;
  }
  const struct stat stamped = ToStat(status);
  place.attribute_stamp = extract::AttributeStamp(stamped);
  place.kind = PlaceKind::kDirectory;
  if (S_ISREG(status.stx_mode)) {
    place.kind = PlaceKind::kFile;
    place.content_stamp = extract::ContentStamp(stamped);
  }
  return place;
}

Place Failed(int error) {
  Place place;
  place.kind = KindOfFailure(error);
  return place;
}

// What lies behind something that is no directory to enter.
Place Blocked(PlaceKind kind) {
  Place place;
  if (kind == PlaceKind::kUnknown || kind == PlaceKind::kForeign) place.kind = kind;
  return place;
}

// What is at `name` in the directory that `dir` is open on.
template <typename PathOf>
Place PlaceAt(int dir, const char* name, const PathOf& path_of) {
  struct statx status {};
  if (!Status(dir, name, status)) return Failed(errno);
  return ToPlace(status, path_of);
}

// What is at `base` itself: a folder may well be a mount point.
Place PlaceOfBase(const std::string& base) {
  struct statx status {};
  if (!Status(AT_FDCWD, base.c_str(), status)) return Failed(errno);
  status.stx_attributes &= ~static_cast<std::uint64_t>(STATX_ATTR_MOUNT_ROOT);
  return ToPlace(status, [&] { return base; });
}

}  // namespace

Place PosixFileSystem::Look(const std::string& base, const std::string& path) {
  Place place = PlaceOfBase(base);
  UniqueFd dir;
  std::string name = base;
  std::size_t done = base.size();
  // One component at a time: no link is followed, and the path may be longer than the system's
  // calls would take.
  while (done < path.size()) {
    if (place.kind != PlaceKind::kDirectory) return Blocked(place.kind);
    const int fd = openat(dir.valid() ? dir.get() : AT_FDCWD, name.c_str(),
                          O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
    if (fd < 0) return Failed(errno);
    dir.Reset(fd);
    const std::size_t end = std::min(path.find('/', done + 1), path.size());
    name = path.substr(done + 1, end - done - 1);
    done = end;
    place = PlaceAt(fd, name.c_str(), [&] { return path.substr(0, end); });
  }
  return place;
}

Place PosixFileSystem::Peek(const std::string& path) {
  return PlaceAt(AT_FDCWD, path.c_str(), [&] { return path; });
}

PlaceKind PosixFileSystem::List(const std::string& dir, std::vector<std::string>& names) {
  names.clear();
  UniqueFd fd(open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!fd.valid()) return KindOfFailure(errno);
  const std::unique_ptr<DIR, CloseDir> stream(fdopendir(fd.get()));
  if (!stream) return PlaceKind::kUnknown;
  fd.Release();
  for (;;) {
    errno = 0;
    const dirent* entry = readdir(stream.get());
    if (entry == nullptr) return errno == 0 ? PlaceKind::kDirectory : KindOfFailure(errno);
    const std::string name = entry->d_name;
    if (name != "." && name != "..") names.push_back(name);
  }
}

Identity PosixFileSystem::Identify(const std::string& dir) {
  struct statx status {};
  Identity identity;
  if (!Status(AT_FDCWD, dir.c_str(), status) || !S_ISDIR(status.stx_mode)) return identity;
  identity.exists = true;
  identity.device = makedev(status.stx_dev_major, status.stx_dev_minor);
  identity.inode = status.stx_ino;
  identity.mount_root = IsMountRoot(status);
  return identity;
}

}  // namespace quarry::fileindexd
