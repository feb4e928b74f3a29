// The base of tests that run on the stand-in platform.

#ifndef QUARRY_TESTS_FAKE_PLATFORM_FIXTURE_H_
#define QUARRY_TESTS_FAKE_PLATFORM_FIXTURE_H_

#include <gtest/gtest.h>

#include <cerrno>

#include "tests/fake_platform/fake_platform.h"
#include "tests/fake_platform/system_calls.h"
#include "tests/support/root.h"

namespace quarry::fake {

// Each test starts with an empty world, an empty root and errno 0, and fails when it keeps a
// platform record, a list or a connection.
class FakePlatformTest : public ::testing::Test {
 protected:
  FakePlatformTest() {
    Reset();
    test::ResetTestRoot();
    errno = 0;
  }
  ~FakePlatformTest() override {
    EXPECT_EQ(Outstanding(), 0) << "platform records were not released";
    Reset();
  }
};

}  // namespace quarry::fake

#endif  // QUARRY_TESTS_FAKE_PLATFORM_FIXTURE_H_
