#include "bench/MemoryWatch.h"

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <string>
#include <string_view>

#include "platform/Queue.h"

namespace bench {

namespace {

constexpr std::chrono::milliseconds kSampleInterval(20);

std::string statusOf(pid_t process) {
  std::ifstream file("/proc/" + std::to_string(process) + "/status");
  return std::string(std::istreambuf_iterator<char>(file), {});
}

uint64_t numberIn(const std::string& status, std::string_view field) {
  const size_t at = status.find('\n' + std::string(field));
  return at == std::string::npos ? 0
                                 : strtoull(status.c_str() + at + 1 + field.size(), nullptr, 10);
}

uint64_t statusBytes(const std::string& status, std::string_view field) {
  return numberIn(status, field) * 1024;  // the kernel writes kilobytes
}

}  // namespace

uint64_t statusNumber(pid_t process, std::string_view field) {
  return numberIn(statusOf(process), field);
}

MemoryWatch::MemoryWatch(pid_t process) : _process(process), _sampler([this] { sample(); }) {}

void MemoryWatch::look() {
  if (_ending) return;
  const std::string status = statusOf(_process);
  const uint64_t anonymous = statusBytes(status, "RssAnon:");
  if (anonymous == 0) return;  // the process has ended
  _memory.anonymous = anonymous;
  _memory.anonymousPeak = std::max(_memory.anonymousPeak, anonymous);
  _memory.residentPeak = std::max(_memory.residentPeak, statusBytes(status, "VmHWM:"));
}

void MemoryWatch::sample() {
  platform::setThreadName("bench.memory");
  platform::MutexLock lock(_mutex);
  while (!_ending) {
    look();
    _changed.wait_for(_mutex, kSampleInterval);
  }
}

void MemoryWatch::stop() {
  if (!_sampler.joinable()) return;
  {
    platform::MutexLock lock(_mutex);
    _ending = true;
  }
  _changed.notify_all();
  _sampler.join();
}

Memory MemoryWatch::memory() {
  platform::MutexLock lock(_mutex);
  look();
  return _memory;
}

}  // namespace bench
