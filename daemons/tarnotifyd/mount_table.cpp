#include "daemons/tarnotifyd/mount_table.h"

#include <fcntl.h>
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstddef>

#include "daemons/common/system_error.h"

namespace quarry::notify {
namespace {

constexpr char kPath[] = "/proc/self/mountinfo";

// Far more mounts than any machine has.
constexpr std::size_t kMaxSize = std::size_t{64} << 20;

bool IsOctal(char c) {
  return c >= '0' && c <= '7';
}

// Blanks, newlines and backslashes stand as "\" and three octal digits.
std::string Unescaped(std::string_view text) {
  std::string plain;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '\\' && i + 3 < text.size() && IsOctal(text[i + 1]) && IsOctal(text[i + 2]) &&
        IsOctal(text[i + 3])) {
      plain += static_cast<char>((text[i + 1] - '0') * 64 + (text[i + 2] - '0') * 8 +
                                 (text[i + 3] - '0'));
      i += 3;
    } else {
      plain += text[i];
    }
  }
  return plain;
}

std::string_view TakeUntil(std::string_view* text, char end) {
  const std::string_view part = text->substr(0, text->find(end));
  text->remove_prefix(std::min(text->size(), part.size() + 1));
  return part;
}

// "36 35 98:0 /root /mount/point options optional... - type source options"
bool ParseMount(std::string_view line, Mount* mount) {
  for (int skipped = 0; skipped < 4; ++skipped) TakeUntil(&line, ' ');
  mount->path = Unescaped(TakeUntil(&line, ' '));
  while (!line.empty() && TakeUntil(&line, ' ') != "-") {
  }
  mount->type = Unescaped(TakeUntil(&line, ' '));
  return !mount->path.empty() && mount->path[0] == '/' && !mount->type.empty();
}

}  // namespace

std::vector<Mount> ParseMounts(std::string_view text) {
  std::vector<Mount> mounts;
  while (!text.empty()) {
    Mount mount;
    if (ParseMount(TakeUntil(&text, '\n'), &mount)) mounts.push_back(std::move(mount));
  }
  return mounts;
}

bool IsKernelsOwn(const std::string& type) {
  static constexpr std::array kTypes = {
      "autofs", "binfmt_misc", "bpf",        "cgroup",     "cgroup2",   "configfs", "debugfs",
      "devpts", "devtmpfs",    "efivarfs",   "fusectl",    "hugetlbfs", "mqueue",   "nsfs",
      "proc",   "pstore",      "rpc_pipefs", "securityfs", "selinuxfs", "sysfs",    "tracefs"};
  return std::find(kTypes.begin(), kTypes.end(), type) != kTypes.end();
}

MountTable::MountTable() : fd_(open(kPath, O_RDONLY | O_CLOEXEC)) {
  if (!fd_.valid()) daemon::ThrowSystemError(std::string("Cannot open ") + kPath);
}

bool MountTable::HasChanged() const {
  pollfd poll_fd = {fd_.get(), POLLPRI, 0};
  return poll(&poll_fd, 1, 0) > 0;
}

std::vector<Mount> MountTable::Read() {
  if (lseek(fd_.get(), 0, SEEK_SET) != 0)
    daemon::ThrowSystemError(std::string("Cannot read ") + kPath);
  std::string text;
  std::array<char, 16384> buffer;
  for (;;) {
    const ssize_t got = read(fd_.get(), buffer.data(), buffer.size());
    if (got < 0 && errno == EINTR) continue;
    if (got < 0 || text.size() > kMaxSize) {
      daemon::ThrowSystemError(std::string("Cannot read ") + kPath);
    }
    if (got == 0) return ParseMounts(text);
    text.append(buffer.data(), static_cast<std::size_t>(got));
  }
}

}  // namespace quarry::notify
