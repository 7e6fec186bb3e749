#pragma once

#include <cstdint>
#include <functional>
#include <string>

namespace cli {

// Maximum depth of subdirectories below the named directory.
inline constexpr size_t kMaxDirectoryDepth = 64;

// The subdirectory that marks a directory as a LinkFolder, whose links are not mail of their own.
inline constexpr const char* kLinkFolderMark = ".tallow-folder";
[[nodiscard]] bool isLinkFolder(const std::string& directory);

// Receives what is found. Return false to stop.
struct WalkVisitor {
  // `path` is absolute; `named` is true if it is the path that was passed in.
  std::function<bool(const std::string& path, bool named, uint64_t size)> file;
  std::function<bool(const std::string& path, const std::string& reason)> failure;
};

// Visits the file `path`, or all files below the directory `path`, sorted by name, files before
// directories. Symbolic links to directories are followed only for `path` itself, so there are no
// loops; links to files are followed. The "tmp" directory of a Maildir and anything that is neither
// a file nor a directory is skipped, and so are link folders. False if the visitor has stopped.
bool walkMail(const std::string& path, const WalkVisitor& visitor);

}  // namespace cli
