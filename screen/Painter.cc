#include "screen/Painter.h"

#include <fmt/format.h>

#include <algorithm>
#include <string>

#include "screen/Curses.h"
#include "screen/TerminalSession.h"

namespace mailscreen {

namespace {

// Terminals that support them show everything between the two as one update.
constexpr std::string_view kUpdateBegins = "\x1b[?2026h";
constexpr std::string_view kUpdateEnds = "\x1b[?2026l";

constexpr short kMatchPair = 1;
constexpr short kDatePair = 2;
constexpr short kFromPair = 3;

// The column widths of a row; a part of width 0 is left out.
struct RowColumns {
  size_t date = 0;
  size_t from = 0;
};

RowColumns rowColumnsOf(size_t columns) {
  constexpr size_t kDay = 10;     // 2024-01-11
  constexpr size_t kMinute = 16;  // 2024-01-11 10:03
  if (columns >= 76) return {kMinute, 22};
  if (columns >= 44) return {kDay, 14};
  return {};
}

// The visible part of a line that is too long for its box, chosen so that the cursor is inside, and
// the column of the cursor.
struct Window {
  GlyphsView glyphs;
  size_t cursor = 0;  // columns
};

Window windowOf(const LineEditor& line, size_t columns) {
  const GlyphsView all = line.glyphs();
  size_t begin = 0;
  size_t cursor = columnsOf(all.substr(0, line.cursor()));
  while (begin < line.cursor() && cursor + 1 > columns) cursor -= columnsOf(all[begin++]);
  return {all.substr(begin), cursor};
}

const char* promptOf(Mode mode) {
  return mode == Mode::folder ? "Folder: " : "Search: ";
}

const LineEditor& lineOf(const Model& model) {
  return model.mode() == Mode::folder ? model.folderLine() : model.line();
}

bool fillsScreen(Mode mode) {
  return mode == Mode::reading || mode == Mode::help;
}

// The prompt is left out if there is little space.
size_t promptColumns(size_t columns, Mode mode) {
  const size_t prompt = std::string_view(promptOf(mode)).size();
  return columns >= 3 * prompt ? prompt : 0;
}

}  // namespace

Painter::Painter(bool colored) : _colored(colored && has_colors()) {
  if (!_colored) return;
  start_color();
  use_default_colors();
  init_pair(kMatchPair, COLOR_YELLOW, -1);
  init_pair(kDatePair, COLOR_GREEN, -1);
  init_pair(kFromPair, COLOR_CYAN, -1);
}

void Painter::paint(const Model& model) {
  werase(stdscr);
  if (fillsScreen(model.mode())) {
    paintDocument(model, model.layout().page);
  } else {
    paintLine(model);
    paintList(model);
    paintRule(model.layout().rule);
    if (!model.rows().empty()) paintDocument(model, model.layout().preview);
  }
  paintStatus(model);
  placeCursor(model);
  wnoutrefresh(stdscr);
  writeToTerminal(kUpdateBegins);
  doupdate();
  writeToTerminal(kUpdateEnds);
}

void Painter::paintLine(const Model& model) {
  const Box& box = model.layout().line;
  if (!box.shown()) return;
  const size_t prompt = promptColumns(box.columns, model.mode());
  _base = A_DIM;
  put(box.row, 0, prompt, glyphsOf(promptOf(model.mode())));
  _base = A_NORMAL;
  put(box.row, prompt, box.columns - prompt, windowOf(lineOf(model), box.columns - prompt).glyphs);
}

void Painter::paintList(const Model& model) {
  const Box& box = model.layout().list;
  const size_t first = model.firstRow();
  const size_t rows =
      std::min(box.rows, model.rows().size() - std::min(first, model.rows().size()));
  for (size_t i = 0; i < rows; ++i) {
    const size_t row = first + i;
    paintRow(model.rows()[row], row == model.selected(), box.row + i, box);
  }
}

void Painter::paintRow(const Row& row, bool selected, size_t screenRow, const Box& box) {
  const attr_t selection = selected ? A_REVERSE : A_NORMAL;
  const RowColumns widths = rowColumnsOf(box.columns);
  const auto colored = [&](short pair) {
    return selection | static_cast<attr_t>(_colored && !selected ? COLOR_PAIR(pair) : A_NORMAL);
  };
  size_t column = box.column;
  // Each part is followed by a space.
  const auto field = [&](size_t width, const Glyphs& glyphs, attr_t base) {
    if (width == 0) return;
    _base = base;
    put(screenRow, column, width + 1, fitted(glyphs, width));
    column += width + 1;
  };
  field(widths.date, row.date.substr(0, widths.date), colored(kDatePair));
  field(widths.from, row.from, colored(kFromPair));
  _base = selection;
  const size_t left = box.column + box.columns - column;
  Glyphs subject = row.subject;
  if (row.follows) subject.insert(0, U"  ");
  if (row.together > 1) subject.insert(0, glyphsOf(fmt::format("({}) ", row.together)));
  put(screenRow, column, left, fitted(subject, left));
}

void Painter::paintRule(const Box& box) {
  if (!box.shown()) return;
  _base = A_DIM;
  const char32_t line = box.columns > 1 ? U'─' : U'│';
  for (size_t i = 0; i < box.rows; ++i) {
    put(box.row + i, box.column, box.columns, Glyphs(box.columns, line));
  }
}

void Painter::paintDocument(const Model& model, const Box& box) {
  if (!box.shown()) return;
  const Document& document = model.document();
  const size_t first = model.firstLine();
  _base = A_NORMAL;
  for (size_t i = 0; i < box.rows && first + i < document.lines(); ++i) {
    put(box.row + i, box.column, box.columns, document.line(first + i),
        document.styleOfLine(first + i));
  }
}

void Painter::paintStatus(const Model& model) {
  const Box& box = model.layout().status;
  if (!box.shown()) return;
  _base = A_REVERSE;
  const Glyphs settings = fitted(lineOfGlyphs(model.settingsText()), box.columns / 2);
  const size_t right = columnsOf(settings);
  const size_t left = box.columns - right;
  const size_t gap = right > 0 ? 1 : 0;
  const size_t room = left > gap ? left - gap : 0;
  put(box.row, 0, left, fitted(lineOfGlyphs(model.statusText()), room));
  put(box.row, left, right, settings);
}

void Painter::placeCursor(const Model& model) {
  const Box& box = model.layout().line;
  const bool typing = box.shown() && !fillsScreen(model.mode());
  curs_set(typing ? 1 : 0);
  if (!typing) return;
  const size_t prompt = promptColumns(box.columns, model.mode());
  const size_t column = prompt + windowOf(lineOf(model), box.columns - prompt).cursor;
  wmove(stdscr, static_cast<int>(box.row), static_cast<int>(std::min(column, box.columns - 1)));
}

void Painter::put(size_t row, size_t column, size_t columns, GlyphsView glyphs, Style style) const {
  wmove(stdscr, static_cast<int>(row), static_cast<int>(column));
  setStyle(style);
  size_t used = 0;
  std::wstring run;
  const auto flush = [&run] {
    waddnwstr(stdscr, run.data(), static_cast<int>(run.size()));
    run.clear();
  };
  for (const char32_t glyph : glyphs) {
    if (isMark(glyph)) {
      flush();
      setStyle(styleOf(glyph));
      continue;
    }
    const size_t width = columnsOf(glyph);
    if (used + width > columns) break;
    used += width;
    // A combining character would be drawn in the cell before.
    if (used > 0) run.push_back(static_cast<wchar_t>(glyph));
  }
  flush();
  setStyle(Style::plain);
  run.assign(columns - used, L' ');
  flush();
}

void Painter::setStyle(Style style) const {
  attr_t attributes = static_cast<attr_t>(_base);
  if (style == Style::faint) attributes |= A_DIM;
  if (style == Style::match) {
    attributes |= A_BOLD;
    if (_colored)
      attributes = (attributes & ~A_COLOR) | static_cast<attr_t>(COLOR_PAIR(kMatchPair));
    if (!_colored) attributes |= A_UNDERLINE;
  }
  wattrset(stdscr, static_cast<int>(attributes));
}

}  // namespace mailscreen
