#pragma once

#include <cstdint>
#include <cstdio>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "bench/DaemonRun.h"
#include "client/Batches.h"
#include "client/SearchServiceProxy.h"

// Mail for the benchmarks, and its transfer to the daemon.
namespace bench {

inline constexpr const char* kClientName = "bench";
inline constexpr const char* kProtectionClass = "default";

// The index of the class in a state directory.
[[nodiscard]] std::string indexPath(const std::string& stateDirectory);
// The document store of the class.
[[nodiscard]] std::string documentStorePath(const std::string& stateDirectory);

// A file of encoded items, in batches as the client program makes them. It separates the time of
// parsing from that of indexing, with bounded memory. One thread; once filled, the same file may be
// opened again by other threads and processes.
class ItemSpool {
 public:
  // Creates the file "items" in the directory.
  explicit ItemSpool(const ScratchDirectory& scratch);
  // Opens a filled file.
  explicit ItemSpool(const std::string& path);

  // Parses the mail at the paths and stores its items; `visit`, which may be empty, is called with
  // each. Throws if a path cannot be read; messages that are not mail are counted and skipped.
  void fill(const std::vector<std::string>& paths,
            const std::function<void(const client::EncodedItem&)>& visit = {});

  // Reads the next batch; false, leaving it empty, at the end. `rewind` starts over.
  [[nodiscard]] bool next(std::vector<client::EncodedItem>& batch);
  void rewind();

  // Sends all batches to the daemon, one call each. Throws at the first refusal.
  void send(client::SearchServiceProxy& service);

  [[nodiscard]] const std::string& path() const { return _path; }
  // Counts of `fill`.
  [[nodiscard]] uint64_t items() const { return _items; }
  [[nodiscard]] uint64_t unreadable() const { return _unreadable; }
  [[nodiscard]] uint64_t mailBytes() const { return _mailBytes; }

 private:
  struct CloseFile {
    void operator()(std::FILE* file) const { std::fclose(file); }
  };

  ItemSpool(std::string path, const char* mode);
  void write(const std::string& bytes);
  void writeCount(uint64_t count);
  std::string read();
  // Nullopt at the end of the file.
  std::optional<uint64_t> readCount();

  const std::string _path;
  std::unique_ptr<std::FILE, CloseFile> _file;
  uint64_t _items = 0;
  uint64_t _unreadable = 0;
  uint64_t _mailBytes = 0;
};

// Indexes the batch for the benchmark's client. Throws if the daemon refuses it.
void indexBatch(client::SearchServiceProxy& service, std::span<const client::EncodedItem> batch,
                const std::string& protectionClass = kProtectionClass);

}  // namespace bench
