#pragma once

#include <cstddef>
#include <memory>
#include <string_view>

struct screen;

namespace mailscreen {

// The terminal of the standard input and output while a screen is drawn on it: raw, with keys as
// codes and pasted text told apart. What it was before is restored at the end. At most one at a
// time; one thread.
class TerminalSession {
 public:
  // Codes of the keys that stand around pasted text.
  static constexpr int kPasteBegins = 0x1000;
  static constexpr int kPasteEnds = 0x1001;

  // Null where nothing is known of a terminal of this kind ($TERM).
  [[nodiscard]] static std::unique_ptr<TerminalSession> open();
  ~TerminalSession();
  TerminalSession(const TerminalSession&) = delete;
  TerminalSession& operator=(const TerminalSession&) = delete;

  // Gives the terminal back for a while, and takes it again.
  void leave();
  void comeBack();

  // The size may have changed.
  void measure();
  [[nodiscard]] size_t rows() const;
  [[nodiscard]] size_t columns() const;

  // Asks the terminal to put a text on the clipboard, of at most kMaxCopied bytes.
  static constexpr size_t kMaxCopied = 8192;
  void copy(std::string_view text);

 private:
  explicit TerminalSession(::screen* handle) : _handle(handle) {}
  void prepare();

  ::screen* const _handle;
  bool _away = false;
};

// Writes control sequences past the screen library, between two of its updates.
void writeToTerminal(std::string_view sequence);

}  // namespace mailscreen
