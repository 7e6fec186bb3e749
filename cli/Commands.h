#pragma once

#include <string>
#include <string_view>

#include "cli/Options.h"
#include "platform/TLError.h"

namespace cli {

// Carries out one command: its result goes to the standard output, all else to the standard error.
[[nodiscard]] ExitStatus runCommand(const Options& options);

// Of runCommand, the one that reads mail.
[[nodiscard]] ExitStatus runIndex(const Options& options);

// Of runCommand, those that keep the index in step with mailboxes.
[[nodiscard]] ExitStatus runSync(const Options& options);
[[nodiscard]] ExitStatus runWatch(const Options& options);
[[nodiscard]] ExitStatus runStatus(const Options& options);

// Of runCommand, those that search.
[[nodiscard]] ExitStatus runSearch(const Options& options);
[[nodiscard]] ExitStatus runExplain(const Options& options);

// Of runCommand, those for single mails, people, and searches that are kept.
[[nodiscard]] ExitStatus runShow(const Options& options);
[[nodiscard]] ExitStatus runDelete(const Options& options);
[[nodiscard]] ExitStatus runAddress(const Options& options);
[[nodiscard]] ExitStatus runSave(const Options& options);

// Of runCommand, those that look at an index without the daemon.
[[nodiscard]] ExitStatus runDump(const Options& options);
[[nodiscard]] ExitStatus runValidate(const Options& options);
[[nodiscard]] ExitStatus runPurge(const Options& options);

// Writes the result of a command, or a piece of it; a full disk or a closed pipe is a failure.
[[nodiscard]] ExitStatus print(std::string_view text, ExitStatus status = ExitStatus::done);

// Says "tallow: MESSAGE" on the standard error.
void complain(const std::string& message);

// The same for an error; the status that goes with it.
ExitStatus complain(const std::optional<TLError>& error);

}  // namespace cli
