#include "daemons/tarnotifyd/directory_handle.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <utility>

#include "daemons/tarnotifyd/directory_scan.h"

namespace quarry::notify {
namespace {

using Answer = DirectoryLookup::Answer;

constexpr int kOpenFlags = O_PATH | O_DIRECTORY | O_CLOEXEC;
constexpr std::size_t kTypeSize = sizeof(std::int32_t);
// Renames may come between two looks (their events are still to be read), and the kernel has been
// seen to fail with ENOMEM, for no such reason, on a directory that was just being removed.
constexpr int kAttempts = 4;

// A handle with room for the largest one.
struct HandleBuffer {
  HandleBuffer() : bytes(sizeof(file_handle) + MAX_HANDLE_SZ) {
    get()->handle_bytes = MAX_HANDLE_SZ;
  }
  file_handle* get() { return reinterpret_cast<file_handle*>(bytes.data()); }
  std::vector<char> bytes;
};

UniqueFd OpenHandle(int mount, std::string_view handle, int flags) {
  HandleBuffer buffer;
  if (handle.size() < kTypeSize || handle.size() - kTypeSize > MAX_HANDLE_SZ) {
    errno = ESTALE;
    return UniqueFd();
  }
  file_handle* raw = buffer.get();
  std::memcpy(&raw->handle_type, handle.data(), kTypeSize);
  raw->handle_bytes = static_cast<unsigned int>(handle.size() - kTypeSize);
  std::memcpy(raw->f_handle, handle.data() + kTypeSize, raw->handle_bytes);
  return UniqueFd(open_by_handle_at(mount, raw, flags));
}

bool IsSame(const struct stat& one, const struct stat& other) {
  return one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

// The path that the kernel has for `fd`; empty when there is none, or one that is too long to tell.
std::string PathOf(int fd) {
  char path[PATH_MAX];
  const std::string link = "/proc/self/fd/" + std::to_string(fd);
  const ssize_t length = readlink(link.c_str(), path, sizeof(path));
  return length > 0 ? std::string(path, static_cast<std::size_t>(length)) : std::string();
}

bool IsEntry(int directory, const std::string& name, const struct stat& status) {
  struct stat named {};
  return !name.empty() && fstatat(directory, name.c_str(), &named, AT_SYMLINK_NOFOLLOW) == 0 &&
         IsSame(named, status);
}

bool IsMountPoint(int directory, const std::string& name) {
  const UniqueFd entry(openat(directory, name.c_str(), kOpenFlags | O_NOFOLLOW));
  DirectoryId id;
  return entry.valid() && Identify(entry.get(), &id) && id.is_mount;
}

// The entry of `parent` with this inode. For a path that is too long for the kernel to tell, and
// for what another mount covers.
Answer SearchName(int parent, ino_t inode, std::string* name) {
  UniqueFd fd(openat(parent, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!fd.valid()) return Answer::kFailed;
  const std::unique_ptr<DIR, int (*)(DIR*)> entries(fdopendir(fd.get()), closedir);
  if (entries == nullptr) return Answer::kFailed;
  fd.Release();
  while (const dirent* entry = readdir(entries.get())) {
    *name = entry->d_name;
    if (entry->d_ino == inode && *name != "." && *name != "..") return Answer::kFound;
  }
  return Answer::kFailed;
}

// kFailed when it was just renamed, too.
Answer NameIn(int parent, int fd, std::string* name) {
  struct stat status {};
  if (fstat(fd, &status) != 0) return Answer::kFailed;
  if (status.st_nlink == 0) return Answer::kGone;
  *name = PathOf(fd);
  name->erase(0, name->rfind('/') + 1);
  if (IsEntry(parent, *name, status)) return Answer::kFound;
  if (!name->empty() && !IsMountPoint(parent, *name)) return Answer::kFailed;
  return SearchName(parent, status.st_ino, name);
}

// What errno says of a handle that could not be opened.
Answer AnswerOfErrno() {
  return errno == ESTALE || errno == ENOENT ? Answer::kGone : Answer::kFailed;
}

// Of the open directory with this handle. kFound with an empty parent when the mount ends here.
Answer PlaceOf(int fd, int mount, std::string_view handle, DirectoryPlace* place) {
  *place = DirectoryPlace{};
  const UniqueFd parent(openat(fd, "..", kOpenFlags));
  // A directory that a mount does not show has no parent there.
  if (!parent.valid()) return errno == ENOENT ? Answer::kFound : Answer::kFailed;
  std::optional<DirectoryIdentity> above = IdentifyDirectory(parent.get());
  if (!above) return Answer::kFailed;
  if (above->handle == handle && above->mount == mount) return Answer::kFound;
  if (above->mount != mount) {
    DirectoryId id;
    if (!Identify(fd, &id)) return Answer::kFailed;
    // Else something is mounted upon the parent: no path leads here as long as it is.
    return id.is_mount ? Answer::kFound : Answer::kGone;
  }
  place->parent = std::move(above->handle);
  return NameIn(parent.get(), fd, &place->name);
}

Answer FindThrough(int entrance, int mount, std::string_view handle, DirectoryPlace* place) {
  Answer answer = Answer::kFailed;
  for (int attempt = 0; attempt < kAttempts && answer == Answer::kFailed; ++attempt) {
    const UniqueFd fd = OpenHandle(entrance, handle, kOpenFlags);
    answer = fd.valid() ? PlaceOf(fd.get(), mount, handle, place) : AnswerOfErrno();
  }
  return answer;
}

Answer PlaceOfFile(int fd, DirectoryPlace* place) {
  struct stat status {};
  if (fstat(fd, &status) != 0) return Answer::kFailed;
  if (status.st_nlink == 0) return Answer::kGone;
  const std::string path = PathOf(fd);
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos) return Answer::kFailed;
  place->name = path.substr(slash + 1);
  const UniqueFd parent(open(path.substr(0, slash + 1).c_str(), kOpenFlags));
  if (!parent.valid() || !IsEntry(parent.get(), place->name, status)) return Answer::kFailed;
  std::optional<DirectoryIdentity> above = IdentifyDirectory(parent.get());
  if (!above) return Answer::kFailed;
  place->parent = std::move(above->handle);
  return Answer::kFound;
}

}  // namespace

std::optional<DirectoryIdentity> IdentifyDirectory(int fd) {
  HandleBuffer buffer;
  DirectoryIdentity identity;
  if (name_to_handle_at(fd, "", buffer.get(), &identity.mount, AT_EMPTY_PATH) != 0) {
    return std::nullopt;
  }
  const file_handle* raw = buffer.get();
  identity.handle.assign(reinterpret_cast<const char*>(&raw->handle_type), kTypeSize);
  identity.handle.append(reinterpret_cast<const char*>(raw->f_handle), raw->handle_bytes);
  return identity;
}

void MountedDirectories::AddEntrance(const std::string& path) {
  entrances_.push_back(path);
  Release();
}

void MountedDirectories::RemoveEntrance(const std::string& path) {
  const auto found = std::find(entrances_.begin(), entrances_.end(), path);
  if (found != entrances_.end()) entrances_.erase(found);
  Release();
}

// False when there is no way in, or one of them could not be tried.
bool MountedDirectories::OpenEntrances() {
  if (!open_.empty()) return true;
  for (const std::string& path : entrances_) {
    if (!OpenEntrance(path)) {
      Release();
      return false;
    }
  }
  return !open_.empty();
}

// What is not there any more is passed over: whoever watches it will notice.
bool MountedDirectories::OpenEntrance(const std::string& path) {
  // O_PATH does not do.
  UniqueFd fd(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!fd.valid()) return IsGone(errno);
  struct stat status {};
  if (fstat(fd.get(), &status) != 0) return false;
  if (status.st_dev != device_) return true;
  const std::optional<DirectoryIdentity> identity = IdentifyDirectory(fd.get());
  if (!identity) return false;
  const auto is_same = [&](const Entrance& other) { return other.mount == identity->mount; };
  if (std::none_of(open_.begin(), open_.end(), is_same)) {
    open_.push_back({std::move(fd), identity->mount});
  }
  return true;
}

DirectoryLookup::Answer MountedDirectories::Find(std::string_view handle, DirectoryPlace* place) {
  if (!OpenEntrances()) return Answer::kFailed;
  Answer worst = Answer::kFound;
  for (const Entrance& entrance : open_) {
    const Answer answer = FindThrough(entrance.fd.get(), entrance.mount, handle, place);
    if (answer == Answer::kFound && !place->parent.empty()) return answer;
    if (worst != Answer::kFailed && answer != Answer::kFound) worst = answer;
  }
  *place = DirectoryPlace{};
  return worst;
}

DirectoryLookup::Answer MountedDirectories::FindFile(std::string_view handle,
                                                     DirectoryPlace* place) {
  if (!OpenEntrances()) return Answer::kFailed;
  Answer answer = Answer::kGone;
  for (const Entrance& entrance : open_) {
    const UniqueFd fd = OpenHandle(entrance.fd.get(), handle, O_PATH | O_NOFOLLOW | O_CLOEXEC);
    answer = fd.valid() ? PlaceOfFile(fd.get(), place) : AnswerOfErrno();
    if (answer != Answer::kFailed) return answer;
  }
  return answer;
}

}  // namespace quarry::notify
