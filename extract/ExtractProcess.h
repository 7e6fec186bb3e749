#pragma once

#include <sys/types.h>

#include <chrono>
#include <optional>
#include <string>
#include <string_view>

#include "extract/Protocol.h"
#include "platform/FileDescriptor.h"

namespace extract {

// The text of attachments, by a process of its own that runs tallow-extract. It is started when the
// first text is wanted, started again after it has ended or taken too long, and ended with this
// object. One thread.
class ExtractProcess {
 public:
  using Clock = std::chrono::steady_clock;

  static constexpr std::chrono::seconds kStartPatience{10};
  static constexpr std::chrono::seconds kPatience{10};       // for one text
  static constexpr size_t kMaxFileBytes = size_t{32} << 20;  // of an attachment
  // Two starts that fail in succession end all attempts.
  static constexpr int kMaxFailedStarts = 2;

  struct Text {
    Outcome outcome;
    std::string text;  // UTF-8; any bytes if the process was taken over
  };

  // `program` is the path of tallow-extract.
  explicit ExtractProcess(std::string program) : _program(std::move(program)) {}
  ~ExtractProcess() { end(); }
  ExtractProcess(const ExtractProcess&) = delete;
  ExtractProcess& operator=(const ExtractProcess&) = delete;

  // The text of a file, at most `limit` bytes and after at most `patience`, besides a start of the
  // program.
  [[nodiscard]] Text text(Kind kind, std::string_view file, size_t limit,
                          std::chrono::milliseconds patience = kPatience);

 private:
  [[nodiscard]] bool start();
  [[nodiscard]] bool spawn();
  void end();
  [[nodiscard]] bool request(Kind kind, std::string_view file, uint32_t limit);
  // Both false at the end of the process and of the time.
  [[nodiscard]] bool read(std::string& bytes, size_t size, Clock::time_point until);
  [[nodiscard]] std::optional<Text> reply(uint32_t limit, Clock::time_point until);

  const std::string _program;
  platform::FileDescriptor _socket;
  pid_t _process = -1;
  int _failedStarts = 0;
};

}  // namespace extract
