#include "platform/linux/fs_type.h"

#include <sys/stat.h>
#include <sys/statfs.h>
#include <sys/sysmacros.h>

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <string>

#include "platform/include/filesystem.h"
#include "platform/linux/last_error.h"

namespace quarry::platform {
namespace {

constexpr unsigned long kMagicFuse = 0x65735546;
constexpr unsigned long kMagicTmpfs = 0x01021994;
constexpr unsigned kLoopMajor = 7;

struct MagicRow {
  unsigned long magic;
  FsType type;
};

constexpr MagicRow kMagicTable[] = {
    {0x0000EF53, kFsExt},          // ext2, ext3, ext4
    {0x9123683E, kFsBtrfs},        //
    {0x58465342, kFsXfs},          //
    {0x2FC12FC1, kFsZfs},          //
    {0xF2F52010, kFsF2fs},         //
    {0x00004D44, kFsFat},          //
    {0x2011BAB0, kFsExfat},        //
    {0x5346544E, kFsNtfs},         // the older driver
    {0x7366746E, kFsNtfs},         // ntfs3
    {0x00004244, kFsHfs},          //
    {0x0000482B, kFsHfs},          // HFS+
    {kMagicTmpfs, kFsTmpfs},       //
    {0x794C7630, kFsOverlay},      //
    {0x00009FA0, kFsPseudo},       // proc
    {0x62656572, kFsPseudo},       // sysfs
    {0x0027E0EB, kFsPseudo},       // cgroup
    {0x63677270, kFsPseudo},       // cgroup2
    {0x00001CD1, kFsPseudo},       // devpts
    {0x64626720, kFsPseudo},       // debugfs
    {0x74726163, kFsPseudo},       // tracefs
    {0x73636673, kFsPseudo},       // securityfs
    {0xCAFE4A11, kFsPseudo},       // bpf
    {0x6165676C, kFsPseudo},       // pstore
    {0xDE5E81E4, kFsPseudo},       // efivarfs
    {0x62656570, kFsPseudo},       // configfs
    {0x65735543, kFsPseudo},       // fusectl
    {0x19800202, kFsPseudo},       // mqueue
    {0x958458F6, kFsPseudo},       // hugetlbfs
    {0x42494E4D, kFsPseudo},       // binfmt_misc
    {0xF97CFF8C, kFsPseudo},       // selinuxfs
    {0x43415D53, kFsPseudo},       // smackfs
    {0x5A3C69F0, kFsPseudo},       // apparmorfs
    {0x6E736673, kFsPseudo},       // nsfs
    {0x50495045, kFsPseudo},       // pipefs
    {0x534F434B, kFsPseudo},       // sockfs
    {0x09041934, kFsPseudo},       // anonymous inodes
    {0x67596969, kFsPseudo},       // rpc_pipefs
    {0x6E667364, kFsPseudo},       // nfsd
    {0x00000187, kFsPseudo},       // autofs: nothing is mounted there yet
    {0x07655821, kFsPseudo},       // rdtgroup
    {0x6C6F6F70, kFsPseudo},       // binderfs
    {0x00009FA2, kFsPseudo},       // usbdevfs
    {0x64646178, kFsPseudo},       // daxfs
    {0x00009FA1, kFsPseudo},       // openpromfs
    {0xABBA1974, kFsPseudo},       // xenfs
    {0x5345434D, kFsPseudo},       // secret memory
    {0x444D4142, kFsPseudo},       // shared buffers of devices
    {0x50494446, kFsPseudo},       // processes
    {0x00006969, kFsNfs},          //
    {0x0000517B, kFsSmb},          // smbfs
    {0xFF534D42, kFsSmb},          // cifs
    {0xFE534D42, kFsSmb},          // smb2
    {0x5346414F, kFsAfs},          //
    {0x6B414653, kFsAfs},          // the kernel's own
    {0x00C36400, kFsCeph},         //
    {0x01021997, kFs9p},           //
    {0x73757245, kFsOtherRemote},  // coda
    {0x0000564C, kFsOtherRemote},  // ncpfs
    {0x0BD00BD0, kFsOtherRemote},  // lustre
    {0x01161970, kFsOtherRemote},  // gfs2
    {0x7461636F, kFsOtherRemote},  // ocfs2
    {0x19830326, kFsOtherRemote},  // fhgfs
    {0x013111A8, kFsOtherRemote},  // ibrix
    {0x47504653, kFsOtherRemote},  // gpfs
    {0xAAD7AAEA, kFsOtherRemote},  // panfs
    {0xBEEFDEAD, kFsOtherRemote},  // snfs
    {0x786F4256, kFsOtherRemote},  // folders of a virtual machine's host
    {0x00009660, kFsIso9660},      //
    {0x15013346, kFsUdf},          //
    {0x73717368, kFsSquashfs},     //
    {0xE0F5E1E2, kFsOtherImage},   // erofs
    {0x28CD3D45, kFsOtherImage},   // cramfs
    {0x00007275, kFsOtherImage},   // romfs
};

constexpr const char* kRemoteFuse[] = {
    "fuse.sshfs",     "fuse.rclone",    "fuse.s3fs",      "fuse.glusterfs",  "fuse.ceph",
    "fuse.ceph-fuse", "fuse.davfs",     "fuse.curlftpfs", "fuse.gvfsd-fuse", "fuse.mfs",
    "fuse.juicefs",   "fuse.gcsfuse",   "fuse.goofys",    "fuse.smbnetfs",   "fuse.afpfs",
    "fuse.nfs",       "fuse.seaweedfs", "fuse.moosefs",   "fuse.lizardfs",   "fuse.beegfs"};
constexpr const char* kImageFuse[] = {"fuse.squashfuse",   "fuse.snapfuse",     "fuse.fuseiso",
                                      "fuse.archivemount", "fuse.fuse-archive", "fuse.erofsfuse"};
constexpr const char* kPseudoFuse[] = {"fuse.lxcfs", "fuse.portal"};

template <std::size_t N>
bool Contains(const char* const (&names)[N], const std::string& name) {
  return std::find(std::begin(names), std::end(names), name) != std::end(names);
}

bool IsRemoteSource(const std::string& source) {
  return source.find("://") != std::string::npos || source.compare(0, 2, "//") == 0 ||
         (source.find(':') != std::string::npos && source.front() != '/');
}

// Whether the device of a file is a disk image, or one that says nothing of its disk.
bool MayBeLoop(const struct stat& info) {
  const unsigned device_major = major(info.st_dev);
  return device_major == kLoopMajor || device_major == 0;
}

FsType TypeOfPath(const char* path, const struct statfs& fs, const struct stat& info) {
  const auto magic = static_cast<unsigned long>(fs.f_type) & 0xFFFFFFFFUL;
  const FsType type = TypeOfMagic(magic);
  if (type >= kFsPseudo && type != kFsFuseLocal) return type;
  if (magic != kMagicFuse && !MayBeLoop(info)) return type;
  Mount mount;
  if (!FindMount(path, &mount)) return type;
  if (magic == kMagicFuse) return TypeOfFuse(mount);
  // The directory of devices is a tmpfs but by name.
  if (mount.type == "devtmpfs") return kFsPseudo;
  return IsLoopMount(mount) ? kFsLoop : type;
}

}  // namespace

FsType TypeOfMagic(unsigned long magic) {
  if (magic == kMagicFuse) return kFsFuseLocal;
  const auto* row = std::find_if(std::begin(kMagicTable), std::end(kMagicTable),
                                 [&](const MagicRow& r) { return r.magic == magic; });
  return row == std::end(kMagicTable) ? kFsOtherLocal : row->type;
}

FsType TypeOfFuse(const Mount& mount) {
  if (mount.type == "fuseblk") return IsLoopMount(mount) ? kFsLoop : kFsFuseLocal;
  if (Contains(kRemoteFuse, mount.type)) return kFsFuseRemote;
  if (Contains(kImageFuse, mount.type)) return kFsOtherImage;
  if (Contains(kPseudoFuse, mount.type)) return kFsPseudo;
  return IsRemoteSource(mount.source) ? kFsFuseRemote : kFsFuseLocal;
}

bool IsLoopMount(const Mount& mount) {
  if (mount.point == "/") return false;
  return mount.device_major == kLoopMajor || mount.source.compare(0, 9, "/dev/loop") == 0;
}

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" {

int TARNGetFSType(const char* path, int) {
  struct statfs fs {};
  struct stat info {};
  if (path == nullptr || *path == '\0') return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  int result;
  do {
    result = statfs(path, &fs);
  } while (result != 0 && errno == EINTR);
  if (result != 0 || stat(path, &info) != 0) return QUARRY_PLATFORM_FAIL(kErrSystem);
  return TypeOfPath(path, fs, info);
}

int TARNFSIsRemoteFS(int type) {
  return type >= kFirstRemote && type < kFirstImage ? 1 : 0;
}

int TARNFSIsImageFS(int type) {
  return type >= kFirstImage ? 1 : 0;
}

}  // extern "C"
