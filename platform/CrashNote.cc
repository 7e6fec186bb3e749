#include "platform/CrashNote.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <charconv>
#include <csignal>
#include <cstddef>
#include <ctime>

#include "platform/Files.h"

namespace platform {

namespace {

constexpr std::array<int, 5> kFatalSignals{SIGABRT, SIGBUS, SIGFPE, SIGILL, SIGSEGV};
constexpr size_t kMaxBytes = 64 * 1024;
constexpr size_t kMaxDigits = 20;

thread_local const char* currentPath = nullptr;

std::array<struct sigaction, kFatalSignals.size()> previousActions;

// Writes one line, the seconds since 1970, with async-signal-safe calls only.
void leaveNote(const char* path) {
  std::array<char, kMaxDigits + 1> line{};
  const auto [end, failure] =
      std::to_chars(line.begin(), line.end() - 1, static_cast<int64_t>(time(nullptr)));
  *end = '\n';
  const int file = open(path, O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0600);
  if (file < 0) return;
  // A failed write cannot be handled here.
  [[maybe_unused]] const ssize_t written =
      write(file, line.begin(), static_cast<size_t>(end + 1 - line.begin()));
  close(file);
}

// After the return the signal is raised again, at the latest, and reaches its previous handler.
void handleFatalSignal(int signal) {
  for (size_t i = 0; i < kFatalSignals.size(); ++i) {
    if (kFatalSignals[i] == signal) sigaction(signal, &previousActions[i], nullptr);
  }
  if (currentPath != nullptr) leaveNote(currentPath);
  raise(signal);
}

}  // namespace

CrashNote::CrashNote(const std::string& path) : _outer(currentPath) {
  currentPath = path.c_str();
}

CrashNote::~CrashNote() {
  currentPath = _outer;
}

void CrashNote::begin() {
  struct sigaction action {};
  action.sa_handler = handleFatalSignal;
  for (size_t i = 0; i < kFatalSignals.size(); ++i) {
    sigaction(kFatalSignals[i], &action, &previousActions[i]);
  }
}

std::vector<int64_t> CrashNote::times(const std::string& path) {
  std::vector<int64_t> times;
  const auto text = readFile(path, kMaxBytes, nullptr);
  if (!text) return times;
  const char* const end = text->data() + text->size();
  for (const char* at = text->data(); at < end; ++at) {
    int64_t seconds = 0;
    const auto [behind, failure] = std::from_chars(at, end, seconds);
    if (failure == std::errc()) times.push_back(seconds);
    for (at = behind; at < end && *at != '\n';) ++at;
  }
  return times;
}

}  // namespace platform
