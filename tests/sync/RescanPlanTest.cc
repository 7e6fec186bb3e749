#include <gtest/gtest.h>

#include "sync/RescanPlan.h"

using mailsync::RescanPlan;
using std::chrono::hours;
using std::chrono::milliseconds;
using std::chrono::minutes;
using Places = std::set<std::string>;

namespace {

// Starts after the first full round. Times are in milliseconds from there.
class RescanPlanTest : public testing::Test {
 protected:
  RescanPlanTest() {
    first = plan.take(start);
    plan.finished(true, start);
  }
  [[nodiscard]] RescanPlan::Time at(int64_t time) const { return start + milliseconds(time); }
  // The places of the round that is due, "*" for everything; nullopt if no round is due.
  std::optional<Places> take(int64_t time, bool succeeds = true) {
    const auto round = plan.take(at(time));
    if (!round) return std::nullopt;
    plan.finished(succeeds, at(time));
    return round->everything ? Places{"*"} : round->places;
  }

  const RescanPlan::Time start{hours(1000)};
  RescanPlan plan{start};
  std::optional<RescanPlan::Round> first;
};

}  // namespace

TEST_F(RescanPlanTest, EverythingAtTheStartOnceADayAndWhenChangesWereLost) {
  EXPECT_TRUE(first && first->everything);
  EXPECT_EQ(plan.next(), start + hours(24));
  plan.changed("/a", at(1000));
  plan.lost(at(1010));
  plan.changed("/b", at(1020));
  EXPECT_EQ(take(1070), Places{"*"});
  EXPECT_EQ(plan.next(), start + hours(24));
  EXPECT_EQ(take(24 * 3600 * 1000), Places{"*"});
  EXPECT_EQ(plan.next(), start + hours(48));
}

TEST_F(RescanPlanTest, ChangesAreTakenTogetherButNotForLong) {
  plan.changed("/a", at(0));
  EXPECT_EQ(take(49), std::nullopt);
  plan.changed("/a", at(40));
  plan.changed("/b", at(40));
  EXPECT_EQ(plan.next(), at(90));
  EXPECT_EQ(take(90), (Places{"/a", "/b"}));
  // Changes that never stop.
  int64_t time = 1000;
  for (; time < 1300; time += 20) {
    plan.changed("/c", at(time));
    EXPECT_EQ(take(time), std::nullopt);
  }
  EXPECT_EQ(take(1300), Places{"/c"});
}

TEST_F(RescanPlanTest, RetriesAFailedRoundWithGrowingPauses) {
  plan.changed("/a", at(0));
  ASSERT_EQ(take(50, false), Places{"/a"});
  plan.changed("/b", at(60));
  EXPECT_EQ(plan.next(), at(300));
  ASSERT_EQ(take(300, false), (Places{"/a", "/b"}));
  EXPECT_EQ(plan.next(), at(800));
  int64_t time = 800;
  for (int i = 0; i < 20; ++i) {
    ASSERT_TRUE(take(time, false));
    time += (plan.next() - at(time)) / milliseconds(1);
  }
  ASSERT_TRUE(take(time, false));
  EXPECT_EQ(plan.next(), at(time) + RescanPlan::kLastRetry);
  // The daemon is running again.
  plan.retry(at(time + 10));
  EXPECT_EQ(take(time + 60), (Places{"/a", "/b"}));
  EXPECT_EQ(plan.next(), start + hours(24));
  // A full round stays a full round.
  plan.lost(at(time + 100));
  ASSERT_EQ(take(time + 150, false), Places{"*"});
  EXPECT_EQ(take(time + 500), Places{"*"});
}

TEST_F(RescanPlanTest, ScansUnwatchedPlacesAtIntervals) {
  plan.setUnwatched({"/a"}, at(0));
  EXPECT_EQ(plan.next(), start + minutes(2));
  plan.changed("/b", at(1000));
  EXPECT_EQ(take(1050), Places{"/b"});
  EXPECT_EQ(take(120000), Places{"/a"});
  EXPECT_EQ(take(120001), std::nullopt);
  EXPECT_EQ(take(240000), Places{"/a"});
  plan.setUnwatched({}, at(240000));
  EXPECT_EQ(plan.next(), start + hours(24));
}

TEST_F(RescanPlanTest, TooManyPlacesCauseAFullRound) {
  for (size_t i = 0; i <= RescanPlan::kMaxPlaces; ++i) plan.changed(std::to_string(i), at(0));
  EXPECT_EQ(take(50), Places{"*"});
}
