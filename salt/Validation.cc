#include <fmt/format.h>

#include <algorithm>
#include <iterator>

#include "salt/IndexImpl.h"
#include "salt/Suffix.h"
#include "salt/ZoneTextCache.h"

// Full reads of the index: one checks the invariants of a merge, one prints.
namespace salt {

namespace {

constexpr size_t kDumpedTextBytes = 16;
constexpr size_t kDumpPieceBytes = 64 * 1024;

// The fault in `text` or in its order after `previous`, or null. A suffix that its page derives
// from the previous one must also have the right common prefix and extra bytes.
const char* fault(std::string_view previous, const SuffixMeta& previousMeta, std::string_view text,
                  const SuffixMeta& meta, bool derived) {
  const int order = text.compare(previous);
  if (order < 0 || (order == 0 && meta < previousMeta)) return "Validation failed: Out of order.";
  if (!derived) return nullptr;
  const size_t lcp = meta.lcp;
  if (lcp > previous.size() || lcp > text.size() ||
      previous.substr(0, lcp) != text.substr(0, lcp)) {
    return "Validation failed: LCP too large.";
  }
  if ((lcp < previous.size() || lcp < text.size()) &&
      previous.substr(0, lcp + 1) == text.substr(0, lcp + 1)) {
    return "Validation failed: LCP too small.";
  }
  if (byteAt(text, lcp) != meta.extra[0] || byteAt(text, lcp + 1) != meta.extra[1]) {
    return "Validation failed: Incorrect extra.";
  }
  return nullptr;
}

// False, with a log line, when the iteration ended with an error.
bool readInFull(const ShardCursor& cursor) {
  const leveldb::Status status = cursor.iterator->status();
  if (!status.ok()) Log.error("Error scanning index: {}", status.ToString());
  return status.ok();
}

// Adds the number of suffixes in the cursor's shard to `total`; false, with a log line, at a fault.
bool shardSound(ShardCursor* cursor, uint64_t* total) {
  std::string previous;
  SuffixMeta previousMeta;
  for (cursor->seekToFirst(); cursor->valid; cursor->next()) {
    Suffix& suffix = cursor->suffix;
    suffix.fetch();
    const bool derived = cursor->shard != 0 && cursor->pos != 0;
    if (const char* const found =
            fault(previous, previousMeta, suffix.knownText(), suffix.meta, derived)) {
      Log.error("{}", found);
      return false;
    }
    previous = suffix.knownText();
    previousMeta = suffix.meta;
    ++*total;
  }
  return readInFull(*cursor);
}

}  // namespace

bool index::Validate() const {
  const IndexView view(*this, false);
  ZoneTextCache zoneTexts(*this);
  ShardCursor cursor(view, 0, &zoneTexts);
  uint64_t total = 0;
  for (unsigned shard = 0; shard <= view.lastShard(); ++shard) {
    cursor.moveTo(static_cast<uint8_t>(shard));
    if (!shardSound(&cursor, &total)) return false;
  }
  if (total != view.metrics.Suffixes) {
    Log.error("Validation failed: # of suffixes: {} != {}.", total, view.metrics.Suffixes);
  }
  return true;
}

std::string index::Dump() const {
  std::string text;
  static_cast<void>(dumpTo([&text](std::string_view piece) {
    text += piece;
    return true;
  }));
  return text;
}

bool index::dumpTo(const std::function<bool(std::string_view)>& sink) const {
  const IndexView view(*this, false);
  ZoneTextCache zoneTexts(*this);
  ShardCursor cursor(view, 0, &zoneTexts);
  std::string piece = std::string(view.metrics) + '\n';
  for (unsigned shard = 0; shard <= view.lastShard(); ++shard) {
    piece +=
        shard == 0 ? "-- SALT INDEX (HOT)\n" : fmt::format("-- SALT INDEX (SHARD {})\n", shard);
    cursor.moveTo(static_cast<uint8_t>(shard));
    for (cursor.seekToFirst(); cursor.valid; cursor.next()) {
      cursor.suffix.fetch();
      fmt::format_to(std::back_inserter(piece), "---- {}: \"{}\"\n",
                     std::string(cursor.suffix.meta),
                     cursor.suffix.knownText().substr(0, kDumpedTextBytes));
      if (piece.size() < kDumpPieceBytes) continue;
      if (!sink(piece)) return false;
      piece.clear();
    }
    if (!readInFull(cursor)) {
      sink(piece);
      return false;
    }
  }
  return sink(piece);
}

}  // namespace salt
