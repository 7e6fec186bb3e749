#include "libtallow/tallow/Client.h"

#include "client/SearchServiceProxy.h"
#include "libtallow/Errors.h"
#include "libtallow/ItemImpl.h"
#include "libtallow/QueryImpl.h"
#include "rpc/Channel.h"

namespace tallow {

namespace {

bool areSendable(std::span<const std::string> texts, const char* what, Error* error) {
  for (const std::string& text : texts) {
    if (!isSendable(text, what, error)) return false;
  }
  return true;
}

}  // namespace

struct Settings::Impl {
  std::string name;
  std::string protectionClass = "default";
  std::string runtimeDirectory = defaultRuntimeDirectory();
  std::chrono::milliseconds patience{0};
};

Settings::Settings(std::string_view name) : _impl(std::make_unique<Impl>()) {
  _impl->name = name;
}
Settings::Settings(const Settings& other) : _impl(std::make_unique<Impl>(*other._impl)) {}
Settings& Settings::operator=(const Settings& other) {
  *_impl = *other._impl;
  return *this;
}
Settings::~Settings() = default;

void Settings::setProtectionClass(std::string_view protectionClass) {
  _impl->protectionClass = protectionClass;
}

void Settings::setRuntimeDirectory(std::string_view directory) {
  _impl->runtimeDirectory = directory;
}

void Settings::setPatience(std::chrono::milliseconds patience) {
  _impl->patience = patience;
}

struct Client::Impl {
  const std::string name;
  const std::string protectionClass;
  client::SearchServiceProxy service;

  [[nodiscard]] bool isNamed(Error* error) const {
    return isSendable(name, "the client's name", error) &&
           isSendable(protectionClass, "the protection class", error);
  }

  [[nodiscard]] static std::vector<client::EncodedItem> encoded(std::span<const Item> items) {
    std::vector<client::EncodedItem> list;
    list.reserve(items.size());
    for (const Item& item : items) list.push_back(client::encode(*item._impl->record));
    return list;
  }
};

Client::Client(const Settings& settings)
    : _impl(new Impl{
          settings._impl->name, settings._impl->protectionClass,
          client::SearchServiceProxy(settings._impl->runtimeDirectory, settings._impl->patience)}) {
}
Client::~Client() = default;

bool Client::index(std::span<const Item> items, Error* error) {
  if (!_impl->isNamed(error)) return false;
  std::optional<TLError> failure;
  return _impl->service.indexItems(Impl::encoded(items), _impl->name, _impl->protectionClass,
                                   &failure) ||
         fail(error, failure);
}

bool Client::remove(std::span<const std::string> identifiers, Error* error) {
  if (!_impl->isNamed(error) || !areSendable(identifiers, "an identifier", error)) return false;
  std::optional<TLError> failure;
  return _impl->service.deleteItemsWithIdentifiers(identifiers, _impl->name, _impl->protectionClass,
                                                   &failure) ||
         fail(error, failure);
}

bool Client::removeGroups(std::span<const std::string> groups, Error* error) {
  if (!_impl->isNamed(error) || !areSendable(groups, "a group", error)) return false;
  std::optional<TLError> failure;
  return _impl->service.deleteItemsWithDomainIdentifiers(groups, _impl->name,
                                                         _impl->protectionClass, &failure) ||
         fail(error, failure);
}

bool Client::removeAll(Error* error) {
  if (!_impl->isNamed(error)) return false;
  std::optional<TLError> failure;
  return _impl->service.deleteAllItems(_impl->name, _impl->protectionClass, &failure) ||
         fail(error, failure);
}

bool Client::update(std::span<const Item> items, std::span<const std::string> removed,
                    std::string_view state, Error* error) {
  if (!_impl->isNamed(error) || !areSendable(removed, "an identifier", error)) return false;
  std::optional<TLError> failure;
  return _impl->service.indexItems(Impl::encoded(items), removed, std::string(state), _impl->name,
                                   _impl->protectionClass, &failure) ||
         fail(error, failure);
}

bool Client::lastState(std::optional<std::string>& state, Error* error) {
  if (!_impl->isNamed(error)) return false;
  std::optional<TLError> failure;
  state = _impl->service.fetchLastClientState(_impl->name, _impl->protectionClass, &failure);
  return !failure || fail(error, failure);
}

std::optional<std::vector<Item>> Client::search(const Query& query, int64_t maximum, Error* error) {
  if (!_impl->isNamed(error)) return std::nullopt;
  std::optional<TLError> failure;
  auto found = _impl->service.searchItems(*query._impl->record, 0, _impl->protectionClass, maximum,
                                          &failure);
  if (!found) {
    fail(error, failure);
    return std::nullopt;
  }
  std::vector<Item> items;
  items.reserve(found->size());
  for (auto& record : *found) {
    items.push_back(Item(std::make_unique<Item::Impl>(Item::Impl{std::move(record)})));
  }
  return items;
}

std::optional<std::vector<ReplacedWord>> Client::replacedWords(Error* error) {
  std::optional<TLError> failure;
  auto found = _impl->service.replacedWords(&failure);
  if (!found) {
    fail(error, failure);
    return std::nullopt;
  }
  std::vector<ReplacedWord> words;
  for (auto& word : *found) {
    words.push_back({std::move(word.typed), std::move(word.replacement), std::move(word.reason)});
  }
  return words;
}

void Client::interrupt() {
  _impl->service.interrupt();
}

const char* version() {
  return TALLOW_VERSION;
}

std::string defaultRuntimeDirectory() {
  return rpc::defaultRuntimeDirectory();
}

}  // namespace tallow
