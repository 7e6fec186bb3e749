#include <gtest/gtest.h>

#include <atomic>
#include <optional>
#include <thread>

#include "salt/ScanTraffic.h"

namespace {

using salt::ScanTraffic;
using std::chrono::hours;
using std::chrono::milliseconds;

}  // namespace

// An end that is not told would be waited for until the test is killed.
TEST(ScanTraffic, WhoWaitsGoesOnBehindTheLastScan) {
  ScanTraffic traffic;
  EXPECT_FALSE(traffic.any());
  traffic.waitForEnd(hours(1));
  std::optional<ScanTraffic::Scan> first(std::in_place, traffic);
  std::optional<ScanTraffic::Scan> second(std::in_place, traffic);
  std::atomic<int> ended = 0;
  std::thread waiting([&] {
    traffic.waitForEnd(hours(1));
    EXPECT_EQ(ended, 2);
  });
  ended = 1;
  first.reset();
  EXPECT_TRUE(traffic.any());
  ended = 2;
  second.reset();
  waiting.join();
  EXPECT_FALSE(traffic.any());
}

TEST(ScanTraffic, NobodyWaitsLongerThanTheyWant) {
  ScanTraffic traffic;
  const ScanTraffic::Scan scan(traffic);
  traffic.waitForEnd(milliseconds(1));
  EXPECT_TRUE(traffic.any());
}
