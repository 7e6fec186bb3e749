#pragma once

#include <string>

// Starts programs for what was chosen on the desktop. None of these waits; failures are logged. All
// do nothing unless the user's settings switch the desktop search on.
namespace desktop {

// Opens the mail by $TALLOW_OPEN, or else shows it in a terminal.
void openMail(const std::string& identifier);

// Shows the mail by `tallow show` in a terminal.
void showMail(const std::string& identifier);

// Opens the screen to search as you type in a terminal, with these words typed.
void searchOnScreen(const std::string& words);

}  // namespace desktop
