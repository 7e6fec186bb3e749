#pragma once

#include <string>
#include <vector>

#include "cli/MailCount.h"

namespace cli {

// A place with mail: a Maildir, an mbox file, or a directory of these.
struct MailPlace {
  std::string path;  // canonical
  MailCount count;
};

struct FoundMail {
  std::vector<MailPlace> places;     // none below another, sorted
  std::vector<std::string> remarks;  // why something was skipped, for the user
};

// Finds the user's mail: in $MAILDIR and $MAIL, in the usual places below `home`, and where mail
// programs have it (see MailProgramSettings.h). `known` are further candidates. Only $MAILDIR,
// $MAIL and `known` may lie outside of the home directory, and none may hold all of it.
[[nodiscard]] FoundMail findMail(const std::string& home, const std::vector<std::string>& known);

// The same for places that the user named: each exists and is taken as it is.
[[nodiscard]] FoundMail lookAtMail(const std::vector<std::string>& paths);

}  // namespace cli
