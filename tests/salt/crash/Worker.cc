#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <memory>
#include <random>
#include <variant>

#include "platform/Assert.h"
#include "platform/Files.h"
#include "tests/salt/SaltSupport.h"
#include "tests/salt/crash/Workload.h"
#include "tests/support/FileSizeLimit.h"

namespace salttest {

namespace {

constexpr uint32_t kReopenings = 200;  // one in this many operations reopens the index first
constexpr uint32_t kShortages = 25;    // one in this many changes the available space

// During its lifetime the file system of `path` has only this much space left.
class DiskFiller {
 public:
  DiskFiller(const std::string& path, uint64_t room) : _ballast(ballastOf(path)) {
    const uint64_t free = platform::freeBytes(_ballast.parent_path());
    const int file = open(_ballast.c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0600);
    TL_ASSERT(file >= 0);
    static_cast<void>(
        posix_fallocate(file, 0, static_cast<off_t>(free - std::min(free, room)) + 1));
    close(file);
  }
  ~DiskFiller() { std::filesystem::remove(_ballast); }
  DiskFiller(const DiskFiller&) = delete;
  DiskFiller& operator=(const DiskFiller&) = delete;

 private:
  const std::filesystem::path _ballast;
};

class Worker {
 public:
  explicit Worker(const WorkerTask& task) : _task(task), _random(task.seed + task.generation) {}

  int run() {
    if (_task.create) _index = newIndex(_task.path, workloadOptions(_task.seed, _task.shortage));
    if (!_index) reopen();
    say(Report::opened);
    for (uint32_t number = _task.first;; ++number) {
      if (_random() % kReopenings == 0) reopen();
      if (_random() % kShortages == 0) changeSpace();
      say(answer(workloadOperation(_task.seed, number)) ? Report::done : Report::refused);
    }
  }

 private:
  static void say(Report report) {
    if (write(STDOUT_FILENO, &report, 1) != 1) _exit(2);
  }

  [[nodiscard]] bool isShort() const { return _shortage.index() != 0; }
  void endShortage() { _shortage.emplace<std::monostate>(); }

  // May fail without space, but never with it.
  void reopen() {
    _index.reset();
    _index = loadIndex(_task.path);
    if (_index) return;
    if (!isShort()) _exit(3);
    endShortage();
    reopen();
  }

  // Sets a new limit. A file may grow slightly beyond the log, enough for some operations or some
  // batches of a merge; or less, so that tables reach the limit too.
  void changeSpace() {
    if (isShort()) return endShortage();
    if (_task.shortage == Shortage::fullDisk) {
      _shortage.emplace<DiskFiller>(_task.path, _random() % 100000);
    } else if (_task.shortage == Shortage::fileSize) {
      const uint64_t log = std::filesystem::file_size(newestLog(_task.path));
      const uint64_t sizes[] = {log + _random() % 300, log + _random() % 20000, _random() % 20000};
      _shortage.emplace<testsupport::FileSizeLimit>(sizes[_random() % std::size(sizes)]);
    }
  }

  // Repeats until the answer cannot depend on space. Reopening the index makes leveldb forget an
  // earlier failure.
  bool answer(const Operation& operation) {
    while (isShort()) {
      if (carryOut(*_index, operation)) return true;
      say(Report::failed);
      if (_random() % 2 == 0) endShortage();
    }
    if (carryOut(*_index, operation)) return true;
    if (_task.shortage == Shortage::none) return false;
    reopen();
    return carryOut(*_index, operation);
  }

  const WorkerTask& _task;
  std::mt19937 _random;
  std::unique_ptr<salt::Index> _index;
  std::variant<std::monostate, testsupport::FileSizeLimit, DiskFiller> _shortage;
};

}  // namespace

int runWorker(const WorkerTask& task) {
  return Worker(task).run();
}

}  // namespace salttest
