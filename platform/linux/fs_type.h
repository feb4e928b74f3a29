// The platform's numbers for types of file systems.

#ifndef QUARRY_PLATFORM_LINUX_FS_TYPE_H_
#define QUARRY_PLATFORM_LINUX_FS_TYPE_H_

#include "platform/linux/mount_info.h"

namespace quarry::platform {

// Local types first; what follows kFirstRemote is reached over a network, what follows kFirstImage
// is a medium or an image that was mounted. 12 is fixed by platform/include/filesystem.h.
enum FsType : int {
  kFsOtherLocal = 0,
  kFsExt = 1,
  kFsBtrfs = 2,
  kFsXfs = 3,
  kFsZfs = 4,
  kFsF2fs = 5,
  kFsFat = 6,
  kFsExfat = 7,
  kFsNtfs = 8,
  kFsHfs = 9,
  kFsTmpfs = 10,
  kFsOverlay = 11,
  kFsPseudo = 12,
  kFsFuseLocal = 13,
  kFirstRemote = 100,
  kFsNfs = 100,
  kFsSmb = 101,
  kFsAfs = 102,
  kFsCeph = 103,
  kFs9p = 104,
  kFsOtherRemote = 105,
  kFsFuseRemote = 106,
  kFirstImage = 200,
  kFsIso9660 = 200,
  kFsUdf = 201,
  kFsSquashfs = 202,
  kFsOtherImage = 203,
  kFsLoop = 204,
};

// The type for the magic number of statfs() alone.
FsType TypeOfMagic(unsigned long magic);

// The type of a file system whose magic number alone does not tell, for what is known of its mount.
FsType TypeOfFuse(const Mount& mount);

// Whether the mount is an image in a file, made a disk for it. The root of a machine is none.
bool IsLoopMount(const Mount& mount);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_FS_TYPE_H_
