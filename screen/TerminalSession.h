#pragma once

#include <cstddef>
#include <memory>
#include <string_view>

struct screen;

namespace mailscreen {

// The terminal of the standard input and output while a screen is drawn on it: in raw mode, with
// keys as codes and pasted text marked. Restored at the end. At most one at a time; one thread.
class TerminalSession {
 public:
  // Codes of the virtual keys before and after pasted text.
  static constexpr int kPasteBegins = 0x1000;
  static constexpr int kPasteEnds = 0x1001;

  // Null if the type of the terminal ($TERM) is unknown.
  [[nodiscard]] static std::unique_ptr<TerminalSession> open();
  ~TerminalSession();
  TerminalSession(const TerminalSession&) = delete;
  TerminalSession& operator=(const TerminalSession&) = delete;

  // Releases the terminal temporarily, and takes it back.
  void leave();
  void comeBack();

  // Reads the size again, after it may have changed.
  void measure();
  [[nodiscard]] size_t rows() const;
  [[nodiscard]] size_t columns() const;

  // Asks the terminal to copy a text of at most kMaxCopied bytes to the clipboard.
  static constexpr size_t kMaxCopied = 8192;
  void copy(std::string_view text);

 private:
  explicit TerminalSession(::screen* handle) : _handle(handle) {}
  void prepare();

  ::screen* const _handle;
  bool _away = false;
};

// Writes a control sequence directly, bypassing the screen library, between two of its updates.
void writeToTerminal(std::string_view sequence);

}  // namespace mailscreen
