#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/FileDescriptor.h"
#include "salt/PostingSet.h"

// Posting lists for the prefixes that many suffixes of a shard begin with: the documents of each
// zone. A scan for such a prefix reads the list instead of the pages. Posting lists are derived
// from the pages and optional: when a list is absent or unreadable, the scan reads the pages.
//
// Sorted suffixes form a tree of shared prefixes. An entry is a node of this tree: all prefixes of
// its text that are longer than the text of the parent node have the same suffixes. Where one child
// has most of the suffixes of a node, as in words that nearly always follow one another, the list
// of the node has only the documents that the child's list has not.
namespace salt {

// Identifies the shard that a posting list file belongs to; a file of any other is not read.
struct PostingsOwner {
  int64_t indexCreated = 0;  // Metrics::CreationTime
  uint8_t shard = 0;

  bool operator==(const PostingsOwner&) const = default;
};

// The path of a shard's posting list file in the index directory. FORMAT.md has the bytes.
[[nodiscard]] std::string postingsPath(const std::string& directory, uint8_t shard);

// Removes the file and syncs the directory, so that no later change can reach the disk with the
// file still there. On failure, false, the pages must not change.
[[nodiscard]] bool removePostings(const std::string& directory, uint8_t shard);

// The posting lists of one shard, read from its file. Immutable; any thread.
class Postings {
 public:
  // Null when there is no file. A damaged file, or one of another owner, is removed with a log
  // line.
  [[nodiscard]] static std::shared_ptr<const Postings> open(const std::string& directory,
                                                            const PostingsOwner& owner);

  // Adds the places of all suffixes that begin with `prefix`, including those of deleted documents.
  // False when there is no list or, with a log line, it cannot be read; then the pages must be
  // scanned.
  [[nodiscard]] bool add(std::string_view prefix, PostingSet* places) const;

 private:
  struct Entry {
    uint32_t text;    // offset in _texts
    uint8_t length;   // of the text
    uint8_t above;    // text length of the parent node
    uint32_t heir;    // the distance to the entry of the child whose documents belong to it; or 0
    uint32_t offset;  // of the list in the file
    uint32_t bytes;   // of the list
  };

  explicit Postings(platform::FileDescriptor file) : _file(std::move(file)) {}

  // Reads everything except the lists; false when the file is invalid.
  [[nodiscard]] bool readTable(const PostingsOwner& owner);
  [[nodiscard]] std::string_view textOf(const Entry& entry) const {
    return std::string_view(_texts).substr(entry.text, entry.length);
  }
  // False when the list is invalid or cannot be read.
  [[nodiscard]] bool addEntry(const Entry& entry, uint32_t* suffixes, PostingSet* places) const;
  [[nodiscard]] bool addList(std::string_view list, uint32_t* suffixes, PostingSet* places) const;
  // Null when the prefix has no entry.
  [[nodiscard]] const Entry* find(std::string_view prefix) const;

  const platform::FileDescriptor _file;
  std::string _texts;
  std::vector<uint16_t> _zones;  // by number in the file
  std::vector<Entry> _entries;   // in text order
};

// Builds the posting list file of a shard from its suffixes in order. One thread.
//
// The nodes that contain the last suffix are open, from the root inwards (the stack of LCP
// intervals of Abouelhoda, Kurtz and Ohlebusch, 2004). A node ends at the first suffix that shares
// less than the node's text.
//
// Memory: the places of the last 260,000 suffixes, the documents of open nodes with more suffixes
// than that, and the texts of the entries. The lists are kept in an unnamed file in the directory
// of the index; when it cannot be created or written, with a log line, no file is made.
class PostingsBuilder {
 public:
  // `fullShard` is MaxShardSuffixes. Only prefixes with at least a 4,000th of that many suffixes,
  // 250 of a million, get an entry, and only those with more where the space does not suffice.
  PostingsBuilder(std::string directory, uint64_t fullShard);

  // Takes the next suffix, which shares `lcp` bytes with the previous one. Where that ends a node
  // with many suffixes, `textBefore(n)` is asked for the first n bytes of the previous suffix.
  template <typename Text>
  void take(size_t lcp, const Place& place, const Text& textBefore) {
    close(lcp, textBefore);
    _pending.push_back(place);
    ++_taken;
    if (_pending.size() >= _maxPending) fold();
  }

