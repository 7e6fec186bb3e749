#include "bench/Corpus.h"

#include <stdexcept>
#include <system_error>

#include "cli/IndexPipeline.h"

namespace bench {

namespace {

[[noreturn]] void failWithErrno() {
  throw std::system_error(errno, std::generic_category(), "spool file");
}

}  // namespace

std::string indexPath(const std::string& stateDirectory) {
  return stateDirectory + "/TallowSearch/" + kProtectionClass + "/salt";
}

std::string documentStorePath(const std::string& stateDirectory) {
  return stateDirectory + "/TallowSearch/" + kProtectionClass + "/docstore/docstore.db";
}

ItemSpool::ItemSpool(std::string path, const char* mode)
    : _path(std::move(path)), _file(std::fopen(_path.c_str(), mode)) {
  if (_file == nullptr) failWithErrno();
}

ItemSpool::ItemSpool(const ScratchDirectory& scratch) : ItemSpool(scratch / "items", "w+b") {}

ItemSpool::ItemSpool(const std::string& path) : ItemSpool(path, "rb") {}

void ItemSpool::fill(const std::vector<std::string>& paths,
                     const std::function<void(const client::EncodedItem&)>& visit) {
  cli::IndexPipeline pipeline(paths);
  while (const auto batch = pipeline.next()) {
    if (!batch->pathFailures.empty()) {
      const auto& failure = batch->pathFailures.front();
      throw std::runtime_error(failure.where + ": " + failure.reason);
    }
    _unreadable += batch->messageFailures.size();
    _mailBytes += batch->inputBytes;
    if (batch->items.empty()) continue;
    writeCount(batch->items.size());
    for (const client::EncodedItem& item : batch->items) {
      write(item.identifier);
      write(item.bytes);
      if (visit) visit(item);
    }
    _items += batch->items.size();
  }
  if (std::fflush(_file.get()) != 0) failWithErrno();
  rewind();
}

bool ItemSpool::next(std::vector<client::EncodedItem>& batch) {
  batch.resize(readCount().value_or(0));
  for (client::EncodedItem& item : batch) {
    item.identifier = read();
    item.bytes = read();
  }
  return !batch.empty();
}

void ItemSpool::rewind() {
  std::rewind(_file.get());
}

void ItemSpool::send(client::SearchServiceProxy& service) {
  rewind();
  for (std::vector<client::EncodedItem> batch; next(batch);) indexBatch(service, batch);
}

void ItemSpool::write(const std::string& bytes) {
  writeCount(bytes.size());
  if (std::fwrite(bytes.data(), 1, bytes.size(), _file.get()) != bytes.size()) failWithErrno();
}

void ItemSpool::writeCount(uint64_t count) {
  if (std::fwrite(&count, sizeof count, 1, _file.get()) != 1) failWithErrno();
}

std::string ItemSpool::read() {
  std::string bytes(readCount().value_or(0), '\0');
  if (std::fread(bytes.data(), 1, bytes.size(), _file.get()) != bytes.size()) failWithErrno();
  return bytes;
}

std::optional<uint64_t> ItemSpool::readCount() {
  uint64_t count = 0;
  if (std::fread(&count, sizeof count, 1, _file.get()) == 1) return count;
  if (std::ferror(_file.get()) != 0) failWithErrno();
  return std::nullopt;
}

void indexBatch(client::SearchServiceProxy& service, std::span<const client::EncodedItem> batch,
                const std::string& protectionClass) {
  std::optional<TLError> error;
  if (!service.indexItems(batch, kClientName, protectionClass, &error)) {
    throw std::runtime_error("indexing: " + platform::printable(error));
  }
}

}  // namespace bench
