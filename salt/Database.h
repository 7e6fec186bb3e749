#pragma once

#include <leveldb/cache.h>
#include <leveldb/db.h>
#include <leveldb/env.h>

#include <memory>
#include <string>
#include <string_view>

#include "platform/Log.h"

namespace salt {

inline constexpr platform::Log Log{platform::kSubsystem, "SALT"};

// Passes what leveldb says of itself to the log, at debug level, cut to 99 bytes a line.
class LeveldbLogger final : public leveldb::Logger {
 public:
  void Logv(const char* format, va_list arguments) override;
};

// An open database with what it needs to live; goes down in the order database, cache, logger.
struct Database {
  std::unique_ptr<leveldb::Logger> logger;
  std::unique_ptr<leveldb::Cache> cache;
  std::unique_ptr<leveldb::DB> db;  // null when opening failed
};

enum class OpenMode { create, existing };

// `create` removes what is at `path` first. A failure is logged.
[[nodiscard]] Database openDatabase(const std::string& path, OpenMode mode);

inline leveldb::Slice slice(std::string_view bytes) {
  return {bytes.data(), bytes.size()};
}
inline std::string_view view(const leveldb::Slice& bytes) {
  return {bytes.data(), bytes.size()};
}

}  // namespace salt
