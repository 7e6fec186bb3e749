#include <gtest/gtest.h>

#include <atomic>
#include <optional>
#include <thread>

#include "salt/ScanTraffic.h"

namespace {

using salt::ScanTraffic;
using std::chrono::hours;

}  // namespace

// An end that is not told would be waited for until the test is killed.
TEST(ScanTraffic, WhoWaitsGoesOnBehindTheLastScan) {
  ScanTraffic traffic;
  EXPECT_FALSE(traffic.any());
  traffic.waitForEnd(hours(1));
  std::optional<ScanTraffic::Scan> first(std::in_place, traffic);
  std::optional<ScanTraffic::Scan> second(std::in_place, traffic);
  std::atomic<bool> waiting = false;
  std::atomic<bool> last = false;
  std::thread scans([&] {
    while (!waiting) std::this_thread::yield();
    first.reset();
    EXPECT_TRUE(traffic.any());
    last = true;
    second.reset();
  });
  waiting = true;
  traffic.waitForEnd(hours(1));
  EXPECT_TRUE(last);
  EXPECT_FALSE(traffic.any());
  scans.join();
}
