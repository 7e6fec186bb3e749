#include "bench/peers/SyncMailbox.h"

#include <stdexcept>
#include <utility>

namespace peers {

namespace fs = std::filesystem;

SyncMailbox::SyncMailbox(std::string root, const std::string& maildir, size_t times, size_t folders)
    : _root(std::move(root)), _sources(mailFiles(maildir)), _folders(folders) {
  if (_sources.empty()) throw std::runtime_error(maildir + ": there is no mail");
  for (size_t i = 0; i < _folders; ++i) {
    const fs::path folder = nextFolder();
    for (const char* part : {"cur", "new", "tmp"}) fs::create_directories(folder / part);
  }
  for (const fs::path& source : _sources) {
    _copier.multiply(source, times, [&](const std::string& name, const std::string& mail) {
      writeMail(nextFolder() / "cur" / name, mail);
      ++_mails;
      _bytes += mail.size();
    });
  }
}

fs::path SyncMailbox::nextFolder() {
  return fs::path(_root) / ("folder" + std::to_string(_nextFolder++ % _folders));
}

std::string SyncMailbox::deliver() {
  constexpr size_t kFirstNumber = 1000000;  // of copies, beyond those that the mailbox is made of
  const size_t number = _deliveries++;
  const std::string name = "delivered" + std::to_string(number) + ".bench";
  std::string word = "zq" + _copier.word();
  const fs::path folder = nextFolder();
  const std::string mail = readMail(_sources[number % _sources.size()]);
  writeMail(folder / "tmp" / name,
            withWordInSubject(_copier.copy(mail, kFirstNumber + number), word));
  fs::rename(folder / "tmp" / name, folder / "new" / name);
  return word;
}

}  // namespace peers
