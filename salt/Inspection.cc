#include "salt/Inspection.h"

#include <utility>

#include "platform/Assert.h"
#include "salt/FrozenFiles.h"
#include "salt/IndexImpl.h"

namespace salt {

Inspection::Inspection(std::string path, std::unique_ptr<FrozenFiles> files)
    : _path(std::move(path)), _files(std::move(files)) {}

Inspection::~Inspection() = default;

std::unique_ptr<Inspection> Inspection::capture(const std::string& path, TLErrorOut error) {
  auto files = FrozenFiles::capture(path, error);
  if (files == nullptr) return nullptr;
  return std::unique_ptr<Inspection>(new Inspection(path, std::move(files)));
}

const Index* Inspection::load() {
  _index = index::load(openDatabase(_path, OpenMode::existing, _files.get()));
  return _index.get();
}

bool Inspection::dump(const std::function<bool(std::string_view)>& sink) const {
  TL_ASSERT(_index);
  return _index->dumpTo(sink);
}

}  // namespace salt
