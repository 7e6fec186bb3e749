#include "modification/Stemmer.h"

#include <algorithm>
#include <array>
#include <span>

namespace {

// A suffix of at least two letters, and its replacement.
struct Rule {
  std::string_view suffix;
  std::string_view replacement;

  // The last letter but one, as a number from 0.
  [[nodiscard]] constexpr size_t group() const {
    return static_cast<size_t>(suffix[suffix.size() - 2] - 'a');
  }
};

// The rules of a step. The longest match applies. They are sorted by group, longest first within
// it, so that a word is compared only with the few rules that share its last letter but one.
template <size_t N>
class Rules {
 public:
  consteval explicit Rules(const Rule (&rules)[N]) {
    std::copy_n(rules, N, _rules.begin());
    for (size_t i = 0; i < N; ++i) {
      if (i > 0 && rules[i].group() < rules[i - 1].group()) throw "rules are not sorted";
      for (size_t group = rules[i].group() + 1; group < _begin.size(); ++group) {
        _begin[group] = static_cast<uint8_t>(i + 1);
      }
    }
  }

  [[nodiscard]] std::span<const Rule> withLastButOne(char letter) const {
    if (letter < 'a' || letter > 'z') return {};
    const auto group = static_cast<size_t>(letter - 'a');
    return {_rules.data() + _begin[group], _rules.data() + _begin[group + 1]};
  }

