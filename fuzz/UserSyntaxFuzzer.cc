// Parses any bytes as a typed search. The result must be a tree of bounded depth that can be
// printed, and must contain every word of a plain query.

#include <cstddef>
#include <cstdint>
#include <utility>
#include <vector>

#include "platform/Assert.h"
#include "platform/Text.h"
#include "usersyntax/Syntax.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string text(reinterpret_cast<const char*>(data), size);
  const usersyntax::Query query = usersyntax::parse(text, 1704700800);
  std::vector<std::pair<const usersyntax::Node*, size_t>> open{{&query.root, 1}};
  size_t words = 0;
  while (!open.empty()) {
    const auto [node, depth] = open.back();
    open.pop_back();
    TL_ASSERT(depth <= 3 * usersyntax::kMaxDepth + 3);
    words += node->kind == usersyntax::Kind::text ? 1 : 0;
    for (const auto& child : node->children) open.emplace_back(&child, depth + 1);
  }
  const bool blank = text.find_first_not_of(" \t\n\v\f\r") == std::string::npos;
  TL_ASSERT(!query.plain || blank == (words == 0));
  TL_ASSERT(!usersyntax::printed(query.root).empty());
  return 0;
}
