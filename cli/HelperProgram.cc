#include "cli/HelperProgram.h"

#include <filesystem>

#include "cli/Commands.h"
#include "platform/Files.h"

namespace cli {

std::string helperProgramPath(const char* name) {
  std::error_code ignored;
  const auto bin = std::filesystem::read_symlink("/proc/self/exe", ignored).parent_path();
  const auto beside = bin / name;
  return std::filesystem::exists(beside, ignored) ? beside
                                                  : bin.parent_path() / "libexec/tallow" / name;
}

std::string extractProgram(const Options& options, bool setting) {
  if (!options.attachments.value_or(setting)) return {};
  std::string program = helperProgramPath("tallow-extract");
  if (platform::fileExists(program)) return program;
  if (options.attachments) complain(program + " is missing, so attachments are not read");
  return {};
}

}  // namespace cli
