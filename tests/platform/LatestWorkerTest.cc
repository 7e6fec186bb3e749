#include <gtest/gtest.h>

#include <functional>
#include <mutex>
#include <vector>

#include "platform/LatestWorker.h"

namespace {

// A worker that doubles numbers when the test allows it.
class LatestWorkerTest : public testing::Test {
 protected:
  int work(int job, const std::stop_token& stop) {
    std::unique_lock lock(mutex);
    started.push_back(job);
    changed.notify_all();
    changed.wait(lock, stop, [this] { return free; });
    return 2 * job;
  }
  void wake() {
    const std::lock_guard lock(mutex);
    ++woken;
    changed.notify_all();
  }
  void await(const std::function<bool()>& holds) {
    std::unique_lock lock(mutex);
    changed.wait(lock, holds);
  }
  void letGo() {
    const std::lock_guard lock(mutex);
    free = true;
    changed.notify_all();
  }

  std::mutex mutex;
  std::condition_variable_any changed;
  std::vector<int> started;
  bool free = false;
  int woken = 0;  // how often
  platform::LatestWorker<int, int> worker{
      "test.latest", [this](int job, const std::stop_token& stop) { return work(job, stop); },
      [this] { wake(); }};
};

}  // namespace

TEST_F(LatestWorkerTest, OnlyTheLastJobHasAResult) {
  EXPECT_EQ(worker.take(), std::nullopt);
  worker.submit(1);
  await([this] { return !started.empty(); });
  worker.submit(2);  // stops the first job and may begin
  worker.submit(3);
  letGo();
  await([this] { return woken == 1; });
  EXPECT_EQ(worker.take(), 6);
  EXPECT_EQ(worker.take(), std::nullopt);
  EXPECT_EQ(started.back(), 3);
}

// The worker is destroyed although the job was never allowed to finish.
TEST_F(LatestWorkerTest, DestructorStopsTheCurrentJob) {
  worker.submit(1);
  await([this] { return !started.empty(); });
}

TEST_F(LatestWorkerTest, ANewJobDropsTheResultOfTheLast) {
  letGo();
  worker.submit(1);
  await([this] { return woken == 1; });
  worker.submit(2);
  await([this] { return woken == 2; });
  EXPECT_EQ(worker.take(), 4);
  EXPECT_EQ(worker.take(), std::nullopt);
}
