#pragma once

#include <optional>
#include <string>
#include <vector>

#include "screen/Document.h"
#include "screen/Event.h"
#include "screen/Layout.h"
#include "screen/LineEditor.h"
#include "screen/Search.h"

namespace mailscreen {

enum class Mode {
  searching,
  folder,   // a folder name is typed
  reading,  // a mail fills the screen
  help
};

// An action that needs the terminal.
struct Command {
  enum class Kind { copy, open, suspend, redraw };
  Kind kind;
  std::string place = {};  // of the mail
};

// The state of the screen and the effect of each key. Independent of the terminal and the daemon:
// it hands out the work to do and takes the results. One thread.
class Model {
 public:
  // Input.
  void type(const std::vector<std::string>& words);
  void resize(size_t rows, size_t columns);
  void press(const Event& event);
  // Drops results of any search but the last, and likewise mails.
  void take(Found found);
  void take(Mail mail);
  // A message to show until the next key.
  void tell(std::string message) { _message = std::move(message); }
  // Requests the failed search again.
  void retry();

  // Output: work to do, each handed out once.
  [[nodiscard]] std::optional<Search> nextSearch();
  [[nodiscard]] std::optional<MailRequest> nextMail();
  [[nodiscard]] std::optional<Command> nextCommand();
  // True if the last search failed and a retry may succeed.
  [[nodiscard]] bool wantsRetry() const {
    return !_searching && (_failure == Failure::unreachable || _failure == Failure::refused);
  }
  [[nodiscard]] bool done() const { return _done; }

  // State to draw.
  [[nodiscard]] Mode mode() const { return _mode; }
  [[nodiscard]] const Layout& layout() const { return _layout; }
  [[nodiscard]] const LineEditor& line() const { return _line; }
  [[nodiscard]] const LineEditor& folderLine() const { return _folderLine; }
  [[nodiscard]] const std::vector<Row>& rows() const { return _rows; }
  [[nodiscard]] size_t selected() const { return _selected; }
  // The first visible row of the list.
  [[nodiscard]] size_t firstRow() const;
  // The mail or the help, wrapped for its box, and its first visible line.
  [[nodiscard]] const Document& document() const { return _mode == Mode::help ? _help : _mail; }
  [[nodiscard]] size_t firstLine() const;
  // Left: a message, failure, remark or hint. Right: order, threads, folder and place.
  [[nodiscard]] std::string statusText() const;
  [[nodiscard]] std::string settingsText() const;

 private:
  void pressSearching(const Event& event);
  void pressFolder(const Event& event);
  void pressReading(const Event& event);
  void pressHelp(const Event& event);
  bool pressCommand(const Event& event);
  void move(bool down);
  bool turnPage(bool forward);
  void scroll(const Event& event);
  void read();
  void select(size_t row);
  [[nodiscard]] size_t rowOf(const std::string& identifier) const;
  void ask(Command::Kind kind);
  void showHelp();
  void changeSearch();
  void wrap();
  [[nodiscard]] const Row* selectedRow() const;
  [[nodiscard]] Search search() const;
  [[nodiscard]] size_t results() const;
  [[nodiscard]] size_t lastTop() const;

  Layout _layout;
  Mode _mode = Mode::searching;
  Mode _before = Mode::searching;  // before the help was opened
  LineEditor _line;
  LineEditor _folderLine;
  std::string _folder;
  cli::SortOrder _order = cli::SortOrder::relevance;
  bool _threads = false;
  size_t _offset = 0;
  bool _fromBelow = false;  // select the last result of the page
  bool _done = false;

  std::optional<Search> _asked;  // the last search handed out
  bool _searching = false;       // its result has not arrived
  std::optional<Search> _shown;  // the search of the current rows
  std::vector<Row> _rows;
  size_t _selected = 0;
  size_t _total = 0;
  bool _complete = true;
  std::vector<std::string> _words;
  std::string _remark;
  Failure _failure = Failure::none;
  std::string _reason;
  std::string _message;
  std::optional<Command> _command;

  std::optional<MailRequest> _mailAsked;
  std::optional<MailRequest> _mailShown;
  bool _mailCut = false;
  Document _mail;
  Document _help;
  size_t _top = 0;      // first visible line of the mail
  size_t _helpTop = 0;  // first visible line of the help
};

}  // namespace mailscreen
