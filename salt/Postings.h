#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/FileDescriptor.h"
#include "salt/DocPages.h"
#include "salt/DocSet.h"
#include "salt/PlaceSet.h"

// For the prefixes that many suffixes of a shard begin with: the documents, with zones and numbers
// of suffixes. A scan for such a prefix reads this instead of the pages. Derived from the pages and
// never needed: without it, or where it cannot be read, the pages are walked.
//
// Suffixes in order make a tree of the prefixes that they share. An entry is a node of this tree:
// all prefixes of its text that are longer than the text of the node above have the same suffixes.
namespace salt {

// What a file of postings belongs to; one of anything else is not read.
struct PostingsOwner {
  int64_t indexCreated = 0;  // Metrics::CreationTime
  uint8_t shard = 0;

  bool operator==(const PostingsOwner&) const = default;
};

// Where the postings of a shard are, in the directory of the index. FORMAT.md has the bytes.
[[nodiscard]] std::string postingsPath(const std::string& directory, uint8_t shard);

// Removes the file and waits until that is on the disk, so that what comes after cannot be there
// with it. False when that failed: then the pages must not change.
[[nodiscard]] bool removePostings(const std::string& directory, uint8_t shard);

// The postings of one shard, as they are in a file. Never changes; any thread.
class Postings {
 public:
  // Null when there is none. One that is damaged, or not this owner's, is removed, with a log line.
  [[nodiscard]] static std::shared_ptr<const Postings> open(const std::string& directory,
                                                            const PostingsOwner& owner);

  // Adds the places of all suffixes that begin with `prefix`, but those of documents in `deleted`.
  // False when they are not here, or cannot be read, which is logged: then nothing is added.
  [[nodiscard]] bool add(std::string_view prefix, const DocSet& deleted, PlaceSet* places) const;

 private:
  struct Entry {
    uint32_t text;    // where it begins in _texts
    uint8_t length;   // of the text
    uint8_t above;    // length of the text of the node above
    uint32_t offset;  // of the list in the file
    uint32_t bytes;   // of the list
  };

  explicit Postings(platform::FileDescriptor file) : _file(std::move(file)) {}

  // Reads all but the lists; false when they are not as they should be.
  [[nodiscard]] bool readTable(const PostingsOwner& owner);
  [[nodiscard]] std::string_view textOf(const Entry& entry) const {
    return std::string_view(_texts).substr(entry.text, entry.length);
  }
  // Null where the prefix has none.
  [[nodiscard]] const Entry* find(std::string_view prefix) const;

  const platform::FileDescriptor _file;
  std::string _texts;
  std::vector<uint16_t> _zones;  // by bit of a mask
  std::vector<Entry> _entries;   // in the order of their texts
};

// Makes a file of postings from the suffixes of a shard, in their order. One thread.
//
// The nodes that the latest suffix is in are open, from the root inwards (the stack of the LCP
// intervals of Abouelhoda, Kurtz and Ohlebusch, 2004). A node ends with the first suffix that
// shares less than its text.
//
// Memory: the places of the latest 260,000 suffixes, the documents of open nodes with more than
// those, and twice the size of the result.
class PostingsBuilder {
 public:
  // `fullShard` is MaxShardSuffixes. An entry has a 500th of that, 2,000 of a million: fewer
  // suffixes are walked as fast.
  explicit PostingsBuilder(uint64_t fullShard)
      : _least(std::max<uint64_t>(kLeast, fullShard / 500)),
        _mostPending(std::clamp<uint64_t>(fullShard / 4, 64, uint64_t{1} << 18)) {}

  // Takes the next suffix, which shares `lcp` bytes with the one before. Where that ends a node
  // with many suffixes, `textBefore(n)` gives the first n bytes of the suffix before.
  template <typename Text>
  void take(size_t lcp, const Place& place, const Text& textBefore) {
    close(lcp, textBefore);
    _pending.push_back(place);
    ++_taken;
    if (_pending.size() >= _mostPending) fold();
  }

  // The bytes of the file, behind the last suffix; empty without entries.
  template <typename Text>
  [[nodiscard]] std::string finish(const PostingsOwner& owner, const Text& textBefore) {
    close(0, textBefore);
    return file(owner);
  }

 private:
  static constexpr uint64_t kLeast = 2;

  struct Counts {
    uint32_t mask = 0;  // of zones
    uint32_t suffixes = 0;
  };
  struct Node {
    size_t depth = 0;      // length of the text that its suffixes share
    size_t begin = 0;      // of those of its suffixes in _pending that are not in `counts`
    uint64_t counted = 0;  // suffixes in `counts`
    std::unique_ptr<DocPages<Counts>> counts;
  };
  struct Made {
    std::string text;
    uint8_t above;
    uint64_t suffixes;
    std::string list;
  };

  // Ends the nodes with longer texts than `lcp`, and opens one of that length if there is none.
  template <typename Text>
  void close(size_t lcp, const Text& textBefore) {
    // It begins with the suffix before, or with all of the last node that ends.
    Node next;
    next.begin = _pending.empty() ? 0 : _pending.size() - 1;
    while (!_open.empty() && _open.back().depth > lcp) {
      next = std::move(_open.back());
      _open.pop_back();
      if (suffixesOf(next) < _least) continue;
      const size_t above = std::max(lcp, _open.empty() ? 0 : _open.back().depth);
      make(&next, std::string(textBefore(next.depth)), above);
    }
    if (lcp == 0 || (!_open.empty() && _open.back().depth == lcp)) return;
    next.depth = lcp;
    _open.push_back(std::move(next));
  }

  [[nodiscard]] uint64_t suffixesOf(const Node& node) const {
    return node.counted + _pending.size() - node.begin;
  }
  void make(Node* node, std::string text, size_t above);
  // Has the node's suffixes in _pending before `end` in its counts.
  void count(Node* node, size_t end);
  // Has the large open nodes count what is pending, and drops what no other needs.
  void fold();
  [[nodiscard]] uint32_t bitOf(uint16_t zoneID);

  // Leaves out the entries with the fewest suffixes until the lists take `mostBytes` at most.
  void prune(uint64_t mostBytes);
  [[nodiscard]] uint64_t budget() const;
  [[nodiscard]] std::string file(const PostingsOwner& owner);

  uint64_t _taken = 0;
  uint64_t _least;
  const uint64_t _mostPending;
  std::vector<Place> _pending;
  std::vector<Node> _open;
  std::vector<Made> _made;
  uint64_t _madeBytes = 0;
  std::vector<uint16_t> _zones;  // by bit
  bool _unfit = false;           // for the format: more than 32 zones, or huge document numbers
};

}  // namespace salt
