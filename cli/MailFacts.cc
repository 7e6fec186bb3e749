#include "cli/MailFacts.h"

#include <sys/stat.h>

#include <algorithm>

#include "cli/MailFile.h"

namespace cli {

namespace {

// Header fields beyond this are ignored.
constexpr size_t kMaxHeadBytes = size_t{64} << 10;
// Maximum number of cached heads.
constexpr size_t kMaxHeads = 200000;

std::string_view withoutBrackets(std::string_view id) {
  const size_t begin = id.find('<');
  const size_t end = id.find('>', begin == std::string_view::npos ? 0 : begin);
  return begin == std::string_view::npos || end == std::string_view::npos
             ? id
             : id.substr(begin + 1, end - begin - 1);
}

MailHead headOf(std::string_view message) {
  MailHead head;
  head.messageID = withoutBrackets(headerValue(message, "message-id"));
  head.inReplyTo = headerValue(message, "in-reply-to");
  head.references = headerValue(message, "references");
  head.listID = headerValue(message, "list-id");
  head.status = headerValue(message, "status") + headerValue(message, "x-status");
  head.spam = usersyntax::folded(headerValue(message, "x-spam-flag")) == "yes";
  return head;
}

// The letters of a flag in Maildir file names and in the status fields of mbox files.
struct FlagLetters {
  usersyntax::Flag flag;
  char inName;
  char inStatus;
};
constexpr FlagLetters kLetters[] = {{usersyntax::Flag::read, 'S', 'R'},
                                    {usersyntax::Flag::unread, 'S', 'R'},
                                    {usersyntax::Flag::flagged, 'F', 'F'},
                                    {usersyntax::Flag::replied, 'R', 'A'}};

std::string withoutSuffixes(std::string name) {
  for (const std::string_view suffix : {".gz", ".xz", ".mbox"}) {
    if (name.size() > suffix.size() && name.ends_with(suffix)) {
      name.resize(name.size() - suffix.size());
    }
  }
  return name;
}

std::string textOf(const std::optional<TLString>& text) {
  return platform::toUTF8(platform::orEmpty(text));
}

}  // namespace

std::optional<MailHead> MailFacts::head(const std::string& identifier) {
  const auto known = _heads.find(identifier);
  if (known != _heads.end()) return known->second;
  if (_heads.size() >= kMaxHeads) _heads.clear();
  std::optional<TLError> error;
  const auto message = _reader.read(identifier, kMaxHeadBytes, &error);
  if (!message) ++_unreadable;
  return _heads[identifier] = message ? std::optional(headOf(*message)) : std::nullopt;
}

std::optional<bool> MailFacts::flag(const std::string& identifier, usersyntax::Flag flag) {
  const auto location = _reader.locate(identifier);
  if (!location) {
    ++_unreadable;
    return std::nullopt;
  }
  const auto* const letters =
      std::find_if(std::begin(kLetters), std::end(kLetters),
                   [flag](const FlagLetters& row) { return row.flag == flag; });
  const bool maildir = !location->offset && isMaildirFile(location->path);
  if (letters != std::end(kLetters) && maildir) {
    const size_t flags = location->path.rfind(":2,");
    const bool set = flags != std::string::npos &&
                     location->path.find(letters->inName, flags + 3) != std::string::npos;
    return set != (flag == usersyntax::Flag::unread);
  }
  const auto found = head(identifier);
  if (!found) return std::nullopt;
  if (letters == std::end(kLetters)) return found->spam;
  const bool set = found->status.find(letters->inStatus) != std::string::npos;
  return set != (flag == usersyntax::Flag::unread);
}

std::optional<uint64_t> MailFacts::size(const std::string& identifier) {
  const auto location = _reader.locate(identifier);
  struct stat info;
  const bool plain = location && !location->offset && !location->path.ends_with(".gz") &&
                     !location->path.ends_with(".xz");
  if (plain && stat(location->path.c_str(), &info) == 0) return static_cast<uint64_t>(info.st_size);
  std::optional<TLError> error;
  const auto message = _reader.read(identifier, kMaxMessageBytes, &error);
  if (message) return message->size();
  ++_unreadable;
  return std::nullopt;
}

std::shared_ptr<TLIndexableItem> MailFacts::item(const std::string& identifier) {
  std::optional<TLError> error;
  const auto message = _reader.read(identifier, kMaxMessageBytes, &error);
  if (message) {
    auto parsed = _parser.parse(*message, {identifier, "", ""});
    if (auto* const good = std::get_if<ParsedMessage>(&parsed)) return std::move(good->item);
  }
  ++_unreadable;
  return nullptr;
}

std::string folderPath(const TLIndexableItem& item) {
  // Percent-encoded like an identifier.
  const auto location = parseIdentifier("file" + textOf(item.domainIdentifier()));
  return location ? location->path : std::string();
}

std::string folderName(const TLIndexableItem& item) {
  const std::string path = folderPath(item);
  std::string name = path.substr(path.rfind('/') + 1);
  if (textOf(item.identifier()).starts_with("mbox/")) return withoutSuffixes(std::move(name));
  if (name.size() > 1 && name[0] == '.') name.erase(0, 1);
  return name;
}

}  // namespace cli
