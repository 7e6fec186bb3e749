#pragma once

#include <functional>
#include <memory>
#include <string>

#include "daemon/RPCInterfaces.h"
#include "daemon/TALSearchService.h"
#include "platform/Log.h"
#include "platform/RunLoop.h"
#include "rpc/Server.h"

// Owns the one service object of the process and the two listeners that export it.
//
// Threads: all operations belong to the main thread; requests arrive on the threads of the
// connections.
class TALDaemon {
 public:
  // The daemon of the process, created at the first call. Null, with a fault in the log, when the
  // data root cannot be created.
  static TALDaemon* sharedInstance();

  // Null when the data root `path` cannot be created. Sockets are created in `runtimeDirectory`.
  [[nodiscard]] static std::unique_ptr<TALDaemon> init(platform::RunLoop& loop,
                                                       const std::string& path,
                                                       const std::string& runtimeDirectory);
  ~TALDaemon();

  [[nodiscard]] TALSearchService& searchService() { return *_searchService; }
  [[nodiscard]] rpc::Listener& searchServiceListener() { return *_searchServiceListener; }
  [[nodiscard]] rpc::Listener& debugServiceListener() { return *_debugServiceListener; }

  // Exports the interface of a service, chosen by the service name alone, to a new connection.
  [[nodiscard]] bool listener(rpc::Listener& listener, rpc::Connection& shouldAcceptNewConnection);

  // Starts listening; further calls do nothing. False when a socket is unavailable.
  bool run(TLErrorOut error);

  // Whether systemd passed both sockets, so that the next connection starts the daemon again.
  [[nodiscard]] bool activated() const;
  // Calls `handler` with the number of open connections whenever it changes.
  void setConnectionsHandler(const std::function<void(size_t open)>& handler);
  // Accepts no more connections. Where systemd passed the sockets, those that arrive now are served
  // by the next daemon.
  void pause();

  // Shuts every indexer down. Blocks until their queues have drained.
  void shutdown();

  // Sends pending replies, for a bounded time, and ends the connections.
  void invalidate();

  static const platform::Log& log();

 private:
  TALDaemon(platform::RunLoop& loop, const std::string& path, const std::string& runtimeDirectory);

  std::unique_ptr<TALSearchService> _searchService;
  rpc::Interface _debugServiceProtocol;
  size_t _searchConnections = 0;
  size_t _debugConnections = 0;
  std::unique_ptr<rpc::Listener> _searchServiceListener;
  std::unique_ptr<rpc::Listener> _debugServiceListener;
  bool _running = false;
};
