#include "inspect/Purge.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <vector>

#include "docstore/StoreCopy.h"
#include "modification/TopKVocabArchive.h"
#include "platform/FileDescriptor.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "platform/ProcessLock.h"
#include "salt/Inspection.h"
#include "salt/Quarantine.h"

namespace inspect {

namespace {

namespace fs = std::filesystem;
using platform::joinPath;

constexpr const char* kStoreDirectory = "docstore";
constexpr const char* kStoreFile = "docstore.db";
// Extra space for the copy: during its compaction logs and tables exist twice.
constexpr uint64_t kSlackBytes = 32 * 1024 * 1024;

bool fail(int code, const std::string& message, TLErrorOut error) {
  platform::setError(error, {kPOSIXErrorDomain, code, message});
  return false;
}

bool failSystem(const std::string& path, TLErrorOut error) {
  platform::setError(error, platform::posixError(errno, path));
  return false;
}

uint64_t sizeOfFiles(const std::string& path) {
  uint64_t bytes = 0;
  std::error_code failure;
  for (fs::recursive_directory_iterator it(path, failure), end; !failure && it != end;
       it.increment(failure)) {
    std::error_code ignored;
    if (it->is_regular_file(ignored)) bytes += it->file_size(ignored);
  }
  return bytes;
}

bool syncItem(const std::string& path, TLErrorOut error) {
  const platform::FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  return (file.get() >= 0 && fsync(file.get()) == 0) || failSystem(path, error);
}

// Syncs everything in the directory, then the directory itself.
bool syncTree(const std::string& path, TLErrorOut error) {
  std::error_code failure;
  for (fs::recursive_directory_iterator it(path, failure), end; !failure && it != end;
       it.increment(failure)) {
    if (!syncItem(it->path(), error)) return false;
  }
  if (failure) return fail(failure.value(), path + ": " + failure.message(), error);
  return syncItem(path, error);
}

// The paths of a class's parts.
struct ClassPaths {
  explicit ClassPaths(std::string path)
      : directory(std::move(path)),
        index(joinPath(directory, "salt")),
        store(joinPath(joinPath(directory, kStoreDirectory), kStoreFile)) {}

  std::string directory;
  std::string index;
  std::string store;
};

class Purge {
 public:
  Purge(const std::string& state, const std::string& protectionClass, PurgeProgress progress)
      : _state(state),
        _class(protectionClass),
        _besides(platform::purgeDirectory(state)),
        _old(joinPath(platform::dataRoot(state), protectionClass)),
        _new(joinPath(_besides, protectionClass)),
        _progress(std::move(progress)) {}

  std::optional<PurgeReport> run(TLErrorOut error) {
    // Acquiring the lock would create its file, which exists wherever a daemon has run.
    if (!platform::fileExists(platform::processLockPath(_state))) {
      errno = ENOENT;
      failSystem(platform::processLockPath(_state), error);
      return std::nullopt;
    }
    const auto lock = platform::ProcessLock::acquire(platform::processLockPath(_state), error);
    if (lock == nullptr || !mayReplace(error)) return std::nullopt;
    step("removing the remains of an earlier purge");
    if (!platform::removeItem(_besides, error)) return std::nullopt;
    PurgeReport report;
    report.bytesBefore = sizeOfFiles(_old.directory);
    report.hadSetAside = !salt::indexesSetAside(_old.index).empty();
    if (!build(report, error) || !exchange(error)) {
      // After the exchange the work directory holds the old class; it must stay until the exchange
      // is on disk.
      if (!_exchanged) platform::removeItem(_besides, nullptr);
      return std::nullopt;
    }
    step("removing the old files");
    if (!platform::removeItem(_besides, error) || !syncItem(_state, error)) return std::nullopt;
    report.bytesAfter = sizeOfFiles(_old.directory);
    return report;
  }

