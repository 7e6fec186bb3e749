#include "tests/salt/Model.h"

#include <fmt/format.h>
#include <leveldb/db.h>
#include <leveldb/iterator.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <sstream>
#include <tuple>
#include <unordered_map>

#include "platform/Assert.h"

namespace salttest {

namespace {

using namespace std::string_literals;

std::string naiveTail(const Place& place) {
  return naiveVarint(place.zoneID) + naiveVarint(place.offset) + naiveVarint(place.docID);
}

std::string printed(const Place& place) {
  return fmt::format("{},{}:{}", place.docID, place.zoneID, place.offset);
}

uint32_t takeVarint(std::string_view* bytes) {
  uint32_t value = 0;
  for (unsigned shift = 0; !bytes->empty(); shift += 7) {
    const auto byte = static_cast<uint8_t>(bytes->front());
    bytes->remove_prefix(1);
    value += uint32_t{byte & 127u} << shift;
    if (byte < 128) break;
  }
  return value;
}

// A page of consecutive places, encoded as the format says.
std::string naivePage(const std::vector<const Place*>& places) {
  std::string docIDs, zoneIDs, offsets, lengths, extras;
  for (size_t i = 0; i < places.size(); ++i) {
    const Place& place = *places[i];
    size_t lcp = 0;
    if (i > 0) {
      const std::string& before = places[i - 1]->text;
      while (lcp < before.size() && lcp < place.text.size() && before[lcp] == place.text[lcp])
        ++lcp;
      extras += (place.text.substr(lcp) + "\0\0"s).substr(0, 2);
      lengths += naiveVarint(static_cast<uint32_t>(lcp));
    }
    docIDs += naiveVarint(place.docID);
    zoneIDs += naiveVarint(place.zoneID);
    offsets += naiveVarint(place.offset);
  }
  // For the first suffix these values have no meaning.
  return naiveVarint(static_cast<uint32_t>(places.size())) + docIDs + zoneIDs + offsets + lengths +
         extras;
}

// Iterates over all keys and compares them with the model.
class Comparison {
 public:
  explicit Comparison(Model* model) : _model(*model) {
    for (Place& place : model->places) {
      _unseen[{place.docID, place.zoneID, place.offset}] = &place;
    }
  }

  std::string run(const Keys& keys) {
    for (const auto& [key, value] : keys) {
      const auto shard = static_cast<uint8_t>(key[0]);
      if (shard == 0) {
        hotKey(key, value);
      } else if (shard < 255) {
        page(shard, key, value);
      }
      if (!_fault.empty()) return _fault;
    }
    if (!_unseen.empty()) return "missing suffix " + printed(*_unseen.begin()->second);
    texts(keys);
    if (storedDeletions(keys) != _model.deleted) fail("deleted documents differ");
    metrics(storedMetrics(keys));
    return _fault;
  }

 private:
  using ID = std::tuple<uint32_t, uint16_t, uint32_t>;

  void fail(const std::string& fault) {
    if (_fault.empty()) _fault = fault;
  }

  void expect(const char* what, uint64_t found, uint64_t expected) {
    if (found != expected) fail(fmt::format("{}: {} instead of {}", what, found, expected));
  }

  // Consumes the place with these numbers, which must be the next one of its shard.
  const Place* take(uint8_t shard, const ID& id) {
    const auto found = _unseen.find(id);
    if (found == _unseen.end()) {
      fail(fmt::format("suffix {},{}:{} of shard {} is unknown or there twice", std::get<0>(id),
                       std::get<1>(id), std::get<2>(id), shard));
      return nullptr;
    }
    Place& place = *found->second;
    _unseen.erase(found);
    place.shard = shard;
    if (_previous != nullptr && !(*_previous < place)) fail("out of order: " + printed(place));
    _previous = &place;
    ++_suffixes[shard];
    return &place;
  }

  void expectKey(const std::string& key, const Place& first) {
    if (key.substr(1) != first.text + '\0' + naiveTail(first)) fail("wrong key: " + printed(first));
  }

  void hotKey(const std::string& key, const std::string& value) {
    std::string_view tail = key;
    tail.remove_prefix(std::min(key.find('\0', 1), key.size() - 1) + 1);
    const auto zoneID = static_cast<uint16_t>(takeVarint(&tail));
    const uint32_t offset = takeVarint(&tail);
    if (const Place* place = take(0, {takeVarint(&tail), zoneID, offset})) expectKey(key, *place);
    expect("bytes of a hot value", value.size(), 0);
  }

