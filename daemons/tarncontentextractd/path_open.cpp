#include "daemons/tarncontentextractd/path_open.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <string_view>
#include <utility>

namespace quarry::extract {
namespace {

constexpr int kPlaceFlags = O_PATH | O_NOFOLLOW | O_CLOEXEC;
constexpr int kDirectoryFlags = O_PATH | O_DIRECTORY | O_CLOEXEC;

// The usual case in one call: a path without any link.
UniqueFd OpenWithoutLinks(const std::string& path) {
  open_how how{};
  how.flags = static_cast<decltype(how.flags)>(kPlaceFlags);
  how.resolve = RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
  return UniqueFd(
      static_cast<int>(syscall(SYS_openat2, AT_FDCWD, path.c_str(), &how, sizeof(how))));
}

bool IsTrustedLink(int parent, const std::string& name) {
  struct stat status {};
  if (fstatat(parent, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) return false;
  return S_ISLNK(status.st_mode) && (status.st_uid == 0 || status.st_uid == geteuid());
}

// The directory `name` in `parent`.
UniqueFd EnterDirectory(int parent, const std::string& name) {
  UniqueFd directory(openat(parent, name.c_str(), kDirectoryFlags | O_NOFOLLOW));
  if (directory.valid() || (errno != ENOTDIR && errno != ELOOP)) return directory;
  const int error = errno;
  if (IsTrustedLink(parent, name)) return UniqueFd(openat(parent, name.c_str(), kDirectoryFlags));
  struct stat status {};
  const bool link =
      fstatat(parent, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 && S_ISLNK(status.st_mode);
  errno = link ? ELOOP : error;
  return UniqueFd();
}

// The next component of `rest`, which is moved behind it; "" at the end.
std::string TakeComponent(std::string_view* rest) {
  while (!rest->empty() && rest->front() == '/') rest->remove_prefix(1);
  std::string component(rest->substr(0, rest->find('/')));
  rest->remove_prefix(component.size());
  return component;
}

// Component by component: through links that are trusted, along paths longer than the system takes,
// and on systems that do not know the one call.
UniqueFd OpenStepwise(const std::string& path) {
  std::string_view rest = path;
  UniqueFd place(open("/", kDirectoryFlags));
  std::string name = TakeComponent(&rest);
  while (place.valid() && !name.empty()) {
    std::string next = TakeComponent(&rest);
    place = next.empty() ? UniqueFd(openat(place.get(), name.c_str(), kPlaceFlags))
                         : EnterDirectory(place.get(), name);
    name = std::move(next);
  }
  return place;
}

}  // namespace

UniqueFd OpenPlace(const std::string& path) {
  if (path.size() < PATH_MAX) {
    UniqueFd place = OpenWithoutLinks(path);
    if (place.valid()) return place;
    // What is not there is not there; all else is worth another look, step by step.
    if (errno == ENOENT) return place;
  }
  return OpenStepwise(path);
}

UniqueFd OpenForReading(int place) {
  char link[64];
  std::snprintf(link, sizeof(link), "/proc/self/fd/%d", place);
  constexpr int kFlags = O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
  UniqueFd file(open(link, kFlags | O_NOATIME));
  if (!file.valid() && errno == EPERM) file = UniqueFd(open(link, kFlags));
  return file;
}

}  // namespace quarry::extract
