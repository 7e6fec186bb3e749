#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "salt/Index.h"

// Finds the most frequent tokens of an index in bounded memory.
namespace saltsearch {

// The weight of one occurrence in a zone; called once per zone and pass.
using ZoneScore = std::function<double(uint32_t docID, uint16_t zone)>;
// The byte offsets at which the tokens of a text begin, ascending.
using TokenStarts = std::function<std::vector<uint32_t>(std::string_view text)>;

// Longer tokens are skipped: nobody types them, and thousands of them would take gigabytes.
inline constexpr size_t kMaxTokenBytes = 1024;

// The `k` heaviest tokens of the live documents with the summed weights of their occurrences,
// heaviest first, ties in byte order. A token extends to the start of the next one or to the end of
// the zone, separators included.
//
// Two passes over all stored text: the first finds candidates (Misra and Gries 1982, in batches and
// weighted), the second counts them exactly. With m = max(k, 100), at most 1.5 m tokens are kept at
// a time. A token is certain to be in the result when fewer than k others are as heavy and its
// weight is above the total weight of all tokens divided by m.
//
// `goOn`, unless empty, is called for each zone; false ends the call with a meaningless result. Any
// thread, concurrently with everything else; does not use the block cache.
[[nodiscard]] std::vector<std::pair<std::string, double>> TopKTokens(
    const salt::Index& index, size_t k, const ZoneScore& zoneScore, const TokenStarts& tokenizer,
    const std::function<bool()>& goOn = nullptr);

// Tokens begin at each byte that is not a space and is first or follows a space.
[[nodiscard]] std::vector<uint32_t> TokenizeSpace(std::string_view text);

// Tokens begin at each ASCII letter that is first or follows a non-letter. Digits belong to no
// token.
[[nodiscard]] std::vector<uint32_t> TokenizeAlphanum(std::string_view text);

}  // namespace saltsearch
