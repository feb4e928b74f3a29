// What is mounted where, as this process sees it.

#ifndef QUARRY_PLATFORM_LINUX_MOUNT_INFO_H_
#define QUARRY_PLATFORM_LINUX_MOUNT_INFO_H_

#include <cstdint>
#include <string>
#include <vector>

namespace quarry::platform {

// One line of /proc/self/mountinfo.
struct Mount {
  std::uint64_t id = 0;
  unsigned device_major = 0;
  unsigned device_minor = 0;
  std::string point;   // where it is mounted
  std::string type;    // "ext4", "fuse.sshfs"
  std::string source;  // "/dev/sda1", "server:/export"
};

// The lines of a mountinfo text, in its order; lines that are none are passed over.
std::vector<Mount> ParseMountInfo(const std::string& text);

// What is mounted at present; empty when it cannot be told.
std::vector<Mount> ReadMounts();

// The mount that holds `path`, which is plain and absolute or "/": the deepest one, and of several
// at one place the last. Null when there is none.
const Mount* MountHolding(const std::vector<Mount>& mounts, const std::string& path);

// Finds the mount that holds an existing `path`, links followed. False when it cannot be told.
bool FindMount(const std::string& path, Mount* mount);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_MOUNT_INFO_H_
