#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tallow {

// The usual attributes of a message, with the type of their value. The numbers are those of
// tallow.proto; any other number of it may be used as well. The daemon searches the texts and
// persons among them.
enum class Key : int32_t {
  subject = 13,                      // text
  contentType = 22,                  // text
  keywords = 26,                     // texts
  messageID = 100,                   // text, without < >
  dateReceived = 101,                // date
  dateCreated = 103,                 // date
  htmlContent = 104,                 // bytes, HTML in UTF-8
  accountIdentifier = 106,           // text
  authors = 107,                     // persons
  recipients = 111,                  // persons
  additionalRecipients = 115,        // persons
  hiddenAdditionalRecipients = 119,  // persons
  attachmentTypes = 131,             // texts
  attachmentNames = 132,             // texts
  conversationID = 136,              // text
  mailboxes = 138,                   // texts, names of folders
  read = 142,                        // flag
  flagged = 143,                     // flag
  repliedTo = 144,                   // flag
  priority = 146,                    // number
  mailboxIdentifiers = 165,          // texts, paths of folders
  textContent = 171,                 // text
  contentSnippet = 172,              // text, set by searches
};

// Either may be empty.
struct Person {
  std::string name;
  std::string address;

  bool operator==(const Person&) const = default;
};

// A message to index, or one that a search found. Texts are UTF-8; invalid bytes become U+FFFD.
// After a move an item may only be assigned to or destroyed. One thread at a time.
//
// A found item has its identifier, group, scores, and the attributes that lists of messages show:
// subject, authors, recipients, dates and snippet. The text of a message is not kept.
class Item {
 public:
  // `identifier` is the client's name of the message: another item with it replaces this one in the
  // index. The daemon refuses an item without one, or with characters that no URL can have.
  explicit Item(std::string_view identifier);
  Item(const Item& other);
  Item(Item&& other) noexcept;
  Item& operator=(const Item& other);
  Item& operator=(Item&& other) noexcept;
  ~Item();

  [[nodiscard]] std::string identifier() const;

  // Items can be deleted by group, such as the folder of a message. Empty for none.
  [[nodiscard]] std::string group() const;
  void setGroup(std::string_view group);

  // Each adds one attribute. Dates are in seconds since 1970-01-01 00:00:00 UTC.
  void addText(Key key, std::string_view text);
  void addTexts(Key key, std::span<const std::string> texts);
  void addBytes(Key key, std::string_view bytes);
  void addDate(Key key, double seconds);
  void addNumber(Key key, int64_t number);
  void addFlag(Key key, bool flag);
  void addPersons(Key key, std::span<const Person> persons);

  // The value of the first attribute with the key; nullopt or empty if it has none of this type.
  [[nodiscard]] std::optional<std::string> text(Key key) const;
  [[nodiscard]] std::vector<std::string> texts(Key key) const;
  [[nodiscard]] std::optional<std::string> bytes(Key key) const;
  [[nodiscard]] std::optional<double> date(Key key) const;
  [[nodiscard]] std::optional<int64_t> number(Key key) const;
  [[nodiscard]] std::optional<bool> flag(Key key) const;
  [[nodiscard]] std::vector<Person> persons(Key key) const;

  // The score that a search ranked the item by, and its part that comes from the texts alone.
  [[nodiscard]] std::optional<float> score() const;
  [[nodiscard]] std::optional<float> textScore() const;

 private:
  friend class Client;
  struct Impl;
  explicit Item(std::unique_ptr<Impl> impl);

  std::unique_ptr<Impl> _impl;
};

}  // namespace tallow