  // Ends the last nodes, after the last suffix. False when there is nothing to write.
  template <typename Text>
  [[nodiscard]] bool finish(const Text& textBefore) {
    close(0, textBefore);
    prune(budget());
    return !_made.empty() && !_unfit;
  }

  // Writes the file, once finished. False, with a log line, on failure.
  [[nodiscard]] bool write(const PostingsOwner& owner);

 private:
  static constexpr uint64_t kNone = UINT64_MAX;

  // The largest child of a node that has an entry.
  struct Heir {
    uint64_t offset = kNone;  // of its list
    std::unique_ptr<PostingSet> places;
  };
  struct Node {
    size_t depth = 0;                    // length of the text shared by its suffixes
    size_t begin = 0;                    // index in _pending of its first suffix not in `places`
    std::unique_ptr<PostingSet> places;  // of the suffixes before
    Heir heir;
  };
  struct Made {
    std::string text;
    uint8_t above;
    uint32_t bytes;   // of the list, at `offset` of _lists
    uint64_t offset;  // identifies the entry
    uint64_t heir;    // the offset of the list of its heir, whose documents belong to it; or kNone
    uint64_t suffixes;  // its own or, if it is an heir whose documents another uses, of that one
  };

  // Ends the nodes whose texts are longer than `lcp`, and opens one of that length if there is
  // none.
  template <typename Text>
  void close(size_t lcp, const Text& textBefore) {
    // A new node begins with the previous suffix, or with all suffixes of the last node ended.
    Node next;
    next.begin = _pending.empty() ? 0 : _pending.size() - 1;
    while (!_open.empty() && _open.back().depth > lcp) {
      next = std::move(_open.back());
      _open.pop_back();
      if (suffixesOf(next) < _minSuffixes) continue;
      Node* const parent = !_open.empty() && _open.back().depth >= lcp ? &_open.back() : nullptr;
      const size_t above = parent != nullptr ? parent->depth : lcp;
      make(&next, std::string(textBefore(next.depth)), above, parent);
    }
    if (lcp == 0 || (!_open.empty() && _open.back().depth == lcp)) return;
    next.depth = lcp;
    _open.push_back(std::move(next));
  }

  [[nodiscard]] uint64_t suffixesOf(const Node& node) const {
    return (node.places ? node.places->suffixes() : 0) + _pending.size() - node.begin;
  }
  // Makes the entry of a node, and adds its suffixes to its parent; without one, the node goes on
  // as its own parent.
  void make(Node* node, std::string text, size_t above, Node* parent);
  // Whether the node's list is to have only documents that its heir has not.
  [[nodiscard]] bool inherits(const Node& node) const;
  // An entry whose documents another one uses lives as long as that.
  void raise(uint64_t offset, uint64_t suffixes);
  // Without the documents of `heir` unless that is null.
  [[nodiscard]] std::string listOf(const PostingSet& places, const PostingSet* heir);
  // Adds the node's suffixes in _pending before `end` to its places.
  void count(size_t end, Node* node);
  // Adds the pending suffixes to the places of the large open nodes, and drops those that no other
  // node needs.
  void fold();
  [[nodiscard]] uint32_t numberOf(uint16_t zoneID);
  // Appends to _lists.
  void keep(std::string_view list);
  // Logs the error in errno.
  void fail();

  // Drops the entries with the fewest suffixes until the lists take at most `maxBytes`.
  void prune(uint64_t maxBytes);
  [[nodiscard]] uint64_t budget() const;
  // The bytes of the file before the lists.
  [[nodiscard]] std::string head(const PostingsOwner& owner) const;

  const std::string _directory;
  uint64_t _taken = 0;
  uint64_t _minSuffixes;
  const uint64_t _maxPending;
  std::vector<Place> _pending;
  std::vector<Node> _open;
  std::vector<Made> _made;
  uint64_t _madeBytes = 0;
  platform::FileDescriptor _lists;
  uint64_t _listsEnd = 0;
  std::vector<uint16_t> _zones;  // by number in the file
  bool _unfit = false;  // a failure, or what the format cannot hold: documents too far apart
};

}  // namespace salt
