#pragma once

#include <cstdint>
#include <functional>
#include <string>

namespace cli {

// How deep directories are entered below the one that was named.
inline constexpr size_t kMaxDirectoryDepth = 64;

// What a walk finds. Results are false to stop it.
struct WalkVisitor {
  // An absolute path, and whether it is the one that was named.
  std::function<bool(const std::string& path, bool named, uint64_t size)> file;
  std::function<bool(const std::string& path, const std::string& reason)> failure;
};

// Visits the file `path`, or all files below the directory `path`, in order of their names, files
// before directories. Symbolic links to directories are followed for `path` itself only, so there
// are no loops; links to files are followed. The "tmp" of a Maildir, and all that is neither file
// nor directory, is left out. False once the visitor has said stop.
bool walkMail(const std::string& path, const WalkVisitor& visitor);

}  // namespace cli
