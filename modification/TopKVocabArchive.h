#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

// The stored form of the vocabulary in CBOR (RFC 8949): an array of three byte strings, each CBOR
// in turn: the words as an array of text strings, the document ID as an unsigned number, the date
// as a double.
namespace topkvocab {

[[nodiscard]] std::string archive(const std::vector<std::string>& words, uint32_t docID,
                                  double date);

// The entries of the outer array; nullopt when the bytes are not an array of byte strings. The
// views point into `bytes`. Not recursive, so hostile bytes are safe.
[[nodiscard]] std::optional<std::vector<std::string_view>> unarchive(std::string_view bytes);

// Decode one entry each; nullopt when it is anything else.
[[nodiscard]] std::optional<std::vector<std::string>> unarchiveWords(std::string_view bytes);
[[nodiscard]] std::optional<uint32_t> unarchiveDocID(std::string_view bytes);
[[nodiscard]] std::optional<double> unarchiveDate(std::string_view bytes);

}  // namespace topkvocab