  std::optional<PurgeReport> estimate(TLErrorOut error) {
    {
      const auto lock =
          platform::ProcessLock::acquireShared(platform::processLockPath(_state), error);
      if (lock == nullptr || !capture(error)) return std::nullopt;
    }
    const auto deleted = loadOld(error) ? deletedTexts(error) : std::nullopt;
    if (!deleted) return std::nullopt;
    PurgeReport report;
    report.documents = deleted->documents;
    report.hadSetAside = !salt::indexesSetAside(_old.index).empty();
    report.bytesBefore = sizeOfFiles(_old.directory);
    report.bytesAfter = estimatedBytes(*deleted);
    return report;
  }

 private:
  void step(const char* what) {
    _step = what;
    _progress(what);
  }

  // A purge would lose files in the class that are not the daemon's own.
  bool mayReplace(TLErrorOut error) {
    struct stat state {};
    if (stat(_state.c_str(), &state) != 0) return failSystem(_state, error);
    for (const std::string& path : {_old.directory, _old.index, _old.store}) {
      struct stat status {};
      if (lstat(path.c_str(), &status) != 0) return failSystem(path, error);
      if (S_ISLNK(status.st_mode)) {
        return fail(ELOOP, path + " is a symbolic link, so that its old files would stay", error);
      }
      if (status.st_dev != state.st_dev) {
        return fail(EXDEV, path + " is on another file system than " + _state, error);
      }
      if (status.st_uid != geteuid()) {
        return fail(EPERM, path + " belongs to another user; purge as that user", error);
      }
    }
    const auto names = platform::listDirectory(_old.directory, error);
    if (!names) return false;
    for (const std::string& name : *names) {
      if (name == kStoreDirectory || name == "salt" || name.starts_with("salt.")) continue;
      return fail(EEXIST, joinPath(_old.directory, name) + " is no file of the daemon's", error);
    }
    return true;
  }

  bool capture(TLErrorOut error) {
    _inspection = salt::Inspection::capture(_old.index, error);
    return _inspection != nullptr;
  }

  bool loadOld(TLErrorOut error) {
    if (_inspection->load() != nullptr) return true;
    return fail(EINVAL, _old.index + ": the index cannot be opened", error);
  }

  std::optional<salt::Inspection::Deleted> deletedTexts(TLErrorOut error) {
    auto deleted = _inspection->deleted();
    if (!deleted) fail(EIO, _old.index + ": the index cannot be read", error);
    return deleted;
  }

  [[nodiscard]] uint64_t estimatedBytes(const salt::Inspection::Deleted& deleted) const {
    const double share = deleted.allTextBytes == 0 ? 0
                                                   : static_cast<double>(deleted.textBytes) /
                                                         static_cast<double>(deleted.allTextBytes);
    const uint64_t store = sizeOfFiles(fs::path(_old.store).parent_path());
    return static_cast<uint64_t>(static_cast<double>(sizeOfFiles(_old.index)) * (1 - share)) +
           store - std::min(store, unusedStoreBytes(_old.store));
  }

  bool hasRoom(TLErrorOut error) {
    const auto deleted = deletedTexts(error);
    if (!deleted) return false;
    const uint64_t needed = estimatedBytes(*deleted) + kSlackBytes;
    const uint64_t free = platform::freeBytes(_state);
    if (free >= needed) return true;
    constexpr double kMegabyte = 1e6;
    return fail(
        ENOSPC,
        fmt::format("{}: {:.0f} MB are needed for a while, and {:.0f} MB are free", _state,
                    static_cast<double>(needed) / kMegabyte, static_cast<double>(free) / kMegabyte),
        error);
  }

