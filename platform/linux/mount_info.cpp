#include "platform/linux/mount_info.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <sstream>

#include "platform/linux/keep_errno.h"
#include "platform/linux/path_name.h"

namespace quarry::platform {
namespace {

bool IsOctal(char c) {
  return c >= '0' && c <= '7';
}

// Blanks and the like are written as a backslash and three octal digits.
std::string Unescape(const std::string& text) {
  std::string out;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const bool escape = text[i] == '\\' && i + 3 < text.size() && IsOctal(text[i + 1]) &&
                        IsOctal(text[i + 2]) && IsOctal(text[i + 3]);
    if (!escape) {
      out += text[i];
      continue;
    }
    out +=
        static_cast<char>((text[i + 1] - '0') * 64 + (text[i + 2] - '0') * 8 + (text[i + 3] - '0'));
    i += 3;
  }
  return out;
}

// "36 35 98:0 /root /mount/point rw,noatime master:1 - ext4 /dev/sda1 rw,errors=continue"
bool ParseLine(const std::string& line, Mount* mount) {
  std::istringstream in(line);
  std::string parent;
  std::string device;
  std::string root;
  std::string point;
  std::string word;
  if (!(in >> mount->id >> parent >> device >> root >> point)) return false;
  while (in >> word && word != "-") {
  }
  std::string source;
  if (!(in >> mount->type >> source)) return false;
  mount->point = Unescape(point);
  mount->source = Unescape(source);
  return std::sscanf(device.c_str(), "%u:%u", &mount->device_major, &mount->device_minor) == 2;
}

// The kernel's own answer to the question of which mount holds a file; since Linux 5.8.
bool MountIdOf(const std::string& path, std::uint64_t* id) {
  struct statx info {};
  if (statx(AT_FDCWD, path.c_str(), AT_NO_AUTOMOUNT, STATX_MNT_ID, &info) != 0) return false;
  if ((info.stx_mask & STATX_MNT_ID) == 0) return false;
  *id = info.stx_mnt_id;
  return true;
}

const Mount* MountWithId(const std::vector<Mount>& mounts, std::uint64_t id) {
  for (const Mount& mount : mounts) {
    if (mount.id == id) return &mount;
  }
  return nullptr;
}

}  // namespace

std::vector<Mount> ParseMountInfo(const std::string& text) {
  std::vector<Mount> mounts;
  std::istringstream in(text);
  std::string line;
  while (std::getline(in, line)) {
    Mount mount;
    if (ParseLine(line, &mount)) mounts.push_back(std::move(mount));
  }
  return mounts;
}

std::vector<Mount> ReadMounts() {
  std::ifstream in("/proc/self/mountinfo");
  std::ostringstream text;
  text << in.rdbuf();
  return ParseMountInfo(text.str());
}

const Mount* MountHolding(const std::vector<Mount>& mounts, const std::string& path) {
  const Mount* best = nullptr;
  for (const Mount& mount : mounts) {
    if (!IsSameOrBelow(path, mount.point)) continue;
    if (best == nullptr || mount.point.size() >= best->point.size()) best = &mount;
  }
  return best;
}

bool FindMount(const std::string& path, Mount* mount) {
  const KeepErrno keep;
  const std::vector<Mount> mounts = ReadMounts();
  const Mount* found = nullptr;
  std::uint64_t id = 0;
  if (MountIdOf(path, &id)) found = MountWithId(mounts, id);
  if (found == nullptr) {
    const std::string real = ResolvedPath(path);
    if (!real.empty()) found = MountHolding(mounts, real);
  }
  if (found == nullptr) return false;
  *mount = *found;
  return true;
}

}  // namespace quarry::platform
