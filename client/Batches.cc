#include "client/Batches.h"

#include "rpc/Channel.h"
#include "rpc/Names.h"

namespace client {

namespace {

// The length before each element, and the padding up to the next.
constexpr size_t kElementOverhead = 4;
constexpr size_t kAlignment = 4;

size_t padded(size_t size) {
  return (size + kAlignment - 1) / kAlignment * kAlignment;
}

size_t sizeOf(const EncodedItem& item) {
  return padded(kElementOverhead + item.bytes.size());
}
size_t sizeOf(const std::string& text) {
  return padded(kElementOverhead + text.size() + 1);
}
const std::string& nameOf(const EncodedItem& item) {
  return item.identifier;
}
const std::string& nameOf(const std::string& text) {
  return text;
}

constexpr size_t kNameLength = 200;
constexpr int kTooLarge = 1;

// The first limit on records that the query exceeds, in words; empty if it exceeds none. Traverses
// the tree level by level, because a tree that is too high must not be written.
std::string brokenLimit(const TLQuery& query) {
  size_t records = query.hasSearchParams() ? 1 + query.searchParams()->keyvaluesCount() : 0;
  std::vector<const TLQueryNode*> level;
  if (query.hasRoot()) level.push_back(query.root().get());
  for (int height = 1; !level.empty(); ++height) {
    if (height > kMaxRecordDepth) {
      return fmt::format("nests conditions more than {} deep", kMaxRecordDepth);
    }
    records += level.size();
    if (records > kMaxRecordElements) {
      return fmt::format("holds more than {} conditions", kMaxRecordElements);
    }
    std::vector<const TLQueryNode*> next;
    for (const TLQueryNode* node : level) {
      for (const auto& child : node->childs()) next.push_back(child.get());
    }
    level = std::move(next);
  }
  return {};
}

template <typename Element>
std::optional<std::vector<std::span<const Element>>> split(std::span<const Element> elements,
                                                           TLErrorOut error, size_t limit) {
  std::vector<std::span<const Element>> pieces;
  size_t begin = 0;
  size_t bytes = 0;
  for (size_t i = 0; i < elements.size(); ++i) {
    const size_t size = sizeOf(elements[i]);
    if (size > limit) {
      platform::setError(error,
                         {rpc::kClientDomain, kTooLarge,
                          fmt::format("{} takes {} bytes, more than the {} that one call can carry",
                                      nameOf(elements[i]).substr(0, kNameLength), size, limit)});
      return std::nullopt;
    }
    if (bytes + size > limit || i - begin == rpc::kMaxArrayElements) {
      pieces.push_back(elements.subspan(begin, i - begin));
      begin = i;
      bytes = 0;
    }
    bytes += size;
  }
  if (begin < elements.size()) pieces.push_back(elements.subspan(begin));
  return pieces;
}

}  // namespace

EncodedItem encode(const TLIndexableItem& item) {
  return {platform::toUTF8(platform::orEmpty(item.identifier())), item.data()};
}

std::optional<std::vector<std::span<const EncodedItem>>> splitItems(
    std::span<const EncodedItem> items, TLErrorOut error, size_t limit) {
  return split(items, error, limit);
}

std::optional<std::vector<std::span<const std::string>>> splitTexts(
    std::span<const std::string> texts, TLErrorOut error, size_t limit) {
  return split(texts, error, limit);
}

std::optional<std::string> encode(const TLQuery& query, TLErrorOut error, size_t limit) {
  std::string broken = brokenLimit(query);
  std::string bytes = broken.empty() ? query.data() : std::string();
  if (bytes.size() > limit) {
    broken = fmt::format("takes {} bytes, more than the {} that one call can carry", bytes.size(),
                         limit);
  }
  if (broken.empty()) return bytes;
  platform::setError(error, {rpc::kClientDomain, kTooLarge, "the query " + broken});
  return std::nullopt;
}

}  // namespace client
