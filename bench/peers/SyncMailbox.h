#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

#include "bench/peers/MailCopies.h"

namespace peers {

// A mailbox of several Maildir folders into which mail is delivered. One thread.
class SyncMailbox {
 public:
  // Makes it at `root`, with the mails of the Maildir, each of them `times` times with changes,
  // spread over so many folders.
  SyncMailbox(std::string root, const std::string& maildir, size_t times, size_t folders);

  [[nodiscard]] const std::string& root() const { return _root; }
  [[nodiscard]] uint64_t mails() const { return _mails; }
  [[nodiscard]] uint64_t bytes() const { return _bytes; }

  // Puts a mail into the next folder, as a delivery agent does. Returns a word that no other mail
  // has.
  std::string deliver();

 private:
  [[nodiscard]] std::filesystem::path nextFolder();

  const std::string _root;
  const std::vector<std::filesystem::path> _sources;
  const size_t _folders;
  MailCopier _copier;
  size_t _nextFolder = 0;
  size_t _deliveries = 0;
  uint64_t _mails = 0;
  uint64_t _bytes = 0;
};

}  // namespace peers
