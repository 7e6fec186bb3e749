#include <gtest/gtest.h>
#include <unicode/normalizer2.h>
#include <unicode/unistr.h>

#include "cli/FlowedText.h"
#include "cli/TextBudget.h"
#include "cli/TextDecoder.h"

using cli::TextBudget;
using cli::TextDecoder;

// The size of a character in the text index: its folded form, including accents, and a space after
// each non-ASCII character.
TEST(TextBudget, ACharacterCostsAtLeastWhatItsFoldedFormTakes) {
  UErrorCode status = U_ZERO_ERROR;
  const icu::Normalizer2* folding = icu::Normalizer2::getNFKCCasefoldInstance(status);
  for (char32_t c = 1; c < 0x110000; ++c) {
    if (c >= 0xD800 && c < 0xE000) continue;
    std::string bytes;
    folding->normalize(icu::UnicodeString(static_cast<UChar32>(c)), status).toUTF8String(bytes);
    const size_t own = c < 0x80 ? 1 : c < 0x800 ? 3 : c < 0x10000 ? 4 : 5;
    EXPECT_GE(cli::zoneCostOf(c), std::max(own, bytes.size() + (c < 0x80 ? 0 : 1))) << unsigned(c);
  }
  EXPECT_EQ(cli::zoneCostOf(U'я'), 3u);
  EXPECT_EQ(cli::zoneCostOf(U'é'), 3u);
  EXPECT_EQ(cli::zoneCostOf(U'京'), 4u);
}

TEST(TextBudget, TakesWholeCharactersUpToTheLimit) {
  const std::tuple<TLStringView, size_t, size_t, bool> cases[] = {
      {u"", 0, 0, false},          {u"abc", 5, 3, false},
      {u"abc", 4, 2, true},        {u"abc", 1, 0, true},
      {u"яя", 8, 2, false},        {u"яя", 7, 1, true},
      {u"京都", 10, 2, false},     {u"a京", 8, 2, false},
      {u"a京", 7, 1, true},  // a space in between
      {u"\U0001F600", 6, 0, true}, {u"\U0001F600", 7, 2, false}};
  for (const auto& [text, room, taken, exhausted] : cases) {
    TextBudget budget(room);
    EXPECT_EQ(budget.take(text).size(), taken) << room;
    EXPECT_EQ(budget.exhausted(), exhausted) << room;
  }
  TextBudget shared(12);
  EXPECT_EQ(shared.take(u"abcd").size(), 4u);
  EXPECT_EQ(shared.take(u"abcdef").size(), 4u);
  EXPECT_EQ(shared.take(u"x").size(), 0u);
}

TEST(TextBudget, MarkupIsNotCutInsideATag) {
  const TLStringView html = u"<p>one</p><p class='x'>two";
  const auto cutAt = [&](size_t size) { return TextBudget(size + 2).takeMarkup(html); };
  EXPECT_EQ(cutAt(8), u"<p>one");
  EXPECT_EQ(cutAt(10), u"<p>one</p>");
  EXPECT_EQ(cutAt(20), u"<p>one</p>");
  EXPECT_EQ(cutAt(24), u"<p>one</p><p class='x'>t");
  EXPECT_EQ(cutAt(26), html);
}

TEST(TextDecoder, ReadsCharsetsAndNeverFails) {
  const std::tuple<std::string, const char*, const char16_t*> cases[] = {
      {"abc", "us-ascii", u"abc"},
      {"caf\xE9", "ISO-8859-1", u"café"},
      {"\x93quoted\x94", "iso-8859-1", u"“quoted”"},
      {"caf\xC3\xA9", "utf-8", u"café"},
      {"caf\xC3\xA9", "", u"café"},
      {"caf\xE9", "us-ascii", u"café"},
      {"caf\xE9", "no-such-charset", u"café"},
      {"bad \xC3(", "UTF-8", u"bad \uFFFD("},
      {"\xED\xC1\xD1\xCB", "koi8-r", u"Маяк"},
      {"\x1B$B5~ET\x1B(B", "iso-2022-jp", u"京都"},
      {"a\r\nb\rc\n", "utf-8", u"a\nb\rc\n"},
      {"", "utf-16", u""},
      {std::string("\0a", 2), "utf-16be", u"a"},
  };
  TextDecoder decoder;
  for (const auto& [bytes, charset, text] : cases) {
    EXPECT_EQ(decoder.decode(bytes, charset), text) << charset;
  }
  EXPECT_EQ(decoder.decode("\xB5\x7E", "big5").size(), 1u);
  for (const char* charset : {"iso-2022-jp", "utf-7", "gb18030", "hz", "utf-32", "shift_jis"}) {
    std::string bytes;
    for (int i = 0; i < 4000; ++i) bytes.push_back(static_cast<char>(i * i * 31 + i / 7));
    EXPECT_FALSE(decoder.decode(bytes, charset).empty()) << charset;
  }
}

TEST(FlowedText, RemovesSoftBreaksOnly) {
  using cli::unflow;
  EXPECT_EQ(unflow(u"one \ntwo\nthree\n", false), u"one two\nthree\n");
  EXPECT_EQ(unflow(u"京 \n都\n", true), u"京都\n");
  EXPECT_EQ(unflow(u"> a \n> b\n>> c \nd", false), u"> a b\n>> c \nd");
  EXPECT_EQ(unflow(u"text \n-- \nname\n", false), u"text \n-- \nname\n");
  EXPECT_EQ(unflow(u" stuffed\n From me\n", false), u"stuffed\nFrom me\n");
  EXPECT_EQ(unflow(u"", false), u"");
  EXPECT_EQ(unflow(u"\n\n", false), u"\n\n");
  EXPECT_EQ(unflow(u"ends ", false), u"ends ");
}
