#pragma once

#include <optional>
#include <string>

// The units of the user's systemd that run the daemon and `tallow watch`. Each call runs systemctl
// and waits for it, within bounds. Errors are texts for the user.
namespace cli {

// Whether the sockets and the watch are enabled and running.
[[nodiscard]] bool unitsAreOn();

// Starts the sockets, stops a running watch, and enables all units, so that they start at the next
// login whatever happens now. Changes nothing if no user manager answers.
[[nodiscard]] std::optional<std::string> enableUnits();

[[nodiscard]] std::optional<std::string> startWatchUnit();

}  // namespace cli
