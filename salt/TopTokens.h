#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "salt/Index.h"

// The most frequent tokens of an index, in bounded memory.
namespace saltsearch {

// Weight of one occurrence in a zone; asked once per zone and pass.
using ZoneScore = std::function<double(uint32_t docID, uint16_t zone)>;
// Byte offsets at which the tokens of a text begin, ascending.
using TokenStarts = std::function<std::vector<uint32_t>(std::string_view text)>;

// Longer tokens are passed over: nobody types them, and thousands of them would be gigabytes.
inline constexpr size_t kMostTokenBytes = 1024;

// At most `k` tokens of the live documents with the summed weights of their occurrences, heaviest
// first, of equal ones the bytewise lesser first. A token runs to the start of the next one or to
// the end of the zone, separators included.
//
// Two walks over all stored text: the first finds candidates (Misra and Gries 1982, in batches and
// with weights), the second counts them exactly. With m = max(k, 100), at most 1.5 m tokens are
// kept at any time, and a token is in the result for certain when less than k others are as heavy
// and its weight is above that of all tokens together divided by m.
//
// `goOn`, where there is one, is asked for each zone; false ends the call, with a result of no
// meaning. Any thread, beside all else; takes nothing of the block cache.
[[nodiscard]] std::vector<std::pair<std::string, double>> TopKTokens(
    const salt::Index& index, size_t k, const ZoneScore& zoneScore, const TokenStarts& tokenizer,
    const std::function<bool()>& goOn = nullptr);

// Tokens begin at each byte that is no blank and stands first or behind a blank.
[[nodiscard]] std::vector<uint32_t> TokenizeSpace(std::string_view text);

// Tokens begin at each ASCII letter that stands first or behind anything but a letter. Digits are
// no part of words.
[[nodiscard]] std::vector<uint32_t> TokenizeAlphanum(std::string_view text);

}  // namespace saltsearch
