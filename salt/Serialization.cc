#include <fmt/format.h>
#include <time.h>

#include <algorithm>
#include <bit>
#include <cstddef>
#include <cstring>
#include <istream>
#include <iterator>
#include <ostream>

#include "salt/Index.h"

// Options, metrics and suffix metadata as bytes and as text.
namespace salt {

using OptionsBlock = Index::OptionsBlock;
using MetricsBlock = Index::MetricsBlock;

// The blocks are written as they are in memory.
static_assert(std::endian::native == std::endian::little);
static_assert(sizeof(OptionsBlock) == 40 && offsetof(OptionsBlock, MaxZoneSize) == 4 &&
              offsetof(OptionsBlock, CompactAfterVacuum) == 24 &&
              offsetof(OptionsBlock, MaxBatchBytes) == 32);
static_assert(sizeof(MetricsBlock) == 200 && offsetof(MetricsBlock, VacuumInProgress) == 96 &&
              offsetof(MetricsBlock, Scans) == 128 && offsetof(MetricsBlock, CodeVersion) == 192);

namespace {

template <typename Block>
void writeBlock(std::ostream& stream, const Block& block) {
  stream.write(reinterpret_cast<const char*>(&block), sizeof block);
}

// Reads a block. The bytes at `flags` are booleans: any value but 0 is true.
template <typename Block, size_t count>
bool readBlock(std::istream& stream, const size_t (&flags)[count], Block* block) {
  char bytes[sizeof(Block)];
  stream.read(bytes, sizeof bytes);
  if (stream.fail()) return false;
  for (const size_t flag : flags) bytes[flag] = bytes[flag] != 0;
  static_assert(std::is_trivially_copyable_v<Block>);
  std::memcpy(static_cast<void*>(block), bytes, sizeof bytes);
  return true;
}

// Reads `size` bytes in pieces, so that a corrupt length takes no more memory than there is input.
bool readText(std::istream& stream, uint64_t size, std::string* text) {
  char piece[4096];
  while (size > 0) {
    const auto step = std::min<uint64_t>(size, sizeof piece);
    stream.read(piece, static_cast<std::streamsize>(step));
    if (stream.fail()) return false;
    text->append(piece, step);
    size -= step;
  }
  return true;
}

double per(double total, uint64_t count) {
  return total / static_cast<double>(count);
}

}  // namespace

bool Index::Options::Valid() const {
  return MinMatchLen <= MaxMatchLen && MaxZoneSize != UINT32_MAX && MaxShards != 0;
}

bool Index::Options::SerializeToOstream(std::ostream& stream) const {
  writeBlock<OptionsBlock>(stream, *this);
  const uint64_t size = Path.size();
  writeBlock(stream, size);
  stream.write(Path.data(), static_cast<std::streamsize>(size));
  return !stream.fail();
}

bool Index::Options::ParseFromIstream(std::istream& stream) {
  OptionsBlock block;
  constexpr size_t flags[] = {offsetof(OptionsBlock, ValidateOnLoad),
                              offsetof(OptionsBlock, CompactAfterVacuum)};
  uint64_t size = 0;
  std::string path;
  if (!readBlock(stream, flags, &block)) return false;
  stream.read(reinterpret_cast<char*>(&size), sizeof size);
  if (stream.fail() || !readText(stream, size, &path)) return false;
  static_cast<OptionsBlock&>(*this) = block;
  Path = std::move(path);
  return true;
}

bool Index::Metrics::SerializeToOstream(std::ostream& stream) const {
  writeBlock<MetricsBlock>(stream, *this);
  return !stream.fail();
}

bool Index::Metrics::ParseFromIstream(std::istream& stream) {
  constexpr size_t flags[] = {offsetof(MetricsBlock, VacuumInProgress)};
  return readBlock<MetricsBlock>(stream, flags, this);
}

Index::Metrics::operator std::string() const {
  char time[64] = "\n";
  const time_t created = CreationTime;
  if (ctime_r(&created, time) == nullptr) std::strcpy(time, "\n");
  std::string text;
  const auto line = [&text](auto format, const auto&... values) {
    fmt::format_to(std::back_inserter(text), format, values...);
  };
  line(FMT_STRING("SALT INDEX METRICS\n-- Code version: {}\n-- Creation time: {}"), CodeVersion,
       time);
  line(FMT_STRING("-- Max doc ID: {}\n-- Last doc ID added: {}\n"), MaxDocID, LastDocID);
  line(FMT_STRING("--\n-- AGGREGATE METRICS\n---- Docs: {}\n---- Zones: {}\n---- Suffixes: {}\n"),
       Docs, Zones, Suffixes);
  const auto textBytes = static_cast<double>(TextBytes);
  line(FMT_STRING("---- Text bytes: {:.2f}MB\n"), textBytes / 1000000);
  if (Docs != 0) {
    line(FMT_STRING("---- Average tokens/doc: {:.2f}\n---- Average bytes/doc: {:.2f}\n"),
         per(static_cast<double>(Suffixes), Docs), per(textBytes, Docs));
  }
  line(FMT_STRING("---- Deleted docs: {}\n"), DeletedDocs);
  line(FMT_STRING("--\n-- SHARD METRICS\n---- Shards: {}\n---- Last shard suffixes: {}\n"
                  "---- Hot (unmerged) suffixes: {}\n---- Pages: {}\n"),
       Shards, LastShardSuffixes, HotSuffixes, Pages);
  if (Pages != 0) {
    line(FMT_STRING("---- Average suffixes/page: {:.2f}\n"),
         per(static_cast<double>(Suffixes) - static_cast<double>(HotSuffixes), Pages));
  }
  line(FMT_STRING("--\n-- INDEXING METRICS\n---- Indexing calls: {}\n"), IndexingCalls);
  if (IndexingCalls != 0) {
    line(FMT_STRING("---- Total time: {:.2f}s\n---- Average time: {:.1f}us\n"), IndexingSeconds,
         per(IndexingSeconds * 1000000, IndexingCalls));
    if (ThrottlingSeconds > 0) {
      line(FMT_STRING("---- Average throttling: {:.1f}us\n"),
           per(ThrottlingSeconds * 1000000, IndexingCalls));
    }
  }
  line(FMT_STRING("--\n-- VACUUM METRICS\n---- Vacuums: {}{}\n"), Vacuums,
       VacuumInProgress ? " (IN PROGRESS)" : "");
  if (Vacuums != 0) {
    line(FMT_STRING("---- Last shard vacuumed: {}\n---- Total time: {:.2f}s\n"
                    "---- Average time: {:.2f}s\n"),
         LastShardVacuumed, VacuumSeconds, per(VacuumSeconds, Vacuums));
  }
  line(FMT_STRING("--\n-- SCANNING METRICS\n---- Scans run: {}\n"), Scans);
  if (Scans != 0) {
    const auto perScan = [this](uint64_t total) { return per(static_cast<double>(total), Scans); };
    line(FMT_STRING("---- Average time: {:.1f}us\n---- Average results: {:.1f}\n"
                    "---- Average text fetches: {:.1f}\n---- Average hot reads: {:.1f}\n"
                    "---- Average page reads: {:.1f}\n"),
         per(ScanSeconds * 1000000, Scans), perScan(ScanResults), perScan(ScanTextFetches),
         perScan(ScanHotReads), perScan(ScanPageReads));
  }
  return text;
}

SuffixMeta::operator std::string() const {
  std::string text = fmt::format("[{}", DocID);
  if (ZoneID != 0) text += fmt::format(",{}", ZoneID);
  text += fmt::format(":{}", Offset);
  if (lcp != 0 || extra[0] != 0) {
    text += fmt::format(" ({})+\"", lcp);
    for (const uint8_t byte : extra) {
      if (byte != 0) text += static_cast<char>(byte);
    }
    text += '"';
  }
  return text + ']';
}

}  // namespace salt
