#include "daemons/fileindexd/gate.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include "tests/support/files.h"

namespace quarry::fileindexd {
namespace {

using std::chrono::hours;
using std::chrono::milliseconds;

TEST(GateTest, LetsPassUnlessPausedOrStopped) {
  Gate gate;
  gate.Pass();
  EXPECT_FALSE(gate.Paused());
  EXPECT_FALSE(gate.Stopping());
  gate.Stop();
  EXPECT_TRUE(gate.Stopping());
  EXPECT_THROW(gate.Pass(), Interrupted);
}

TEST(GateTest, HoldsUpWhilePaused) {
  Gate gate;
  gate.SetPaused(true);
  std::atomic<bool> passed{false};
  std::thread thread([&] {
    gate.Pass();
    passed = true;
  });
  gate.Wake();
  EXPECT_TRUE(gate.Paused());
  EXPECT_FALSE(passed);
  gate.SetPaused(false);
  thread.join();
  EXPECT_TRUE(passed);
}

TEST(GateTest, StopEndsAPause) {
  Gate gate;
  gate.SetPaused(true);
  std::thread thread([&] { EXPECT_THROW(gate.Pass(), Interrupted); });
  gate.Stop();
  thread.join();
}

TEST(GateTest, WaitsForItsTimeOrUntilItIsWoken) {
  Gate gate;
  EXPECT_FALSE(gate.WaitFor(milliseconds(1)));
  gate.Wake();
  EXPECT_TRUE(gate.WaitFor(hours(1)));
  EXPECT_FALSE(gate.WaitFor(milliseconds(1)));
  std::thread thread([&] { EXPECT_TRUE(gate.WaitFor(hours(1))); });
  gate.Wake();
  thread.join();
}

TEST(GateTest, StopEndsAWait) {
  Gate gate;
  std::thread thread([&] { EXPECT_FALSE(gate.WaitFor(hours(1))); });
  gate.Stop();
  thread.join();
  EXPECT_FALSE(gate.WaitFor(hours(1)));
}

TEST(GateTest, AStopEndsARest) {
  Gate gate;
  gate.Rest(std::chrono::milliseconds(1));
  gate.Wake();
  gate.SetPaused(true);
  gate.Rest(std::chrono::milliseconds(1));
  EXPECT_TRUE(gate.WaitFor(std::chrono::hours(1))) << "the rest has taken the wake";
  std::thread stopper([&] { gate.Stop(); });
  EXPECT_THROW(gate.Rest(std::chrono::hours(1)), Interrupted);
  stopper.join();
  EXPECT_THROW(gate.Rest(std::chrono::hours(1)), Interrupted);
}

}  // namespace
}  // namespace quarry::fileindexd
