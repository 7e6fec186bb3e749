#include <gtest/gtest.h>

#include <ostream>
#include <random>
#include <thread>

#include "tests/support/LogCapture.h"
#include "tokenizer/Tokenizer.h"

using tokenizer::Tokenizer;

namespace {

struct TextForm {
  std::string text;
  std::vector<uint32_t> offsets;

  bool operator==(const TextForm&) const = default;
};

TextForm textForm(const Tokenizer& tokenizer, TLStringView text) {
  TextForm form;
  tokenizer.TokenizeToText(text, form.text, form.offsets);
  return form;
}

// Empty if `form` is "word space word space" with one offset per word and no NUL.
std::string brokenRule(const TextForm& form) {
  if (form.text.find('\0') != std::string::npos) return "a NUL";
  if (!platform::isValidUTF8(form.text)) return "invalid UTF-8";
  size_t start = 0;
  for (const uint32_t offset : form.offsets) {
    if (offset != start) return "an offset that is not after a space";
    const size_t space = form.text.find(' ', start);
    if (space == std::string::npos) return "a word without a space";
    if (space == start) return "an empty word";
    start = space + 1;
  }
  return start == form.text.size() ? "" : "text without offset";
}

// How GoogleTest prints a text form.
void PrintTo(const TextForm& form, std::ostream* out) {
  *out << '"' << form.text << '"' << testing::PrintToString(form.offsets);
}

TLString repeated(TLStringView unit, size_t length) {
  TLString text;
  text.reserve(length);
  while (text.size() + unit.size() <= length) text += unit;
  return text;
}

class LexemonTest : public testing::Test {
 protected:
  std::unique_ptr<Tokenizer> fast = tokenizer::NewFastLexemonTokenizer("en_US");
  std::unique_ptr<Tokenizer> chain = tokenizer::NewLexemonTokenizer("en_US");
};

}  // namespace

TEST_F(LexemonTest, SplitsAndCleans) {
  const struct {
    TLStringView text;
    std::string words;
  } cases[] = {
      {u"", ""},
      {u" \t\r\n?!...", ""},
      {u"Hello, World!", "hello world "},
      {u"john.doe@Example.com report_2024.pdf a-b c/d",
       "john doe example com report 2024 pdf a b c d "},
      {u"3.14 1,000;5 10:30:15 192.168.0.1 1_2 2024-01-15",
       "3.14 1,000;5 10:30:15 192.168.0.1 1_2 "
       "2024 01 15 "},
      {u"3. .5 1..2 1.a a.1 1:a 1:_2 fe80::1", "3 5 1 2 1 a a 1 1 a 1 2 fe80 1 "},
      {u"abc123 123abc 3.14abc", "abc123 123abc 3.14abc "},
      {u"John's it's JOHN'S don't rock'n'roll 's s's", "john it john dont rocknroll s s "},
      {u"James' 'quoted' 1'000 5's o'5 a''b", "james quoted 1000 5 s o 5 a b "},
      {u"John\u2019s don\u2019t l\u2019h\u00F4tel \u043C\u02BC\u044F\u0442\u0430",
       "john dont lhotel \u043C\u044F\u0442\u0430 "},
      {u"Caf\u00E9 cafe\u0301 \u00C5ngstr\u00F6m STRASSE Stra\u00DFe",
       "cafe cafe angstrom strasse strasse "},
      {u"\u0391\u03B8\u03AE\u03BD\u03B1 \u0401\u043B\u043A\u0430 \u0419\u043E\u0434",
       "\u03B1\u03B8\u03B7\u03BD\u03B1 \u0435\u043B\u043A\u0430 \u0438\u043E\u0434 "},
      {u"\u0939\u093F\u0928\u094D\u0926\u0940 \u05E9\u05C1\u05DC\u05D5\u05DD",
       "\u0939\u093F\u0928\u094D\u0926\u0940 \u05E9\u05C1\u05DC\u05D5\u05DD "},
      {u"\u6F22\u5B57\u304B\u306A\u4EA4\u3058\u308A\u6587",
       "\u6F22\u5B57 \u304B\u306A "
       "\u4EA4\u3058\u308A \u6587 "},
      {u"\uFF26\uFF55\uFF4C\uFF4C \uFB01ne \uFF11\uFF10\uFF1A\uFF13\uFF10", "full fine 10:30 "},
      {u"co\u00ADoperate \u0645\u06CC\u200C\u062E\u0648\u0627\u0647\u0645 a\u200Bb",
       "cooperate \u0645\u06CC\u062E\u0648\u0627\u0647\u0645 a b "},
      {u"a\u00A0b 1\u00A02 1\u202F000 x\u3000y", "a b 1 2 1 000 x y "},
      {u"\uFDFA",
       "\u0635\u0644\u0649 \u0627\u0644\u0644\u0647 \u0639\u0644\u064A\u0647 "
       "\u0648\u0633\u0644\u0645 "},
      {u"\U0001F600 ok\u2122 \u2460 m\u00B2 \u2122", "ok 1 m 2 "},
      {u"\U0001D400\U0001D401 \U00020000", "ab \U00020000 "},
  };
  for (const auto& each : cases) {
    const TextForm form = textForm(*fast, each.text);
    EXPECT_EQ(form.text, each.words);
    EXPECT_EQ(brokenRule(form), "");
    EXPECT_EQ(textForm(*chain, each.text), form) << platform::toUTF8(each.text);
  }
  EXPECT_EQ(textForm(*fast, TLString(u"a\0b\xD800 c", 6)).text, "a b c ");
}

