#pragma once

#include <functional>
#include <string>

#include "cli/Mailboxes.h"
#include "cli/Options.h"
#include "sync/MailSync.h"

namespace cli {

// The settings that `sync`, `status` and searches share, from the command line.
[[nodiscard]] mailsync::SyncSettings syncSettings(const Options& options);

// The same for the mailboxes of one class.
[[nodiscard]] mailsync::SyncSettings syncSettings(const Options& options,
                                                  const MailboxGroup& group);

// True after SIGINT, SIGTERM or SIGHUP; a second signal ends the process at once. The first call
// installs the signal handlers.
[[nodiscard]] bool interrupted();

// One line, such as "3 added, 1 deleted".
[[nodiscard]] std::string summaryOf(const mailsync::SyncReport& report, bool dryRun);

}  // namespace cli
