#include "tests/support/LogCapture.h"

#include <algorithm>

namespace testsupport {

LogCapture::LogCapture() {
  platform::setLogSink([this](const platform::LogRecord& record) {
    platform::MutexLock lock(_mutex);
    _lines.push_back(fmt::format("{} {}: {}", platform::logLevelName(record.level), record.category,
                                 record.message));
  });
}

LogCapture::~LogCapture() {
  platform::setLogSink({});
}

std::vector<std::string> LogCapture::lines() const {
  platform::MutexLock lock(_mutex);
  return _lines;
}

bool LogCapture::has(const std::string& line) const {
  const auto all = lines();
  return std::find(all.begin(), all.end(), line) != all.end();
}

size_t LogCapture::count(const std::string& text) const {
  const auto all = lines();
  return static_cast<size_t>(std::count_if(all.begin(), all.end(), [&](const std::string& line) {
    return line.find(text) != std::string::npos;
  }));
}

bool LogCapture::contains(const std::string& text) const {
  return count(text) > 0;
}

void LogCapture::clear() {
  platform::MutexLock lock(_mutex);
  _lines.clear();
}

}  // namespace testsupport
