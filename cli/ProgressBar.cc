#include "cli/ProgressBar.h"

#include <fmt/format.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>

namespace cli {

namespace {

constexpr std::chrono::milliseconds kInterval(100);
constexpr size_t kBarColumns = 24;

size_t terminalColumns() {
  winsize size{};
  const bool known = ioctl(STDERR_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0;
  return known ? size.ws_col : 80;
}

std::string durationText(double seconds) {
  const auto whole = static_cast<uint64_t>(std::clamp(seconds, 0.0, 359999.0));
  return whole >= 3600 ? fmt::format("{}:{:02}:{:02}", whole / 3600, whole / 60 % 60, whole % 60)
                       : fmt::format("{}:{:02}", whole / 60, whole % 60);
}

}  // namespace

std::string progressText(uint64_t bytes, uint64_t total, uint64_t messages, double seconds,
                         size_t columns) {
  const double done =
      total == 0 ? 1.0 : std::min(1.0, static_cast<double>(bytes) / static_cast<double>(total));
  const auto filled = static_cast<size_t>(done * kBarColumns);
  std::string text = fmt::format("[{:=>{}}{:>{}}] {:3}%  {} messages", "", filled, "",
                                 kBarColumns - filled, static_cast<int>(done * 100), messages);
  if (seconds > 0) {
    text += fmt::format("  {:.0f}/s", static_cast<double>(messages) / seconds);
    if (done > 0) text += fmt::format("  {} left", durationText(seconds / done - seconds));
  }
  return text.substr(0, columns);
}

ProgressBar::ProgressBar(uint64_t total)
    : _shown(shown()), _total(total), _start(std::chrono::steady_clock::now()) {}

bool ProgressBar::shown() {
  return isatty(STDERR_FILENO) == 1;
}

void ProgressBar::update(uint64_t bytes, uint64_t messages) {
  const auto now = std::chrono::steady_clock::now();
  if (!_shown || now - _lastUpdate < kInterval) return;
  _lastUpdate = now;
  const double seconds = std::chrono::duration<double>(now - _start).count();
  fmt::print(stderr, "\r\x1b[K{}",
             progressText(bytes, _total, messages, seconds, terminalColumns() - 1));
  std::fflush(stderr);
  _onScreen = true;
}

void ProgressBar::clear() {
  if (!_onScreen) return;
  fmt::print(stderr, "\r\x1b[K");
  std::fflush(stderr);
  _onScreen = false;
}

}  // namespace cli
