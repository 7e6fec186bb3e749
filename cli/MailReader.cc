#include "cli/MailReader.h"

#include <sys/stat.h>

#include <algorithm>
#include <array>

#include "cli/LineReader.h"
#include "cli/MailFile.h"
#include "platform/Files.h"
#include "sync/MessageDigest.h"

namespace cli {

namespace {

constexpr std::string_view kFlags = ":2,";
constexpr std::array<const char*, 2> kMailDirectories{"new", "cur"};

// 0 for a directory that does not exist.
std::vector<timespec> changeTimesOf(const std::string& maildir) {
  std::vector<timespec> times;
  for (const char* const sub : kMailDirectories) {
    struct stat info {};
    const bool there = stat((maildir + '/' + sub).c_str(), &info) == 0;
    times.push_back(there ? info.st_mtim : timespec{});
  }
  return times;
}

bool isSame(const timespec& a, const timespec& b) {
  return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
}

std::string nameOf(const std::string& path) {
  return path.substr(path.rfind('/') + 1);
}

std::string maildirOf(const std::string& path) {
  const size_t name = path.rfind('/');
  return path.substr(0, path.rfind('/', name - 1));
}

bool isEmptyLine(std::string_view line) {
  return line == "\n" || line == "\r\n";
}

bool isQuotedFrom(std::string_view line) {
  const size_t quotes = line.find_first_not_of('>');
  return quotes != 0 && quotes != std::string_view::npos &&
         line.substr(quotes).starts_with("From ");
}

TLError moved(const std::string& what) {
  return {"tallow", ENOENT, what};
}

// Reads the message after the current From line, up to the next one.
std::optional<std::string> readMboxMessage(LineReader& lines, size_t most, TLErrorOut error) {
  const auto first = lines.next();
  if (!first || !first->bytes.starts_with("From ")) {
    platform::setError(error, moved("the mailbox has changed since it was indexed"));
    return std::nullopt;
  }
  std::string message;
  bool afterEmpty = false;
  while (message.size() < most) {
    const auto piece = lines.next();
    if (!piece || (piece->startsLine && afterEmpty && isFromLine(piece->bytes))) break;
    afterEmpty = piece->startsLine && isEmptyLine(piece->bytes);
    message += piece->bytes.substr(piece->startsLine && isQuotedFrom(piece->bytes) ? 1 : 0);
  }
  // The empty line before the next message does not belong to this one.
  if (message.ends_with("\n\r\n")) {
    message.resize(message.size() - 2);
  } else if (message.ends_with("\n\n")) {
    message.pop_back();
  }
  return message;
}

// `name` is the digest of the content, with ".N" for a duplicate.
bool isNamedBy(std::string_view message, std::string_view name) {
  return mailsync::messageDigest(message) == name.substr(0, name.find('.'));
}

char lowered(char c) {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c;
}

bool isNamed(std::string_view line, std::string_view name) {
  return line.size() > name.size() && line[name.size()] == ':' &&
         std::equal(name.begin(), name.end(), line.begin(),
                    [](char wanted, char c) { return wanted == lowered(c); });
}

}  // namespace

const MailReader::Listing& MailReader::listingOf(const std::string& maildir) {
  const auto known = _listings.find(maildir);
  if (known != _listings.end()) return known->second;
  if (_listings.size() >= kMaxListings) _listings.clear();
  Listing& listing = _listings[maildir];
  listing.times = changeTimesOf(maildir);
  for (const char* const sub : kMailDirectories) {
    const std::string directory = maildir + '/' + sub + '/';
    const auto names = platform::listDirectory(directory, nullptr);
    if (!names) continue;
    for (const std::string& name : *names) {
      listing.paths[name.substr(0, name.rfind(kFlags))] = directory + name;
    }
  }
  return listing;
}

void MailReader::refresh() {
  std::erase_if(_listings, [](const auto& entry) {
    const auto now = changeTimesOf(entry.first);
    return !std::equal(now.begin(), now.end(), entry.second.times.begin(), isSame);
  });
}

std::optional<MailLocation> MailReader::locate(const std::string& identifier) {
  auto location = parseIdentifier(identifier);
  if (location && location->message) {
    if (_offsetOf) location->offset = _offsetOf(identifier);
    return location->offset ? location : std::nullopt;
  }
  if (!location || location->offset || !isMaildirFile(location->path)) return location;
  const Listing& listing = listingOf(maildirOf(location->path));
  const auto found = listing.paths.find(nameOf(location->path));
  if (found == listing.paths.end()) return std::nullopt;
  location->path = found->second;
  return location;
}

std::optional<std::string> MailReader::read(const std::string& identifier, size_t most,
                                            TLErrorOut error) {
  const auto location = locate(identifier);
  if (!location) {
    platform::setError(error, moved("there is no such message any more"));
    return std::nullopt;
  }
  auto source = openByteSource(location->path, error);
  if (source == nullptr) return std::nullopt;
  if (location->offset && !source->advance(*location->offset, error)) return std::nullopt;
  LineReader lines(std::move(source));
  std::optional<std::string> message;
  if (location->message) {
    message = readMboxMessage(lines, kMaxMessageBytes, error);
    if (message && !isNamedBy(*message, *location->message)) {
      platform::setError(error, moved("the mailbox has changed since the last sync"));
      return std::nullopt;
    }
  } else if (location->offset) {
    message = readMboxMessage(lines, most, error);
  } else {
    message.emplace();
    while (message->size() < most) {
      const auto piece = lines.next();
      if (!piece) break;
      *message += piece->bytes;
    }
  }
  if (!message) return std::nullopt;
  if (lines.error() && message->empty()) {
    platform::setError(error, *lines.error());
    return std::nullopt;
  }
  if (message->size() > most) message->resize(most);
  return message;
}

std::string headerValue(std::string_view message, std::string_view name) {
  std::string value;
  bool inside = false;
  for (size_t at = 0; at < message.size();) {
    const size_t end = std::min(message.find('\n', at), message.size());
    std::string_view line = message.substr(at, end - at);
    at = end + 1;
    if (line.ends_with('\r')) line.remove_suffix(1);
    if (line.empty()) break;
    const bool folded = line[0] == ' ' || line[0] == '\t';
    if (!folded && inside) break;
    if (!folded) {
      inside = isNamed(line, name);
      if (inside) line.remove_prefix(name.size() + 1);
    }
    if (!inside) continue;
    const size_t begin = std::min(line.find_first_not_of(" \t"), line.size());
    if (!value.empty()) value += ' ';
    value += line.substr(begin);
  }
  return value;
}

}  // namespace cli
