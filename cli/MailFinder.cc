#include "cli/MailFinder.h"

#include <algorithm>
#include <cstdlib>
#include <map>

#include "cli/MailProgramSettings.h"
#include "cli/MailWalker.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "sync/Inventory.h"
#include "sync/MailSync.h"

namespace cli {

namespace {

// Below the home directory: where people, delivery agents and mail programs usually keep mail.
constexpr const char* kUsualPlaces[] = {"Maildir",
                                        "Mail",
                                        "mail",
                                        ".mail",
                                        "mbox",
                                        ".local/share/mail",
                                        ".local/share/local-mail",
                                        ".local/share/evolution/mail/local"};

// Whether each candidate may lie outside of the home directory, by path as it was found.
using Candidates = std::map<std::string, bool>;

void addVariable(Candidates& candidates, const char* name) {
  const char* const value = std::getenv(name);
  if (value != nullptr && *value == '/') candidates[value] = true;
}

Candidates candidatesOf(const std::string& home, const std::vector<std::string>& known) {
  Candidates candidates;
  for (const char* const place : kUsualPlaces) candidates[platform::joinPath(home, place)] = false;
  for (const std::string& path : placesOfMailPrograms(home)) candidates[path] = false;
  for (const char* const name : {"MAILDIR", "MAIL"}) addVariable(candidates, name);
  for (const std::string& path : known) candidates[path] = true;
  return candidates;
}

// Why a candidate is not taken; empty if it is.
std::string refusal(const std::string& path, const std::string& home, bool anywhere) {
  if (mailsync::isAtOrBelow(home, path)) return "holds your whole home directory";
  if (!anywhere && !mailsync::isAtOrBelow(path, home)) {
    return "is outside of your home directory; `tallow setup DIR` takes it";
  }
  return "";
}

FoundMail countMail(std::vector<std::string> paths, bool evenEmpty) {
  FoundMail found;
  MailCounter counter;
  for (std::string& path : mailsync::outermost(std::move(paths))) {
    const MailCount count = counter.count(path);
    if (!count.unreadable.empty()) found.remarks.push_back(count.unreadable);
    if (count.boxes > 0 || !count.complete || evenEmpty) {
      found.places.push_back({std::move(path), count});
    }
  }
  return found;
}

}  // namespace

FoundMail findMail(const std::string& home, const std::vector<std::string>& known) {
  const std::string canonicalHome = mailsync::canonicalPath(home);
  std::vector<std::string> paths;
  std::map<std::string, std::string> refused;  // reason by canonical path
  for (const auto& [path, anywhere] : candidatesOf(home, known)) {
    if (!platform::fileExists(path)) continue;
    const std::string canonical = mailsync::canonicalPath(path);
    const std::string reason = refusal(canonical, canonicalHome, anywhere);
    if (reason.empty()) {
      paths.push_back(canonical);
    } else {
      refused[canonical] = reason;
    }
  }
  for (const std::string& path : paths) refused.erase(path);
  FoundMail found = countMail(std::move(paths), false);
  for (const auto& [path, reason] : refused) found.remarks.push_back(path + " " + reason);
  return found;
}

FoundMail lookAtMail(const std::vector<std::string>& paths) {
  std::vector<std::string> canonical;
  for (const std::string& path : paths) canonical.push_back(mailsync::canonicalPath(path));
  return countMail(std::move(canonical), true);
}

}  // namespace cli
