#include "daemons/tarncontentextractd/path_open.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <utility>

namespace quarry::extract {
namespace {

constexpr int kPlaceFlags = O_PATH | O_NOFOLLOW | O_CLOEXEC;
constexpr int kDirectoryFlags = O_PATH | O_DIRECTORY | O_CLOEXEC;

// As many as the system follows.
constexpr int kMaxLinks = 40;

// The usual case in one call: a path without any link.
UniqueFd OpenWithoutLinks(const std::string& path) {
  open_how how{};
  how.flags = static_cast<decltype(how.flags)>(kPlaceFlags);
  how.resolve = RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
  return UniqueFd(
      static_cast<int>(syscall(SYS_openat2, AT_FDCWD, path.c_str(), &how, sizeof(how))));
}

// Goes a path component by component: through links that are trusted, along paths longer than the
// system takes, and on systems that do not know the one call.
class Walk {
 public:
  explicit Walk(std::string path) : rest_(std::move(path)), place_(open("/", kDirectoryFlags)) {}

  UniqueFd ToEnd() {
    std::string name = TakeComponent();
    while (place_.valid() && !name.empty() && !AtEnd()) {
      place_ = Enter(name);
      name = TakeComponent();
    }
    if (!place_.valid() || name.empty()) return std::move(place_);
    return UniqueFd(openat(place_.get(), name.c_str(), kPlaceFlags));
  }

 private:
  bool AtEnd() const { return rest_.find_first_not_of('/', at_) == std::string::npos; }

  // The next component, "" at the end.
  std::string TakeComponent() {
    const std::size_t start = std::min(rest_.find_first_not_of('/', at_), rest_.size());
    at_ = std::min(rest_.find('/', start), rest_.size());
    return rest_.substr(start, at_ - start);
  }

  // The directory `name` in the place reached; where that is a link, the place where the way goes
  // on.
  UniqueFd Enter(const std::string& name) {
    UniqueFd directory(openat(place_.get(), name.c_str(), kDirectoryFlags | O_NOFOLLOW));
    if (directory.valid() || (errno != ENOTDIR && errno != ELOOP)) return directory;
    const UniqueFd link(openat(place_.get(), name.c_str(), kPlaceFlags));
    struct stat status {};
    if (!link.valid() || fstat(link.get(), &status) != 0) return UniqueFd();
    if (!S_ISLNK(status.st_mode)) return Refuse(ENOTDIR);
    if (!IsTrusted(status) || ++links_ > kMaxLinks) return Refuse(ELOOP);
    return Follow(link.get());
  }

  // What the link says is walked in front of what is left, by the same rules: nothing can be put in
  // its place between looking at it and going through it.
  UniqueFd Follow(int link) {
    std::array<char, PATH_MAX> target;
    const ssize_t size = readlinkat(link, "", target.data(), target.size());
    if (size <= 0) return UniqueFd();
    rest_ = std::string(target.data(), static_cast<std::size_t>(size)) + rest_.substr(at_);
    at_ = 0;
    return rest_[0] == '/' ? UniqueFd(open("/", kDirectoryFlags)) : std::move(place_);
  }

  static bool IsTrusted(const struct stat& link) {
    return link.st_uid == 0 || link.st_uid == geteuid();
  }

  static UniqueFd Refuse(int error) {
    errno = error;
    return UniqueFd();
  }

  std::string rest_;
  std::size_t at_ = 0;
  UniqueFd place_;
  int links_ = 0;
};

}  // namespace

UniqueFd OpenPlace(const std::string& path) {
  if (path.size() < PATH_MAX) {
    UniqueFd place = OpenWithoutLinks(path);
    if (place.valid()) return place;
    // What is not there is not there; all else is worth another look, step by step.
    if (errno == ENOENT) return place;
  }
  return Walk(path).ToEnd();
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
