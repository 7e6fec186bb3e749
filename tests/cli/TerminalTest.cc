#include <gtest/gtest.h>

#include <nlohmann/json.hpp>
#include <random>

#include "cli/Highlight.h"
#include "cli/ProgressBar.h"
#include "cli/Results.h"
#include "cli/Terminal.h"
#include "platform/Text.h"

TEST(Terminal, TextIsCleaned) {
  const std::pair<std::string, const char*> cases[] = {
      {"plain 京都 é", "plain 京都 é"},
      {"a\tb\r\nc\u2008d\u2028e\u00A0f", "a b  c d e f"},
      {"\x1b[31mred\x07", "\uFFFD[31mred\uFFFD"},
      {std::string("nul\0!", 5), "nul\uFFFD!"},
      {"del\x7F", "del\uFFFD"},
      {"c1\u009B31m \u0080", "c1\uFFFD31m \uFFFD"},
      {"bidi\u202Etxt.exe\u2066\u2069\u202A", "biditxt.exe"},
      {"bad \xC3( \xFF", "bad \uFFFD( \uFFFD"},
      {"\U0001F600", "\U0001F600"},
  };
  for (const auto& [text, clean] : cases) EXPECT_EQ(cli::cleanForTerminal(text), clean);
  EXPECT_EQ(cli::cleanLinesForTerminal("a\nb\x1b\n"), "a\nb\uFFFD\n");
}

// Any input gives valid UTF-8 without control characters.
TEST(Terminal, CleansRandomBytes) {
  std::mt19937 random(11);
  for (int round = 0; round < 3000; ++round) {
    std::string bytes;
    for (size_t i = 0, n = random() % 30; i < n; ++i) {
      static constexpr const char* kPieces[] = {"\x1b", "\u009B", "\u202E", "\u2067", "\n"};
      if (random() % 4 == 0) {
        bytes += kPieces[random() % std::size(kPieces)];
      } else {
        bytes.push_back(static_cast<char>(random()));
      }
    }
    const nlohmann::json json{{"key", bytes}};
    for (const std::string& text : {cli::cleanForTerminal(bytes), cli::jsonText(json)}) {
      EXPECT_TRUE(platform::isValidUTF8(text));
      for (const char16_t c : platform::fromUTF8(text)) {
        EXPECT_FALSE((c < 0x20 && c != '\n') || (c >= 0x7F && c < 0xA0)) << unsigned(c);
        EXPECT_FALSE((c >= 0x202A && c <= 0x202E) || (c >= 0x2066 && c <= 0x2069));
      }
    }
    // The JSON value still equals the input.
    EXPECT_EQ(nlohmann::json::parse(cli::jsonText(json))["key"],
              platform::toUTF8(platform::fromUTF8(bytes)));
  }
}

TEST(Terminal, HighlightIgnoresCaseAndAccents) {
  const std::tuple<const char*, const char*, const char*> cases[] = {
      {"The Invoice, invoices", "invo", "The <Invoice>, <invoices>"},
      {"Crème brûlée", "creme bru", "<Crème> <brûlée>"},
      {"creme", "CRÈME ", "<creme>"},
      {"reinvoice", "invoice", "reinvoice"},
      {"МАЯК и маяка", "маяк", "<МАЯК> и <маяка>"},
      {"四月の京都旅行", "京都", "<四月の京都旅行>"},
      {"nothing", "", "nothing"},
      {"a*b", "b", "a*<b>"},
  };
  for (const auto& [text, query, marked] : cases) {
    EXPECT_EQ(cli::highlight(text, cli::queryWords(query), "<", ">"), marked);
  }
}

TEST(Terminal, ProgressIsOneLineOfTheGivenWidth) {
  EXPECT_EQ(cli::progressText(50, 200, 100, 10, 200),
            "[======                  ]  25%  100 messages  10/s  0:30 left");
  EXPECT_EQ(cli::progressText(0, 0, 0, 0, 200), "[========================] 100%  0 messages");
  EXPECT_EQ(cli::progressText(1, 1 << 30, 1, 100, 200).find("left") == std::string::npos, false);
  EXPECT_EQ(cli::progressText(50, 200, 100, 10, 20).size(), 20u);
}

TEST(Fitted, CountsColumns) {
  const std::tuple<const char*, size_t, const char*> cases[] = {
      {"abc", 0, "abc"},
      {"abc", 3, "abc"},
      {"abcd", 3, "ab…"},
      {"京都", 4, "京都"},
      {"京都旅", 4, "京…"},
      {"京都旅", 5, "京都…"},
      {"e\u0301e\u0301", 2, "e\u0301e\u0301"},
      {"e\u0301e\u0301e", 2, "e\u0301…"},
  };
  for (const auto& [text, width, shown] : cases) EXPECT_EQ(cli::fitted(text, width), shown) << text;
}

TEST(Passage, ShowsWhereTheMostWordsAre) {
  const std::string text =
      "One invoice came.\n\n" + std::string(100, 'x') +
      " then the second\n  invoice for   the boat shed came, and was paid late";
  const auto passage = [&](const char* query, size_t characters) {
    return cli::passageOf(text, cli::queryWords(query), characters);
  };
  EXPECT_EQ(passage("invoice boat", 60), "… the second invoice for the boat shed came, and was …");
  EXPECT_EQ(passage("invoice", 24), "One invoice came. …");
  EXPECT_EQ(passage("late", 40), "… was paid late");
  EXPECT_EQ(passage("zebra", 40), "");
  EXPECT_EQ(passage("", 40), "");
  EXPECT_FALSE(passage("xx", 10).empty());
  EXPECT_TRUE(cli::holdsWord("Café", {"cafe"}));
  EXPECT_FALSE(cli::holdsWord("Café", {"tea"}));
}
