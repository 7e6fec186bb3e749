#include <gtest/gtest.h>

#include <atomic>
#include <optional>
#include <thread>

#include "salt/Activity.h"

namespace {

using salt::Activity;
using std::chrono::hours;

}  // namespace

// Without a notification of the end the wait would last until the test is killed.
TEST(Activity, WaitEndsAfterTheLastScan) {
  Activity traffic;
  EXPECT_FALSE(traffic.any());
  traffic.waitForEnd(hours(1));
  std::optional<Activity::Work> first(std::in_place, traffic);
  std::optional<Activity::Work> second(std::in_place, traffic);
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