  void page(uint8_t shard, const std::string& key, const std::string& value) {
    ++_pages;
    std::string_view rest = value;
    const uint32_t count = takeVarint(&rest);
    if (count == 0 || count > _model.op.MaxPageSuffixes || count > rest.size()) {
      return fail(fmt::format("page of {} suffixes", count));
    }
    std::vector<uint32_t> numbers(3 * count);
    for (uint32_t& number : numbers) number = takeVarint(&rest);
    std::vector<const Place*> places;
    for (size_t i = 0; i < count; ++i) {
      const auto zoneID = static_cast<uint16_t>(numbers[count + i]);
      const Place* place = take(shard, {numbers[i], zoneID, numbers[2 * count + i]});
      if (place == nullptr) return;
      places.push_back(place);
    }
    expectKey(key, *places.front());
    const size_t columns = value.size() - rest.size();
    takeVarint(&rest);
    std::string known = value.substr(0, columns) + std::string(rest);
    known.erase(std::min(known.size(), known.size() - 2 * count), 2);
    if (known != naivePage(places)) fail("wrong page that begins with " + printed(*places.front()));
  }

  void texts(const Keys& keys) {
    size_t found = 0;
    for (auto at = keys.lower_bound("\xFF"); at != keys.end(); ++at) {
      if (at->first.find(',') != std::string::npos) ++found;
    }
    expect("number of texts", found, _model.texts.size());
    for (const auto& [id, text] : _model.texts) {
      const auto at = keys.find(fmt::format("\xFF{},{}", id.first, id.second));
      if (at == keys.end() || at->second != text) {
        fail(fmt::format("wrong text of {},{}", id.first, id.second));
      }
    }
  }

  void metrics(const salt::Index::Metrics& m) {
    expect("Suffixes", m.Suffixes, _model.places.size());
    expect("HotSuffixes", m.HotSuffixes, _suffixes[0]);
    expect("Pages", m.Pages, _pages);
    if (_suffixes.rbegin()->first > m.Shards) fail("page of a shard that is not opened");
    // Counts all suffixes added to the newest shard, both while it fills up and later.
    expect("LastShardSuffixes", m.LastShardSuffixes,
           m.Shards == 0 ? 0 : _suffixes[static_cast<uint8_t>(m.Shards)]);
    expect("IndexingCalls", m.IndexingCalls, _model.indexingCalls);
    expect("MaxDocID", m.MaxDocID, _model.maxDocID);
    expect("LastDocID", m.LastDocID, _model.lastDocID);
  }

