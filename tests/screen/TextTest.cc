#include <gmock/gmock.h>

#include <clocale>
#include <random>

#include "cli/Terminal.h"
#include "screen/Document.h"
#include "screen/Layout.h"
#include "screen/LineEditor.h"

using mailscreen::Document;
using mailscreen::Event;
using mailscreen::Glyphs;
using mailscreen::Key;
using mailscreen::LineEditor;
using testing::ElementsAre;

namespace {

// Column widths depend on the locale.
class ScreenTextTest : public testing::Test {
 protected:
  void SetUp() override { ASSERT_NE(std::setlocale(LC_CTYPE, "C.UTF-8"), nullptr); }

  static std::vector<std::string> wrapped(const std::string& text, size_t columns) {
    Document document;
    document.set(mailscreen::glyphsOf(text));
    document.wrap(columns);
    std::vector<std::string> lines;
    for (size_t i = 0; i < document.lines(); ++i) {
      lines.push_back(mailscreen::toUTF8(document.line(i)));
    }
    return lines;
  }
};

constexpr const char* kMatch = "\x02";
constexpr const char* kPlain = "\x01";

}  // namespace

TEST_F(ScreenTextTest, GlyphsAreSafeToDraw) {
  const std::pair<const char*, const char*> cases[] = {
      {"plain 京都 é", "plain 京都 é"},
      {"\u0301first", "first"},
      {"z\u0301\u0302\u0303\u0304\u0305\u0306o", "z\u0301\u0302\u0303\u0304o"},
      {"a\u200Db\u200Fc\u00ADd\uFEFFe", "abcde"},
      {"\u0645\u06CC\u200C\u062E", "\u0645\u06CC\u200C\u062E"},
      {"\u2764\uFE0F \U0001F44B\U0001F3FD", "\u2764 \U0001F44B"},
      {"\x1b[2J\x01\x02\u202Ex", "\uFFFD[2J\uFFFD\uFFFDx"},
      {"private \U0010FFFE", "private \uFFFD"},
  };
  for (const auto& [text, shown] : cases) {
    EXPECT_EQ(mailscreen::toUTF8(mailscreen::lineOfGlyphs(text)), shown) << text;
  }
  EXPECT_EQ(mailscreen::toUTF8(mailscreen::fitted(U"京都駅", 5)), "京都…");
  EXPECT_EQ(mailscreen::toUTF8(mailscreen::fitted(U"京都駅", 4)), "京…");
  EXPECT_EQ(mailscreen::toUTF8(mailscreen::fitted(U"京都駅", 6)), "京都駅");
  EXPECT_EQ(mailscreen::toUTF8(mailscreen::fitted(U"京", 1)), "…");
}

TEST_F(ScreenTextTest, WrapsLinesBetweenWords) {
  EXPECT_THAT(wrapped("one two three\n\nfour\n\n", 8),
              ElementsAre("one two ", "three", "", "four"));
  EXPECT_THAT(wrapped("abcdefgh ij", 4), ElementsAre("abcd", "efgh", "ij"));
  EXPECT_THAT(wrapped("ab abcdefgh", 4), ElementsAre("ab ", "abcd", "efgh"));
  EXPECT_THAT(wrapped("京都 京都駅", 4), ElementsAre("京都", "京都", "駅"));
  EXPECT_THAT(wrapped("京a", 1), ElementsAre("京", "a"));
  EXPECT_THAT(wrapped("", 10), ElementsAre());
}

// For any text and width, all lines fit, and only spaces at line ends are lost.
TEST_F(ScreenTextTest, WrappedLinesKeepTheText) {
  static constexpr const char* kPieces[] = {"a", "bc ", " ", "\n", "京", "e\u0301", "\x02", "\x01"};
  std::mt19937 random(3);
  for (int round = 0; round < 2000; ++round) {
    std::string text;
    for (size_t i = 0, n = random() % 60; i < n; ++i)
      text += kPieces[random() % std::size(kPieces)];
    Document document;
    document.set(mailscreen::glyphsOf(text));
    for (const size_t columns : {size_t{2}, size_t{1 + random() % 20}, size_t{300}}) {
      document.wrap(columns);
      Glyphs all;
      for (size_t i = 0; i < document.lines(); ++i) {
        EXPECT_LE(mailscreen::columnsOf(document.line(i)), std::max(columns, size_t{2}));
        all += document.line(i);
      }
      Glyphs whole = mailscreen::glyphsOf(text);
      for (Glyphs* const each : {&all, &whole}) {
        std::erase_if(*each, [](char32_t c) { return c == U' ' || c == U'\n'; });
      }
      EXPECT_EQ(all, whole) << text;
      const auto match = document.firstMatch();
      EXPECT_EQ(match.has_value(), text.find('\x02') != std::string::npos);
      if (match) {
        EXPECT_NE(document.line(*match).find(U'\x02'), Glyphs::npos);
      }
    }
  }
}

