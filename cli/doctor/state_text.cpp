#include "cli/doctor/state_text.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <ctime>
#include <system_error>

#include "cli/problem.h"
#include "common/file_util.h"
#include "common/json.h"
#include "common/unique_fd.h"

namespace quarry::cli {
namespace {

constexpr int kMostNames = 100;

[[noreturn]] void Refuse(const std::string& what) {
  throw Problem(what + ": " + std::generic_category().message(errno));
}

void ReadAll(int fd, const std::string& path, std::string* text) {
  char piece[65536];
  while (text->size() <= kMaxStateBytes) {
    const ssize_t got = read(fd, piece, sizeof(piece));
    if (got == 0) return;
    if (got < 0 && errno != EINTR) Refuse("Cannot read " + path);
    if (got > 0) text->append(piece, static_cast<std::size_t>(got));
  }
}

// Where the object that begins at `begin` ends, npos when it does not.
std::size_t EndOfObject(const std::string& text, std::size_t begin) {
  std::size_t depth = 0;
  bool in_string = false;
  for (std::size_t at = begin; at < text.size(); ++at) {
    const char c = text[at];
    if (in_string) {
      if (c == '\\') ++at;
      if (c == '"') in_string = false;
    } else if (c == '"') {
      in_string = true;
    } else if (c == '{') {
      ++depth;
    } else if (c == '}' && --depth == 0) {
      return at + 1;
    }
  }
  return std::string::npos;
}

std::string AsideName(const std::string& path, int attempt) {
  const std::time_t now = std::time(nullptr);
  struct tm local {};
  localtime_r(&now, &local);
  char stamp[32];
  std::strftime(stamp, sizeof(stamp), ".damaged-%Y%m%d-%H%M%S", &local);
  return path + stamp + (attempt == 0 ? "" : "-" + std::to_string(attempt));
}

bool Exists(const std::string& path) {
  struct stat info {};
  return lstat(path.c_str(), &info) == 0;
}

// A link is kept; what it leads to is what is damaged.
std::string TargetOf(const std::string& path) {
  const std::string target = RealPath(path);
  return target.empty() ? path : target;
}

// A second name for the file.
std::string LinkAside(const std::string& target) {
  for (int attempt = 0; attempt < kMostNames; ++attempt) {
    const std::string aside = AsideName(target, attempt);
    if (link(target.c_str(), aside.c_str()) == 0) return aside;
    if (errno != EEXIST) break;
  }
  Refuse("Cannot set " + target + " aside");
}

}  // namespace

StateText ReadStateText(const std::string& path) {
  StateText state;
  // A FIFO in the file's place must not hold anybody.
  const UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  state.exists = fd.valid() || Exists(path);
  if (!fd.valid()) {
    if (errno == EACCES || errno == EPERM) Refuse("Cannot read " + path);
    return state;
  }
  struct stat info {};
  state.is_file = fstat(fd.get(), &info) == 0 && S_ISREG(info.st_mode);
  if (state.is_file) ReadAll(fd.get(), path, &state.text);
  return state;
}

std::vector<Json::Value> WholeObjects(const std::string& text) {
  std::vector<Json::Value> objects;
  std::size_t at = text.find('[');
  while (at != std::string::npos && (at = text.find('{', at)) != std::string::npos) {
    const std::size_t end = EndOfObject(text, at);
    if (end == std::string::npos) break;
    Json::Value object;
    if (fromString(object, text.substr(at, end - at))) objects.push_back(std::move(object));
    at = end;
  }
  return objects;
}

std::string SetAside(const std::string& path) {
  const std::string target = TargetOf(path);
  for (int attempt = 0; attempt < kMostNames; ++attempt) {
    const std::string aside = AsideName(target, attempt);
    if (Exists(aside)) continue;
    if (rename(target.c_str(), aside.c_str()) == 0) return aside;
    break;
  }
  Refuse("Cannot set " + target + " aside");
}

std::string ReplaceDamaged(const std::string& path, const Json::Value& value) {
  const std::string target = TargetOf(path);
  struct stat info {};
  const bool is_file = lstat(target.c_str(), &info) == 0 && S_ISREG(info.st_mode);
  const std::string aside = is_file ? LinkAside(target) : SetAside(target);
  if (toFile(value, target)) return aside;
  const int saved = errno;
  if (is_file) {
    unlink(aside.c_str());
  } else {
    rename(aside.c_str(), target.c_str());
  }
  errno = saved;
  Refuse("Cannot write " + target);
}

}  // namespace quarry::cli