 private:
  std::array<Rule, N> _rules{};
  std::array<uint8_t, 27> _begin{};  // of each group, and the end
};

constexpr Rules kStep2({
    {"ational", "ate"}, {"tional", "tion"}, {"enci", "ence"}, {"anci", "ance"},  {"izer", "ize"},
    {"logi", "log"},    {"entli", "ent"},   {"ousli", "ous"}, {"alli", "al"},    {"bli", "ble"},
    {"eli", "e"},       {"ization", "ize"}, {"ation", "ate"}, {"ator", "ate"},   {"iveness", "ive"},
    {"fulness", "ful"}, {"ousness", "ous"}, {"alism", "al"},  {"biliti", "ble"}, {"aliti", "al"},
    {"iviti", "ive"},
});

constexpr Rules kStep3({
    {"ical", "ic"},
    {"ness", ""},
    {"icate", "ic"},
    {"iciti", "ic"},
    {"ful", ""},
    {"ative", ""},
    {"alize", "al"},
});

constexpr Rules kStep4({
    {"al", ""},    {"ance", ""}, {"ence", ""}, {"er", ""},  {"ic", ""},  {"able", ""}, {"ible", ""},
    {"ement", ""}, {"ment", ""}, {"ant", ""},  {"ent", ""}, {"ion", ""}, {"ou", ""},   {"ism", ""},
    {"ate", ""},   {"iti", ""},  {"ous", ""},  {"ive", ""}, {"ize", ""},
});

std::string_view wordOf(const stemmer& s) {
  return {s.word, static_cast<size_t>(s.end + 1)};
}

std::string_view stemOf(const stemmer& s) {
  return {s.word, static_cast<size_t>(s.stemEnd + 1)};
}

// Whether the byte is a consonant, given whether the previous one is; false before the first.
bool isConsonant(char letter, bool afterConsonant) {
  switch (letter) {
    case 'a':
    case 'e':
    case 'i':
    case 'o':
    case 'u':
      return false;
    case 'y':
      return !afterConsonant;
    default:
      return true;
  }
}

// A run of y alternates, so its first letter decides for all.
bool isConsonantAt(std::string_view text, size_t index) {
  size_t first = index;
  while (first > 0 && text[first] == 'y') --first;
  bool consonant = isConsonant(text[first], false);
  for (size_t i = first + 1; i <= index; ++i) consonant = isConsonant(text[i], consonant);
  return consonant;
}

// The number m of vowel-consonant sequences: text is [C](VC){m}[V].
int32_t measure(std::string_view text) {
  int32_t sequences = 0;
  bool consonant = false;
  for (size_t i = 0; i < text.size(); ++i) {
    const bool next = isConsonant(text[i], consonant);
    if (i > 0 && next && !consonant) ++sequences;
    consonant = next;
  }
  return sequences;
}

// *v*
bool holdsVowel(std::string_view text) {
  bool consonant = false;
  for (const char letter : text) {
    consonant = isConsonant(letter, consonant);
    if (!consonant) return true;
  }
  return false;
}

// *d, of ASCII letters: two equal bytes of another script are parts of one character.
bool endsInDoubleConsonant(std::string_view text) {
  const size_t size = text.size();
  return size >= 2 && text[size - 1] == text[size - 2] &&
         static_cast<unsigned char>(text.back()) < 0x80 && isConsonantAt(text, size - 1);
}

// *o: consonant, vowel, consonant other than w, x and y, as in hop.
bool endsShort(std::string_view text) {
  const size_t size = text.size();
  return size >= 3 && isConsonantAt(text, size - 1) && !isConsonantAt(text, size - 2) &&
         isConsonantAt(text, size - 3) &&
         std::string_view("wxy").find(text.back()) == std::string_view::npos;
}

// Sets the end of the stem if the word has the suffix.
bool endsWith(stemmer* s, std::string_view suffix) {
  if (!wordOf(*s).ends_with(suffix)) return false;
  s->stemEnd = s->end - static_cast<int32_t>(suffix.size());
  return true;
}

// Replaces the last suffix found; the replacement is no longer than the suffix.
void replaceSuffix(stemmer* s, std::string_view replacement) {
  std::copy(replacement.begin(), replacement.end(), s->word + s->stemEnd + 1);
  s->end = s->stemEnd + static_cast<int32_t>(replacement.size());
}

// The rule that applies, with the end of the stem set; null if none does.
template <size_t N>
const Rule* findRule(stemmer* s, const Rules<N>& rules) {
  if (s->end < 1) return nullptr;
  for (const Rule& rule : rules.withLastButOne(s->word[s->end - 1])) {
    if (endsWith(s, rule.suffix)) return &rule;
  }
  return nullptr;
}

// Plurals.
void step1a(stemmer* s) {
  if (endsWith(s, "sses")) {
    replaceSuffix(s, "ss");
  } else if (endsWith(s, "ies")) {
    replaceSuffix(s, "i");
  } else if (!endsWith(s, "ss") && endsWith(s, "s")) {
    replaceSuffix(s, "");
  }
}

// After removing ed or ing, restores the end of the word: conflat(e), tann(ed), fil(e).
void restoreEnding(stemmer* s) {
  const std::string_view word = wordOf(*s);
  if (word.ends_with("at") || word.ends_with("bl") || word.ends_with("iz")) {
    s->word[++s->end] = 'e';
  } else if (endsInDoubleConsonant(word)) {
    if (std::string_view("lsz").find(word.back()) == std::string_view::npos) --s->end;
  } else if (measure(word) == 1 && endsShort(word)) {
    s->word[++s->end] = 'e';
  }
}

// Past tense and participle.
void step1b(stemmer* s) {
  if (endsWith(s, "eed")) {
    if (measure(stemOf(*s)) > 0) replaceSuffix(s, "ee");
  } else if ((endsWith(s, "ed") || endsWith(s, "ing")) && holdsVowel(stemOf(*s))) {
    replaceSuffix(s, "");
    restoreEnding(s);
  }
}

void step1c(stemmer* s) {
  if (endsWith(s, "y") && holdsVowel(stemOf(*s))) replaceSuffix(s, "i");
}

// Steps 2 and 3: reduce double suffixes to single ones, and remove some single ones.
template <size_t N>
void shorten(stemmer* s, const Rules<N>& rules) {
  const Rule* rule = findRule(s, rules);
  if (rule != nullptr && measure(stemOf(*s)) > 0) replaceSuffix(s, rule->replacement);
}

// Removes single suffixes where enough of the word is left.
void step4(stemmer* s) {
  const Rule* rule = findRule(s, kStep4);
  if (rule == nullptr) return;
  const std::string_view rest = stemOf(*s);
  if (rule->suffix == "ion" && !rest.ends_with('s') && !rest.ends_with('t')) return;
  if (measure(rest) > 1) replaceSuffix(s, "");
}

// Removes a final e, and one of two final l.
void step5(stemmer* s) {
  if (endsWith(s, "e")) {
    const std::string_view rest = stemOf(*s);
    const int32_t m = measure(rest);
    if (m > 1 || (m == 1 && !endsShort(rest))) replaceSuffix(s, "");
  }
  if (endsWith(s, "ll") && measure(wordOf(*s)) > 1) --s->end;
}

}  // namespace

stemmer* create_stemmer() {
  return new stemmer;
}

void free_stemmer(stemmer* record) {
  delete record;
}

int32_t stem(stemmer* record, char* word, int32_t lastIndex) {
  if (lastIndex < 2) return lastIndex;
  *record = {word, lastIndex, lastIndex};
  step1a(record);
  step1b(record);
  if (record->end < 1) return record->end;
  step1c(record);
  shorten(record, kStep2);
  shorten(record, kStep3);
  step4(record);
  step5(record);
  return record->end;
}

std::string TALStemWord(std::string_view word, int32_t maximumLength) {
  std::string stemmed(word);
  if (maximumLength < 0 || word.size() > static_cast<size_t>(maximumLength)) return stemmed;
  stemmer record;
  const int32_t end = stem(&record, stemmed.data(), static_cast<int32_t>(stemmed.size()) - 1);
  stemmed.resize(static_cast<size_t>(end + 1));
  return stemmed;
}
