#include <gtest/gtest.h>

#include <numeric>

#include "client/Batches.h"

namespace {

std::vector<client::EncodedItem> itemsOfSizes(const std::vector<size_t>& sizes) {
  std::vector<client::EncodedItem> items;
  for (const size_t size : sizes) {
    items.push_back({"item" + std::to_string(items.size()), std::string(size, 'x')});
  }
  return items;
}

std::vector<size_t> counts(const std::vector<std::span<const client::EncodedItem>>& pieces) {
  std::vector<size_t> result;
  for (const auto piece : pieces) result.push_back(piece.size());
  return result;
}

}  // namespace

// An element takes 4 bytes of length plus its bytes, padded to a multiple of 4.
TEST(Batches, AreAsFullAsTheLimitAllows) {
  using Sizes = std::vector<size_t>;
  const struct {
    Sizes sizes;
    size_t limit;
    Sizes counts;
  } kCases[] = {
      {{}, 100, {}},
      {{0, 0}, 8, {2}},
      {{0, 0}, 7, {1, 1}},
      {{4, 4, 4}, 16, {2, 1}},
      {{4, 5, 4}, 20, {2, 1}},
      {{4, 5, 4}, 19, {1, 1, 1}},
      {{96, 1, 1, 1}, 100, {1, 3}},
      {{96, 1, 1, 1}, 107, {1, 3}},
      {{96, 1, 1, 1}, 108, {2, 2}},
  };
  for (const auto& c : kCases) {
    const auto items = itemsOfSizes(c.sizes);
    std::optional<TLError> error;
    const auto pieces = client::splitItems(items, &error, c.limit);
    ASSERT_TRUE(pieces.has_value()) << error->message;
    EXPECT_EQ(counts(*pieces), c.counts) << "limit " << c.limit;
    const client::EncodedItem* next = items.data();
    for (const auto piece : *pieces) {
      EXPECT_EQ(piece.data(), next);  // in order and complete
      next += piece.size();
    }
  }
}

TEST(Batches, ErrorNamesAnItemThatExceedsTheLimit) {
  const auto items = itemsOfSizes({1, 97, 1});
  std::optional<TLError> error;
  EXPECT_FALSE(client::splitItems(items, &error, 100).has_value());
  EXPECT_EQ(error->message, "item1 takes 104 bytes, more than the 100 that one call can carry");
  const std::vector<std::string> texts{"ab", "0123456789"};
  EXPECT_FALSE(client::splitTexts(texts, &error, 12).has_value());
  EXPECT_EQ(error->message, "0123456789 takes 16 bytes, more than the 12 that one call can carry");
  EXPECT_EQ(client::splitTexts(texts, &error, 16)->size(), 2u);
}

// A query that the daemon would refuse is not even encoded.
TEST(Batches, RefusesAQueryBeyondTheRecordLimits) {
  const auto inner = [](std::vector<std::shared_ptr<TLQueryNode>> childs) {
    auto node = std::make_shared<TLQueryNode>();
    node->setMergeOp(TLQueryNodeMergeOp::AND);
    node->setChilds(std::move(childs));
    return node;
  };
  const auto encoded = [](std::shared_ptr<TLQueryNode> root, size_t limit) {
    TLQuery query;
    query.setRoot(std::move(root));
    std::optional<TLError> error;
    const auto bytes = client::encode(query, &error, limit);
    EXPECT_NE(bytes.has_value(), error.has_value());
    TLQuery read;
    EXPECT_TRUE(!bytes || read.initWithData(*bytes));
    return error ? error->message : std::string();
  };
  constexpr size_t kBytes = client::kMaxArrayBytes;
  auto high = std::make_shared<TLQueryNode>();
  for (int i = 1; i < kMaxRecordDepth; ++i) high = inner({high});
  EXPECT_EQ(encoded(high, kBytes), "");
  high = inner({high});
  EXPECT_EQ(encoded(high, kBytes), "the query nests conditions more than 256 deep");
  for (int i = 0; i < 100000; ++i) high = inner({high});
  EXPECT_EQ(encoded(high, kBytes), "the query nests conditions more than 256 deep");
  std::vector<std::shared_ptr<TLQueryNode>> many(kMaxRecordElements - 1, inner({}));
  EXPECT_EQ(encoded(inner(many), kBytes), "");
  many.push_back(inner({}));
  EXPECT_EQ(encoded(inner(many), kBytes), "the query holds more than 262144 conditions");
  EXPECT_EQ(encoded(inner({}), 3),
            "the query takes 4 bytes, more than the 3 that one call can carry");
  EXPECT_EQ(encoded(inner({}), 4), "");
}
