#include "platform/linux/file_copy.h"

#include <fcntl.h>
#include <fts.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <memory>

#include "common/unique_fd.h"
#include "platform/include/filesystem.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/keep_errno.h"
#include "platform/linux/last_error.h"
#include "platform/linux/path_name.h"

namespace quarry::platform {
namespace {

constexpr mode_t kPermissions = 07777;
constexpr mode_t kPlainPermissions = 0777;
constexpr std::size_t kPieceBytes = std::size_t{1} << 20;

struct FtsClose {
  void operator()(FTS* tree) const {
    const KeepErrno keep;
    fts_close(tree);
  }
};
using Tree = std::unique_ptr<FTS, FtsClose>;

// A walk of `path` that never recurses and follows no links: each directory before and after what
// is in it.
Tree Walk(const std::string& path) {
  std::string root = path;
  char* roots[] = {root.data(), nullptr};
  return Tree(fts_open(roots, FTS_PHYSICAL | FTS_NOCHDIR, nullptr));
}

// Calls `visit(entry)` for every entry until one fails.
template <typename Visit>
bool ForEachEntry(const std::string& path, const Visit& visit) {
  const Tree tree = Walk(path);
  if (tree == nullptr) return false;
  while (true) {
    errno = 0;
    FTSENT* entry = fts_read(tree.get());
    if (entry == nullptr) return errno == 0;
    if (entry->fts_info == FTS_ERR || entry->fts_info == FTS_DNR || entry->fts_info == FTS_NS) {
      errno = entry->fts_errno;
      return false;
    }
    if (!visit(*entry)) return false;
  }
}

bool CopyBytes(int from, int to) {
  std::string piece(kPieceBytes, '\0');
  while (true) {
    const ssize_t got = read(from, piece.data(), piece.size());
    if (got < 0 && errno == EINTR) continue;
    if (got <= 0) return got == 0;
    for (ssize_t done = 0; done < got;) {
      const ssize_t written = write(to, piece.data() + done, static_cast<std::size_t>(got - done));
      if (written < 0 && errno == EINTR) continue;
      if (written < 0) return false;
      done += written;
    }
  }
}

// The kernel copies without moving the bytes through this process, or shares them, where the file
// systems can; otherwise they are read and written.
bool CopyContent(int from, int to) {
  while (true) {
    const ssize_t copied = copy_file_range(from, nullptr, to, nullptr, kPieceBytes * 1024, 0);
    if (copied == 0) return CopyBytes(from, to);
    if (copied < 0 && errno != EINTR) return CopyBytes(from, to);
  }
}

bool CopyRegular(const char* from, const std::string& to, mode_t mode) {
  const UniqueFd source(open(from, O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
  if (!source.valid()) return false;
  const UniqueFd target(open(to.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, mode));
  return target.valid() && CopyContent(source.get(), target.get());
}

bool CopyLink(const char* from, const std::string& to) {
  std::string text(PATH_MAX, '\0');
  const ssize_t size = readlink(from, text.data(), text.size());
  if (size < 0) return false;
  text.resize(static_cast<std::size_t>(size));
  return symlink(text.c_str(), to.c_str()) == 0;
}

// Whether this process may not, or on this file system cannot, give a file that owner.
bool IsOwnerOutOfReach(int error) {
  return error == EPERM || error == EINVAL;
}

// Whether the target's file system has no such attributes, or this process may not set this one:
// those of the kernel and of security modules belong to whoever writes the file.
bool IsAttributeOutOfReach(int error) {
  return error == ENOTSUP || error == EPERM || error == EACCES || error == EINVAL;
}

// The bytes that `ask(buffer, size)` gives, which tells their number when it gets no room. False,
// with errno set, when it cannot be asked.
template <typename Ask>
bool TakeAll(const Ask& ask, std::string* bytes) {
  while (true) {
    const ssize_t size = ask(nullptr, 0);
    if (size < 0) return false;
    bytes->resize(static_cast<std::size_t>(size));
    const ssize_t got = size == 0 ? 0 : ask(bytes->data(), bytes->size());
    if (got < 0 && errno == ERANGE) continue;  // it has grown in between
    if (got < 0) return false;
    bytes->resize(static_cast<std::size_t>(got));
    return true;
  }
}

bool CopyExtendedAttribute(const char* from, const std::string& to, const char* name) {
  std::string value;
  const auto ask = [&](void* room, std::size_t size) { return lgetxattr(from, name, room, size); };
  if (!TakeAll(ask, &value)) return errno == ENODATA || IsAttributeOutOfReach(errno);
  return lsetxattr(to.c_str(), name, value.data(), value.size(), 0) == 0 ||
         IsAttributeOutOfReach(errno);
}

// Access lists are among them.
bool CopyExtendedAttributes(const char* from, const std::string& to) {
  std::string names;
  const auto ask = [&](void* room, std::size_t size) {
    return llistxattr(from, static_cast<char*>(room), size);
  };
  if (!TakeAll(ask, &names)) return IsAttributeOutOfReach(errno);
  // A file that is to be read-only takes none; it gets its mode afterwards. Links have none.
  if (!names.empty()) fchmodat(AT_FDCWD, to.c_str(), S_IRWXU, AT_SYMLINK_NOFOLLOW);
  for (std::size_t begin = 0; begin < names.size(); begin = names.find('\0', begin) + 1) {
    if (!CopyExtendedAttribute(from, to, names.c_str() + begin)) return false;
  }
  return true;
}

// Owner before the rest: a change of owner takes the set-id bits away. Where the owner cannot be
// kept they are not either: they would lend the rights of another user than they did.
bool CopyAttributes(const FTSENT& entry, const std::string& to) {
  const struct stat& info = *entry.fts_statp;
  const bool owned = lchown(to.c_str(), info.st_uid, info.st_gid) == 0;
  if (!owned && !IsOwnerOutOfReach(errno)) return false;
  const mode_t mode = info.st_mode & (owned ? kPermissions : kPlainPermissions);
  if (!CopyExtendedAttributes(entry.fts_accpath, to)) return false;
  if (!S_ISLNK(info.st_mode) && chmod(to.c_str(), mode) != 0) return false;
  const timespec times[] = {info.st_atim, info.st_mtim};
  return utimensat(AT_FDCWD, to.c_str(), times, AT_SYMLINK_NOFOLLOW) == 0;
}

// A directory must stay writable until all is in it; afterwards it gets the mode that it was to
// have. `preserve` false asks for the source's mode as the umask leaves it.
bool FinishDirectory(const FTSENT& entry, const std::string& to, bool preserve) {
  if (preserve) return CopyAttributes(entry, to);
  struct stat made {};
  if (stat(to.c_str(), &made) != 0) return false;
  const mode_t wanted = made.st_mode & entry.fts_statp->st_mode & kPlainPermissions;
  return wanted == (made.st_mode & kPlainPermissions) || chmod(to.c_str(), wanted) == 0;
}

bool CopyEntry(const FTSENT& entry, const std::string& to, bool preserve) {
  const struct stat& info = *entry.fts_statp;
  const mode_t plain = info.st_mode & kPlainPermissions;
  bool copied = false;
  switch (entry.fts_info) {
    case FTS_D:
      return mkdir(to.c_str(), plain | S_IRWXU) == 0;
    case FTS_DP:
      return FinishDirectory(entry, to, preserve);
    case FTS_F:
      copied = CopyRegular(entry.fts_accpath, to, plain);
      break;
    case FTS_SL:
    case FTS_SLNONE:
      copied = CopyLink(entry.fts_accpath, to);
      break;
    default:
      copied = mknod(to.c_str(), info.st_mode, info.st_rdev) == 0;
      break;
  }
  return copied && (!preserve || CopyAttributes(entry, to));
}

bool RemoveEntry(const FTSENT& entry) {
  switch (entry.fts_info) {
    case FTS_D:
      return true;
    case FTS_DP:
      return rmdir(entry.fts_accpath) == 0;
    default:
      return unlink(entry.fts_accpath) == 0;
  }
}

void RemoveTreeKeepingErrno(const std::string& path) {
  const KeepErrno keep;
  RemoveTree(path);
}

// A name beside `path` that nobody else uses.
std::string NameBeside(const std::string& path, const char* what) {
  static std::atomic<unsigned> counter{0};
  char suffix[64];
  std::snprintf(suffix, sizeof(suffix), ".%s-%d-%u", what, static_cast<int>(getpid()), ++counter);
  return path + suffix;
}

// Whether `to` would lie inside the directory `from`, so that the copy would never end.
bool IsInside(const std::string& to, const std::string& from) {
  struct stat info {};
  if (lstat(from.c_str(), &info) != 0 || !S_ISDIR(info.st_mode)) return false;
  const std::string source = ResolvedPath(from);
  const std::string parent = ResolvedPath(ParentDirectory(to));
  return !source.empty() && !parent.empty() && IsSameOrBelow(parent, source);
}

// Copies beside the target, so that what is there is replaced by a whole copy or not at all.
bool CopyAside(const std::string& from, const std::string& to, bool preserve,
               std::string* temporary) {
  if (IsInside(to, from)) {
    errno = EINVAL;
    return false;
  }
  *temporary = NameBeside(to, "copy");
  if (CopyTree(from, *temporary, preserve)) return true;
  RemoveTreeKeepingErrno(*temporary);
  return false;
}

bool CopyOver(const std::string& from, const std::string& to, bool preserve) {
  std::string temporary;
  if (!CopyAside(from, to, preserve, &temporary)) return false;
  if (rename(temporary.c_str(), to.c_str()) == 0) return true;
  RemoveTreeKeepingErrno(temporary);
  return false;
}

bool Move(const std::string& from, const std::string& to, bool preserve) {
  if (rename(from.c_str(), to.c_str()) == 0) return true;
  return errno == EXDEV && MoveByCopy(from, to, preserve);
}

// A "/" at the end names the same place.
std::string WithoutSlash(const char* path) {
  std::string text = path;
  while (text.size() > 1 && text.back() == '/') text.pop_back();
  return text;
}

}  // namespace

bool CopyTree(const std::string& from, const std::string& to, bool preserve) {
  return ForEachEntry(from, [&](const FTSENT& entry) {
    return CopyEntry(entry, to + std::string(entry.fts_path + from.size()), preserve);
  });
}

bool RemoveTree(const std::string& path) {
  return ForEachEntry(path, [](const FTSENT& entry) { return RemoveEntry(entry); });
}

bool MoveByCopy(const std::string& from, const std::string& to, bool preserve) {
  const UniqueFd place(open(ParentDirectory(to).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  std::string copy;
  if (!place.valid() || !CopyAside(from, to, preserve, &copy)) return false;
  // The source gives up its name in one step and is removed only when the copy has its own.
  const std::string old = NameBeside(from, "moved");
  if (syncfs(place.get()) != 0 || rename(from.c_str(), old.c_str()) != 0) {
    RemoveTreeKeepingErrno(copy);
    return false;
  }
  if (rename(copy.c_str(), to.c_str()) != 0 || fsync(place.get()) != 0) {
    const KeepErrno keep;
    rename(old.c_str(), from.c_str());
    RemoveTree(copy);
    return false;
  }
  // The move is done whatever becomes of the rest of the source.
  RemoveTreeKeepingErrno(old);
  return true;
}

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" int TARNFileCopy(const char* from, const char* to, TARNCOPYARGS* args) {
  if (from == nullptr || to == nullptr || *from == '\0' || *to == '\0') {
    errno = EINVAL;
    return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  }
  const bool preserve = args != nullptr && args->preserve == 1;
  const bool move = args != nullptr && args->move == 1;
  const std::string source = WithoutSlash(from);
  const std::string target = WithoutSlash(to);
  const int before = errno;
  const bool done = move ? Move(source, target, preserve) : CopyOver(source, target, preserve);
  if (!done) return QUARRY_PLATFORM_FAIL(kErrSystem);
  errno = before;
  return 0;
}
