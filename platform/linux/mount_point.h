// Mount points and snapshots.

#ifndef QUARRY_PLATFORM_LINUX_MOUNT_POINT_H_
#define QUARRY_PLATFORM_LINUX_MOUNT_POINT_H_

#include <string>

namespace quarry::platform {

// Whether `path` is the root of a mount: 1, 0, or -1, with errno set, when there is no such path.
// `ask_kernel` false leaves the kernel's own answer aside, as kernels before 5.8 do.
int IsMountRoot(const std::string& path, bool ask_kernel = true);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_MOUNT_POINT_H_
