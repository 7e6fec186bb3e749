#include <algorithm>
#include <bit>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Assert.h"
#include "salt/BitCoding.h"
#include "salt/Coding.h"
#include "salt/IndexImpl.h"
#include "salt/Suffix.h"

// Any text and any numbers. Checks gamma codes in two ways, suffixLength against a loop that
// applies the rule byte by byte, the round trip of keys and pages, and a page's suffixes against
// the texts they were made from.
namespace {

std::string slowCut(std::string_view text, const salt::Index::OptionsBlock& op) {
  std::string cut;
  for (size_t i = 0; i < text.size() && i < op.MaxMatchLen && text[i] != '\0'; ++i) {
    cut += text[i];
    if (text[i] == ' ' && i >= op.MinMatchLen) break;
  }
  return cut;
}

struct Entry {
  std::string text;
  salt::SuffixMeta meta;
};

// Sorted suffixes of the text, with numbers taken from its bytes.
std::vector<Entry> entriesOf(std::string_view text, const salt::Index::OptionsBlock& op) {
  std::vector<Entry> entries;
  for (size_t i = 0; i < text.size() && entries.size() < op.MaxPageSuffixes; ++i) {
    const std::string cut = slowCut(text.substr(i), op);
    TL_ASSERT(cut == text.substr(i, salt::suffixLength(text.substr(i), op)));
    const auto byte = static_cast<uint8_t>(text[i]);
    entries.push_back({cut,
                       {1 + (uint32_t{byte} << byte % 24),
                        static_cast<uint32_t>(i << byte % 20),
                        static_cast<uint16_t>(byte << byte % 9),
                        0,
                        {0, 0}}});
  }
  std::sort(entries.begin(), entries.end(), [](const Entry& a, const Entry& b) {
    return a.text < b.text || (a.text == b.text && a.meta < b.meta);
  });
  for (size_t n = 1; n < entries.size(); ++n) {
    const std::string& before = entries[n - 1].text;
    Entry& entry = entries[n];
    size_t lcp = 0;
    while (lcp < before.size() && lcp < entry.text.size() && before[lcp] == entry.text[lcp]) ++lcp;
    entry.meta.lcp = static_cast<uint8_t>(lcp);
    for (size_t i = 0; i < 2 && lcp + i < entry.text.size(); ++i) {
      entry.meta.extra[i] = static_cast<uint8_t>(entry.text[lcp + i]);
    }
  }
  return entries;
}

bool samePlace(const salt::SuffixMeta& a, const salt::SuffixMeta& b) {
  return a.DocID == b.DocID && a.ZoneID == b.ZoneID && a.Offset == b.Offset;
}

std::vector<salt::SuffixMeta> throughPage(const std::vector<Entry>& entries,
                                          const salt::Index::OptionsBlock& op) {
  std::vector<salt::SuffixMeta> metas;
  for (const Entry& entry : entries) metas.push_back(entry.meta);
  std::string value;
  salt::pageToValue(metas.data(), metas.size(), &value);
  std::vector<salt::SuffixMeta> decoded;
  salt::valueToPage(value, op, &decoded);
  TL_ASSERT(decoded.size() == metas.size());
  for (size_t i = 0; i < metas.size(); ++i) {
    TL_ASSERT(samePlace(decoded[i], metas[i]));
    TL_ASSERT(std::string(decoded[i]) == std::string(metas[i]));
  }
  return decoded;
}

void walkPage(const salt::index& idx, const std::vector<Entry>& entries) {
  if (entries.empty()) return;
  const auto metas = throughPage(entries, idx.op);
  salt::Suffix suffix(idx, {});
  std::string key;
  for (const Entry& entry : entries) {
    salt::suffixKey(1, entry.text, entry.meta, &key);
    suffix.fromKey(key);
    TL_ASSERT(suffix.knownText() == entry.text && samePlace(suffix.meta, entry.meta));
  }
  salt::suffixKey(1, entries.front().text, entries.front().meta, &key);
  suffix.fromKey(key);
  for (size_t i = 1; i < entries.size(); ++i) {
    suffix.fromNextMeta(metas[i]);
    const std::string& text = entries[i].text;
    TL_ASSERT(text.compare(0, suffix.size, suffix.knownText()) == 0);
    TL_ASSERT(!suffix.full || suffix.size == text.size());
  }
}

// Codes are what they are when read bit by bit, as far as there are any.
void readCodes(std::string_view bytes) {
  const size_t end = bytes.size() * 8;
  const auto bitAt = [&](size_t at) {
    return static_cast<uint32_t>(static_cast<uint8_t>(bytes[at / 8]) >> (7 - at % 8) & 1);
  };
  salt::BitReader reader(bytes);
  for (size_t at = 0;;) {
    size_t zeros = 0;
    while (at + zeros < end && bitAt(at + zeros) == 0) ++zeros;
    const bool valid = at + 2 * zeros < end && zeros < std::bit_width(salt::kMaxGamma);
    uint32_t expected = 0;
    for (size_t i = 0; valid && i <= zeros; ++i) expected = expected << 1 | bitAt(at + zeros + i);
    TL_ASSERT(reader.gamma() == expected && reader.good == valid);
    if (!valid) return;
    at += 2 * zeros + 1;
  }
}

// An empty index whose options are used; its directory is kept for the whole run.
const salt::index& sharedIndex() {
  static const std::unique_ptr<salt::Index> shared = [] {
    std::string path = std::filesystem::temp_directory_path() / "salt-fuzz-XXXXXX";
    TL_ASSERT(mkdtemp(path.data()) != nullptr);
    salt::Index::Options options;
    options.Path = path;
    return std::unique_ptr<salt::Index>(salt::NewIndex(options));
  }();
  return static_cast<const salt::index&>(*shared);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  readCodes(text);
  walkPage(sharedIndex(), entriesOf(text, sharedIndex().op));
  if (size < 2) return 0;
  salt::Index::OptionsBlock op;
  op.MaxMatchLen = data[0];
  op.MinMatchLen = static_cast<uint8_t>(data[1] % (op.MaxMatchLen + 1));
  throughPage(entriesOf(text, op), op);
  return 0;
}