TEST_F(ScreenTextTest, StylesContinueInTheNextLine) {
  Document document;
  document.set(mailscreen::glyphsOf(std::string("a ") + kMatch + "long word" + kPlain + " b"));
  document.wrap(5);
  ASSERT_EQ(document.lines(), 4u);
  EXPECT_EQ(document.styleOfLine(1), mailscreen::Style::plain);
  EXPECT_EQ(document.styleOfLine(2), mailscreen::Style::match);
  EXPECT_EQ(document.styleOfLine(3), mailscreen::Style::plain);
  EXPECT_EQ(document.firstMatch(), 1u);
}

TEST_F(ScreenTextTest, EditsALine) {
  LineEditor line;
  const auto press = [&line](Key key) { return line.press({key}); };
  EXPECT_TRUE(line.press({Key::text, "three lo\u0308ans\n\u202E\x1b"}));
  EXPECT_EQ(line.text(), "three lo\u0308ans ");
  EXPECT_TRUE(press(Key::deleteBefore));
  for (int i = 0; i < 3; ++i) EXPECT_FALSE(press(Key::left));
  EXPECT_TRUE(press(Key::deleteBefore));  // with the combining character on it
  EXPECT_EQ(line.text(), "three lans");
  EXPECT_TRUE(line.press({Key::text, "o"}));
  EXPECT_FALSE(press(Key::end));
  EXPECT_TRUE(press(Key::deleteWord));
  EXPECT_TRUE(press(Key::deleteWord));
  EXPECT_FALSE(press(Key::deleteWord));
  EXPECT_TRUE(line.press({Key::text, "one two"}));
  press(Key::home);
  EXPECT_FALSE(press(Key::deleteToStart));
  press(Key::right);
  EXPECT_TRUE(press(Key::deleteAfter));
  EXPECT_EQ(line.text(), "oe two");
  EXPECT_TRUE(press(Key::deleteToEnd));
  EXPECT_FALSE(press(Key::deleteAfter));
  EXPECT_EQ(line.text(), "o");
  EXPECT_TRUE(press(Key::deleteToStart));
  EXPECT_TRUE(line.empty());
  line.press({Key::text, std::string(10 * LineEditor::kMaxGlyphs, 'x')});
  EXPECT_EQ(line.glyphs().size(), LineEditor::kMaxGlyphs);
  EXPECT_FALSE(line.press({Key::text, "y"}));
}

// At any size, nothing is outside of the screen and nothing covers something else.
TEST_F(ScreenTextTest, LayoutFitsAnyScreen) {
  for (size_t rows = 0; rows < 40; ++rows) {
    for (size_t columns = 0; columns < 140; ++columns) {
      const auto layout = mailscreen::layoutOf(rows, columns);
      size_t cells = 0;
      for (const auto& box :
           {layout.line, layout.list, layout.rule, layout.preview, layout.status}) {
        if (!box.shown()) continue;
        EXPECT_LE(box.row + box.rows, rows);
        EXPECT_LE(box.column + box.columns, columns);
        cells += box.rows * box.columns;
      }
      EXPECT_LE(cells, rows * columns);
      EXPECT_EQ(layout.line.shown(), rows > 0 && columns > 0);
      EXPECT_LE(layout.page.row + layout.page.rows + layout.status.rows, std::max(rows, size_t{1}));
    }
  }
  EXPECT_EQ(mailscreen::layoutOf(40, 120).preview, (mailscreen::Box{1, 56, 38, 64}));
  EXPECT_EQ(mailscreen::layoutOf(24, 80).preview, (mailscreen::Box{10, 0, 13, 80}));
}
