#pragma once

#include <functional>
#include <memory>
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

 private:
  Inspection(std::string path, std::unique_ptr<FrozenFiles> files);

  const std::string _path;
  const std::unique_ptr<FrozenFiles> _files;
  std::unique_ptr<index> _index;
};

}  // namespace salt
