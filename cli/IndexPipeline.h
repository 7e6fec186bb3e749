#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "cli/BatchQueue.h"
#include "cli/MailFile.h"
#include "client/Batches.h"
#include "extract/Protocol.h"

namespace cli {

// A batch from the reading thread: items to send, and messages for the user.
struct MailBatch {
  std::vector<client::EncodedItem> items;
  size_t itemBytes = 0;
  uint64_t inputBytes = 0;  // read from files since the previous batch

  struct Failure {
    std::string where;
    std::string reason;
  };
  std::vector<Failure> messageFailures;  // these messages were skipped
  std::vector<Failure> pathFailures;     // paths on the command line that cannot be read
  std::vector<std::string> cut;          // messages whose text was truncated for the index
  std::vector<std::string> ignored;      // files of a directory that are no mail
  extract::Counts attachments;
};

// Limits of a batch; it is sent when any is reached. The last one limits what a batch without items
// can collect.
inline constexpr size_t kBatchBytes = size_t{4} << 20;
inline constexpr size_t kBatchItems = 500;
inline constexpr size_t kBatchReports = 1000;

// Reads mail and converts it to items on its own thread, so that reading and sending overlap.
//
// Threads: call `next` and the destructor on the thread that created the pipeline. The reading
// thread shares only the queue with it. The destructor stops the reading thread at the next message
// and joins it.
class IndexPipeline {
 public:
  // `extractProgram` is the path of tallow-extract, for the text of attachments, or empty.
  explicit IndexPipeline(std::vector<std::string> paths, std::string extractProgram = {});
  ~IndexPipeline();
  IndexPipeline(const IndexPipeline&) = delete;
  IndexPipeline& operator=(const IndexPipeline&) = delete;

  // Waits for the next batch; nullopt at the end.
  [[nodiscard]] std::optional<MailBatch> next() { return _queue.next(); }

 private:
  class Reading;

  void run();

  const std::vector<std::string> _paths;
  const std::string _extractProgram;
  BatchQueue<MailBatch> _queue;  // thread-safe
  std::thread _thread;
};

}  // namespace cli
