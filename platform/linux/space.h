// Room on volumes and in quotas.

#ifndef QUARRY_PLATFORM_LINUX_SPACE_H_
#define QUARRY_PLATFORM_LINUX_SPACE_H_

#include <sys/quota.h>

namespace quarry::platform {

// Whether `bytes` more bytes keep within the hard limit of a user's quota record.
bool FitsQuota(const dqblk& quota, unsigned long long bytes);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_SPACE_H_
