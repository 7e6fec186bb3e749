#include "salt/ZoneTextCache.h"

#include <algorithm>

#include "platform/Files.h"
#include "salt/Coding.h"
#include "salt/IndexImpl.h"

namespace salt {

ZoneTextCache::ZoneTextCache(const index& owner, uint64_t maxFileBytes)
    : _idx(owner),
      _iterator(owner.db->NewIterator(readOptions(false))),
      _file(platform::openUnnamedFile(owner.path())) {
  if (_file.get() >= 0) {
    _maxFileBytes = std::min(maxFileBytes, platform::freeBytes(owner.path()) / 4);
  }
}

std::string_view ZoneTextCache::find(const SuffixMeta& meta) {
  const Kept* const kept = find(meta.DocID, meta.ZoneID);
  if (kept == nullptr || !readKept(*kept, meta)) readStored(meta);
  return _suffix;
}

const ZoneTextCache::Kept* ZoneTextCache::find(uint32_t docID, uint16_t zoneID) const {
  const uint32_t first = _firstOf.at(docID);
  if (first == 0) return nullptr;
  for (size_t at = first - 1;; ++at) {
    if (_kept[at].zoneID == zoneID) return &_kept[at];
    if (_kept[at].last) return nullptr;
  }
}

bool ZoneTextCache::readKept(const Kept& kept, const SuffixMeta& meta) {
  const uint32_t offset = std::min(meta.Offset, kept.bytes);
  _suffix.resize(std::min<size_t>(kept.bytes - offset, _idx.op.MaxMatchLen));
  if (!platform::readAt(_file.get(), kept.begin + offset, _suffix.data(), _suffix.size())) {
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
  if (_file.get() >= 0 && _firstOf.at(meta.DocID) == 0) readAhead(meta.DocID);
}

// Ends with a whole document.
void ZoneTextCache::readAhead(uint32_t docID) {
  uint64_t read = 0;
  uint32_t inHand = 0;  // the document of the zones that were read last
  for (_iterator->Seek(slice(index::textKey(docID, 0).view())); _iterator->Valid();
       _iterator->Next()) {
    uint16_t zoneID = 0;
    if (!parseTextKey(view(_iterator->key()), &docID, &zoneID)) break;
    if (docID != inHand) {
      if (read >= kReadAheadBytes || _firstOf.at(docID) != 0) break;
      if (inHand != 0) _kept.back().last = true;
      inHand = docID;
      _firstOf[docID] = static_cast<uint32_t>(_kept.size() + 1);
    }
    const std::string_view text = view(_iterator->value());
    _kept.push_back({static_cast<uint32_t>(_fileBytes + _read.size()),
                     static_cast<uint32_t>(text.size()), zoneID, false});
    _read += text;
    read += text.size();
    if (_read.size() >= kReadAheadBytes && !keepRead()) return;
  }
  if (inHand != 0) _kept.back().last = true;
  if (!keepRead() || _fileBytes <= _maxFileBytes) return;
  _firstOf = {};
  _kept.clear();
  _fileBytes = 0;
}

bool ZoneTextCache::keepRead() {
  const bool written = platform::writeAt(_file.get(), _fileBytes, _read);
  _fileBytes += _read.size();
  _read.clear();
  if (!written) forget();
  return written;
}

// When the disk is full or fails, the texts in the file are not needed: the database has them.
void ZoneTextCache::forget() {
  _firstOf = {};
  _kept.clear();
  _file.reset();
}

}  // namespace salt
