#include "screen/Model.h"

#include <fmt/format.h>

#include <algorithm>
#include <utility>

#include "screen/Help.h"

namespace mailscreen {

namespace {

constexpr const char* kHint = "F1 help  Enter read  Esc leave";

bool isBlank(std::string_view text) {
  return text.find_first_not_of(' ') == std::string_view::npos;
}

// Letters that work as keys while a mail or the help is shown.
Event readingKey(char letter) {
  switch (letter) {
    case 'j':
      return {Key::down};
    case 'k':
      return {Key::up};
    case ' ':
      return {Key::pageDown};
    case 'b':
      return {Key::pageUp};
    case 'g':
      return {Key::home};
    case 'G':
      return {Key::end};
    case 'y':
      return {Key::copy};
    case 'o':
      return {Key::open};
    case '?':
      return {Key::help};
    case 'q':
      return {Key::escape};
    default:
      return {Key::text, std::string(1, letter)};
  }
}

}  // namespace

void Model::resize(size_t rows, size_t columns) {
  _layout = layoutOf(rows, columns);
  wrap();
}

void Model::press(const Event& event) {
  _message.clear();
  switch (event.key) {
    case Key::interrupt:
      _done = true;
      return;
    case Key::suspend:
      _command = Command{Command::Kind::suspend};
      return;
    case Key::redraw:
      _command = Command{Command::Kind::redraw};
      return;
    default:
      break;
  }
  switch (_mode) {
    case Mode::searching:
      return pressSearching(event);
    case Mode::folder:
      return pressFolder(event);
    case Mode::reading:
    case Mode::help:
      break;
  }
  if (event.key != Key::text) {
    return _mode == Mode::reading ? pressReading(event) : pressHelp(event);
  }
  for (const char letter : event.text) {
    const Event key = readingKey(letter);
    if (_mode == Mode::reading) {
      pressReading(key);
    } else if (_mode == Mode::help) {
      pressHelp(key);
    }
  }
}

void Model::pressSearching(const Event& event) {
  switch (event.key) {
    case Key::escape:
      _done = true;
      return;
    case Key::enter:
      return read();
    case Key::up:
    case Key::down:
      return move(event.key == Key::down);
    case Key::pageUp:
    case Key::pageDown:
      turnPage(event.key == Key::pageDown);
      return;
    case Key::threads:
      _threads = !_threads;
      return changeSearch();
    case Key::order:
      _order = _order == cli::SortOrder::date ? cli::SortOrder::relevance : cli::SortOrder::date;
      return changeSearch();
    case Key::folder: {
      const Row* const row = selectedRow();
      _folderLine.set(!_folder.empty() || row == nullptr ? _folder : row->folder);
      _mode = Mode::folder;
      return;
    }
    default:
      break;
  }
  // A question mark alone is not a useful search.
  if (event.key == Key::text && event.text == "?" && _line.empty()) return showHelp();
  if (!pressCommand(event) && _line.press(event)) changeSearch();
}

void Model::pressFolder(const Event& event) {
  if (event.key == Key::escape) {
    _mode = Mode::searching;
  } else if (event.key == Key::enter) {
    _mode = Mode::searching;
    _folder = isBlank(_folderLine.text()) ? "" : _folderLine.text();
    changeSearch();
  } else if (!pressCommand(event)) {
    _folderLine.press(event);
  }
}

void Model::pressReading(const Event& event) {
  if (event.key == Key::escape || event.key == Key::left) {
    _mode = Mode::searching;
    wrap();
  } else if (event.key == Key::text) {
    if (event.text == "n" && _selected + 1 < _rows.size()) select(_selected + 1);
    if (event.text == "p" && _selected > 0) select(_selected - 1);
  } else if (!pressCommand(event)) {
    scroll(event);
  }
}

void Model::pressHelp(const Event& event) {
  if (event.key == Key::escape || event.key == Key::help) {
    _mode = _before;
    wrap();
  } else {
    scroll(event);
  }
}

// Keys with the same meaning in the results and in a mail.
bool Model::pressCommand(const Event& event) {
  switch (event.key) {
    case Key::help:
      showHelp();
      return true;
    case Key::copy:
      ask(Command::Kind::copy);
      return true;
    case Key::open:
      ask(Command::Kind::open);
      return true;
    default:
      return false;
  }
}

void Model::move(bool down) {
  if (down && _selected + 1 < _rows.size()) {
    select(_selected + 1);
  } else if (!down && _selected > 0) {
    select(_selected - 1);
  } else if (turnPage(down)) {
    _fromBelow = !down;
  }
}

bool Model::turnPage(bool forward) {
  if (!_shown || !_shown->isLike(search())) return false;  // the page has not arrived yet
  const size_t next = _offset + results();
  const bool more = !_complete || _total > next;
  if (forward ? _rows.empty() || !more : _offset == 0) return false;
  _offset = forward ? next : _offset - std::min(_offset, search().limit);
  _fromBelow = false;
  return true;
}

void Model::scroll(const Event& event) {
  size_t& top = _mode == Mode::help ? _helpTop : _top;
  const size_t page = std::max(_layout.page.rows, size_t{2}) - 1;
  switch (event.key) {
    case Key::up:
      top -= std::min(top, size_t{1});
      break;
    case Key::down:
    case Key::enter:
      ++top;
      break;
    case Key::pageUp:
      top -= std::min(top, page);
      break;
    case Key::pageDown:
      top += page;
      break;
    case Key::home:
      top = 0;
      break;
    case Key::end:
      top = lastTop();
      break;
    default:
      break;
  }
  top = std::min(top, lastTop());
}

void Model::read() {
  if (selectedRow() == nullptr) return;
  _mode = Mode::reading;
  _top = 0;
  wrap();
}

void Model::select(size_t row) {
  _selected = row;
  _top = 0;
}

// The row of a mail, or the nearest row if the mail is no longer listed.
size_t Model::rowOf(const std::string& identifier) const {
  const auto found = std::find_if(_rows.begin(), _rows.end(),
                                  [&](const Row& row) { return row.identifier == identifier; });
  if (found != _rows.end()) return static_cast<size_t>(found - _rows.begin());
  return std::min(_selected, _rows.empty() ? 0 : _rows.size() - 1);
}

void Model::ask(Command::Kind kind) {
  const Row* const row = selectedRow();
  if (row == nullptr) {
    tell("no mail is selected");
  } else if (kind == Command::Kind::open && row->path.empty()) {
    tell("the mail is in no file of this disk");
  } else {
    _command = Command{kind, kind == Command::Kind::copy ? row->place : row->path};
  }
}

void Model::showHelp() {
  if (_help.lines() == 0) _help.set(helpText());
  _before = _mode;
  _mode = Mode::help;
  _helpTop = 0;
  wrap();
}

void Model::type(const std::vector<std::string>& words) {
  _line.set(fmt::format("{}", fmt::join(words, " ")));
  changeSearch();
}

void Model::changeSearch() {
  _offset = 0;
  _fromBelow = false;
  const Search wanted = search();
  if (!isBlank(wanted.words) || !wanted.folder.empty()) return;
  // Nothing to search for; a pending result is no longer wanted.
  _asked.reset();
  _searching = false;
  _shown.reset();
  _rows.clear();
  _selected = 0;
  _total = 0;
  _complete = true;
  _failure = Failure::none;
  _remark.clear();
}

void Model::wrap() {
  if (_mode == Mode::help) {
    _help.wrap(_layout.page.columns);
    _helpTop = std::min(_helpTop, lastTop());
  } else if (_mode == Mode::reading) {
    _mail.wrap(_layout.page.columns);
    _top = std::min(_top, lastTop());
  } else {
    _mail.wrap(_layout.preview.columns);
  }
}

void Model::take(Found found) {
  if (!_searching || !(*_asked == found.search)) return;
  _searching = false;
  _failure = found.failure;
  _reason = std::move(found.reason);
  _remark = std::move(found.remark);
  // Keeps the results while the daemon restarts or an incomplete query is typed.
  if (_failure == Failure::unreachable || _failure == Failure::query) return;
  const bool same = _shown && _shown->isLike(found.search);
  const Row* const row = selectedRow();
  const std::string kept = same && row != nullptr ? row->identifier : "";
  _rows = std::move(found.rows);
  _total = found.total;
  _complete = found.complete;
  _words = std::move(found.words);
  const size_t last = _rows.empty() ? 0 : _rows.size() - 1;
  _selected = same ? rowOf(kept) : _fromBelow ? last : 0;
  _fromBelow = false;
  _shown = std::move(found.search);
}

void Model::take(Mail mail) {
  if (!_mailAsked || !(*_mailAsked == mail.request)) return;
  _mail.set(std::move(mail.text));
  _mailCut = mail.cut;
  _mailShown = std::move(mail.request);
  wrap();
}

void Model::retry() {
  if (wantsRetry()) _asked.reset();
}

std::optional<Search> Model::nextSearch() {
  Search wanted = search();
  if (isBlank(wanted.words) && wanted.folder.empty()) return std::nullopt;
  if (_asked && *_asked == wanted) return std::nullopt;
  _asked = wanted;
  _searching = true;
  return wanted;
}

std::optional<MailRequest> Model::nextMail() {
  const Row* const row = selectedRow();
  const bool whole = _mode == Mode::reading;
  if (row == nullptr || !(whole || _layout.preview.shown())) return std::nullopt;
  MailRequest wanted{row->identifier, _words, whole};
  const auto covers = [&](const std::optional<MailRequest>& request, bool cut) {
    return request && request->identifier == wanted.identifier && request->words == wanted.words &&
           (request->whole || !whole || !cut);
  };
  const bool asked = covers(_mailAsked, true);
  const bool there = _mailAsked == _mailShown && covers(_mailShown, _mailCut);
  if (asked || there) return std::nullopt;
  _mailAsked = wanted;
  return wanted;
}

std::optional<Command> Model::nextCommand() {
  return std::exchange(_command, std::nullopt);
}

const Row* Model::selectedRow() const {
  return _selected < _rows.size() ? &_rows[_selected] : nullptr;
}

Search Model::search() const {
  return {_line.text(), _folder, _order, _threads, _offset, std::max(_layout.list.rows, size_t{1})};
}

// The number of results, or conversations, on the page.
size_t Model::results() const {
  return static_cast<size_t>(
      std::count_if(_rows.begin(), _rows.end(), [](const Row& row) { return !row.follows; }));
}

size_t Model::lastTop() const {
  const size_t lines = document().lines();
  return lines - std::min(lines, _layout.page.rows);
}

size_t Model::firstRow() const {
  const size_t rows = std::max(_layout.list.rows, size_t{1});
  return _selected < rows ? 0 : _selected - rows + 1;
}

size_t Model::firstLine() const {
  if (_mode == Mode::help) return _helpTop;
  if (_mode == Mode::reading) return _top;
  const size_t rows = _layout.preview.rows;
  const size_t match = _mail.firstMatch().value_or(0);
  if (match < rows) return 0;
  return std::min(match - rows / 3, _mail.lines() - std::min(_mail.lines(), rows));
}

std::string Model::statusText() const {
  if (!_message.empty()) return _message;
  switch (_failure) {
    case Failure::none:
      break;
    case Failure::query:
      return _reason;
    case Failure::unreachable:
    case Failure::refused:
      return _reason + "; trying again";
  }
  if (_mode == Mode::reading || _mode == Mode::help) return "q back";
  if (!_remark.empty()) return _remark;
  if (_shown && _rows.empty()) return "no match";
  return kHint;
}

std::string Model::settingsText() const {
  if (_mode == Mode::help) return "";
  std::string text;
  if (_mode == Mode::reading) {
    const size_t last = std::min(_mail.lines(), _top + _layout.page.rows);
    return fmt::format("{}-{} of {}", std::min(_mail.lines(), _top + 1), last, _mail.lines());
  }
  if (_order == cli::SortOrder::date) text += "newest first  ";
  if (_threads) text += "conversations  ";
  if (!_folder.empty()) text += fmt::format("in {}  ", _folder);
  if (_rows.empty()) return text;
  const size_t last = _offset + results();
  return text + (_complete ? fmt::format("{}-{} of {}", _offset + 1, last, _total)
                           : fmt::format("{}-{} and more", _offset + 1, last));
}

}  // namespace mailscreen
