#pragma once

#include <chrono>
#include <string>
#include <string_view>

#include "extract/Protocol.h"

// The parsers of attachments. They take any bytes, and may still take much time or memory, or end
// the process: the libraries below them read hostile files. So only tallow-extract and tests call
// them, the former in its sandbox.
namespace extract {

struct Extraction {
  Outcome outcome = Outcome::empty;
  std::string text;  // valid UTF-8; not empty if `extracted` or `cut`, else empty
};

// Collects text up to a limit of bytes and a point in time.
class TextCollector {
 public:
  using Clock = std::chrono::steady_clock;

  // How long the parsers go on before they return what they have. A single page or step may take
  // longer.
  static constexpr std::chrono::seconds kPatience{5};

  explicit TextCollector(size_t limit) : _limit(limit), _until(Clock::now() + kPatience) {}

  // Appends as many whole characters as there is room for. `text` need not be valid.
  void append(std::string_view text);
  // Ends a line, unless the text is empty or ends with one.
  void endLine();

  // Whether more text has no effect, or takes too long.
  [[nodiscard]] bool done() const { return _full || Clock::now() >= _until; }

  // The text as a result. `whole` says that the file was read to its end without a fault.
  [[nodiscard]] Extraction finish(bool whole) &&;

 private:
  const size_t _limit;
  const Clock::time_point _until;
  std::string _text;
  bool _full = false;
};

// The text of a file, of at most `limit` bytes. Not for Kind::text and Kind::message.
[[nodiscard]] Extraction extractText(Kind kind, std::string_view bytes, size_t limit);

// One for each group of kinds; see extractText.
[[nodiscard]] Extraction textOfPDF(std::string_view bytes, size_t limit);
[[nodiscard]] Extraction textOfOffice(Kind kind, std::string_view bytes, size_t limit);
[[nodiscard]] Extraction namesInZip(std::string_view bytes, size_t limit);

// Has the libraries load everything that they load from files on first use. Call once, before the
// process gives up the file system.
void loadLibraries();
void loadPDFLibrary();  // a part of it

}  // namespace extract
