#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/TLError.h"
#include "salt/Index.h"

namespace salt {

class SnapshotEnv;
class index;

// Reads an index that no process has open, without changing its directory. The files are captured
// first; whatever opening has to write (leveldb recovers its log into a new table) goes to memory.
// One thread.
class Inspection {
 public:
  // Captures the files, which is quick. The caller must keep every process from opening the index
  // meanwhile; afterwards it may be opened and changed, and this object does not see the changes.
  // Null with an error when the directory or a file cannot be read.
  [[nodiscard]] static std::unique_ptr<Inspection> capture(const std::string& path,
                                                           TLErrorOut error);
  ~Inspection();
  Inspection(const Inspection&) = delete;
  Inspection& operator=(const Inspection&) = delete;

  // Like LoadIndex; null, with a log line, when the index cannot be opened. The result lives as
  // long as this object.
  [[nodiscard]] const Index* load();

  // The text of Index::Dump in pieces; call load() first. `sink` returns false to stop. False when
  // it did or, with a log line, when reading failed.
  [[nodiscard]] bool dump(const std::function<bool(std::string_view)>& sink) const;

  // The space that deleted documents still take. Reads all texts; nullopt, with a log line, on
  // failure.
  struct Deleted {
    uint64_t documents = 0;
    uint64_t textBytes = 0;     // of the deleted documents
    uint64_t allTextBytes = 0;  // of the whole index
  };
  [[nodiscard]] std::optional<Deleted> deleted() const;

  // Writes a copy of the loaded index to the directory `to` without any byte of the documents that
  // are deleted or for which `isKept` is false: it gives the same answers and contains no deleted
  // documents. What was at `to` is removed. Calls `progress` after each batch. Returns the number
  // of documents left out; nullopt with an error on failure, when the contents of `to` are
  // unusable. The copy is not synced.
  [[nodiscard]] std::optional<uint64_t> copyLive(const std::string& to,
                                                 const std::function<bool(uint32_t docID)>& isKept,
                                                 const std::function<void()>& progress,
                                                 TLErrorOut error) const;

 private:
  Inspection(std::string path, std::unique_ptr<SnapshotEnv> files);

  const std::string _path;
  const std::unique_ptr<SnapshotEnv> _files;
  std::unique_ptr<index> _index;
};

}  // namespace salt
