#include "tests/daemon/DaemonSupport.h"

namespace testsupport {

client::EncodedItem mail(const std::string& identifier, const std::string& subject,
                         const std::string& body) {
  TLIndexableItem item;
  item.setIdentifier(platform::fromUTF8(identifier));
  item.addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, platform::fromUTF8(subject));
  item.addAttributeWithKeyStringValue(TLAttributeKey::TEXT_CONTENT, platform::fromUTF8(body));
  return client::encode(item);
}

std::vector<client::EncodedItem> mails(const std::string& prefix, int count) {
  std::vector<client::EncodedItem> items;
  for (int i = 0; i < count; ++i) {
    std::string body;
    for (int word = 0; word < 300; ++word) body += fmt::format("w{} ", i * 7 + word);
    items.push_back(mail(fmt::format("{}{}", prefix, i), "word " + prefix, body));
  }
  return items;
}

int64_t search(client::SearchServiceProxy& service, const std::string& text,
               const std::string& protectionClass) {
  TLQuery query;
  query.setRawQuery(platform::fromUTF8(text));
  query.setOriginalQuery(platform::fromUTF8(text));
  std::optional<TLError> error;
  const auto items = service.searchItems(query, 0, protectionClass,
                                         client::SearchServiceProxy::kNoMaximum, &error);
  return items ? static_cast<int64_t>(items->size()) : error->code;
}

}  // namespace testsupport
