#pragma once

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/Mutex.h"
#include "platform/RunLoop.h"
#include "records/TLIndexableItem.h"
#include "rpc/Server.h"
#include "tests/support/TemporaryDirectory.h"

namespace testsupport {

// A search service in this process, as far as a sync needs it. Keeps items by identifier and a
// client state in memory. An unknown identifier ends a list of deletions with an error, as in the
// daemon.
class StoringDaemon {
 public:
  struct Content {
    std::map<std::string, std::shared_ptr<TLIndexableItem>> items;
    std::optional<std::string> state;
  };
  // Fault injection for a call that indexes or deletes: it is executed up to this point, then
  // fails.
  enum class Fault { none, before, afterDeletions, afterItems, afterState };

  StoringDaemon();
  ~StoringDaemon();
  StoringDaemon(const StoringDaemon&) = delete;
  StoringDaemon& operator=(const StoringDaemon&) = delete;

  [[nodiscard]] const std::string& runtimeDirectory() const { return _directory.path(); }
  [[nodiscard]] Content content() const;
  void setContent(Content content);
  // Injects the fault into the call after the next `calls`.
  void failAfter(size_t calls, Fault fault);
  // Items whose subject contains the text make their batch fail.
  void refuse(const std::string& subject);
  // The number of items received since the start.
  [[nodiscard]] size_t received() const;
  // Runs `action` once, on the daemon's thread, before the reply to the call in which the number of
  // received items reaches `items`.
  void whenReceived(size_t items, std::function<void()> action);

 private:
  void change(const std::vector<std::string>& identifiers, const std::vector<std::string>& items,
              const std::optional<std::string>& state, rpc::Reply& reply);
  void search(const std::string& query, rpc::Reply& reply);

  TemporaryDirectory _directory;
  rpc::Interface _interface;
  mutable platform::Mutex _mutex;
  Content _content TL_GUARDED_BY(_mutex);
  Fault _fault TL_GUARDED_BY(_mutex) = Fault::none;
  size_t _faultIn TL_GUARDED_BY(_mutex) = 0;
  std::string _refused TL_GUARDED_BY(_mutex);
  size_t _received TL_GUARDED_BY(_mutex) = 0;
  size_t _awaited TL_GUARDED_BY(_mutex) = 0;
  std::function<void()> _whenReceived TL_GUARDED_BY(_mutex);
  platform::RunLoop _loop;
  std::unique_ptr<rpc::Listener> _listener;
  std::thread _thread;
};

}  // namespace testsupport
