#include <benchmark/benchmark.h>

#include <memory>
#include <vector>

#include "parameters/TLParamsManager.h"
#include "records/TLIndexableItem.h"

namespace {

// An item as a mail client sends it, with eight attributes, among them a text body of 4 KiB.
std::shared_ptr<TLIndexableItem> mailItem() {
  auto item = std::make_shared<TLIndexableItem>();
  item->setIdentifier(u"mbox/home/ann/mail/2023.mbox?offset=123456");
  item->setDomainIdentifier(u"home/ann/mail/2023.mbox");
  item->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, u"Re: agenda of the next meeting");
  item->addPersonsWithKey(TLAttributeKey::AUTHORS, {u"ann@example.com"});
  item->addPersonsWithKey(TLAttributeKey::RECIPIENTS, {u"bob@example.com", u"list@example.org"});
  item->addAttributeWithKeyDoubleValue(TLAttributeKey::MAIL_DATE_RECEIVED, 1.6e9);
  item->addAttributeWithKeyDoubleValue(TLAttributeKey::CONTENT_CREATION_DATE, 1.6e9);
  item->addAttributeWithKeyStringValue(TLAttributeKey::MAIL_MESSAGE_ID, u"1234.5678@example.com");
  item->addAttributeWithKeyStringValues(TLAttributeKey::MAILBOXES, {{u"inbox"}});
  item->addAttributeWithKeyStringValue(TLAttributeKey::TEXT_CONTENT, TLString(4096, u'x'));
  return item;
}

// The same item as the document store keeps it.
std::shared_ptr<TLIndexableItem> storedItem() {
  auto item = std::make_shared<TLIndexableItem>();
  const auto mail = mailItem();
  item->setIdentifier(mail->identifier());
  item->setAttributes({mail->attributes().begin(), mail->attributes().begin() + 5});
  item->addAttributeWithKeyStringValue(TLAttributeKey::CONTENT_SNIPPET, TLString(100, u'x'));
  return item;
}

void readAll(benchmark::State& state, const std::string& bytes) {
  for (auto _ : state) {
    TLIndexableItem item;
    benchmark::DoNotOptimize(item.initWithData(bytes));
  }
  state.SetBytesProcessed(state.iterations() * static_cast<int64_t>(bytes.size()));
  state.SetItemsProcessed(state.iterations());
}

void readMailItem(benchmark::State& state) {
  readAll(state, mailItem()->data());
}
BENCHMARK(readMailItem);

void readStoredItem(benchmark::State& state) {
  readAll(state, storedItem()->data());
}
BENCHMARK(readStoredItem);

// Like a search with its results: all items exist at once.
void readStoredItemsInBulk(benchmark::State& state) {
  const std::string bytes = storedItem()->data();
  const auto count = static_cast<size_t>(state.range(0));
  for (auto _ : state) {
    std::vector<std::shared_ptr<TLIndexableItem>> items;
    items.reserve(count);
    for (size_t i = 0; i < count; ++i) {
      items.push_back(std::make_shared<TLIndexableItem>());
      benchmark::DoNotOptimize(items.back()->initWithData(bytes));
    }
  }
  state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(readStoredItemsInBulk)->Arg(1000);

void writeMailItem(benchmark::State& state) {
  const auto item = mailItem();
  for (auto _ : state) benchmark::DoNotOptimize(item->data());
  state.SetItemsProcessed(state.iterations());
}
BENCHMARK(writeMailItem);

// The last row of the table: the longest linear search.
void readParameter(benchmark::State& state) {
  const auto params = TLParamsManager::paramsFromFallback();
  for (auto _ : state) {
    benchmark::DoNotOptimize(params->floatValueForKey("zoneScore.AttachmentType"));
  }
}
BENCHMARK(readParameter);

}  // namespace

BENCHMARK_MAIN();
