#include "daemon/TALDaemon.h"

#include "platform/Files.h"
#include "platform/Paths.h"

namespace {

constexpr uint64_t kFarewellMilliseconds = 2000;

}  // namespace

const platform::Log& TALDaemon::log() {
  static const platform::Log handle(platform::kSubsystem, "TALDaemon");
  return handle;
}

TALDaemon* TALDaemon::sharedInstance() {
  static const std::unique_ptr<TALDaemon> instance =
      init(platform::mainRunLoop(), platform::dataRoot(), platform::runtimeDirectory());
  return instance.get();
}

std::unique_ptr<TALDaemon> TALDaemon::init(platform::RunLoop& loop, const std::string& path,
                                           const std::string& runtimeDirectory) {
  log().standard("Initializing daemon");
  std::optional<TLError> error;
  if (!platform::createDirectories(path, &error)) {
    log().fault("Could not create tallow directory: {}", platform::printable(error));
    return nullptr;
  }
  return std::unique_ptr<TALDaemon>(new TALDaemon(loop, path, runtimeDirectory));
}

TALDaemon::TALDaemon(platform::RunLoop& loop, const std::string& path,
                     const std::string& runtimeDirectory)
    : _searchService(std::make_unique<TALSearchService>(std::make_shared<TALIndexerManager>(path))),
      _debugServiceProtocol(makeDebugServiceProtocol(*_searchService)),
      _searchServiceListener(rpc::makeListener(loop, runtimeDirectory, rpc::kSearchServiceName)),
      _debugServiceListener(rpc::makeListener(loop, runtimeDirectory, rpc::kDebugServiceName)) {
  const auto delegate = [this](rpc::Listener& from, rpc::Connection& connection) {
    return listener(from, connection);
  };
  _searchServiceListener->setDelegate(delegate);
  _debugServiceListener->setDelegate(delegate);
}

TALDaemon::~TALDaemon() = default;

bool TALDaemon::listener(rpc::Listener&, rpc::Connection& connection) {
  log().standard("accept new connection: {}", connection.description());
  if (connection.serviceName() == rpc::kSearchServiceName) {
    const auto lastReplaced = std::make_shared<WordReplacements>();
    connection.addExportedInterface(makeSearchServiceProtocol(*_searchService, lastReplaced));
    connection.addExportedInterface(makeSearchExplanationProtocol(lastReplaced));
    return true;
  }
  if (connection.serviceName() == rpc::kDebugServiceName) {
    connection.addExportedInterface(_debugServiceProtocol);
    return true;
  }
  return false;
}

bool TALDaemon::run(TLErrorOut error) {
  if (_running) return true;
  _running = true;
  log().standard("Resuming listeners");
  return _searchServiceListener->resume(error) && _debugServiceListener->resume(error);
}

bool TALDaemon::activated() const {
  return _searchServiceListener->activated() && _debugServiceListener->activated();
}

void TALDaemon::setConnectionsHandler(const std::function<void(size_t)>& handler) {
  const auto count = [this, handler](size_t& one, size_t open) {
    one = open;
    handler(_searchConnections + _debugConnections);
  };
  _searchServiceListener->setConnectionsHandler(
      [this, count](size_t open) { count(_searchConnections, open); });
  _debugServiceListener->setConnectionsHandler(
      [this, count](size_t open) { count(_debugConnections, open); });
}

void TALDaemon::pause() {
  _searchServiceListener->pause();
  _debugServiceListener->pause();
}

void TALDaemon::shutdown() {
  log().standard("Starting shutdown...");
  _searchService->shutdown();
  log().standard("Shutting down.");
}

void TALDaemon::invalidate() {
  _searchServiceListener->invalidate(kFarewellMilliseconds);
  _debugServiceListener->invalidate(kFarewellMilliseconds);
}