TEST_F(LexemonTest, ListFormHasTheSameWordsAndBothAppend) {
  for (const Tokenizer* each : {fast.get(), chain.get()}) {
    std::vector<TLString> list = {u"first"};
    each->TokenizeToList(u"Gr\u00FC\u00DFe, one two", list);
    EXPECT_EQ(list, (std::vector<TLString>{u"first", u"grusse", u"one", u"two"}));
    TextForm form = textForm(*each, u"one two");
    EXPECT_EQ(form, (TextForm{"one two ", {0, 4}}));
    each->TokenizeToText(u"x \u00E9", form.text, form.offsets);
    EXPECT_EQ(form, (TextForm{"one two x e ", {0, 4, 8, 10}}));
  }
}

// The table and the stretches of the fast form must give the same as the Unicode rules over the
// whole text.
TEST_F(LexemonTest, FastFormEqualsTheUnicodeRulesOnRandomText) {
  const std::vector<TLString> alphabets = {
      u"abSs 019.,;:'_-\n",
      u"aZ5 '.:\t\r\n\v\f\x01\x7F\"#/@",
      u"a1 '.:_\u00E9\u0301\u2019\u00A0\u00AD\u200B\u200D\u202F",
      u"a1' \n\u05D0\u0627\u3042\u6F22\uAC00\u1100\u1161\u0E01\u0E31\uFF9E\u2122\uFF1A\uFF11",
      u"s's \u0130\u0131\u00DF\u0345\u1E9E\u03C2\uFDFA\u00BD\u24B6\u20E3\uFE0F\U0001F468\U0001F1E9",
  };
  std::mt19937 random(11);
  for (int round = 0; round < 30000; ++round) {
    TLString text;
    // Sometimes long enough for several stretches of mixed text.
    for (size_t i = round % 1000 == 0 ? 12000 : random() % 60; i > 0; --i) {
      const TLString& alphabet = alphabets[random() % 8 == 0 ? random() % alphabets.size()
                                                             : static_cast<size_t>(round) % 5];
      text += random() % 500 == 0 ? static_cast<char16_t>(random())
                                  : alphabet[random() % alphabet.size()];
    }
    const TextForm form = textForm(*fast, text);
    ASSERT_EQ(brokenRule(form), "") << platform::toUTF8(text);
    ASSERT_EQ(form, textForm(*chain, text)) << platform::toUTF8(text);
  }
}

TEST(Lexemon, EachLocaleAgreesWithTheTable) {
  std::mt19937 random(13);
  for (const char* locale : {"de", "fi", "sv_SE", "ja_JP", "zh_Hans", "th", "he", "fr_CA", "el",
                             "tr_TR", "en_US_POSIX", "ru", "ko"}) {
    const auto fast = tokenizer::NewFastLexemonTokenizer(locale);
    const auto chain = tokenizer::NewLexemonTokenizer(locale);
    ASSERT_TRUE(fast && chain) << locale;
    for (int round = 0; round < 400; ++round) {
      TLString text;
      for (size_t i = random() % 80; i > 0; --i) {
        text += random() % 3 == 0 ? u"a1'.:s,;_ "[random() % 10]
                                  : static_cast<char16_t>(random() % 128);
      }
      ASSERT_EQ(textForm(*fast, text), textForm(*chain, text)) << locale << platform::toUTF8(text);
    }
  }
}

