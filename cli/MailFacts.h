#pragma once

#include <optional>
#include <string>
#include <unordered_map>

#include "cli/MailReader.h"
#include "cli/MessageParser.h"
#include "records/TLIndexableItem.h"
#include "usersyntax/Names.h"

namespace cli {

// Facts from the head of a message that the index does not keep.
struct MailHead {
  std::string messageID;  // without < >; empty if there is none
  std::string inReplyTo;
  std::string references;
  std::string listID;
  std::string status;  // of Status and X-Status together
  bool spam = false;
};

// Facts about a message beyond the copy in the index. They are read from the mail itself when
// requested, and heads are cached. One thread.
class MailFacts {
 public:
  explicit MailFacts(MailReader::OffsetOf offsetOf = nullptr) : _reader(std::move(offsetOf)) {}

  // Nullopt if the message cannot be read; `unreadable` counts these.
  [[nodiscard]] std::optional<MailHead> head(const std::string& identifier);
  [[nodiscard]] std::optional<bool> flag(const std::string& identifier, usersyntax::Flag flag);
  [[nodiscard]] std::optional<uint64_t> size(const std::string& identifier);
  // The message as an item for indexing, with its text.
  [[nodiscard]] std::shared_ptr<TLIndexableItem> item(const std::string& identifier);

  [[nodiscard]] MailReader& reader() { return _reader; }
  [[nodiscard]] size_t unreadable() const { return _unreadable; }

 private:
  MailReader _reader;
  MessageParser _parser;
  std::unordered_map<std::string, std::optional<MailHead>> _heads;
  size_t _unreadable = 0;
};

// The display name of an item's folder: the last part of its path, without the dot of a Maildir++
// folder and the extensions of mbox files.
[[nodiscard]] std::string folderName(const TLIndexableItem& item);
// The path of the folder; empty for an item from another client without one.
[[nodiscard]] std::string folderPath(const TLIndexableItem& item);

}  // namespace cli
