#include "salt/ZoneTextCache.h"

#include <algorithm>

#include "platform/Files.h"
#include "salt/Coding.h"
#include "salt/IndexImpl.h"

namespace salt {

namespace {

uint64_t idOf(uint32_t docID, uint16_t zoneID) {
  return uint64_t{docID} << 16 | zoneID;
}

}  // namespace

ZoneTextCache::ZoneTextCache(const index& owner, uint64_t maxFileBytes)
    : _idx(owner),
      _iterator(owner.db->NewIterator(readOptions(false))),
      _file(platform::openUnnamedFile(owner.path())) {
  if (_file.get() >= 0) {
    _maxFileBytes = std::min(maxFileBytes, platform::freeBytes(owner.path()) / 4);
  }
}

std::string_view ZoneTextCache::find(const SuffixMeta& meta) {
  const auto kept = _kept.find(idOf(meta.DocID, meta.ZoneID));
  if (kept == _kept.end() || !readKept(kept->second, meta)) readStored(meta);
  return _suffix;
}

bool ZoneTextCache::readKept(const Stretch& stretch, const SuffixMeta& meta) {
  const uint32_t offset = std::min(meta.Offset, stretch.bytes);
  _suffix.resize(std::min<size_t>(stretch.bytes - offset, _idx.op.MaxMatchLen));
  if (!platform::readAt(_file.get(), stretch.begin + offset, _suffix.data(), _suffix.size())) {
    forget();
    return false;
  }
  _suffix.resize(suffixLength(_suffix, _idx.op));
  return true;
}

void ZoneTextCache::readStored(const SuffixMeta& meta) {
  _suffix.clear();
  const TextKey key = index::textKey(meta.DocID, meta.ZoneID);
  _iterator->Seek(slice(key.view()));
  if (!_iterator->Valid() || view(_iterator->key()) != key.view()) return;
  _suffix = _idx.suffixText(meta, view(_iterator->value()));
  if (_file.get() < 0) return;
  addRead(idOf(meta.DocID, meta.ZoneID));
  for (_iterator->Next(); _iterator->Valid() && _read.size() < kReadAheadBytes; _iterator->Next()) {
    uint32_t docID = 0;
    uint16_t zoneID = 0;
    if (!parseTextKey(view(_iterator->key()), &docID, &zoneID)) break;
    const uint64_t id = idOf(docID, zoneID);
    if (_kept.contains(id)) break;
    addRead(id);
  }
  keepRead();
}

void ZoneTextCache::addRead(uint64_t id) {
  const leveldb::Slice text = _iterator->value();
  _kept[id] = {_fileBytes + _read.size(), static_cast<uint32_t>(text.size())};
  _read.append(text.data(), text.size());
}

void ZoneTextCache::keepRead() {
  if (!platform::writeAt(_file.get(), _fileBytes, _read)) {
    forget();
  } else {
    _fileBytes += _read.size();
  }
  _read.clear();
  if (_fileBytes > _maxFileBytes) {
    _kept.clear();
    _fileBytes = 0;
  }
}

// When the disk is full or fails, the texts in the file are not needed: the database has them.
void ZoneTextCache::forget() {
  _kept.clear();
  _file.reset();
}

}  // namespace salt
