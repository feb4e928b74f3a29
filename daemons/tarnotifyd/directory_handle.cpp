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

// The entry of `parent` with this inode; empty when there is none. For a path that is too long for
// the kernel to tell, and for what another mount covers.
std::string SearchName(int parent, ino_t inode) {
  UniqueFd fd(openat(parent, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!fd.valid()) return std::string();
  const std::unique_ptr<DIR, int (*)(DIR*)> entries(fdopendir(fd.get()), closedir);
  if (entries == nullptr) return std::string();
  fd.Release();
  while (const dirent* entry = readdir(entries.get())) {
    const std::string name = entry->d_name;
    if (entry->d_ino == inode && name != "." && name != "..") return name;
  }
  return std::string();
}

std::string NameIn(int parent, int fd, const struct stat& status) {
  std::string name = PathOf(fd);
  name.erase(0, name.rfind('/') + 1);
  if (IsEntry(parent, name, status)) return name;
  return status.st_nlink == 0 ? std::string() : SearchName(parent, status.st_ino);
}

// What errno says of a handle that could not be opened.
Answer AnswerOfErrno() {
  return errno == ESTALE || errno == ENOENT ? Answer::kGone : Answer::kFailed;
}

// Of the open directory with this handle. kGone when nothing could be made of it, kFound with an
// empty parent when the mount ends here.
Answer PlaceOf(int fd, int mount, std::string_view handle, DirectoryPlace* place) {
  struct stat status {};
  if (fstat(fd, &status) != 0) return Answer::kFailed;
  const UniqueFd parent(openat(fd, "..", kOpenFlags));
  *place = DirectoryPlace{};
  // A directory that a mount does not show has no parent there.
  if (!parent.valid()) return errno == ENOENT ? Answer::kFound : Answer::kFailed;
  std::optional<DirectoryIdentity> above = IdentifyDirectory(parent.get());
  if (!above) return Answer::kFailed;
  if (above->mount != mount || above->handle == handle) return Answer::kFound;
  place->name = NameIn(parent.get(), fd, status);
  if (place->name.empty()) return Answer::kGone;
  place->parent = std::move(above->handle);
  return Answer::kFound;
}

Answer FindThrough(int entrance, int mount, std::string_view handle, DirectoryPlace* place) {
  Answer answer = Answer::kGone;
  for (int attempt = 0; attempt < kAttempts; ++attempt) {
    const UniqueFd fd = OpenHandle(entrance, handle, kOpenFlags);
    answer = fd.valid() ? PlaceOf(fd.get(), mount, handle, place) : AnswerOfErrno();
    if (answer == Answer::kFound || (!fd.valid() && answer == Answer::kGone)) return answer;
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

const std::vector<MountedDirectories::Entrance>& MountedDirectories::OpenEntrances() {
  if (!open_.empty()) return open_;
  for (const std::string& path : entrances_) {
    UniqueFd fd(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));  // O_PATH does not do
    struct stat status {};
    if (!fd.valid() || fstat(fd.get(), &status) != 0 || status.st_dev != device_) continue;
    const std::optional<DirectoryIdentity> identity = IdentifyDirectory(fd.get());
    const auto is_same = [&](const Entrance& other) { return other.mount == identity->mount; };
    if (identity && std::none_of(open_.begin(), open_.end(), is_same)) {
      open_.push_back({std::move(fd), identity->mount});
    }
  }
  return open_;
}

DirectoryLookup::Answer MountedDirectories::Find(std::string_view handle, DirectoryPlace* place) {
  Answer best = Answer::kGone;
  for (const Entrance& entrance : OpenEntrances()) {
    const Answer answer = FindThrough(entrance.fd.get(), entrance.mount, handle, place);
    if (answer == Answer::kGone) return answer;  // for all mounts
    if (answer == Answer::kFound && !place->parent.empty()) return answer;
    best = answer;
  }
  return best;
}

DirectoryLookup::Answer MountedDirectories::FindFile(std::string_view handle,
                                                     DirectoryPlace* place) {
  Answer answer = Answer::kGone;
  for (const Entrance& entrance : OpenEntrances()) {
    const UniqueFd fd = OpenHandle(entrance.fd.get(), handle, O_PATH | O_NOFOLLOW | O_CLOEXEC);
    answer = fd.valid() ? PlaceOfFile(fd.get(), place) : AnswerOfErrno();
    if (answer != Answer::kFailed) return answer;
  }
  return answer;
}

}  // namespace quarry::notify
