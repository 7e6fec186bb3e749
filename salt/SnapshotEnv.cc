#include "salt/SnapshotEnv.h"

#include <fcntl.h>
#include <leveldb/helpers/memenv.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <string_view>

#include "platform/Files.h"
#include "platform/Paths.h"

namespace salt {

namespace {

// For a log or a manifest. leveldb starts a new log at about 6 MiB; a larger file is not ours.
constexpr size_t kMaxCopiedBytes = 256 * 1024 * 1024;

bool isNumber(std::string_view text) {
  return !text.empty() && text.find_first_not_of("0123456789") == std::string_view::npos;
}

// Names that leveldb gives; all other files are ignored.
bool isTable(std::string_view name) {
  return (name.ends_with(".ldb") || name.ends_with(".sst")) &&
         isNumber(name.substr(0, name.size() - 4));
}

bool isCopied(std::string_view name) {
  constexpr std::string_view kManifest = "MANIFEST-";
  return name == "CURRENT" ||
         (name.starts_with(kManifest) && isNumber(name.substr(kManifest.size()))) ||
         (name.ends_with(".log") && isNumber(name.substr(0, name.size() - 4)));
}

leveldb::Status refused(const std::string& path) {
  return leveldb::Status::IOError(path, "read-only snapshot");
}

// Reads from a descriptor that it does not own.
class TableReader final : public leveldb::RandomAccessFile {
 public:
  TableReader(std::string path, int descriptor) : _path(std::move(path)), _descriptor(descriptor) {}

  leveldb::Status Read(uint64_t offset, size_t n, leveldb::Slice* result,
                       char* scratch) const override {
    size_t done = 0;
    while (done < n) {
      const ssize_t got =
          pread(_descriptor, scratch + done, n - done, static_cast<off_t>(offset + done));
      if (got < 0 && errno == EINTR) continue;
      if (got < 0) {
        return leveldb::Status::IOError(platform::posixError(errno, _path).message);
      }
      if (got == 0) break;
      done += static_cast<size_t>(got);
    }
    *result = leveldb::Slice(scratch, done);
    return leveldb::Status::OK();
  }

 private:
  const std::string _path;
  const int _descriptor;
};

}  // namespace

SnapshotEnv::SnapshotEnv(std::unique_ptr<leveldb::Env> memory)
    : leveldb::EnvWrapper(memory.get()), _memory(std::move(memory)) {}

std::unique_ptr<SnapshotEnv> SnapshotEnv::capture(const std::string& directory, TLErrorOut error) {
  const auto names = platform::listDirectory(directory, error);
  if (!names) return nullptr;
  std::unique_ptr<leveldb::Env> memory(leveldb::NewMemEnv(leveldb::Env::Default()));
  std::unique_ptr<SnapshotEnv> files(new SnapshotEnv(std::move(memory)));
  for (const std::string& name : *names) {
    const std::string path = platform::joinPath(directory, name);
    if (isTable(name) && !files->addTable(path, error)) return nullptr;
    if (isCopied(name) && !files->addCopy(path, error)) return nullptr;
  }
  return files;
}

bool SnapshotEnv::addTable(const std::string& path, TLErrorOut error) {
  Table table{platform::FileDescriptor(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK)), 0};
  struct stat info;
  if (table.file.get() < 0 || fstat(table.file.get(), &info) != 0) {
    platform::setError(error, platform::posixError(errno, path));
    return false;
  }
  if (!S_ISREG(info.st_mode)) return true;  // not one of leveldb's
  table.size = static_cast<uint64_t>(info.st_size);
  _tables.emplace(path, std::move(table));
  return true;
}

bool SnapshotEnv::addCopy(const std::string& path, TLErrorOut error) {
  const auto bytes = platform::readFile(path, kMaxCopiedBytes, error);
  return bytes && leveldb::WriteStringToFile(_memory.get(), *bytes, path).ok();
}

const SnapshotEnv::Table* SnapshotEnv::table(const std::string& path) {
  const auto entry = _tables.find(path);
  return entry == _tables.end() || target()->FileExists(path) ? nullptr : &entry->second;
}

leveldb::Status SnapshotEnv::NewRandomAccessFile(const std::string& path,
                                                 leveldb::RandomAccessFile** file) {
  const Table* const captured = table(path);
  if (captured == nullptr) return target()->NewRandomAccessFile(path, file);
  *file = new TableReader(path, captured->file.get());
  return leveldb::Status::OK();
}

leveldb::Status SnapshotEnv::NewWritableFile(const std::string& path,
                                             leveldb::WritableFile** file) {
  return mayWrite() ? target()->NewWritableFile(path, file) : refused(path);
}

leveldb::Status SnapshotEnv::NewAppendableFile(const std::string& path,
                                               leveldb::WritableFile** file) {
  return mayWrite() ? target()->NewAppendableFile(path, file) : refused(path);
}

bool SnapshotEnv::FileExists(const std::string& path) {
  return table(path) != nullptr || target()->FileExists(path);
}

leveldb::Status SnapshotEnv::GetChildren(const std::string& directory,
                                         std::vector<std::string>* names) {
  const leveldb::Status status = target()->GetChildren(directory, names);
  for (const auto& [path, captured] : _tables) {
    if (table(path) != nullptr) names->push_back(path.substr(path.rfind('/') + 1));
  }
  return status;
}

// leveldb removes a captured table when it no longer needs it; the file stays.
leveldb::Status SnapshotEnv::RemoveFile(const std::string& path) {
  return table(path) != nullptr ? leveldb::Status::OK() : target()->RemoveFile(path);
}

leveldb::Status SnapshotEnv::GetFileSize(const std::string& path, uint64_t* size) {
  const Table* const captured = table(path);
  if (captured == nullptr) return target()->GetFileSize(path, size);
  *size = captured->size;
  return leveldb::Status::OK();
}

}  // namespace salt
