#include "salt/ZoneTexts.h"

#include "salt/Coding.h"
#include "salt/IndexImpl.h"

namespace salt {

namespace {

uint64_t idOf(uint32_t docID, uint16_t zoneID) {
  return uint64_t{docID} << 16 | zoneID;
}

}  // namespace

ZoneTexts::ZoneTexts(const index& owner) : _iterator(owner.db->NewIterator(readOptions(false))) {}

std::string_view ZoneTexts::find(uint32_t docID, uint16_t zoneID) {
  const uint64_t id = idOf(docID, zoneID);
  if (const auto found = _younger.find(id); found != _younger.end()) return found->second;
  if (const auto found = _older.find(id); found != _older.end()) {
    return keep(id, std::move(found->second));
  }
  return read(docID, zoneID);
}

std::string_view ZoneTexts::keep(uint64_t id, std::string text) {
  const size_t bytes = text.size() + kTextOverhead;
  if (_youngerBytes + bytes > kKeptBytes / 2) {
    _full = !_older.empty();
    _older = std::move(_younger);
    _younger.clear();
    _youngerBytes = 0;
  }
  _youngerBytes += bytes;
  return _younger.insert_or_assign(id, std::move(text)).first->second;
}

std::string_view ZoneTexts::read(uint32_t docID, uint16_t zoneID) {
  const TextKey key = index::textKey(docID, zoneID);
  _iterator->Seek(slice(key.view()));
  if (!_iterator->Valid() || view(_iterator->key()) != key.view()) return "";
  std::string wanted = _iterator->value().ToString();
  if (!_full) readOn();
  return keep(idOf(docID, zoneID), std::move(wanted));
}

void ZoneTexts::readOn() {
  size_t bytes = 0;
  for (_iterator->Next(); _iterator->Valid() && bytes < kReadAheadBytes; _iterator->Next()) {
    uint32_t docID = 0;
    uint16_t zoneID = 0;
    if (!parseTextKey(view(_iterator->key()), &docID, &zoneID)) return;
    const uint64_t id = idOf(docID, zoneID);
    bytes += _iterator->value().size();
    if (!_younger.contains(id) && !_older.contains(id)) keep(id, _iterator->value().ToString());
  }
}

}  // namespace salt
