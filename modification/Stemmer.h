#pragma once

#include <cstdint>
#include <string>
#include <string_view>

// Cuts an English word down to its stem: M. F. Porter, "An algorithm for suffix stripping", Program
// 14(3), 1980, with three changes: a word of one or two letters stays as it is, and step 2 has the
// rules bli -> ble (in place of abli -> able) and logi -> log.
//
// Words are lowercase ASCII. Every byte that is neither a, e, i, o, u nor a y behind a consonant
// counts as a consonant, digits and the bytes of other scripts included; no character of those is
// ever cut in two.

// What one call of `stem` works on; means nothing between calls.
struct stemmer {
  char* word;
  int32_t end;      // index of the last byte of the word
  int32_t stemEnd;  // index of the last byte before the suffix that was found last
};

// The caller owns the record, which is not initialised, and gives it to free_stemmer.
[[nodiscard]] stemmer* create_stemmer();
void free_stemmer(stemmer* record);

// Stems the word of bytes 0 to `lastIndex` in place, in time linear in its length and without
// allocation, and returns the index of the stem's last byte. The stem is never longer than the word
// and is not terminated. Any thread, with a record of its own.
[[nodiscard]] int32_t stem(stemmer* record, char* word, int32_t lastIndex);

// The stem of a word; the word itself when it has more than `maximumLength` bytes.
[[nodiscard]] std::string TALStemWord(std::string_view word, int32_t maximumLength);

// Longest word, in bytes, that those who change queries have stemmed.
inline constexpr int32_t kMaximumStemmedLength = 100;
