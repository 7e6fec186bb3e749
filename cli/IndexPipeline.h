#pragma once

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "cli/MailFile.h"
#include "client/Batches.h"
#include "platform/Mutex.h"

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

// How many batches wait at most for whoever sends them, so that reading never runs far ahead.
inline constexpr size_t kQueuedBatches = 2;

// Reads mail and makes it items on a thread of its own, so that reading and sending overlap.
//
// Threads: `next` and the destructor belong to the thread that made the pipeline. The reading
// thread shares with it only the queue, under `_mutex`, and is joined by the destructor, which
// makes it stop at the next message.
class IndexPipeline {
 public:
  explicit IndexPipeline(std::vector<std::string> paths);
  ~IndexPipeline();
  IndexPipeline(const IndexPipeline&) = delete;
  IndexPipeline& operator=(const IndexPipeline&) = delete;

  // Waits for the next batch; none at the end.
  [[nodiscard]] std::optional<MailBatch> next();

 private:
  class Reading;

  void run();
  // False once nobody wants more.
  bool push(MailBatch batch);

  const std::vector<std::string> _paths;
  platform::Mutex _mutex;
  std::condition_variable_any _changed;
  std::deque<MailBatch> _batches TL_GUARDED_BY(_mutex);
  bool _ended TL_GUARDED_BY(_mutex) = false;
  bool _cancelled TL_GUARDED_BY(_mutex) = false;
  std::thread _thread;
};

}  // namespace cli
