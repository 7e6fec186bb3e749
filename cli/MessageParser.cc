#include "cli/MessageParser.h"

#include <optional>
#include <vector>

#include "cli/AttachmentText.h"
#include "cli/Identifier.h"
#include "cli/MessageParts.h"
#include "cli/Mime.h"
#include "cli/TextBudget.h"

namespace cli {

namespace {

using Key = TLAttributeKey;

std::optional<double> secondsOf(GDateTime* date) {
  if (date == nullptr) return std::nullopt;
  return static_cast<double>(g_date_time_to_unix(date));
}

std::string_view headerOf(GMimeMessage* message, const char* name) {
  return orEmpty(g_mime_object_get_header(GMIME_OBJECT(message), name));
}

std::optional<double> receivedDate(GMimeMessage* message) {
  const std::string_view received = headerOf(message, "Received");
  const size_t semicolon = received.rfind(';');
  if (semicolon == std::string_view::npos) return std::nullopt;
  GDateTime* date =
      g_mime_utils_header_decode_date(std::string(received.substr(semicolon + 1)).c_str());
  const auto seconds = secondsOf(date);
  if (date != nullptr) g_date_time_unref(date);
  return seconds;
}

// Fills one item from one message.
class ItemBuilder {
 public:
  ItemBuilder(GMimeMessage* message, const MessageOrigin& origin, TextDecoder& decoder,
              extract::ExtractProcess* process)
      : _message(message), _origin(origin), _decoder(decoder), _process(process) {}

  ParsedMessage build() {
    _item->setIdentifier(platform::fromUTF8(_origin.identifier));
    _item->setDomainIdentifier(platform::fromUTF8(percentEncodePath(_origin.folderPath)));
    addText(Key::SUBJECT, orEmpty(g_mime_message_get_subject(_message)));
    const std::string_view sender = headerOf(_message, "X-From");
    addText(Key::X_FROM, sender.empty() ? headerOf(_message, "Sender") : sender);
    addPersons(Key::AUTHORS, GMIME_ADDRESS_TYPE_FROM, "From");
    addPersons(Key::RECIPIENTS, GMIME_ADDRESS_TYPE_TO, "To");
    addPersons(Key::ADDITIONAL_RECIPIENTS, GMIME_ADDRESS_TYPE_CC, "Cc");
    addPersons(Key::HIDDEN_ADDITIONAL_RECIPIENTS, GMIME_ADDRESS_TYPE_BCC, "Bcc");
    addDates();
    const Leaves leaves = leavesOf(_message);
    addBody(leaves);
    addAttachments(leaves.attachments);
    addText(Key::MAIL_MESSAGE_ID, orEmpty(g_mime_message_get_message_id(_message)));
    addTexts(Key::MAILBOXES, {platform::fromUTF8(_origin.folderName)});
    addTexts(Key::MAILBOX_IDENTIFIERS, {platform::fromUTF8(_origin.folderPath)});
    addText(Key::CONTENT_TYPE, "message/rfc822");
    return {_item, _cut, _counts};
  }

 private:
  void addText(Key key, std::string_view text) {
    if (text.empty()) return;
    addTexts(key, {platform::fromUTF8(text)}, true);
  }

  // Adds the texts as one text or as a list, within the budget of one zone.
  void addTexts(Key key, const std::vector<TLString>& texts, bool single = false) {
    TextBudget budget;
    std::vector<TLString> kept;
    for (const TLString& text : texts) {
      const TLStringView taken = budget.take(text);
      if (!taken.empty()) kept.emplace_back(taken);
      if (budget.exhausted()) break;
    }
    _cut = _cut || budget.exhausted();
    if (kept.empty()) return;
    if (single) {
      _item->addAttributeWithKeyStringValue(key, std::move(kept.front()));
    } else {
      _item->addAttributeWithKeyStringValues(key, std::move(kept));
    }
  }

  // A header with text but without a valid address becomes one person with that name.
  void addPersons(Key key, GMimeAddressType type, const char* header) {
    TextBudget names;
    TextBudget addresses;
    std::vector<std::shared_ptr<TLPerson>> persons;
    InternetAddressList* const all = g_mime_message_get_addresses(_message, type);
    std::vector<InternetAddressList*> pending{all};
    while (!pending.empty()) {
      InternetAddressList* const list = pending.back();
      pending.pop_back();
      const int count = list == nullptr ? 0 : internet_address_list_length(list);
      for (int i = 0; i < count; ++i) {
        InternetAddress* const address = internet_address_list_get_address(list, i);
        if (INTERNET_ADDRESS_IS_GROUP(address)) {
          pending.push_back(internet_address_group_get_members(INTERNET_ADDRESS_GROUP(address)));
        } else if (INTERNET_ADDRESS_IS_MAILBOX(address)) {
          auto person = personOf(address, names, addresses);
          if (person != nullptr) persons.push_back(std::move(person));
        }
        if (names.exhausted() || addresses.exhausted()) break;
      }
    }
    const TLString text = platform::fromUTF8(headerOf(_message, header));
    if ((all == nullptr || internet_address_list_length(all) == 0) && !isBlank(text)) {
      persons.push_back(std::make_shared<TLPerson>());
      persons.back()->setName(TLString(names.take(text)));
    }
    _cut = _cut || names.exhausted() || addresses.exhausted();
    if (!persons.empty()) _item->addAttributeWithKeyPersonValues(key, std::move(persons));
  }

