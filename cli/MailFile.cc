#include "cli/MailFile.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>

#include "cli/Identifier.h"
#include "cli/LineReader.h"
#include "platform/Text.h"

namespace cli {

namespace {

using platform::isDigit;

constexpr std::string_view kFrom = "From ";

// 9:05, 09:05, 09:05:59
bool isTime(std::string_view word) {
  const size_t colon = word.find(':');
  return (colon == 1 || colon == 2) && word.size() >= colon + 3 && isDigit(word[0]) &&
         isDigit(word[colon - 1]) && isDigit(word[colon + 1]) && isDigit(word[colon + 2]);
}

bool isYear(std::string_view word) {
  return word.size() == 4 && (word.starts_with("19") || word.starts_with("20")) &&
         isDigit(word[2]) && isDigit(word[3]);
}

bool isBlankLine(std::string_view line) {
  return line == "\n" || line == "\r\n";
}

// True for a line with "From " after at least one ">".
bool isQuotedFromLine(std::string_view line) {
  const size_t quotes = line.find_first_not_of('>');
  return quotes != 0 && quotes != std::string_view::npos && line.substr(quotes).starts_with(kFrom);
}

std::string_view withoutSuffix(std::string_view text, std::string_view suffix) {
  return text.size() > suffix.size() && text.ends_with(suffix)
             ? text.substr(0, text.size() - suffix.size())
             : text;
}

std::string directoryOf(const std::string& path) {
  const size_t slash = path.rfind('/');
  return slash == 0 ? "/" : path.substr(0, slash);
}

std::string lastComponent(const std::string& path) {
  return path.substr(path.rfind('/') + 1);
}

MessageOrigin originOfFile(const std::string& path) {
  std::string folder = directoryOf(path);
  if (isMaildirFile(path)) folder = directoryOf(folder);
  std::string name = lastComponent(folder);
  // The names of Maildir++ subfolders begin with a dot.
  if (isMaildirFile(path) && name.size() > 1 && name[0] == '.') name.erase(0, 1);
  return {fileIdentifier(path), std::move(folder), std::move(name)};
}

MessageOrigin originOfMbox(const std::string& path) {
  const std::string full = lastComponent(path);
  std::string_view name = full;
  for (const char* suffix : {".gz", ".xz", ".mbox"}) name = withoutSuffix(name, suffix);
  return {"", path, std::string(name)};
}

// True if the text starts with a header field and contains a field that every message has.
bool looksLikeMessage(std::string_view head) {
  const size_t colon = head.find(':');
  if (colon == 0 || colon == std::string_view::npos) return false;
  const std::string_view name = head.substr(0, colon);
  if (!std::all_of(name.begin(), name.end(), [](char c) { return c > ' ' && c < '\x7F'; })) {
    return false;
  }
  static constexpr std::array<std::string_view, 2> kFields{"from:", "date:"};
  const auto sameLetter = [](char a, char b) {
    return (a >= 'A' && a <= 'Z' ? static_cast<char>(a + 32) : a) == b;
  };
  return std::any_of(kFields.begin(), kFields.end(), [&](std::string_view field) {
    auto found = head.begin();
    for (;; ++found) {
      found = std::search(found, head.end(), field.begin(), field.end(), sameLetter);
      if (found == head.end()) return false;
      if (found == head.begin() || *(found - 1) == '\n') return true;
    }
  });
}

// Reads one file. Collects the current message in `_message`.
class Reader {
 public:
  Reader(const std::string& path, bool named, const MailSink& sink, LineReader& lines)
      : _path(path), _named(named), _sink(sink), _lines(lines) {}

  bool run() {
    const std::string_view head = _lines.peek();
    if (head.starts_with(kFrom)) return readMbox();
    const bool failedAtOnce = _lines.error() && head.empty();
    if (!failedAtOnce &&
        (isMaildirFile(_path) || _path.ends_with(".eml") || looksLikeMessage(head))) {
      return readSingle();
    }
    if (head.empty() && !_lines.error()) return true;  // an empty mbox file
    if (_lines.error()) return _sink.failure(_path, _lines.error()->message);
    if (_named) return _sink.failure(_path, "neither an mbox file nor a message");
    _sink.ignored(_path);
    return true;
  }

 private:
  bool readSingle() {
    while (const auto piece = next()) append(piece->bytes);
    return finish(originOfFile(_path), _path, true);
  }

  bool readMbox() {
    MessageOrigin origin = originOfMbox(_path);
    uint64_t start = 0;
    bool afterBlank = true;
    const auto deliver = [&](bool last) {
      origin.identifier = mboxIdentifier(_path, start);
      origin.offset = start;
      // The empty line before the next message does not belong to this one.
      if (_message.ends_with("\n\r\n")) {
        _message.resize(_message.size() - 2);
      } else if (_message.ends_with("\n\n")) {
        _message.pop_back();
      }
      return finish(origin, fmt::format("{}:{}", _path, start), last);
    };
    while (const auto piece = next()) {
      const bool first = piece->offset == 0;
      const bool separator = piece->startsLine && afterBlank && (first || isFromLine(piece->bytes));
      afterBlank = piece->startsLine && isBlankLine(piece->bytes);
      if (separator) {
        if (!first && !deliver(false)) return false;
        start = piece->offset;
        continue;
      }
      append(piece->bytes.substr(piece->startsLine && isQuotedFromLine(piece->bytes) ? 1 : 0));
    }
    return deliver(true);
  }

  std::optional<LineReader::Piece> next() {
    auto piece = _lines.next();
    const uint64_t consumed = _lines.source().consumed();
    if (consumed != _consumed) _sink.progress(consumed - _consumed);
    _consumed = consumed;
    return piece;
  }

  void append(std::string_view bytes) {
    _tooLong = _tooLong || _message.size() + bytes.size() > kMaxMessageBytes;
    if (!_tooLong) _message.append(bytes);
  }

  // Passes on the current message and resets for the next one. The last message of a file that
  // could not be read to its end is incomplete.
  bool finish(const MessageOrigin& origin, const std::string& where, bool last) {
    bool goOn;
    if (_tooLong) {
      goOn = _sink.failure(where, fmt::format("longer than {} MiB", kMaxMessageBytes >> 20));
    } else if (last && _lines.error()) {
      goOn = _sink.failure(where, _lines.error()->message);
    } else {
      goOn = _sink.message(_message, origin);
    }
    _message.clear();
    _tooLong = false;
    return goOn;
  }

  const std::string& _path;
  const bool _named;
  const MailSink& _sink;
  LineReader& _lines;
  std::string _message;
  bool _tooLong = false;
  uint64_t _consumed = 0;
};

}  // namespace

bool isFromLine(std::string_view line) {
  if (!line.starts_with(kFrom)) return false;
  bool time = false;
  bool year = false;
  for (size_t begin = kFrom.size(); begin < line.size();) {
    const size_t end = std::min(line.find_first_of(" \t\r\n", begin), line.size());
    const std::string_view word = line.substr(begin, end - begin);
    time = time || isTime(word);
    year = year || isYear(word);
    begin = end + 1;
  }
  return time && year;
}

bool readMailFile(const std::string& path, bool named, const MailSink& sink) {
  std::optional<TLError> error;
  auto source = openByteSource(path, &error);
  if (source == nullptr) return sink.failure(path, error->message);
  LineReader lines(std::move(source));
  return Reader(path, named, sink, lines).run();
}

}  // namespace cli
