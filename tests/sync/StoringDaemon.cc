#include "tests/sync/StoringDaemon.h"

#include <gtest/gtest.h>

#include <utility>

#include "platform/Text.h"
#include "records/TLQuery.h"

namespace testsupport {

namespace {

const TLError kUnknownIdentifier{"DocStore", 12, "not found"};
const TLError kItemRefused{"TALIndexer", 1, "index failed"};
const TLError kBroken{"Test", 5, "the call failed"};

std::vector<std::string> copiesOf(const std::vector<std::string_view>& texts) {
  return {texts.begin(), texts.end()};
}

}  // namespace

StoringDaemon::StoringDaemon() {
  using rpc::Arguments;
  using Reply = std::shared_ptr<rpc::Reply>;
  const auto add = [&](const char* member, const char* input, const char* output, auto handler) {
    _interface.methods.push_back({member, input, output, std::vector<const char*>(), handler});
  };
  add("DeleteItemsWithIdentifiers", "asss", "", [this](rpc::Arguments& arguments, Reply reply) {
    change(copiesOf(arguments.readStringArray()), {}, std::nullopt, *reply);
  });
  add("IndexItemsDeleteItemsWithIdentifiers", "aayasbayss", "",
      [this](rpc::Arguments& arguments, Reply reply) {
        const auto items = copiesOf(arguments.readBytesArray());
        const auto identifiers = copiesOf(arguments.readStringArray());
        const bool given = arguments.readBoolean();
        std::optional<std::string> state = std::string(arguments.readBytes());
        if (!given) state.reset();
        change(identifiers, items, state, *reply);
      });
  add("FetchLastClientState", "ss", "bay", [this](rpc::Arguments&, Reply reply) {
    const Content now = content();
    reply->send({now.state.has_value(), rpc::Bytes{now.state.value_or("")}});
  });
  add("SearchItemsForQuery", "aytsx", "aay", [this](rpc::Arguments& arguments, Reply reply) {
    search(std::string(arguments.readBytes()), *reply);
  });
  _listener = rpc::makeListener(_loop, _directory.path(), "com.quill.tallowsearch.SearchService");
  _listener->setDelegate([this](auto&, rpc::Connection& connection) {
    connection.addExportedInterface(_interface);
    return true;
  });
  std::optional<TLError> error;
  EXPECT_TRUE(_listener->resume(&error)) << platform::printable(error);
  _thread = std::thread([this] { _loop.run(); });
}

StoringDaemon::~StoringDaemon() {
  _loop.post([this] { _listener.reset(); });
  _loop.stop();
  _thread.join();
}

void StoringDaemon::change(const std::vector<std::string>& identifiers,
                           const std::vector<std::string>& items,
                           const std::optional<std::string>& state, rpc::Reply& reply) {
  const platform::MutexLock lock(_mutex);
  Fault fault = Fault::none;
  if (_fault != Fault::none && _faultIn-- == 0) fault = std::exchange(_fault, Fault::none);
  if (fault == Fault::before) return reply.sendError(kBroken);
  for (const std::string& identifier : identifiers) {
    if (_content.items.erase(identifier) == 0) return reply.sendError(kUnknownIdentifier);
  }
  if (fault == Fault::afterDeletions) return reply.sendError(kBroken);
  for (const std::string& bytes : items) {
    auto item = std::make_shared<TLIndexableItem>();
    EXPECT_TRUE(item->initWithData(bytes));
    ++_received;
    const auto& subject = item->stringValueForKey(TLAttributeKey::SUBJECT);
    if (!_refused.empty() && subject &&
        platform::toUTF8(*subject).find(_refused) != std::string::npos) {
      return reply.sendError(kItemRefused);
    }
    _content.items[platform::toUTF8(platform::orEmpty(item->identifier()))] = std::move(item);
  }
  if (_whenReceived && _received >= _awaited) std::exchange(_whenReceived, nullptr)();
  if (fault == Fault::afterItems) return reply.sendError(kBroken);
  if (state) _content.state = state;
  if (fault == Fault::afterState) return reply.sendError(kBroken);
  reply.send({});
}

// Supports only the search of an inventory: items whose folder path begins with a text.
void StoringDaemon::search(const std::string& bytes, rpc::Reply& reply) {
  TLQuery query;
  EXPECT_TRUE(query.initWithData(bytes));
  const TLString place(platform::orEmpty(query.root()->stringValue()));
  rpc::BytesArray found;
  for (const auto& [identifier, item] : content().items) {
    const auto* folders = item->stringValuesForKey(TLAttributeKey::MAILBOX_IDENTIFIERS);
    if (folders != nullptr && folders->front().starts_with(place)) found.push_back(item->data());
  }
  reply.send({found});
}

StoringDaemon::Content StoringDaemon::content() const {
  const platform::MutexLock lock(_mutex);
  return _content;
}

void StoringDaemon::setContent(Content content) {
  const platform::MutexLock lock(_mutex);
  _content = std::move(content);
}

void StoringDaemon::failAfter(size_t calls, Fault fault) {
  const platform::MutexLock lock(_mutex);
  _faultIn = calls;
  _fault = fault;
}

void StoringDaemon::refuse(const std::string& subject) {
  const platform::MutexLock lock(_mutex);
  _refused = subject;
}

size_t StoringDaemon::received() const {
  const platform::MutexLock lock(_mutex);
  return _received;
}

void StoringDaemon::whenReceived(size_t items, std::function<void()> action) {
  const platform::MutexLock lock(_mutex);
  _awaited = items;
  _whenReceived = std::move(action);
}

}  // namespace testsupport
