#include "platform/Log.h"

#include <sys/stat.h>
#include <sys/uio.h>
#define SD_JOURNAL_SUPPRESS_LOCATION
#include <systemd/sd-journal.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdlib>

#include "platform/Mutex.h"

namespace platform {

namespace {

struct LevelRow {
  LogLevel level;
  const char* name;
  int priority;  // syslog priority of the journal
};

constexpr std::array<LevelRow, 5> kLevels{{{LogLevel::debug, "debug", 7},
                                           {LogLevel::info, "info", 6},
                                           {LogLevel::standard, "default", 5},
                                           {LogLevel::error, "error", 3},
                                           {LogLevel::fault, "fault", 2}}};

std::atomic<LogLevel> processThreshold{LogLevel::standard};

const LevelRow& row(LogLevel level) {
  return kLevels[static_cast<size_t>(level)];
}

struct SinkHolder {
  Mutex mutex;
  LogSink sink TL_GUARDED_BY(mutex);
  std::atomic<bool> present{false};  // spares the mutex in the common case
};

SinkHolder& holder() {
  static auto* instance = new SinkHolder;  // outlives every thread that may still log
  return *instance;
}

// systemd puts the device and inode of its stream into JOURNAL_STREAM.
bool standardErrorIsJournal() {
  const char* stream = std::getenv("JOURNAL_STREAM");
  struct stat info;
  if (stream == nullptr || fstat(2, &info) != 0) return false;
  return fmt::format("{}:{}", info.st_dev, info.st_ino) == stream;
}

void writeToJournal(std::string_view subsystem, std::string_view category, LogLevel level,
                    std::string_view message) {
  const std::array<std::string, 4> fields{
      fmt::format("MESSAGE={}", message), fmt::format("PRIORITY={}", row(level).priority),
      fmt::format("SUBSYSTEM={}", subsystem), fmt::format("CATEGORY={}", category)};
  std::array<iovec, 4> parts;
  for (size_t i = 0; i < fields.size(); ++i) {
    parts[i] = {const_cast<char*>(fields[i].data()), fields[i].size()};
  }
  sd_journal_sendv(parts.data(), static_cast<int>(parts.size()));
}

// The kernel sends SIGPIPE to the writing thread, but only the main thread's loop handles it. So it
// is redirected to the process: if nobody reads the log, the daemon ends in order, whichever thread
// was writing.
void writeLine(std::string_view line) {
  while (!line.empty()) {
    const ssize_t written = write(STDERR_FILENO, line.data(), line.size());
    if (written >= 0) {
      line.remove_prefix(static_cast<size_t>(written));
    } else if (errno == EPIPE) {
      kill(getpid(), SIGPIPE);
      return;
    } else if (errno != EINTR) {
      return;  // a message that cannot be written is lost
    }
  }
}

// One message is one line: line breaks and other control characters become spaces.
void writeToStandardError(std::string_view subsystem, std::string_view category, LogLevel level,
                          std::string_view message) {
  std::string line = fmt::format("{:<7} {}:{} ", row(level).name, subsystem, category);
  for (const char c : message) line += static_cast<unsigned char>(c) < 0x20 || c == 0x7F ? ' ' : c;
  line += '\n';
  writeLine(line);
}

}  // namespace

const char* logLevelName(LogLevel level) {
  return row(level).name;
}

void setLogSink(LogSink sink) {
  SinkHolder& h = holder();
  MutexLock lock(h.mutex);
  h.present = static_cast<bool>(sink);
  h.sink = std::move(sink);
}

void setProcessLogThreshold(LogLevel level) {
  processThreshold = level;
}

LogLevel logThreshold() {
  static const LogLevel threshold = [] {
    const char* name = std::getenv("TALLOW_LOG");
    for (const LevelRow& r : kLevels) {
      if (name != nullptr && std::string_view(name) == r.name) return r.level;
    }
    return processThreshold.load();
  }();
  return threshold;
}

bool Log::enabled(LogLevel level) const {
  return level >= logThreshold() || holder().present.load(std::memory_order_relaxed);
}

void Log::emit(LogLevel level, std::string_view message) const {
  SinkHolder& h = holder();
  if (h.present) {
    MutexLock lock(h.mutex);
    if (h.sink) {
      h.sink({_subsystem, _category, level, message});
      return;
    }
  }
  static const bool journal = standardErrorIsJournal();
  if (journal) {
    writeToJournal(_subsystem, _category, level, message);
  } else {
    writeToStandardError(_subsystem, _category, level, message);
  }
}

}  // namespace platform
