#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "cli/BatchQueue.h"
#include "cli/MailFile.h"
#include "client/Batches.h"

namespace cli {

// What the reader of mail hands over in one piece: items to send, and what there is to tell.
struct MailBatch {
  std::vector<client::EncodedItem> items;
  size_t itemBytes = 0;
  uint64_t inputBytes = 0;  // read from files since the batch before

  struct Failure {
    std::string where;
    std::string reason;
  };
  std::vector<Failure> messageFailures;  // passed over, the rest goes on
  std::vector<Failure> pathFailures;     // a path that was named cannot be read
  std::vector<std::string> cut;          // messages whose text was too long for the index
  std::vector<std::string> ignored;      // files of a directory that are no mail
};

// Bounds of a batch; one goes out when any is reached. The last bounds what a batch without items
// can gather.
inline constexpr size_t kBatchBytes = size_t{4} << 20;
inline constexpr size_t kBatchItems = 500;
inline constexpr size_t kBatchReports = 1000;

// Reads mail and makes it items on a thread of its own, so that reading and sending overlap.
//
// Threads: `next` and the destructor belong to the thread that made the pipeline. The reading
// thread shares with it only the queue, and is joined by the destructor, which
// makes it stop at the next message.
class IndexPipeline {
 public:
  explicit IndexPipeline(std::vector<std::string> paths);
  ~IndexPipeline();
  IndexPipeline(const IndexPipeline&) = delete;
  IndexPipeline& operator=(const IndexPipeline&) = delete;

  // Waits for the next batch; none at the end.
  [[nodiscard]] std::optional<MailBatch> next() { return _queue.next(); }

 private:
  class Reading;

  void run();

  const std::vector<std::string> _paths;
  BatchQueue<MailBatch> _queue;  // synchronised by itself
  std::thread _thread;
};

}  // namespace cli
