#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "client/Channel.h"

namespace client {

inline constexpr const char* kDebugServiceName = "com.quill.tallow.DebugService";

// Whole numbers come as int64_t, also where the daemon sends them unsigned, unless they need more.
using Statistic = std::variant<int64_t, uint64_t, double>;
using Statistics = std::vector<std::pair<std::string, Statistic>>;

// The diagnostic service of the daemon; threads and errors as in SearchServiceProxy.
class DebugServiceProxy {
 public:
  explicit DebugServiceProxy(const std::string& runtimeDirectory)
      : _channel(runtimeDirectory, kDebugServiceName) {}

  // A text about the daemon that holds `input`.
  [[nodiscard]] std::optional<std::string> ping(const std::string& input, TLErrorOut error);

  // In the daemon's order.
  [[nodiscard]] std::optional<Statistics> fetchStatsForIndexer(const std::string& name,
                                                               const std::string& protectionClass,
                                                               TLErrorOut error);

  // The metrics of the text index as lines of text.
  [[nodiscard]] std::optional<std::string> fetchStatsForSalt(const std::string& name,
                                                             const std::string& protectionClass,
                                                             TLErrorOut error);

  bool forceVacuumAndCompact(const std::string& protectionClass, TLErrorOut error);

 private:
  Channel _channel;
};

}  // namespace client
