#include "salt/Postings.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>

#include <bit>
#include <cerrno>
#include <cstring>
#include <optional>
#include <type_traits>
#include <unordered_map>

#include "platform/Files.h"
#include "platform/Paths.h"
#include "salt/BitCoding.h"
#include "salt/Coding.h"
#include "salt/Database.h"

namespace salt {

namespace {

struct Header {
  char magic[8] = {'T', 'A', 'L', 'P', 'O', 'S', 'T', '3'};
  int64_t indexCreated = 0;
  uint64_t fileBytes = 0;
  uint32_t tableBytes = 0;
  uint32_t entries = 0;
  uint32_t shard = 0;
  uint32_t reserved = 0;
  uint64_t sum = 0;  // of the header with 0 in this field, and the table
};
static_assert(sizeof(Header) == 48);
static_assert(sizeof(DocPage) == DocPage::kDocs / 8 && std::is_trivially_copyable_v<DocPage>);

constexpr size_t kSumBytes = 4;  // before each list
constexpr uint32_t kMaxTableBytes = uint32_t{1} << 28;
constexpr uint64_t kMinSuffixes = 2;  // of an entry
constexpr uint64_t kMinBudget = 64 * 1024;
// A suffix takes about eleven bytes of the index, so this limits posting lists to a twentieth.
constexpr uint64_t kSuffixesPerByte = 2;
// An heir has all of a node's suffixes but one in so many.
constexpr uint64_t kSuffixesOverHeirs = 4;

// Detects accidental damage, not forgery.
uint64_t sumOf(std::string_view bytes, uint64_t seed = 0) {
  constexpr uint64_t kFactor = UINT64_C(0x9E3779B97F4A7C15);
  uint64_t sum = seed ^ (bytes.size() * kFactor);
  const auto mix = [&sum](uint64_t word) {
    sum = (sum ^ word) * kFactor;
    sum ^= sum >> 32;
  };
  size_t at = 0;
  for (uint64_t word = 0; at + sizeof word <= bytes.size(); at += sizeof word) {
    std::memcpy(&word, bytes.data() + at, sizeof word);
    mix(word);
  }
  for (; at < bytes.size(); ++at) mix(static_cast<uint8_t>(bytes[at]));
  return sum;
}

// Reads untrusted bytes: invalid input clears `good` and yields 0.
class Input {
 public:
  explicit Input(std::string_view bytes) : _bytes(bytes) {}

  uint32_t varint() {
    uint32_t value = 0;
    for (int shift = 0; shift < 32 && !_bytes.empty(); shift += 7) {
      const auto byte = static_cast<uint8_t>(_bytes.front());
      _bytes.remove_prefix(1);
      value |= static_cast<uint32_t>(byte & 0x7F) << shift;
      if (byte < 0x80) return value;
    }
    good = false;
    return 0;
  }

  std::string_view bytes(size_t count) {
    if (count > _bytes.size()) {
      good = false;
      return "";
    }
    const std::string_view taken = _bytes.substr(0, count);
    _bytes.remove_prefix(count);
    return taken;
  }

  [[nodiscard]] bool empty() const { return _bytes.empty(); }
  [[nodiscard]] std::string_view rest() const { return _bytes; }

  bool good = true;

