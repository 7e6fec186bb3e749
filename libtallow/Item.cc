#include "libtallow/tallow/Item.h"

#include "libtallow/ItemImpl.h"

namespace tallow {

namespace {

TLAttributeKey keyOf(Key key) {
  return static_cast<TLAttributeKey>(key);
}

std::string utf8(const std::optional<TLString>& text) {
  return platform::toUTF8(platform::orEmpty(text));
}

std::shared_ptr<TLPerson> recordOf(const Person& person) {
  auto record = std::make_shared<TLPerson>();
  if (!person.name.empty()) record->setName(platform::fromUTF8(person.name));
  if (!person.address.empty()) record->setEmailAddress(platform::fromUTF8(person.address));
  return record;
}

}  // namespace

Item::Item(std::string_view identifier)
    : _impl(std::make_unique<Impl>(Impl{std::make_shared<TLIndexableItem>()})) {
  _impl->record->setIdentifier(platform::fromUTF8(identifier));
}

Item::Item(std::unique_ptr<Impl> impl) : _impl(std::move(impl)) {}
Item::Item(const Item& other)
    : _impl(std::make_unique<Impl>(Impl{other._impl->record->copyWithZone()})) {}
Item::Item(Item&& other) noexcept = default;
Item& Item::operator=(const Item& other) {
  *this = Item(other);
  return *this;
}
Item& Item::operator=(Item&& other) noexcept = default;
Item::~Item() = default;

std::string Item::identifier() const {
  return utf8(_impl->record->identifier());
}

std::string Item::group() const {
  return utf8(_impl->record->domainIdentifier());
}

void Item::setGroup(std::string_view group) {
  _impl->record->setDomainIdentifier(platform::fromUTF8(group));
}

void Item::addText(Key key, std::string_view text) {
  _impl->record->addAttributeWithKeyStringValue(keyOf(key), platform::fromUTF8(text));
}

void Item::addTexts(Key key, std::span<const std::string> texts) {
  std::vector<TLString> strings;
  for (const std::string& text : texts) strings.push_back(platform::fromUTF8(text));
  _impl->record->addAttributeWithKeyStringValues(keyOf(key), std::move(strings));
}

void Item::addBytes(Key key, std::string_view bytes) {
  _impl->record->addAttributeWithKeyBytesValue(keyOf(key), std::string(bytes));
}

void Item::addDate(Key key, double seconds) {
  _impl->record->addAttributeWithKeyDoubleValue(keyOf(key), seconds);
}

void Item::addNumber(Key key, int64_t number) {
  _impl->record->addAttributeWithKeyIntValue(keyOf(key), number);
}

void Item::addFlag(Key key, bool flag) {
  _impl->record->addAttributeWithKeyBoolValue(keyOf(key), flag);
}

void Item::addPersons(Key key, std::span<const Person> persons) {
  std::vector<std::shared_ptr<TLPerson>> records;
  for (const Person& person : persons) records.push_back(recordOf(person));
  _impl->record->addAttributeWithKeyPersonValues(keyOf(key), std::move(records));
}

std::optional<std::string> Item::text(Key key) const {
  const auto& text = _impl->record->stringValueForKey(keyOf(key));
  return text ? std::optional(platform::toUTF8(*text)) : std::nullopt;
}

std::vector<std::string> Item::texts(Key key) const {
  std::vector<std::string> texts;
  const auto* const strings = _impl->record->stringValuesForKey(keyOf(key));
  if (strings == nullptr) return texts;
  for (const TLString& string : *strings) texts.push_back(platform::toUTF8(string));
  return texts;
}

std::optional<std::string> Item::bytes(Key key) const {
  return _impl->record->bytesValueForKey(keyOf(key));
}

std::optional<double> Item::date(Key key) const {
  const auto& attribute = _impl->record->attributeForKey(keyOf(key));
  if (attribute == nullptr || !attribute->hasDoubleValue()) return std::nullopt;
  return attribute->doubleValue();
}

std::optional<int64_t> Item::number(Key key) const {
  const auto& attribute = _impl->record->attributeForKey(keyOf(key));
  if (attribute == nullptr || !attribute->hasIntValue()) return std::nullopt;
  return attribute->intValue();
}

std::optional<bool> Item::flag(Key key) const {
  const auto& attribute = _impl->record->attributeForKey(keyOf(key));
  if (attribute == nullptr || !attribute->hasBoolValue()) return std::nullopt;
  return attribute->boolValue();
}

std::vector<Person> Item::persons(Key key) const {
  std::vector<Person> persons;
  const auto* const records = _impl->record->personValuesForKey(keyOf(key));
  if (records == nullptr) return persons;
  for (const auto& record : *records) {
    persons.push_back({utf8(record->name()), utf8(record->emailAddress())});
  }
  return persons;
}

std::optional<float> Item::score() const {
  const auto& record = *_impl->record;
  if (!record.hasCard() || !record.card()->hasLightScore()) return std::nullopt;
  return record.card()->lightScore();
}

std::optional<float> Item::textScore() const {
  const auto& record = *_impl->record;
  if (!record.hasCard() || !record.card()->hasTextScore()) return std::nullopt;
  return record.card()->textScore();
}

}  // namespace tallow
