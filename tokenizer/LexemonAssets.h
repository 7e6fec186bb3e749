#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <vector>

#include "platform/TLError.h"

// The service that provides the language data for word breaking and downloads missing data.
class LexemonAssets {
 public:
  struct Asset {
    std::optional<std::string> path;  // directory of the data; nullopt if it is missing
  };

  virtual ~LexemonAssets() = default;

  // Codes of the languages whose data is part of the system.
  [[nodiscard]] virtual std::vector<std::string> EmbeddedLanguages() = 0;
  [[nodiscard]] virtual Asset getAssetPathForLanguageCode(const std::string& code) = 0;
  // Waits for the data or the deadline; the error, or nullopt.
  [[nodiscard]] virtual std::optional<TLError> blockingOnDemandDownloadForLanguageCode(
      const std::string& code, std::chrono::steady_clock::time_point deadline) = 0;
  // Starts a download and returns at once.
  virtual void onDemandDownloadForLanguageCode(const std::string& code) = 0;

  // The service of this system. Its embedded languages are those that ICU's word breaking supports
  // well. It cannot download anything, so every download fails at once. Lives as long as the
  // process; any thread.
  [[nodiscard]] static LexemonAssets& systemService();
};
