#include "salt/Inspection.h"

#include <utility>

#include "platform/Assert.h"
#include "salt/IndexImpl.h"
#include "salt/LiveCopy.h"
#include "salt/SnapshotEnv.h"

namespace salt {

Inspection::Inspection(std::string path, std::unique_ptr<SnapshotEnv> files)
    : _path(std::move(path)), _files(std::move(files)) {}

Inspection::~Inspection() = default;

std::unique_ptr<Inspection> Inspection::capture(const std::string& path, TLErrorOut error) {
  auto files = SnapshotEnv::capture(path, error);
  if (files == nullptr) return nullptr;
  return std::unique_ptr<Inspection>(new Inspection(path, std::move(files)));
}

const Index* Inspection::load() {
  _index = index::load(openDatabase(_path, OpenMode::existing, _files.get()));
  return _index.get();
}

std::optional<Inspection::Deleted> Inspection::deleted() const {
  TL_ASSERT(_index);
  const IndexView view(*_index, false);
  Deleted deleted;
  deleted.documents = view.deleted->size();
  leveldb::Iterator& it = *view.iterators.front();
  uint32_t docID = 0;
  uint16_t zoneID = 0;
  for (it.Seek("\xFF"); it.Valid(); it.Next()) {
    if (!parseTextKey(salt::view(it.key()), &docID, &zoneID)) continue;
    deleted.allTextBytes += it.value().size();
    if (view.deleted->contains(docID)) deleted.textBytes += it.value().size();
  }
  if (it.status().ok()) return deleted;
  Log.error("Error reading from db: {}", it.status().ToString());
  return std::nullopt;
}

std::optional<uint64_t> Inspection::copyLive(const std::string& to,
                                             const std::function<bool(uint32_t)>& isKept,
                                             const std::function<void()>& progress,
                                             TLErrorOut error) const {
  TL_ASSERT(_index);
  return LiveCopy(*_index, isKept, progress).write(to, error);
}

bool Inspection::dump(const std::function<bool(std::string_view)>& sink) const {
  TL_ASSERT(_index);
  return _index->dumpTo(sink);
}

}  // namespace salt
