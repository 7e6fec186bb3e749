#include "tests/daemon/DaemonSupport.h"

#include <algorithm>

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

std::optional<std::multiset<std::string>> found(client::SearchServiceProxy& service,
                                                const std::string& text,
                                                const std::string& protectionClass,
                                                TLErrorOut error) {
  TLQuery query;
  query.setRawQuery(platform::fromUTF8(text));
  query.setOriginalQuery(platform::fromUTF8(text));
  const auto items =
      service.searchItems(query, 0, protectionClass, client::SearchServiceProxy::kNoMaximum, error);
  if (!items) return std::nullopt;
  std::multiset<std::string> identifiers;
  for (const auto& item : *items) {
    identifiers.insert(platform::toUTF8(platform::orEmpty(item->identifier())));
  }
  return identifiers;
}

double percentile(std::vector<double> values, double part) {
  if (values.empty()) return 0;
  std::sort(values.begin(), values.end());
  return values[static_cast<size_t>(part * static_cast<double>(values.size() - 1))];
}

int64_t search(client::SearchServiceProxy& service, const std::string& text,
               const std::string& protectionClass) {
  std::optional<TLError> error;
  const auto identifiers = found(service, text, protectionClass, &error);
  return identifiers ? static_cast<int64_t>(identifiers->size()) : error->code;
}

}  // namespace testsupport
