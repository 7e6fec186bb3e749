#include "cli/MailCount.h"

#include <fmt/format.h>

#include <algorithm>
#include <filesystem>
#include <vector>

#include "cli/MailFile.h"
#include "cli/MailWalker.h"

namespace cli {

namespace {

namespace fs = std::filesystem;

// The kind that the directory itself tells, so that most entries need no look of their own. Links
// are none.
fs::file_type typeOf(const fs::directory_entry& entry) {
  std::error_code gone;
  if (entry.is_symlink(gone)) return fs::file_type::symlink;
  if (entry.is_directory(gone)) return fs::file_type::directory;
  return entry.is_regular_file(gone) ? fs::file_type::regular : fs::file_type::unknown;
}

bool isMaildir(const fs::path& directory) {
  std::error_code ignored;
  return fs::is_directory(directory / "cur", ignored) &&
         fs::is_directory(directory / "new", ignored);
}

bool isPartOfMaildir(const fs::path& name) {
  return name == "cur" || name == "new" || name == "tmp";
}

void noteFailure(MailCount& count, const fs::path& path, const std::error_code& failure) {
  if (failure && count.unreadable.empty()) {
    count.unreadable = path.string() + ": " + failure.message();
  }
}

}  // namespace

// Whether another directory or file may be read.
bool MailCounter::take(MailCount& count) {
  count.complete =
      count.complete && _directories < kMaxDirectories && std::chrono::steady_clock::now() < _end;
  return count.complete;
}

// The number of mails in a long mbox file is estimated from its beginning.
MailCounter::FileKind MailCounter::countFile(const std::string& path, uint64_t size,
                                             MailCount& count) {
  uint64_t mails = 0;
  uint64_t bytes = 0;
  FileKind kind = FileKind::other;
  const MailSink sink{[&](std::string_view, const MessageOrigin& origin) {
                        ++mails;
                        kind = origin.offset ? FileKind::mbox : FileKind::message;
                        return bytes < kReadOfMbox;
                      },
                      [](const std::string&, const std::string&) { return true; },
                      [](const std::string&) {}, [&](uint64_t more) { bytes += more; }};
  readMailFile(path, false, sink);
  const bool partly = kind == FileKind::mbox && bytes < size;
  count.estimated = count.estimated || partly;
  count.mails += partly ? mails * size / std::max<uint64_t>(bytes, 1) : mails;
  return kind;
}

// Each file in a Maildir's cur or new is a mail.
void MailCounter::countMaildirFiles(const fs::path& directory, MailCount& count) {
  std::error_code failure;
  fs::directory_iterator at(directory, failure);
  for (const fs::directory_iterator end; !failure && at != end && take(count);
       at.increment(failure)) {
    if (typeOf(*at) == fs::file_type::regular) ++count.mails;
  }
  noteFailure(count, directory, failure);
}

void MailCounter::countDirectory(const Directory& directory, MailCount& count,
                                 std::vector<Directory>& pending) {
  const bool maildir = isMaildir(directory.path);
  bool messages = false;
  std::error_code failure;
  fs::directory_iterator at(directory.path, failure);
  for (const fs::directory_iterator end; !failure && at != end && take(count);
       at.increment(failure)) {
    const auto type = typeOf(*at);
    if (type == fs::file_type::directory && !(maildir && isPartOfMaildir(at->path().filename()))) {
      pending.push_back({at->path(), directory.depth + 1});
    } else if (type == fs::file_type::regular && !maildir) {
      std::error_code gone;
      const FileKind kind = countFile(at->path(), at->file_size(gone), count);
      count.boxes += kind == FileKind::mbox ? 1 : 0;
      messages = messages || kind == FileKind::message;
    }
  }
  noteFailure(count, directory.path, failure);
  if (maildir) {
    countMaildirFiles(directory.path / "cur", count);
    countMaildirFiles(directory.path / "new", count);
  }
  if (maildir || messages) ++count.boxes;
}

MailCount MailCounter::count(const std::string& path) {
  MailCount count;
  std::error_code failure;
  if (fs::is_regular_file(path, failure)) {
    const FileKind kind = countFile(path, fs::file_size(path, failure), count);
    count.boxes = kind == FileKind::other ? 0 : 1;
    return count;
  }
  std::vector<Directory> pending{{path, 0}};
  while (!pending.empty() && take(count)) {
    const Directory directory = std::move(pending.back());
    pending.pop_back();
    ++_directories;
    if (isLinkFolder(directory.path)) continue;
    if (directory.depth > kMaxDepth) {
      count.complete = false;
      break;
    }
    countDirectory(directory, count, pending);
  }
  return count;
}

std::string countText(const MailCount& count) {
  const char* const roughly = !count.complete ? "at least " : count.estimated ? "about " : "";
  return fmt::format("{}{} {} in {} {}", roughly, count.mails, count.mails == 1 ? "mail" : "mails",
                     count.boxes, count.boxes == 1 ? "folder" : "folders");
}

}  // namespace cli
