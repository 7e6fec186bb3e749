// Decodes any record from any bytes: the first byte selects the class, the rest is its wire form. A
// record that decodes must survive being written, read again, copied and compared.

#include <cstddef>
#include <cstdint>
#include <nlohmann/json.hpp>
#include <string_view>

#include "platform/Assert.h"
#include "records/TLIndexableItem.h"
#include "records/TLQuery.h"

namespace {

// A parameter without a key can be read, but must not be written.
void complete(TLParameters& params) {
  for (const auto& keyvalue : params.keyvalues()) {
    if (!keyvalue->hasKey()) keyvalue->setKey(u"key");
  }
}
void complete(TLQuery& query) {
  if (query.hasSearchParams()) complete(*query.searchParams());
}
template <typename Record>
void complete(Record&) {}

template <typename Record>
void check(std::string_view bytes) {
  Record record;
  if (!record.initWithData(bytes)) return;
  complete(record);
  const std::string data = record.data();
  Record again;
  TL_ASSERT(again.initWithData(data));
  TL_ASSERT(again.data() == data);
  const auto copy = record.copyWithZone();
  TL_ASSERT(copy->data() == data);
  TL_ASSERT(again.hash() == record.hash() && copy->hash() == record.hash());
  // A record equals its copy unless it contains NaN, which the dictionary shows as null.
  const std::string text = record.dictionaryRepresentation().dump();
  const bool equal = copy->isEqual(record);
  TL_ASSERT(equal || text.find("null") != std::string::npos);
  TL_ASSERT(again.isEqual(record) == equal && again.isEqual(*copy) == equal);
  TL_ASSERT(again.dictionaryRepresentation().dump() == text);
  again.mergeFrom(*copy);
  copy->copyTo(record);
  TL_ASSERT(record.data() == data);
}

// Attributes in wire form must behave like decoded ones.
void checkWritten(std::string_view bytes) {
  TLIndexableItem kept;
  if (!kept.initWithWrittenData(bytes)) return;
  TLIndexableItem item;
  TL_ASSERT(item.initWithData(bytes));
  const auto key = TLAttributeKey::MAIL_DATE_RECEIVED;
  const double date = kept.doubleValueForKey(key);
  TL_ASSERT(date == item.doubleValueForKey(key) || date != date);
  const std::string forwarded = kept.data();
  TL_ASSERT(kept.attributesCount() == item.attributesCount() && kept.data() == item.data());
  TLIndexableItem again;
  TL_ASSERT(again.initWithData(forwarded) && again.data() == item.data());
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0) return 0;
  const std::string_view bytes(reinterpret_cast<const char*>(data) + 1, size - 1);
  switch (data[0] % 8) {
    case 0:
      check<TLPerson>(bytes);
      break;
    case 1:
      check<TLCard>(bytes);
      break;
    case 2:
      check<TLAttribute>(bytes);
      break;
    case 3:
      check<TLIndexableItem>(bytes);
      checkWritten(bytes);
      break;
    case 4:
      check<TLQueryNode>(bytes);
      break;
    case 5:
      check<TLQuery>(bytes);
      break;
    default:
      check<TLParameters>(bytes);
      break;
  }
  return 0;
}
