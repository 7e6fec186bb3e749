#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "cli/BatchQueue.h"
#include "client/Batches.h"
#include "sync/Catalogue.h"

namespace mailsync {

// What the reader hands over in one piece.
struct ReadBatch {
  struct Item {
    int64_t message;  // in the catalogue
    bool replace;     // an older version may be in the index
    std::string digest;
    client::EncodedItem item;
  };
  struct Failure {
    int64_t message;
    std::string where;
    std::string reason;
    bool lasting;  // the message is at fault, and not the moment
  };
  std::vector<Item> items;
  std::vector<Failure> failures;
  size_t bytes = 0;
  uint64_t cut = 0;  // items whose text was too long for the index
};

// Reads the messages of some waiting rows and makes them items, on a thread of its own, so that
// reading and sending overlap. What has gone or changed meanwhile is left out and stays waiting.
//
// Threads: `next` and the destructor belong to the thread that made the reader. The reading thread
// shares with it only the queue, and is joined by the destructor, which makes it
// stop at the next message.
class ItemReader {
 public:
  // The messages of one mbox file should stand together: it is read once for each such group.
  // Messages of more than `largestMessage` bytes, where that is not 0, are failures.
  ItemReader(std::vector<WaitingMessage> messages, uint64_t largestMessage);
  ~ItemReader();
  ItemReader(const ItemReader&) = delete;
  ItemReader& operator=(const ItemReader&) = delete;

  // Waits for the next batch; none at the end.
  [[nodiscard]] std::optional<ReadBatch> next() { return _queue.next(); }

 private:
  class Reading;

  void run();

  const std::vector<WaitingMessage> _messages;
  const uint64_t _largestMessage;
  cli::BatchQueue<ReadBatch> _queue;  // synchronised by itself
  std::thread _thread;
};

}  // namespace mailsync
