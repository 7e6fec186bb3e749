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

ItemSpool::ItemSpool(const ScratchDirectory& scratch)
    : _file(std::fopen((scratch / "items").c_str(), "w+b")) {
  if (_file == nullptr) failWithErrno();
}

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
    ++_batches;
  }
  if (std::fflush(_file.get()) != 0) failWithErrno();
}

void ItemSpool::send(client::SearchServiceProxy& service) {
  std::rewind(_file.get());
  std::vector<client::EncodedItem> batch;
  for (uint64_t i = 0; i < _batches; ++i) {
    batch.resize(readCount());
    for (client::EncodedItem& item : batch) {
      item.identifier = read();
      item.bytes = read();
    }
    std::optional<TLError> error;
    if (!service.indexItems(batch, kClientName, kProtectionClass, &error)) {
      throw std::runtime_error("indexing: " + platform::printable(error));
    }
  }
}

void ItemSpool::write(const std::string& bytes) {
  writeCount(bytes.size());
  if (std::fwrite(bytes.data(), 1, bytes.size(), _file.get()) != bytes.size()) failWithErrno();
}

void ItemSpool::writeCount(uint64_t count) {
  if (std::fwrite(&count, sizeof count, 1, _file.get()) != 1) failWithErrno();
}

std::string ItemSpool::read() {
  std::string bytes(readCount(), '\0');
  if (std::fread(bytes.data(), 1, bytes.size(), _file.get()) != bytes.size()) failWithErrno();
  return bytes;
}

uint64_t ItemSpool::readCount() {
  uint64_t count = 0;
  if (std::fread(&count, sizeof count, 1, _file.get()) != 1) failWithErrno();
  return count;
}

}  // namespace bench
