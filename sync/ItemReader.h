#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "cli/BatchQueue.h"
#include "client/Batches.h"
#include "extract/Protocol.h"
#include "sync/Catalogue.h"

namespace mailsync {

// A batch of items and failures from the reader.
struct ReadBatch {
  struct Item {
    int64_t message;  // in the catalogue
    bool replace;     // an older version may be in the index
    std::string digest;
    std::optional<int64_t> date;  // seconds since 1970
    client::EncodedItem item;
  };
  struct Failure {
    int64_t message;
    std::string where;
    std::string reason;
    bool lasting;  // caused by the message itself, so a retry would not help
  };
  std::vector<Item> items;
  std::vector<Failure> failures;
  size_t bytes = 0;
  uint64_t cut = 0;  // items whose text was too long for the index
  extract::Counts attachments;
};

// Reads waiting messages and converts them to items on its own thread, so that reading and sending
// overlap. Messages that were removed or changed since the scan are skipped and keep waiting.
//
// Threads: call `next` and the destructor on the thread that created the reader. The reading thread
// shares only the queue with it. The destructor stops the reading thread at the next message and
// joins it.
class ItemReader {
 public:
  // Messages of one mbox file should be adjacent, because the file is read once for each such
  // group. Messages of more than `largestMessage` bytes fail; 0 means no limit. `extractProgram` is
  // the path of tallow-extract, for the text of attachments, or empty.
  ItemReader(std::vector<WaitingMessage> messages, uint64_t largestMessage,
             std::string extractProgram);
  ~ItemReader();
  ItemReader(const ItemReader&) = delete;
  ItemReader& operator=(const ItemReader&) = delete;

  // Waits for the next batch; nullopt at the end.
  [[nodiscard]] std::optional<ReadBatch> next() { return _queue.next(); }

 private:
  class Reading;

  void run();

  const std::vector<WaitingMessage> _messages;
  const uint64_t _largestMessage;
  const std::string _extractProgram;
  cli::BatchQueue<ReadBatch> _queue;  // thread-safe
  std::thread _thread;
};

}  // namespace mailsync