  static std::shared_ptr<TLPerson> personOf(InternetAddress* address, TextBudget& names,
                                            TextBudget& addresses) {
    const TLString name = platform::fromUTF8(orEmpty(internet_address_get_name(address)));
    const TLString mail = platform::fromUTF8(
        orEmpty(internet_address_mailbox_get_addr(INTERNET_ADDRESS_MAILBOX(address))));
    const TLStringView takenName = names.take(name);
    const TLStringView takenMail = addresses.take(mail);
    if (takenName.empty() && takenMail.empty()) return nullptr;
    auto person = std::make_shared<TLPerson>();
    if (!takenName.empty()) person->setName(TLString(takenName));
    if (!takenMail.empty()) person->setEmailAddress(TLString(takenMail));
    return person;
  }

  void addDates() {
    const auto sent = secondsOf(g_mime_message_get_date(_message));
    auto received = receivedDate(_message);
    if (!received) received = sent;
    if (received) _item->addAttributeWithKeyDoubleValue(Key::MAIL_DATE_RECEIVED, *received);
    if (sent) _item->addAttributeWithKeyDoubleValue(Key::CONTENT_CREATION_DATE, *sent);
  }

  void addBody(const Leaves& leaves) {
    TextBudget budget;
    const TLString plain = joinedText(leaves.plain, _decoder);
    TLString text(budget.take(plain));
    if (!leaves.html.empty() && isBlank(plain)) {
      text.clear();
      budget = TextBudget();
      const TLString html = joinedText(leaves.html, _decoder);
      const TLStringView taken = budget.takeMarkup(html);
      if (!taken.empty()) {
        _item->addAttributeWithKeyBytesValue(Key::HTML_CONTENT_DATA, platform::toUTF8(taken));
      }
      _cut = _cut || budget.exhausted();
      budget = TextBudget();  // plain text is a zone of its own
    }
    _cut = _cut || budget.exhausted();
    addAttachmentTexts(leaves, budget, text);
    if (!text.empty()) _item->addAttributeWithKeyStringValue(Key::TEXT_CONTENT, std::move(text));
  }

  // Appends what is left of the budget can hold. Attachments that do not fit do not count as cut.
  void addAttachmentTexts(const Leaves& leaves, TextBudget& budget, TLString& text) {
    if (_process == nullptr) return;
    const TLString added = AttachmentText(*_process, _decoder, budget, _counts).of(leaves.files);
    if (!text.empty() && !added.empty() && text.back() != u'\n') text.push_back(u'\n');
    text += added;
  }

  void addAttachments(const std::vector<GMimeObject*>& attachments) {
    std::vector<TLString> names;
    std::vector<TLString> types;
    for (GMimeObject* attachment : attachments) {
      const char* name =
          GMIME_IS_PART(attachment) ? g_mime_part_get_filename(GMIME_PART(attachment)) : nullptr;
      if (name != nullptr) names.push_back(platform::fromUTF8(name));
      GMimeContentType* const type = g_mime_object_get_content_type(attachment);
      if (type == nullptr) continue;
      const CString text(g_mime_content_type_get_mime_type(type));
      types.push_back(platform::fromUTF8(orEmpty(text.get())));
    }
    addTexts(Key::ATTACHMENT_NAMES, names);
    addTexts(Key::ATTACHMENT_TYPES, types);
  }

  GMimeMessage* const _message;
  const MessageOrigin& _origin;
  TextDecoder& _decoder;
  extract::ExtractProcess* const _process;  // null without attachments
  extract::Counts _counts;
  const std::shared_ptr<TLIndexableItem> _item = std::make_shared<TLIndexableItem>();
  bool _cut = false;
};

}  // namespace

MessageParser::MessageParser(const std::string& extractProgram) {
  if (!extractProgram.empty()) _process.emplace(extractProgram);
  initMIME();
}

std::variant<ParsedMessage, UnparsableMessage> MessageParser::parse(std::string_view bytes,
                                                                    const MessageOrigin& origin) {
  if (bytes.find_first_not_of(" \t\r\n") == std::string_view::npos) {
    return UnparsableMessage{"the message is empty"};
  }
  const Object<GMimeMessage> message = parseMIME(bytes);
  if (message == nullptr) return UnparsableMessage{"not a mail message"};
  GMimeHeaderList* const headers = g_mime_object_get_header_list(GMIME_OBJECT(message.get()));
  if (g_mime_header_list_get_count(headers) == 0) {
    return UnparsableMessage{"the message has no header"};
  }
  return ItemBuilder(message.get(), origin, _decoder, _process ? &*_process : nullptr).build();
}

}  // namespace cli