  bool build(PurgeReport& report, TLErrorOut error) {
    step("opening the text index");
    if (!capture(error) || !loadOld(error) || !hasRoom(error)) return false;
    if (!platform::createDirectories(_besides, error) ||
        !platform::createDirectories(_new.directory, error, _class) ||
        !platform::createDirectories(fs::path(_new.store).parent_path(), error)) {
      return false;
    }
    step("copying the document store");
    const auto store = StoreCopy::make(_old.store, _new.store, error);
    const auto ids = store == nullptr ? std::nullopt : store->documentIDs(error);
    if (!ids) return false;
    step("copying the text index");
    const auto isStored = [&ids](uint32_t docID) {
      return std::binary_search(ids->begin(), ids->end(), docID);
    };
    const auto left = _inspection->copyLive(
        _new.index, isStored, [this] { _progress(_step); }, error);
    if (!left) return false;
    report.documents = *left;
    _inspection.reset();
    return check(*store, error);
  }

  // Compacts the copy, which also builds its posting lists, and reads all of it. Without space to
  // compact, the copy is correct but slower.
  bool check(StoreCopy& store, TLErrorOut error) {
    step("compacting the text index");
    const std::unique_ptr<salt::Index> index(salt::LoadIndex(_new.index, error));
    if (index == nullptr) {
      if (*error) return false;
      return fail(EINVAL, _new.index + ": the copy cannot be opened", error);
    }
    index->Compact();
    step("checking the text index");
    if (!index->Validate()) return fail(EINVAL, _old.index + ": the index is damaged", error);
    if (!purgeVocabulary(*index, store, error)) return false;
    return index->Sync() || fail(EIO, _new.index + ": the copy cannot be synced", error);
  }

  // Removes words that no document contains any more.
  static bool purgeVocabulary(const salt::Index& index, StoreCopy& store, TLErrorOut error) {
    const auto stored = store.vocabulary(error);
    if (!stored) return !*error;
    const auto entries = topkvocab::unarchive(*stored);
    const bool whole = entries && entries->size() == 3;
    const auto words = whole ? topkvocab::unarchiveWords((*entries)[0]) : std::nullopt;
    std::vector<std::string> kept;
    if (words) {
      const auto found = index.ScanPrefixes(*words, 1);
      for (size_t i = 0; i < words->size(); ++i) {
        if (!found[i].empty()) kept.push_back((*words)[i]);
      }
    }
    // If it is invalid, the daemon counts the vocabulary again.
    const auto docID = whole ? topkvocab::unarchiveDocID((*entries)[1]) : std::nullopt;
    const auto date = whole ? topkvocab::unarchiveDate((*entries)[2]) : std::nullopt;
    return store.setVocabulary(topkvocab::archive(kept, docID.value_or(0), date.value_or(0)),
                               error);
  }

  bool exchange(TLErrorOut error) {
    step("syncing to the disk");
    if (!syncTree(_besides, error) || !syncItem(_state, error)) return false;
    step("exchanging old and new");
    if (renameat2(AT_FDCWD, _new.directory.c_str(), AT_FDCWD, _old.directory.c_str(),
                  RENAME_EXCHANGE) != 0) {
      return failSystem("exchanging " + _new.directory + " and " + _old.directory, error);
    }
    _exchanged = true;
    return syncItem(platform::dataRoot(_state), error) && syncItem(_besides, error);
  }

  const std::string _state;
  const std::string _class;
  const std::string _besides;
  const ClassPaths _old;
  const ClassPaths _new;
  const PurgeProgress _progress;
  const char* _step = "";
  bool _exchanged = false;
  std::unique_ptr<salt::Inspection> _inspection;
};

}  // namespace

std::optional<PurgeReport> purge(const std::string& state, const std::string& protectionClass,
                                 const PurgeProgress& progress, TLErrorOut error) {
  std::optional<TLError> failure;
  auto report = Purge(state, protectionClass, progress).run(&failure);
  if (failure) platform::setError(error, *failure);
  return report;
}

std::optional<PurgeReport> estimatePurge(const std::string& state,
                                         const std::string& protectionClass, TLErrorOut error) {
  std::optional<TLError> failure;
  auto report = Purge(state, protectionClass, [](const char*) {}).estimate(&failure);
  if (failure) platform::setError(error, *failure);
  return report;
}

}  // namespace inspect
