// What is mounted where.

#ifndef QUARRY_DAEMONS_TARNOTIFYD_MOUNT_TABLE_H_
#define QUARRY_DAEMONS_TARNOTIFYD_MOUNT_TABLE_H_

#include <string>
#include <string_view>
#include <vector>

#include "common/unique_fd.h"

namespace quarry::notify {

struct Mount {
  std::string path;
  std::string type;  // of the file system, "ext4" for example
};

// The lines of /proc/<pid>/mountinfo; a line that is none is left out.
std::vector<Mount> ParseMounts(std::string_view text);

// Whether the kernel makes up what is in a file system of this type: no user's files are there.
bool IsKernelsOwn(const std::string& type);

// The mounts that this process sees. One thread.
class MountTable {
 public:
  // Throws Error 502 when the kernel does not tell.
  MountTable();

  // Whether something was mounted or unmounted since the last Read().
  bool HasChanged() const;
  // Throws Error 502.
  std::vector<Mount> Read();

 private:
  UniqueFd fd_;
};

}  // namespace quarry::notify

#endif  // QUARRY_DAEMONS_TARNOTIFYD_MOUNT_TABLE_H_
