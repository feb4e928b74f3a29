#include "daemons/common/priority.h"

#include <gtest/gtest.h>
#include <sys/resource.h>

#include <functional>
#include <thread>

#include "tests/daemons/common/io_class.h"

namespace quarry::daemon {
namespace {

int Nice() {
  return getpriority(PRIO_PROCESS, 0);
}

// In threads, whose priorities end with them.
void InThread(const std::function<void()>& body) {
  std::thread(body).join();
}

TEST(PriorityTest, HoldsForTheThreadAndThoseThatItStarts) {
  const int nice = Nice();
  InThread([] {
    WorkInBackground();
    InThread([] {
      EXPECT_EQ(kBackgroundNice, Nice());
      EXPECT_EQ(test::kIdleIoClass, test::IoClass());
    });
  });
  EXPECT_EQ(nice, Nice());
}

TEST(PriorityTest, NobodyBecomesLessNice) {
  InThread([] {
    ASSERT_EQ(0, setpriority(PRIO_PROCESS, 0, 15));
    WorkInBackground();
    EXPECT_EQ(15, Nice());
    EXPECT_EQ(test::kIdleIoClass, test::IoClass());
  });
}

}  // namespace
}  // namespace quarry::daemon
