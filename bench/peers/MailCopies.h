#pragma once

#include <cstddef>
#include <filesystem>
#include <functional>
#include <random>
#include <string>
#include <vector>

namespace peers {

// Files of mail in a Maildir without folders, in the order of their names, those of "cur" first.
[[nodiscard]] std::vector<std::filesystem::path> mailFiles(const std::filesystem::path& maildir);

[[nodiscard]] std::string readMail(const std::filesystem::path& path);
void writeMail(const std::filesystem::path& path, const std::string& mail);

// The mail with a word before its subject. (A line at its end may be in no part that is indexed.)
[[nodiscard]] std::string withWordInSubject(std::string mail, const std::string& word);

// Makes mails that differ from others in the Message-ID and in one word, so that no indexer takes
// one for another. The same calls give the same mails.
class MailCopier {
 public:
  // The mail with another Message-ID, where it has one, and a line with a new word at its end.
  [[nodiscard]] std::string copy(const std::string& mail, size_t number);

  // Ten letters.
  [[nodiscard]] std::string word();

  // Hands out a mail, and after it `times` - 1 copies, whose names begin with the number of the
  // copy, so that those of one mail are not neighbours.
  void multiply(const std::filesystem::path& path, size_t times,
                const std::function<void(const std::string& name, const std::string& mail)>& visit);

 private:
  std::mt19937 _random;  // with the seed of the standard
};

}  // namespace peers
