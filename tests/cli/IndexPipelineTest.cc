#include <fmt/format.h>
#include <gtest/gtest.h>

#include "cli/BatchPace.h"
#include "cli/IndexPipeline.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

std::string mboxOf(size_t messages, size_t bodyBytes) {
  std::string bytes;
  for (size_t i = 0; i < messages; ++i) {
    bytes += fmt::format("From m@example.org Mon Jan  8 08:49:00 2024\nSubject: {}\n\n{}\n\n", i,
                         std::string(bodyBytes, 'x'));
  }
  return bytes;
}

}  // namespace

TEST(IndexPipeline, BatchesAreBoundedAndKeepTheOrder) {
  const testsupport::TemporaryDirectory directory;
  for (const auto& [messages, bodyBytes] : {std::pair<size_t, size_t>{1201, 10}, {100, 150000}}) {
    cli::IndexPipeline pipeline({directory.write("box", mboxOf(messages, bodyBytes))});
    size_t seen = 0;
    uint64_t inputBytes = 0;
    while (const auto batch = pipeline.next()) {
      EXPECT_LE(batch->items.size(), cli::kBatchItems);
      EXPECT_LE(batch->itemBytes, cli::kBatchBytes);
      inputBytes += batch->inputBytes;
      for (const auto& encoded : batch->items) {
        TLIndexableItem item;
        ASSERT_TRUE(item.initWithData(encoded.bytes));
        EXPECT_EQ(platform::toUTF8(*item.stringValueForKey(TLAttributeKey::SUBJECT)),
                  std::to_string(seen++));
      }
    }
    EXPECT_EQ(seen, messages);
    EXPECT_EQ(inputBytes, mboxOf(messages, bodyBytes).size());
  }
}

TEST(IndexPipeline, CanBeDestroyedEarly) {
  const testsupport::TemporaryDirectory directory;
  cli::IndexPipeline pipeline({directory.write("box", mboxOf(5000, 10))});
  EXPECT_TRUE(pipeline.next().has_value());
}

TEST(BatchPaceTest, FollowsTheQuickRepliesAndForgetsTheLateOnes) {
  using std::chrono::milliseconds;
  cli::BatchPace pace;
  EXPECT_EQ(pace.items(), cli::BatchPace::kFirst);
  pace.replied(20, milliseconds(20));
  EXPECT_EQ(pace.items(), 50u);
  pace.replied(50, milliseconds(10000));  // a merge
  EXPECT_EQ(pace.items(), 45u);
  pace.replied(45, milliseconds(22));
  EXPECT_EQ(pace.items(), 102u);
  for (int i = 0; i < 20; ++i) pace.replied(100, milliseconds(1000));
  EXPECT_EQ(pace.items(), 15u);  // the mails are larger now
  for (int i = 0; i < 100; ++i) pace.replied(10, milliseconds(5000));
  EXPECT_EQ(pace.items(), cli::BatchPace::kMin);
  pace.replied(5, milliseconds(0));
  EXPECT_EQ(pace.items(), cli::BatchPace::kMax);
}
