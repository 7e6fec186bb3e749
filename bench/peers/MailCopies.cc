#include "bench/peers/MailCopies.h"

#include <algorithm>
#include <cctype>
#include <fstream>
#include <iterator>
#include <stdexcept>
#include <string_view>

namespace peers {

namespace fs = std::filesystem;

namespace {

// The header field of that name, from the name on; npos when the header has none.
size_t findField(std::string_view mail, std::string_view name) {
  for (size_t line = 0; line < mail.size() && mail[line] != '\n' && mail[line] != '\r';) {
    const std::string_view start = mail.substr(line, name.size());
    const bool same = std::equal(start.begin(), start.end(), name.begin(), name.end(),
                                 [](unsigned char a, char b) { return std::tolower(a) == b; });
    if (same) return line;
    const size_t end = mail.find('\n', line);
    if (end == std::string_view::npos) break;
    line = end + 1;
  }
  return std::string_view::npos;
}

}  // namespace

std::vector<fs::path> mailFiles(const fs::path& maildir) {
  std::vector<fs::path> all;
  for (const char* folder : {"cur", "new"}) {
    if (!fs::is_directory(maildir / folder)) continue;
    std::vector<fs::path> mails;
    for (const auto& entry : fs::directory_iterator(maildir / folder)) {
      if (entry.is_regular_file()) mails.push_back(entry.path());
    }
    std::sort(mails.begin(), mails.end());
    all.insert(all.end(), mails.begin(), mails.end());
  }
  return all;
}

std::string readMail(const fs::path& path) {
  std::ifstream file(path, std::ios::binary);
  std::string mail{std::istreambuf_iterator<char>(file), {}};
  if (!file) throw std::runtime_error(path.string() + ": cannot be read");
  return mail;
}

void writeMail(const fs::path& path, const std::string& mail) {
  std::ofstream file(path, std::ios::binary);
  if (!(file << mail).flush()) throw std::runtime_error(path.string() + ": cannot be written");
}

std::string withWordInSubject(std::string mail, const std::string& word) {
  constexpr std::string_view kField = "subject:";
  const size_t field = findField(mail, kField);
  if (field == std::string_view::npos) return "Subject: " + word + '\n' + mail;
  return mail.insert(field + kField.size(), ' ' + word);
}

std::string MailCopier::copy(const std::string& mail, size_t number) {
  constexpr std::string_view kField = "message-id:";
  std::string copy = mail;
  if (const size_t field = findField(copy, kField); field != std::string_view::npos) {
    const size_t id = copy.find_first_not_of("< \t\r\n", field + kField.size());
    const bool empty = id == std::string::npos || copy[id - 1] == '\n';  // the next field
    if (!empty) copy.insert(id, "copy" + std::to_string(number) + '.');
  }
  if (!copy.ends_with('\n')) copy += '\n';
  return copy + word() + '\n';
}

std::string MailCopier::word() {
  constexpr size_t kLetters = 10;
  std::string word(kLetters, ' ');
  for (char& letter : word) letter = static_cast<char>('a' + _random() % 26);
  return word;
}

void MailCopier::multiply(
    const fs::path& path, size_t times,
    const std::function<void(const std::string& name, const std::string& mail)>& visit) {
  const std::string mail = readMail(path);
  const std::string name = path.filename();
  visit(name, mail);
  for (size_t number = 1; number < times; ++number) {
    visit("copy" + std::to_string(number) + '.' + name, copy(mail, number));
  }
}

}  // namespace peers