 private:
  std::string_view _bytes;
};

// Whether the codes of the documents of a page would take nearly as much as its bits do, which are
// read much faster.
bool isDense(const DocPage& docs) {
  constexpr unsigned kMinBits = DocPage::kDocs * 3 / 4;
  unsigned bits = 0;
  uint32_t end = 0;  // of the run before
  forEachRun(docs, [&](uint32_t first, uint32_t count) {
    bits += gammaBits(first - end + 1) + gammaBits(count);
    end = first + count;
  });
  return bits >= kMinBits;
}

// Removes the dense pages and appends their bits; returns their numbers.
std::vector<uint32_t> takeDensePages(DocSet* docs, std::string* bits) {
  std::vector<uint32_t> taken;
  for (size_t page = 0; page < docs->pages(); ++page) {
    const DocPage* const those = docs->page(page);
    if (those == nullptr || !isDense(*those)) continue;
    bits->append(reinterpret_cast<const char*>(those), sizeof *those);
    docs->erasePage(page);
    taken.push_back(static_cast<uint32_t>(page));
  }
  return taken;
}

bool syncDirectory(const std::string& directory) {
  const platform::FileDescriptor file(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  return file.get() >= 0 && fsync(file.get()) == 0;
}

}  // namespace

std::string postingsPath(const std::string& directory, uint8_t shard) {
  return platform::joinPath(directory, fmt::format("postings-{:03}", shard));
}

bool removePostings(const std::string& directory, uint8_t shard) {
  const std::string path = postingsPath(directory, shard);
  if (unlink(path.c_str()) != 0) {
    if (errno == ENOENT) return true;
  } else if (syncDirectory(directory)) {
    return true;
  }
  Log.error("Error removing {}: {}", path, std::strerror(errno));
  return false;
}

// --- Reading

std::shared_ptr<const Postings> Postings::open(const std::string& directory,
                                               const PostingsOwner& owner) {
  const std::string path = postingsPath(directory, owner.shard);
  platform::FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (file.get() < 0) {
    if (errno != ENOENT) Log.error("Error opening {}: {}", path, std::strerror(errno));
    return nullptr;
  }
  std::shared_ptr<Postings> postings(new Postings(std::move(file)));
  if (postings->readTable(owner)) return postings;
  Log.error("Postings in {} are not used: damaged, or of another index or version", path);
  (void)removePostings(directory, owner.shard);
  return nullptr;
}

bool Postings::readTable(const PostingsOwner& owner) {
  Header header;
  struct stat info {};
  if (!platform::readAt(_file.get(), 0, reinterpret_cast<char*>(&header), sizeof header) ||
      fstat(_file.get(), &info) != 0) {
    return false;
  }
  const uint64_t sum = std::exchange(header.sum, 0);
  if (std::memcmp(header.magic, Header().magic, sizeof header.magic) != 0 ||
      header.indexCreated != owner.indexCreated || header.shard != owner.shard ||
      header.fileBytes != static_cast<uint64_t>(info.st_size) ||
      header.tableBytes > std::min<uint64_t>(kMaxTableBytes, header.fileBytes)) {
    return false;
  }
  std::string table(header.tableBytes, '\0');
  if (!platform::readAt(_file.get(), sizeof header, table.data(), table.size())) return false;
  const std::string_view head(reinterpret_cast<const char*>(&header), sizeof header);
  if (sumOf(table, sumOf(head)) != sum) return false;

  Input input(table);
  const uint32_t zones = input.varint();
  for (uint32_t i = 0; i < zones && input.good; ++i) {
    _zones.push_back(static_cast<uint16_t>(input.varint()));
  }
  uint64_t offset = sizeof header + table.size();
  std::string text;
  for (uint32_t i = 0; i < header.entries && input.good; ++i) {
    const uint32_t shared = input.varint();
    text.resize(std::min<size_t>(text.size(), shared));
    text += input.bytes(input.varint());
    const uint32_t above = input.varint();
    const uint32_t heir = input.varint();
    const uint32_t bytes = input.varint();
    if (text.size() > UINT8_MAX || above >= text.size() || heir >= header.entries - i ||
        bytes < kSumBytes) {
      return false;
    }
    _entries.push_back({static_cast<uint32_t>(_texts.size()), static_cast<uint8_t>(text.size()),
                        static_cast<uint8_t>(above), heir, static_cast<uint32_t>(offset), bytes});
    _texts += text;
    offset += bytes;
  }
  _texts.shrink_to_fit();
  return input.good && input.empty() && offset == header.fileBytes && offset <= UINT32_MAX;
}

const Postings::Entry* Postings::find(std::string_view prefix) const {
  const auto entry = std::lower_bound(
      _entries.begin(), _entries.end(), prefix,
      [this](const Entry& left, std::string_view right) { return textOf(left) < right; });
  const bool found =
      entry != _entries.end() && textOf(*entry).starts_with(prefix) && prefix.size() > entry->above;
  return found ? &*entry : nullptr;
}

bool Postings::add(std::string_view prefix, PostingSet* places) const {
  const Entry* entry = find(prefix);
  if (entry == nullptr) return false;
  uint32_t suffixes = 0;
  bool good = addEntry(*entry, &suffixes, places);
  while (good && entry->heir != 0) {
    entry += entry->heir;
    uint32_t among = 0;  // `suffixes` counts them
    good = addEntry(*entry, &among, places);
  }
  if (good) {
    places->addSuffixes(suffixes);
  } else {
    Log.error("Postings cannot be read");
  }
  return good;
}

bool Postings::addEntry(const Entry& entry, uint32_t* suffixes, PostingSet* places) const {
  std::string bytes(entry.bytes, '\0');
  if (!platform::readAt(_file.get(), entry.offset, bytes.data(), bytes.size())) return false;
  uint32_t sum = 0;
  std::memcpy(&sum, bytes.data(), sizeof sum);
  const std::string_view list = std::string_view(bytes).substr(kSumBytes);
  return sum == static_cast<uint32_t>(sumOf(list)) && addList(list, suffixes, places);
}

// A list has the number of suffixes and that of zones; for each zone its number in the file and how
// many runs of documents and dense pages it has; then gamma codes, for each zone those of its runs
// and then those of its dense pages; then the bits of all dense pages.
bool Postings::addList(std::string_view list, uint32_t* suffixes, PostingSet* places) const {
  struct Zone {
    uint32_t number = 0;
    uint32_t runs = 0;
    uint32_t pages = 0;
  };
  Input input(list);
  *suffixes = input.varint();
  std::vector<Zone> zones(std::min<size_t>(input.varint(), _zones.size()));
  uint64_t pages = 0;
  for (auto& zone : zones) {
    zone = {input.varint(), input.varint(), input.varint()};
    if (zone.number >= _zones.size()) return false;
    pages += zone.pages;
  }
  const size_t rest = input.rest().size();
  if (!input.good || pages > rest / sizeof(DocPage)) return false;
  BitReader codes(input.bytes(rest - pages * sizeof(DocPage)));
  for (const Zone& zone : zones) {
    DocSet& docs = places->docsOf(_zones[zone.number]);
    uint64_t end = 0;  // of the run before
    for (uint32_t i = 0; i < zone.runs; ++i) {
      const uint64_t first = end + codes.gamma();
      const uint32_t count = codes.gamma();
      end = first + count;
      if (!codes.good || end > UINT32_MAX) return false;
      docs.insert(static_cast<uint32_t>(first), count);
    }
    uint64_t next = 0;  // after the page before
    for (uint32_t i = 0; i < zone.pages; ++i) {
      next += codes.gamma();
      if (!codes.good || next > UINT32_MAX / DocPage::kDocs) return false;
      DocPage bits;
      std::memcpy(&bits, input.bytes(sizeof bits).data(), sizeof bits);
      docs.insert(static_cast<size_t>(next - 1), bits);
    }
  }
  return true;
}

// --- Building

PostingsBuilder::PostingsBuilder(std::string directory, uint64_t fullShard)
    : _directory(std::move(directory)),
      _minSuffixes(std::max<uint64_t>(kMinSuffixes, fullShard / 4000)),
      _maxPending(std::clamp<uint64_t>(fullShard / 4, 64, uint64_t{1} << 18)),
      _lists(platform::openUnnamedFile(_directory)) {
  if (_lists.get() < 0) fail();
}

void PostingsBuilder::fail() {
  Log.error("Error writing postings: {}", std::strerror(errno));
  _unfit = true;
}

void PostingsBuilder::count(size_t end, Node* node) {
  if (node->places == nullptr) node->places = std::make_unique<PostingSet>();
  for (; node->begin < end; ++node->begin) node->places->add(_pending[node->begin]);
}

void PostingsBuilder::fold() {
  size_t end = _pending.size() - 1;  // a node may begin with the last suffix
  for (Node& node : _open) {
    if (suffixesOf(node) >= _minSuffixes) continue;
    end = std::min(end, node.begin);
    break;
  }
  for (Node& node : _open) {
    if (node.begin < end) count(end, &node);
    node.begin -= end;
  }
  _pending.erase(_pending.begin(), _pending.begin() + static_cast<ptrdiff_t>(end));
}

void PostingsBuilder::make(Node* node, std::string text, size_t above, Node* parent) {
  const size_t begin = node->begin;
  count(_pending.size(), node);
  const uint64_t suffixes = node->places->suffixes();
  const bool inheriting = inherits(*node);
  const std::string list = listOf(*node->places, inheriting ? node->heir.places.get() : nullptr);
  if (inheriting) raise(node->heir.offset, suffixes);
  _madeBytes += list.size() + text.size();
  _made.push_back({std::move(text), static_cast<uint8_t>(above), static_cast<uint32_t>(list.size()),
                   _listsEnd, inheriting ? node->heir.offset : kNone, suffixes});
  if (parent == nullptr) {
    node->heir = {_listsEnd, std::make_unique<PostingSet>(*node->places)};
  } else {
    count(begin, parent);
    parent->places->insert(*node->places);
    parent->places->addSuffixes(node->begin - begin);
    parent->begin = node->begin;
    const PostingSet* const heir = parent->heir.places.get();
    if (heir == nullptr || heir->suffixes() < suffixes) {
      parent->heir = {_listsEnd, std::move(node->places)};
    }
  }
  keep(list);
  if (_madeBytes > 2 * budget()) prune(budget());
}

bool PostingsBuilder::inherits(const Node& node) const {
  const PostingSet* const heir = node.heir.places.get();
  return heir != nullptr && heir->suffixes() >= _minSuffixes &&
         heir->suffixes() >=
             node.places->suffixes() / kSuffixesOverHeirs * (kSuffixesOverHeirs - 1);
}

void PostingsBuilder::raise(uint64_t offset, uint64_t suffixes) {
  for (auto made = _made.rbegin(); made != _made.rend() && offset != kNone; ++made) {
    if (made->offset != offset) continue;
    made->suffixes = suffixes;
    offset = made->heir;
  }
}

std::string PostingsBuilder::listOf(const PostingSet& places, const PostingSet* heir) {
  if (places.suffixes() > UINT32_MAX) _unfit = true;
  std::string list(kSumBytes, '\0');
  appendVarint(&list, static_cast<uint32_t>(places.suffixes()));
  appendVarint(&list, static_cast<uint32_t>(places.zones().size()));
  std::string codes;
  std::string dense;
  BitWriter bits(&codes);
  const auto put = [&](uint32_t number) {
    if (number > kMaxGamma) _unfit = true;
    if (!_unfit) bits.putGamma(number);
  };
  for (const PostingSet::Zone& zone : places.zones()) {
    DocSet docs = zone.docs;
    const DocSet* const among = heir != nullptr ? heir->docsOf(zone.ZoneID) : nullptr;
    if (among != nullptr) docs.erase(*among);
    const std::vector<uint32_t> pages = takeDensePages(&docs, &dense);
    uint32_t runs = 0;
    uint32_t end = 0;  // of the run before
    forEachRun(docs, [&](uint32_t first, uint32_t count) {
      put(first - end);
      put(count);
      end = first + count;
      ++runs;
    });
    uint32_t next = 0;  // after the page before
    for (const uint32_t page : pages) {
      put(page + 1 - next);
      next = page + 1;
    }
    appendVarint(&list, numberOf(zone.ZoneID));
    appendVarint(&list, runs);
    appendVarint(&list, static_cast<uint32_t>(pages.size()));
  }
  bits.finish();
  list += codes;
  list += dense;
  const auto sum = static_cast<uint32_t>(sumOf(std::string_view(list).substr(kSumBytes)));
  std::memcpy(list.data(), &sum, sizeof sum);
  return list;
}

uint32_t PostingsBuilder::numberOf(uint16_t zoneID) {
  const auto known = std::find(_zones.begin(), _zones.end(), zoneID);
  const auto number = static_cast<uint32_t>(known - _zones.begin());
  if (known == _zones.end()) _zones.push_back(zoneID);
  return number;
}

void PostingsBuilder::keep(std::string_view list) {
  if (_unfit) return;
  if (!platform::writeAt(_lists.get(), _listsEnd, list)) return fail();
  _listsEnd += list.size();
}

uint64_t PostingsBuilder::budget() const {
  return std::max(kMinBudget, _taken / kSuffixesPerByte);
}

void PostingsBuilder::prune(uint64_t maxBytes) {
  while (_madeBytes > maxBytes) {
    _minSuffixes += std::max<uint64_t>(_minSuffixes / 8, 1);
    std::erase_if(_made, [this](const Made& made) {
      if (made.suffixes >= _minSuffixes) return false;
      _madeBytes -= made.bytes + made.text.size();
      return true;
    });
  }
}

bool PostingsBuilder::write(const PostingsOwner& owner) {
  std::sort(_made.begin(), _made.end(),
            [](const Made& left, const Made& right) { return left.text < right.text; });
  const auto writeAll = [this, &owner](int file) {
    const std::string start = head(owner);
    uint64_t end = start.size();
    if (!platform::writeAt(file, 0, start)) return false;
    std::string list;
    for (const Made& made : _made) {
      list.resize(made.bytes);
      if (!platform::readAt(_lists.get(), made.offset, list.data(), list.size()) ||
          !platform::writeAt(file, end, list)) {
        return false;
      }
      end += list.size();
    }
    return true;
  };
  std::optional<TLError> error;
  if (platform::writeFileAtomically(postingsPath(_directory, owner.shard), writeAll, &error)) {
    return true;
  }
  Log.error("Error writing postings: {}", error->message);
  return false;
}

std::string PostingsBuilder::head(const PostingsOwner& owner) const {
  std::string table;
  appendVarint(&table, static_cast<uint32_t>(_zones.size()));
  for (const uint16_t zone : _zones) appendVarint(&table, zone);
  std::unordered_map<uint64_t, size_t> places;  // of entries, by offset
  for (size_t i = 0; i < _made.size(); ++i) places[_made[i].offset] = i;
  std::string_view before;
  uint64_t lists = 0;
  for (size_t i = 0; i < _made.size(); ++i) {
    const Made& made = _made[i];
    const auto shared = static_cast<size_t>(
        std::mismatch(before.begin(), before.end(), made.text.begin(), made.text.end()).first -
        before.begin());
    appendVarint(&table, static_cast<uint32_t>(shared));
    appendVarint(&table, static_cast<uint32_t>(made.text.size() - shared));
    table.append(made.text, shared);
    appendVarint(&table, made.above);
    TL_ASSERT(made.heir == kNone || places.contains(made.heir));
    appendVarint(&table, made.heir == kNone ? 0 : static_cast<uint32_t>(places[made.heir] - i));
    appendVarint(&table, made.bytes);
    lists += made.bytes;
    before = made.text;
  }
  Header header;
  header.indexCreated = owner.indexCreated;
  header.shard = owner.shard;
  header.tableBytes = static_cast<uint32_t>(table.size());
  header.entries = static_cast<uint32_t>(_made.size());
  header.fileBytes = sizeof header + table.size() + lists;
  const std::string_view head(reinterpret_cast<const char*>(&header), sizeof header);
  header.sum = sumOf(table, sumOf(head));
  return std::string(head) + table;
}

}  // namespace salt
