#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

namespace cli {

// A rough count of the mail in a place.
struct MailCount {
  uint64_t mails = 0;
  uint64_t boxes =
      0;  // Maildir folders, mbox files, and directories with messages in files of their own
  bool estimated = false;  // of a long mbox file only the beginning was read
  bool complete = true;    // false: there may be more, because a bound of the counter was reached
  std::string unreadable;  // why the place, or the first part of it, cannot be read
};

// Counts mail in one place after another, within bounds that all of them share.
class MailCounter {
 public:
  static constexpr size_t kMaxDepth = 16;           // of directories below a place
  static constexpr size_t kMaxDirectories = 20000;  // in all places
  static constexpr uint64_t kReadOfMbox = uint64_t{4} << 20;
  static constexpr std::chrono::seconds kPatience{10};

  // `path` is canonical. Links are not followed.
  [[nodiscard]] MailCount count(const std::string& path);

 private:
  struct Directory {
    std::filesystem::path path;
    size_t depth;
  };
  enum class FileKind { other, message, mbox };

  bool take(MailCount& count);
  static FileKind countFile(const std::string& path, uint64_t size, MailCount& count);
  void countMaildirFiles(const std::filesystem::path& directory, MailCount& count);
  void countDirectory(const Directory& directory, MailCount& count,
                      std::vector<Directory>& pending);

  size_t _directories = 0;
  const std::chrono::steady_clock::time_point _end = std::chrono::steady_clock::now() + kPatience;
};

// "about 1234 mails in 5 folders", for one line.
[[nodiscard]] std::string countText(const MailCount& count);

}  // namespace cli
