#include "sync/MessageDigest.h"

#include <glib.h>

#include <algorithm>
#include <array>
#include <functional>

namespace mailsync {

namespace {

constexpr std::array<std::string_view, 8> kStateFields{
    "Status", "X-Status", "X-Keywords", "X-UID", "X-IMAP", "X-IMAPbase", "Content-Length", "Lines"};
constexpr int kDigits = 32;

bool equalIgnoringCase(std::string_view a, std::string_view b) {
  return a.size() == b.size() && g_ascii_strncasecmp(a.data(), b.data(), a.size()) == 0;
}

bool isStateField(std::string_view name) {
  return std::any_of(kStateFields.begin(), kStateFields.end(),
                     [&](std::string_view field) { return equalIgnoringCase(name, field); });
}

// Calls `visit` with each line of the header, including its line feed, and the name of its field.
// Returns the offset of the empty line before the body.
size_t eachHeaderLine(
    std::string_view message,
    const std::function<void(std::string_view line, std::string_view name)>& visit) {
  std::string_view name;
  size_t begin = 0;
  while (begin < message.size()) {
    const size_t feed = message.find('\n', begin);
    const size_t end = feed == std::string_view::npos ? message.size() : feed + 1;
    const std::string_view line = message.substr(begin, end - begin);
    if (line == "\n" || line == "\r\n") break;
    const bool continues = line.front() == ' ' || line.front() == '\t';
    if (!continues) name = line.substr(0, std::min(line.find(':'), line.size()));
    visit(line, name);
    begin = end;
  }
  return begin;
}

}  // namespace

std::string messageDigest(std::string_view message) {
  GChecksum* const sum = g_checksum_new(G_CHECKSUM_SHA256);
  const auto add = [sum](std::string_view bytes) {
    g_checksum_update(sum, reinterpret_cast<const guchar*>(bytes.data()),
                      static_cast<gssize>(bytes.size()));
  };
  const size_t body = eachHeaderLine(message, [&](std::string_view line, std::string_view name) {
    if (!isStateField(name)) add(line);
  });
  add(message.substr(body));
  std::string digest(g_checksum_get_string(sum), kDigits);
  g_checksum_free(sum);
  return digest;
}

std::string statusFlags(std::string_view message) {
  std::string letters;
  eachHeaderLine(message, [&](std::string_view line, std::string_view name) {
    if (!equalIgnoringCase(name, "Status") && !equalIgnoringCase(name, "X-Status")) return;
    for (const char letter : line.substr(std::min(name.size() + 1, line.size()))) {
      if (letter == 'R' && equalIgnoringCase(name, "Status")) letters += 'S';
      if (letter == 'A') letters += 'R';
      if (letter == 'F') letters += 'F';
      if (letter == 'D') letters += 'T';
    }
  });
  std::sort(letters.begin(), letters.end());
  letters.erase(std::unique(letters.begin(), letters.end()), letters.end());
  return letters;
}

}  // namespace mailsync
