#pragma once

#include <string>
#include <string_view>

#include "cli/Options.h"
#include "platform/TLError.h"

namespace cli {

// Runs one command. Its result goes to the standard output, everything else to the standard error.
[[nodiscard]] ExitStatus runCommand(const Options& options);

// Parts of runCommand: from nothing to the first search.
[[nodiscard]] ExitStatus runSetup(const Options& options);

// The command that reads mail.
[[nodiscard]] ExitStatus runIndex(const Options& options);

// The commands that keep the index in step with mailboxes.
[[nodiscard]] ExitStatus runSync(const Options& options);
[[nodiscard]] ExitStatus runWatch(const Options& options);
[[nodiscard]] ExitStatus runStatus(const Options& options);

// The commands that search.
[[nodiscard]] ExitStatus runSearch(const Options& options);
[[nodiscard]] ExitStatus runExplain(const Options& options);

// The commands for single mails, people and saved searches.
[[nodiscard]] ExitStatus runShow(const Options& options);
[[nodiscard]] ExitStatus runDelete(const Options& options);
[[nodiscard]] ExitStatus runAddress(const Options& options);
[[nodiscard]] ExitStatus runSave(const Options& options);

// The commands that read an index without the daemon.
[[nodiscard]] ExitStatus runDump(const Options& options);
[[nodiscard]] ExitStatus runValidate(const Options& options);
[[nodiscard]] ExitStatus runPurge(const Options& options);

// Writes the result of a command, or a part of it. Fails on a full disk or a closed pipe.
[[nodiscard]] ExitStatus print(std::string_view text, ExitStatus status = ExitStatus::done);

// Writes "tallow: MESSAGE" to the standard error.
void complain(const std::string& message);

// The same for an error. Returns the matching exit status.
ExitStatus complain(const std::optional<TLError>& error);

}  // namespace cli
