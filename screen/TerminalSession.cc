#include "screen/TerminalSession.h"

#include <fmt/format.h>
#include <glib.h>
#include <langinfo.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cerrno>
#include <clocale>
#include <cstdio>
#include <string>

#include "screen/Curses.h"

namespace mailscreen {

namespace {

// How long to wait after an escape byte for the rest of a key's code.
constexpr int kEscapeMilliseconds = 25;

constexpr std::string_view kMarkPastes = "\x1b[?2004h";
constexpr std::string_view kDoNotMarkPastes = "\x1b[?2004l";

// Output is UTF-8, whatever the locale says.
void chooseLocale() {
  std::setlocale(LC_CTYPE, "");
  if (std::string_view(nl_langinfo(CODESET)) != "UTF-8") std::setlocale(LC_CTYPE, "C.UTF-8");
}

}  // namespace

void writeToTerminal(std::string_view sequence) {
  while (!sequence.empty()) {
    const ssize_t count = ::write(STDOUT_FILENO, sequence.data(), sequence.size());
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return;
    sequence.remove_prefix(static_cast<size_t>(count));
  }
}

std::unique_ptr<TerminalSession> TerminalSession::open() {
  chooseLocale();
  set_escdelay(kEscapeMilliseconds);
  ::screen* const handle = newterm(nullptr, stdout, stdin);
  if (handle == nullptr) return nullptr;
  std::unique_ptr<TerminalSession> session(new TerminalSession(handle));
  session->prepare();
  return session;
}

TerminalSession::~TerminalSession() {
  leave();
  delscreen(_handle);
}

void TerminalSession::prepare() {
  set_term(_handle);
  raw();
  noecho();
  nonl();
  keypad(stdscr, TRUE);
  meta(stdscr, TRUE);
  nodelay(stdscr, TRUE);
  define_key("\x1b[200~", kPasteBegins);
  define_key("\x1b[201~", kPasteEnds);
  writeToTerminal(kMarkPastes);
}

void TerminalSession::leave() {
  if (_away) return;
  _away = true;
  writeToTerminal(kDoNotMarkPastes);
  endwin();
}

void TerminalSession::comeBack() {
  _away = false;
  reset_prog_mode();
  measure();
  clearok(curscr, TRUE);
  writeToTerminal(kMarkPastes);
}

void TerminalSession::measure() {
  winsize size{};
  if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) != 0 || size.ws_row == 0 || size.ws_col == 0) return;
  if (!is_term_resized(size.ws_row, size.ws_col)) return;
  resize_term(size.ws_row, size.ws_col);
  clearok(curscr, TRUE);  // terminals move text when their size changes
}

size_t TerminalSession::rows() const {
  return static_cast<size_t>(getmaxy(stdscr));
}

size_t TerminalSession::columns() const {
  return static_cast<size_t>(getmaxx(stdscr));
}

void TerminalSession::copy(std::string_view text) {
  if (text.size() > kMaxCopied) return;
  gchar* const coded = g_base64_encode(reinterpret_cast<const guchar*>(text.data()), text.size());
  writeToTerminal(fmt::format("\x1b]52;c;{}\x07", coded));
  g_free(coded);
}

}  // namespace mailscreen
