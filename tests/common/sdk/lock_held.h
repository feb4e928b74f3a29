// Sees whether platform calls are made under the platform lock.

#ifndef QUARRY_TESTS_COMMON_SDK_LOCK_HELD_H_
#define QUARRY_TESTS_COMMON_SDK_LOCK_HELD_H_

#include <thread>

#include "common/lock_file.h"
#include "common/sdk/share.h"

namespace quarry::sdk {

inline bool IsSDKMutexFree() {
  bool locked = false;
  std::thread([&locked] {
    locked = SDKMutex().TryLock();
    if (locked) SDKMutex().Unlock();
  }).join();
  return locked;
}

}  // namespace quarry::sdk

#endif  // QUARRY_TESTS_COMMON_SDK_LOCK_HELD_H_
