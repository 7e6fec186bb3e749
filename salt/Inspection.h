#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/TLError.h"
#include "salt/Index.h"

namespace salt {

class FrozenFiles;
class index;

// A look at an index that no process has open. Nothing in its directory is changed or made: the
// files are taken hold of first, and what opening has to write (leveldb recovers its log into a new
// table) goes to memory. One thread.
class Inspection {
 public:
  // Takes hold of the files; that is quick. The caller keeps every process from opening the index
  // meanwhile; afterwards it may be opened and changed, which this object does not see. Null with
  // an error when the directory or a file cannot be read.
  [[nodiscard]] static std::unique_ptr<Inspection> capture(const std::string& path,
                                                           TLErrorOut error);
  ~Inspection();
  Inspection(const Inspection&) = delete;
  Inspection& operator=(const Inspection&) = delete;

  // As LoadIndex; null, with a log line, when the index cannot be opened. Lives as long as this.
  [[nodiscard]] const Index* load();

  // The text of Index::Dump in pieces, once loaded. `sink` returns false to stop. False when it
  // did, or, with a log line, when reading failed.
  [[nodiscard]] bool dump(const std::function<bool(std::string_view)>& sink) const;

  // What deleted documents still take. Reads all texts; null, with a log line, when that fails.
  struct Deleted {
    uint64_t documents = 0;
    uint64_t textBytes = 0;     // of these
    uint64_t allTextBytes = 0;  // of the index
  };
  [[nodiscard]] std::optional<Deleted> deleted() const;

  // Once loaded, writes the index anew to the directory `to`, without any byte of the documents
  // that are deleted or for which `isKept` is false: same answers, with nothing deleted. What was
  // at `to` is removed. Calls `progress` after each batch. Gives the number of documents left out;
  // none, with the error, when it failed: then nothing of use is at `to`. The copy is not synced.
  [[nodiscard]] std::optional<uint64_t> copyLive(const std::string& to,
                                                 const std::function<bool(uint32_t docID)>& isKept,
                                                 const std::function<void()>& progress,
                                                 TLErrorOut error) const;

 private:
  Inspection(std::string path, std::unique_ptr<FrozenFiles> files);

  const std::string _path;
  const std::unique_ptr<FrozenFiles> _files;
  std::unique_ptr<index> _index;
};

}  // namespace salt
