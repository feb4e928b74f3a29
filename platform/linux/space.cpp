#include "platform/linux/space.h"

#include <fcntl.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>

#include "common/unique_fd.h"
#include "platform/include/error.h"
#include "platform/include/filesystem.h"
#include "platform/linux/keep_errno.h"
#include "platform/linux/last_error.h"

namespace quarry::platform {
namespace {

// Fails the question with `error`: 0 is "no".
int Refuse(int error, int line) {
  SetLastError(error, "space.cpp", line);
  return 0;
}

// A volume without quotas, and a kernel that cannot be asked by path, set no limit.
bool ReadQuota(const char* path, unsigned int uid, dqblk* quota) {
#ifdef SYS_quotactl_fd
  const KeepErrno keep;
  const UniqueFd fd(open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  return fd.valid() && syscall(SYS_quotactl_fd, fd.get(), QCMD(Q_GETQUOTA, USRQUOTA), uid,
                               static_cast<void*>(quota)) == 0;
#else
  static_cast<void>(path);
  static_cast<void>(uid);
  static_cast<void>(quota);
  return false;
#endif
}

}  // namespace

bool FitsQuota(const dqblk& quota, unsigned long long bytes) {
  constexpr unsigned long long kQuotaBlock = 1024;
  if (quota.dqb_bhardlimit == 0) return true;
  const unsigned long long limit = quota.dqb_bhardlimit * kQuotaBlock;
  return quota.dqb_curspace <= limit && bytes <= limit - quota.dqb_curspace;
}

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" int TARNQuotaIsEnough(const char* path, unsigned int uid, unsigned long long bytes) {
  if (path == nullptr) return Refuse(kErrBadParameter, __LINE__);
  struct statvfs volume {};
  int result;
  do {
    result = statvfs(path, &volume);
  } while (result != 0 && errno == EINTR);
  if (result != 0) return Refuse(kErrSystem, __LINE__);
  // What is reserved for root is left to repairs, for root as well.
  const unsigned long long block = volume.f_frsize == 0 ? volume.f_bsize : volume.f_frsize;
  if (block != 0 && volume.f_bavail < bytes / block + (bytes % block != 0 ? 1 : 0)) {
    return Refuse(kHLIBErrNoSpace, __LINE__);
  }
  // Root has no quota.
  dqblk quota{};
  if (uid != 0 && ReadQuota(path, uid, &quota) && !FitsQuota(quota, bytes)) {
    return Refuse(kHLIBErrQuota, __LINE__);
  }
  return 1;
}