// Each of these is one run without a space; if a step is not linear, the test does not end.
TEST_F(LexemonTest, LongestDocumentsOfOneKind) {
  constexpr size_t kMaxUnits = 2097151;
  const struct {
    TLStringView first;
    TLStringView unit;
    size_t words;
  } cases[] = {
      {u"", u"a", 1},
      {u"", u"\u00E9", 1},
      {u"", u"\u0301", 0},
      {u"a", u"\u0301\u0323", 1},
      {u"a", u"\u0301\u200D\u0323\u200D", 1},
      {u"\u30AB", u"\uFF9E\u0301", 1},
      {u"\u0F40", u"\u0F73\u0F71", 1},
      {u"", u"\u1161", 1},
      {u"", u"\u6F22", kMaxUnits},
      {u"", u"\U0001F600", 0},
      {u"", u"\U0001F468\u200D", 0},
      {u"a", u"\u200C", 1},
      {u"", u"1:", 1},
      {u"\u00E9", u"1:", 1},
      {u"", u"_", 0},
      {u"", u"\u00E9 ", kMaxUnits / 2},
      {u"", u"1\u202F", (kMaxUnits + 1) / 2 - 1},
  };
  for (const auto& each : cases) {
    const TLString text = TLString(each.first) + repeated(each.unit, kMaxUnits - each.first.size());
    const TextForm form = textForm(*fast, text);
    EXPECT_EQ(brokenRule(form), "") << platform::toUTF8(each.unit);
    EXPECT_EQ(form.offsets.size(), each.words) << platform::toUTF8(each.unit);
  }
  EXPECT_EQ(textForm(*fast, repeated(u"a", kMaxUnits)).text.size(), kMaxUnits + 1);
}

TEST_F(LexemonTest, ManyThreadsShareOneTokenizer) {
  const TLString text =
      repeated(u"Gr\u00FC\u00DFe an J\u00F6rg's Freunde, plain ascii text. ", 9000);
  const TextForm expected = textForm(*fast, text);
  const auto german = tokenizer::NewFastLexemonTokenizer("de");
  std::vector<std::thread> threads;
  std::vector<TextForm> forms(6);
  for (TextForm& form : forms) {
    threads.emplace_back([&] {
      for (int round = 0; round < 10; ++round) {
        form = textForm(*fast, text);
        static_cast<void>(textForm(*german, u"\u00FCber \u00C4rger"));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  for (const TextForm& form : forms) EXPECT_EQ(form, expected);
}

TEST(Factories, RefuseAnInvalidLocaleWithALogLine) {
  testsupport::LogCapture log;
  EXPECT_NE(tokenizer::NewLexemonTokenizer("de_DE"), nullptr);
  EXPECT_NE(tokenizer::NewFastLexemonTokenizer("de_DE"), nullptr);
  EXPECT_NE(tokenizer::NewSpaceTokenizer(), nullptr);
  EXPECT_EQ(log.lines(), (std::vector<std::string>{
                             "info Tokenizer: Creating lexemon tokenizer for locale: de_DE",
                             "info Tokenizer: Creating fast lexemon tokenizer for locale: de_DE",
                             "info Tokenizer: Creating space tokenizer"}));
  for (const std::string& bad :
       {std::string(), std::string("_US"), std::string("en\0x", 4), std::string(400, 'x')}) {
    log.clear();
    EXPECT_EQ(tokenizer::NewLexemonTokenizer(bad), nullptr);
    EXPECT_EQ(tokenizer::NewFastLexemonTokenizer(bad), nullptr);
    EXPECT_TRUE(log.contains("Failed to create lexemon tokenizer for locale: "));
    EXPECT_TRUE(log.contains("Failed to create fast lexemon tokenizer for locale: "));
  }
}

TEST(SpaceTokenizer, KeepsTheTextAndAllButOneSpace) {
  const auto tokenizer = tokenizer::NewSpaceTokenizer();
  const struct {
    TLStringView text;
    std::vector<uint32_t> offsets;
    std::vector<TLString> list;
  } cases[] = {
      {u"", {}, {}},
      {u"   ", {}, {}},
      {u"a b", {0, 2}, {u"a", u"b"}},
      {u"a  b", {0, 3}, {u"a ", u"b"}},
      {u" a", {1}, {u"a"}},
      {u"\u00C9 B ", {0, 3}, {u"\u00C9", u"B "}},
  };
  for (const auto& each : cases) {
    TextForm form{"x ", {}};
    tokenizer->TokenizeToText(each.text, form.text, form.offsets);
    EXPECT_EQ(form.text, "x " + platform::toUTF8(each.text));
    for (uint32_t& offset : form.offsets) offset -= 2;
    EXPECT_EQ(form.offsets, each.offsets);
    std::vector<TLString> list;
    tokenizer->TokenizeToList(each.text, list);
    EXPECT_EQ(list, each.list);
  }
}

TEST(SpecialCharacters, LookAtTheLastUnitOnly) {
  for (const TLStringView text : {u"word ", u"word?", u"word$", u"a\n", u"a\u00A0", u"a\u2029",
                                  u"a\u3001", u"a\u20AC", u"a\u200D", u"a\x7F"}) {
    EXPECT_TRUE(hasTrailingSpecialChar(text)) << platform::toUTF8(text);
  }
  for (const TLStringView text :
       {u"", u"word", u"?a", u"5", u"\u00E9", u"a\u0301", u"\U0001F600"}) {
    EXPECT_FALSE(hasTrailingSpecialChar(text)) << platform::toUTF8(text);
  }
}
