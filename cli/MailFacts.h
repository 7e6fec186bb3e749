#pragma once

#include <optional>
#include <string>
#include <unordered_map>

#include "cli/MailReader.h"
#include "cli/MessageParser.h"
#include "records/TLIndexableItem.h"
#include "usersyntax/Names.h"

namespace cli {

// What the head of a message says that the index does not keep.
struct MailHead {
  std::string messageID;  // without < >; empty where there is none
  std::string inReplyTo;
  std::string references;
  std::string listID;
  std::string status;  // of Status and X-Status together
  bool spam = false;
};

// What is known of a message beyond the copy that the index keeps: it is looked up in the mail
// itself, when it is asked for, and heads are kept. One thread.
class MailFacts {
 public:
  explicit MailFacts(MailReader::OffsetOf offsetOf = nullptr) : _reader(std::move(offsetOf)) {}

  // None where the message cannot be read; `unreadable` counts these.
  [[nodiscard]] std::optional<MailHead> head(const std::string& identifier);
  [[nodiscard]] std::optional<bool> flag(const std::string& identifier, usersyntax::Flag flag);
  [[nodiscard]] std::optional<uint64_t> size(const std::string& identifier);
  // The message as it is indexed, with its text.
  [[nodiscard]] std::shared_ptr<TLIndexableItem> item(const std::string& identifier);

  [[nodiscard]] MailReader& reader() { return _reader; }
  [[nodiscard]] size_t unreadable() const { return _unreadable; }

 private:
  MailReader _reader;
  MessageParser _parser;
  std::unordered_map<std::string, std::optional<MailHead>> _heads;
  size_t _unreadable = 0;
};

// The folder of an item as it is shown: the last part of its path, without the dot of a Maildir++
// folder and the endings of mbox files.
[[nodiscard]] std::string folderName(const TLIndexableItem& item);
// Its path; empty for an item of another client that is in none.
[[nodiscard]] std::string folderPath(const TLIndexableItem& item);

}  // namespace cli
