#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "rpc/Channel.h"

namespace client {

// Whole numbers are int64_t, even if the daemon sends them unsigned, unless they are too large for
// it.
using Statistic = std::variant<int64_t, uint64_t, double>;
using Statistics = std::vector<std::pair<std::string, Statistic>>;

// The daemon's diagnostic service; threads and errors as in SearchServiceProxy.
class DebugServiceProxy {
 public:
  explicit DebugServiceProxy(const std::string& runtimeDirectory,
                             rpc::Patience patience = rpc::Patience(0))
      : _channel(runtimeDirectory, rpc::kDebugServiceName, patience) {}

  // A text about the daemon that contains `input`.
  [[nodiscard]] std::optional<std::string> ping(const std::string& input, TLErrorOut error);

  // In the daemon's order.
  [[nodiscard]] std::optional<Statistics> fetchStatsForIndexer(const std::string& name,
                                                               const std::string& protectionClass,
                                                               TLErrorOut error);

  // The metrics of the text index as text.
  [[nodiscard]] std::optional<std::string> fetchStatsForSalt(const std::string& name,
                                                             const std::string& protectionClass,
                                                             TLErrorOut error);

  bool forceVacuumAndCompact(const std::string& protectionClass, TLErrorOut error);

 private:
  rpc::Channel _channel;
};

}  // namespace client
