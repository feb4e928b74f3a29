// Sees whether platform calls are made under the platform lock.

#ifndef QUARRY_TESTS_COMMON_SDK_LOCK_HELD_H_
#define QUARRY_TESTS_COMMON_SDK_LOCK_HELD_H_

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <thread>

#include "common/lock_file.h"
#include "common/sdk/share.h"
#include "tests/support/thrown.h"

namespace quarry::sdk {

inline bool IsSDKMutexFree() {
  bool locked = false;
  std::thread([&locked] {
    locked = SDKMutex().TryLock();
    if (locked) SDKMutex().Unlock();
  }).join();
  return locked;
}

// test::FailureOf() of a call that leaves the lock free.
inline std::string FailureOf(const std::function<void()>& call) {
  std::string failure = test::FailureOf(call);
  EXPECT_TRUE(IsSDKMutexFree());
  return failure;
}

}  // namespace quarry::sdk

#endif  // QUARRY_TESTS_COMMON_SDK_LOCK_HELD_H_
