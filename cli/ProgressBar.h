#pragma once

#include <chrono>
#include <cstdint>
#include <string>

namespace cli {

// A line on the standard error that shows the progress of the work, its rate and the remaining
// time. Silent unless the standard error is a terminal. One thread.
class ProgressBar {
 public:
  // `total` is in bytes.
  explicit ProgressBar(uint64_t total);
  ~ProgressBar() { clear(); }
  ProgressBar(const ProgressBar&) = delete;
  ProgressBar& operator=(const ProgressBar&) = delete;

  [[nodiscard]] static bool shown();

  void update(uint64_t bytes, uint64_t messages);

  // Erases the line, so that other text can be written.
  void clear();

 private:
  const bool _shown;
  const uint64_t _total;
  const std::chrono::steady_clock::time_point _start;
  std::chrono::steady_clock::time_point _lastUpdate;
  bool _onScreen = false;
};

// The text of the bar, at most `columns` wide.
[[nodiscard]] std::string progressText(uint64_t bytes, uint64_t total, uint64_t messages,
                                       double seconds, size_t columns);

}  // namespace cli
