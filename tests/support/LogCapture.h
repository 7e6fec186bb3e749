#pragma once

#include <string>
#include <vector>

#include "platform/Log.h"
#include "platform/Mutex.h"

namespace testsupport {

// Captures every log message of the process, at all levels, during its lifetime. Any thread may
// log.
class LogCapture {
 public:
  LogCapture();
  ~LogCapture();
  LogCapture(const LogCapture&) = delete;
  LogCapture& operator=(const LogCapture&) = delete;

  // "LEVEL CATEGORY: MESSAGE", in order.
  [[nodiscard]] std::vector<std::string> lines() const;

  // True if some line equals (`has`) or contains the text.
  [[nodiscard]] bool has(const std::string& line) const;
  [[nodiscard]] bool contains(const std::string& text) const;
  [[nodiscard]] size_t count(const std::string& text) const;
  void clear();

 private:
  mutable platform::Mutex _mutex;
  std::vector<std::string> _lines TL_GUARDED_BY(_mutex);
};

}  // namespace testsupport
