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
  folder,   // a folder is typed
  reading,  // a mail fills the screen
  help
};

// Something that needs the terminal.
struct Command {
  enum class Kind { copy, open, suspend, redraw };
  Kind kind;
  std::string place = {};  // of the mail
};

// All that the screen shows, and what a key does to it. Knows neither terminal nor daemon: what has
// to be done it hands out, and takes what comes of it. One thread.
class Model {
 public:
  // In.
  void resize(size_t rows, size_t columns);
  void press(const Event& event);
  // Results of an earlier search than the last are dropped, and so are mails.
  void take(Found found);
  void take(Mail mail);
  // Something to tell until the next key.
  void tell(std::string message) { _message = std::move(message); }
  // Lets a search that failed be tried again.
  void retry();

  // Out: what has to be done, once.
  [[nodiscard]] std::optional<Search> nextSearch();
  [[nodiscard]] std::optional<MailRequest> nextMail();
  [[nodiscard]] std::optional<Command> nextCommand();
  // The last search has failed, and may not the next time.
  [[nodiscard]] bool wantsRetry() const {
    return !_searching && (_failure == Failure::unreachable || _failure == Failure::refused);
  }
  [[nodiscard]] bool done() const { return _done; }

  // To be drawn.
  [[nodiscard]] Mode mode() const { return _mode; }
  [[nodiscard]] const Layout& layout() const { return _layout; }
  [[nodiscard]] const LineEditor& line() const { return _line; }
  [[nodiscard]] const LineEditor& folderLine() const { return _folderLine; }
  [[nodiscard]] const std::vector<Row>& rows() const { return _rows; }
  [[nodiscard]] size_t selected() const { return _selected; }
  // The row at the top of the list.
  [[nodiscard]] size_t firstRow() const;
  // The mail or the help, broken for its box, and the line at the top.
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
  Mode _before = Mode::searching;  // the help
  LineEditor _line;
  LineEditor _folderLine;
  std::string _folder;
  cli::SortOrder _order = cli::SortOrder::relevance;
  bool _threads = false;
  size_t _offset = 0;
  bool _fromBelow = false;  // the last result of the page is to be selected
  bool _done = false;

  std::optional<Search> _asked;  // the last search that was handed out
  bool _searching = false;       // it has no answer yet
  std::optional<Search> _shown;  // the one that the rows are of
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
  size_t _top = 0;      // of the mail that is read
  size_t _helpTop = 0;  // of the help
};

}  // namespace mailscreen
