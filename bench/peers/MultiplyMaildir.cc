#include <CLI/CLI.hpp>
#include <filesystem>
#include <stdexcept>

#include "bench/DaemonRun.h"
#include "bench/peers/MailCopies.h"

// Multiplies a Maildir to measure sizes that are not at hand.
namespace {

namespace fs = std::filesystem;

int run(int argc, char** argv) {
  std::string source;
  std::string target;
  size_t times = 1;
  CLI::App app("Makes a Maildir with all mails of another one and changed copies of them.",
               "multiply_maildir");
  app.add_option("SOURCE", source, "The Maildir to copy")
      ->required()
      ->check(CLI::ExistingDirectory);
  app.add_option("TARGET", target, "The Maildir to make, new or empty")->required();
  app.add_option("--times", times, "How many times as many mails (default: 1)")
      ->check(CLI::Range(size_t{1}, size_t{10000}));
  CLI11_PARSE(app, argc, argv);
  if (fs::exists(target) && !fs::is_empty(target)) {
    throw std::runtime_error(target + " is not empty");
  }
  for (const char* folder : {"cur", "new", "tmp"}) {
    fs::create_directories(fs::path(target) / folder);
  }
  peers::MailCopier copier;
  for (const fs::path& mail : peers::mailFiles(source)) {
    const fs::path folder = fs::path(target) / mail.parent_path().filename();
    copier.multiply(mail, times, [&](const std::string& name, const std::string& content) {
      peers::writeMail(folder / name, content);
    });
  }
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("multiply_maildir", run, argc, argv);
}
