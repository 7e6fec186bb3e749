#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <vector>

#include "platform/TLError.h"

// The service that holds the data of languages for word breaking and fetches what is missing.
class LexemonAssets {
 public:
  struct Asset {
    std::optional<std::string> path;  // directory of the data, none when it is not there
  };

  virtual ~LexemonAssets() = default;

  // Codes of the languages whose data comes with the system.
  [[nodiscard]] virtual std::vector<std::string> EmbeddedLanguages() = 0;
  [[nodiscard]] virtual Asset getAssetPathForLanguageCode(const std::string& code) = 0;
  // Returns when the data is there or the deadline has passed: the error, or none.
  [[nodiscard]] virtual std::optional<TLError> blockingOnDemandDownloadForLanguageCode(
      const std::string& code, std::chrono::steady_clock::time_point deadline) = 0;
  // Starts a fetch and returns at once.
  virtual void onDemandDownloadForLanguageCode(const std::string& code) = 0;

  // The service of this system: it embeds the languages that the word breaking of ICU serves well,
  // and has nothing to fetch, so each fetch fails at once. Lives as long as the process; any
  // thread.
  [[nodiscard]] static LexemonAssets& systemService();
};