  Model& _model;
  std::map<ID, Place*> _unseen;
  std::map<uint8_t, uint64_t> _suffixes;  // by shard
  uint64_t _pages = 0;
  const Place* _previous = nullptr;
  std::string _fault;
};

}  // namespace

bool Place::operator<(const Place& other) const {
  if (shard != other.shard) return shard < other.shard;
  if (const int order = text.compare(other.text); order != 0) return order < 0;
  return naiveTail(*this) < naiveTail(other);
}

std::string naiveVarint(uint32_t value) {
  std::string bytes;
  do {
    bytes += static_cast<char>((value & 127) + (value > 127 ? 128 : 0));
    value /= 128;
  } while (value > 0);
  return bytes;
}

std::string naiveCut(std::string_view text, const salt::Index::Options& op) {
  std::string cut;
  for (size_t i = 0; i < text.size() && i < op.MaxMatchLen; ++i) {
    if (text[i] == '\0') break;
    cut += text[i];
    if (text[i] == ' ' && i >= op.MinMatchLen) break;
  }
  return cut;
}

bool Model::addZone(uint32_t docID, uint16_t zoneID, const std::string& text,
                    const std::vector<uint32_t>& offsets, bool merge) {
  if (deleted.contains(docID) || text.size() > op.MaxZoneSize) return false;
  const auto stored = texts.find({docID, zoneID});
  std::string whole = text;
  if (stored != texts.end()) {
    if (!merge) return false;
    if (stored->second == text) return true;
    whole = stored->second + '\0' + text;
    if (whole.size() > op.MaxZoneSize) return false;
  }
  const auto base = static_cast<uint32_t>(whole.size() - text.size());
  for (const uint32_t offset : offsets) {
    places.push_back({0, docID, zoneID, base + offset, naiveCut(text.substr(offset), op)});
  }
  texts[{docID, zoneID}] = whole;
  ++indexingCalls;
  maxDocID = std::max(maxDocID, docID);
  lastDocID = docID;
  return true;
}

bool Model::deleteDoc(uint32_t docID) {
  deleted.insert(docID);
  return true;
}

std::vector<std::string> Model::scan(std::string_view prefix) const {
  const std::string cut = naiveCut(prefix, op);
  std::vector<Place> found;
  for (const Place& place : places) {
    if (place.text.starts_with(cut) && !deleted.contains(place.docID)) found.push_back(place);
  }
  std::sort(found.begin(), found.end());
  std::vector<std::string> lines;
  for (const Place& place : found) lines.push_back(printed(place));
  return lines;
}

std::string Model::difference(const salt::Index::Metrics& metrics) const {
  std::set<uint32_t> docs;
  std::unordered_map<uint16_t, uint64_t> zoneCounts;
  uint64_t zones = 0;
  uint64_t textBytes = 0;
  for (const auto& [id, text] : texts) {
    if (deleted.contains(id.first)) continue;
    docs.insert(id.first);
    ++zoneCounts[id.second];
    ++zones;
    textBytes += text.size();
  }
  if (metrics.Docs != docs.size()) return "Docs";
  if (metrics.Zones != zones) return "Zones";
  if (metrics.ZoneCounts != zoneCounts) return "ZoneCounts";
  if (metrics.TextBytes != textBytes) return "TextBytes";
  if (metrics.DeletedDocs != deleted.size()) return "DeletedDocs";
  return metrics.Suffixes == places.size() ? "" : "Suffixes";
}

bool carryOut(salt::Index& index, Operation made) {
  if (made.zoneID == 0) return index.DeleteDoc(made.docID);
  return index.AddZone(made.docID, made.zoneID, made.text, made.offsets, made.merge);
}

bool carryOut(Model& model, const Operation& made) {
  if (made.zoneID == 0) return model.deleteDoc(made.docID);
  return model.addZone(made.docID, made.zoneID, made.text, made.offsets, made.merge);
}

std::string randomText(std::mt19937& random, size_t size) {
  std::string text;
  while (text.size() < size) {
    const auto dice = random() % 100;
    if (dice < 2) {
      text += '\0';
    } else if (dice < 4) {
      text += static_cast<char>(0x80 + random() % 0x80);
    } else if (dice < 20) {
      text += ' ';
    } else if (dice < 25 && text.size() > 2) {
      text += text.substr(random() % text.size());  // long repeats
    } else {
      text += static_cast<char>('a' + random() % 3);
    }
  }
  text.resize(size);
  return text;
}

std::vector<uint32_t> randomOffsets(std::mt19937& random, std::string_view text) {
  std::vector<uint32_t> offsets;
  for (uint32_t i = 0; i < text.size(); ++i) {
    if (text[i] != '\0' && random() % 3 == 0) offsets.push_back(i);
  }
  return offsets;
}

Keys readKeys(const std::string& path) {
  Keys keys;
  leveldb::DB* opened = nullptr;
  if (!leveldb::DB::Open({}, path, &opened).ok()) return keys;
  const std::unique_ptr<leveldb::DB> db(opened);
  const std::unique_ptr<leveldb::Iterator> iterator(db->NewIterator({}));
  for (iterator->SeekToFirst(); iterator->Valid(); iterator->Next()) {
    keys.emplace(iterator->key().ToString(), iterator->value().ToString());
  }
  TL_ASSERT(iterator->status().ok());
  return keys;
}

salt::Index::Metrics storedMetrics(const Keys& keys) {
  std::istringstream stream(keys.at("\xFFMETRICS"));
  salt::Index::Metrics metrics;
  TL_ASSERT(metrics.ParseFromIstream(stream));
  return metrics;
}

std::set<uint32_t> storedDeletions(const Keys& keys) {
  std::set<uint32_t> deleted;
  const auto record = keys.find(
      "\xFF"
      "DELETED");
  for (size_t at = 0; record != keys.end() && at + 4 <= record->second.size(); at += 4) {
    uint32_t docID = 0;
    std::memcpy(&docID, record->second.data() + at, 4);
    deleted.insert(docID);
  }
  return deleted;
}

std::string difference(const Keys& keys, Model* model) {
  return Comparison(model).run(keys);
}

}  // namespace salttest
