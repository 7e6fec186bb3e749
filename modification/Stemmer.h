#pragma once

#include <cstdint>
#include <string>
#include <string_view>

// Reduces an English word to its stem: M. F. Porter, "An algorithm for suffix stripping", Program
// 14(3), 1980, with three changes: a word of one or two letters is unchanged, and step 2 has the
// rules bli -> ble (in place of abli -> able) and logi -> log.
//
// Words are lowercase ASCII. Every byte other than a, e, i, o, u and a y after a consonant counts
// as a consonant, including digits and the bytes of other scripts; multi-byte characters are never
// split.

// The working state of one `stem` call; meaningless between calls.
struct stemmer {
  char* word;
  int32_t end;      // index of the last byte of the word
  int32_t stemEnd;  // index of the last byte before the most recently matched suffix
};

// For callers who stem many words with one record. The caller owns it, uninitialised, and passes it
// to free_stemmer.
[[nodiscard]] stemmer* create_stemmer();
void free_stemmer(stemmer* record);

// Stems the word in bytes 0 to `lastIndex` in place, in linear time and without allocation, and
// returns the index of the stem's last byte. The stem is never longer than the word and is not
// terminated. Any thread, each with its own record.
[[nodiscard]] int32_t stem(stemmer* record, char* word, int32_t lastIndex);

// The stem of a word; the word itself when it has more than `maximumLength` bytes.
[[nodiscard]] std::string TALStemWord(std::string_view word, int32_t maximumLength);

// Upper bound, in bytes, of the words that query modification stems.
inline constexpr int32_t kMaxStemmedBytes = 100;
