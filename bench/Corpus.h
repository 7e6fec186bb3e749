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

// Mail on its way to the daemon, for the benchmarks.
namespace bench {

inline constexpr const char* kClientName = "bench";
inline constexpr const char* kProtectionClass = "default";

// The index of the class, below a state directory.
[[nodiscard]] std::string indexPath(const std::string& stateDirectory);
// Its documents.
[[nodiscard]] std::string documentStorePath(const std::string& stateDirectory);

// Encoded items in a file, in batches as the client program makes them, so that parsing mail and
// indexing it can be timed apart at a bounded cost of memory. One thread; others, and other
// processes, may open the same file for themselves once it is filled.
class ItemSpool {
 public:
  // Makes the file "items" in the directory.
  explicit ItemSpool(const ScratchDirectory& scratch);
  // Opens a file that was filled.
  explicit ItemSpool(const std::string& path);

  // Parses the mail at the paths and stores its items; `visit`, which may be empty, sees each.
  // Throws when a path cannot be read; messages that are no mail are counted and passed over.
  void fill(const std::vector<std::string>& paths,
            const std::function<void(const client::EncodedItem&)>& visit = {});

  // Reads the next batch; false, and none, at the end. `rewind` starts over.
  [[nodiscard]] bool next(std::vector<client::EncodedItem>& batch);
  void rewind();

  // Hands all batches to the daemon, one call each. Throws at the first that it refuses.
  void send(client::SearchServiceProxy& service);

  [[nodiscard]] const std::string& path() const { return _path; }
  // What `fill` has seen.
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
  // None at the end of the file.
  std::optional<uint64_t> readCount();

  const std::string _path;
  std::unique_ptr<std::FILE, CloseFile> _file;
  uint64_t _items = 0;
  uint64_t _unreadable = 0;
  uint64_t _mailBytes = 0;
};

// Indexes the batch for the bench's client. Throws when the daemon refuses it.
void indexBatch(client::SearchServiceProxy& service, std::span<const client::EncodedItem> batch,
                const std::string& protectionClass = kProtectionClass);

}  // namespace bench
