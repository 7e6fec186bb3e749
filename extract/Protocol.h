#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

// What the client and tallow-extract say to each other over a stream socket, one request at a time:
//
//   program -> client   reply {empty, size 0}: it is sandboxed and ready
//   client -> program   request, with the file as a descriptor (SCM_RIGHTS)
//   program -> client   reply, then `size` bytes of text in UTF-8
//
// Both headers are of fixed size, in the byte order of the machine. Neither side trusts the other.
namespace extract {

// What a file is taken to be. `text` and `message` never reach the program: the client decodes them
// as it decodes the mail's own text.
enum class Kind : uint32_t { pdf, openDocument, officeXML, zip, html, text, message };
inline constexpr std::array kKindNames{"pdf",  "opendocument", "office-xml", "zip",
                                       "html", "text",         "message"};

// What became of an attachment. The program tells of the first five only.
enum class Outcome : uint32_t {
  extracted,
  cut,        // a part of the text, up to a limit or to damage
  empty,      // no text, as in a scanned PDF
  encrypted,  // needs a password
  damaged,
  tooLarge,  // the file is not looked at
  timedOut,
  crashed,
  notRun,  // the program cannot be run
  noRoom,  // the limit of the mail's text, of its attachments or of its time was reached before
};
inline constexpr std::array kOutcomeNames{"extracted", "cut",       "empty",     "encrypted",
                                          "damaged",   "too-large", "timed-out", "crashed",
                                          "not-run",   "no-room"};

[[nodiscard]] inline const char* nameOf(Kind kind) {
  return kKindNames[static_cast<size_t>(kind)];
}
[[nodiscard]] inline const char* nameOf(Outcome outcome) {
  return kOutcomeNames[static_cast<size_t>(outcome)];
}

// How many attachments of each kind had which outcome.
struct Counts {
  using Row = std::array<uint64_t, kOutcomeNames.size()>;
  std::array<Row, kKindNames.size()> rows{};

  void add(Kind kind, Outcome outcome, uint64_t count = 1) {
    rows[static_cast<size_t>(kind)][static_cast<size_t>(outcome)] += count;
  }
  void add(const Counts& other);
  // Calls `take(kind, outcome, count)` for each count that is not 0.
  template <typename Take>
  void forEach(const Take& take) const {
    for (size_t kind = 0; kind < rows.size(); ++kind) {
      for (size_t outcome = 0; outcome < rows[kind].size(); ++outcome) {
        if (rows[kind][outcome] > 0) {
          take(static_cast<Kind>(kind), static_cast<Outcome>(outcome), rows[kind][outcome]);
        }
      }
    }
  }
};

// The longest text that is asked for, in bytes; a zone of the index holds less.
inline constexpr uint32_t kMaxTextBytes = 1 << 20;

struct Request {
  Kind kind = Kind::pdf;
  uint32_t limit = 0;  // of the text, in bytes; from 1 to kMaxTextBytes

  bool operator==(const Request&) const = default;
};

struct ReplyHeader {
  Outcome outcome = Outcome::empty;
  bool last = false;  // the program ends after this reply; start another one
  uint32_t size = 0;  // of the text that follows, in bytes

  bool operator==(const ReplyHeader&) const = default;
};

inline constexpr size_t kRequestBytes = 12;
inline constexpr size_t kReplyBytes = 16;

[[nodiscard]] std::string encode(const Request& request);
[[nodiscard]] std::string encode(const ReplyHeader& reply);

// Nullopt for anything that `encode` does not make, for a kind that the program does not take, and
// for a reply with more than `limit` bytes.
[[nodiscard]] std::optional<Request> parseRequest(std::string_view bytes);
[[nodiscard]] std::optional<ReplyHeader> parseReply(std::string_view bytes, uint32_t limit);

}  // namespace extract
