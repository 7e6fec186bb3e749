#pragma once

#include <string>
#include <vector>

#include "desktop/MailSearch.h"

struct sd_bus_message;

// The arguments and replies of the search interfaces of the desktops. All functions return a
// negative errno value on failure.
namespace desktop {

// The one action of a result in KDE beside opening it.
inline constexpr const char* kShowAction = "show";

// Reads a list of texts.
int readTexts(sd_bus_message* call, std::vector<std::string>& texts);

// The identifiers of the results: as.
int appendIdentifiers(sd_bus_message* reply, const FoundMails& mails);

// What GNOME shows of one result: a{sv}.
int appendMeta(sd_bus_message* reply, const FoundMail& mail);

// The results as KDE shows them: a(sssida{sv}).
int appendMatches(sd_bus_message* reply, const FoundMails& mails);

// The actions of each result in KDE: a(sss).
int appendActions(sd_bus_message* reply);

// The settings of the runner in KDE: a{sv}.
int appendConfig(sd_bus_message* reply);

}  // namespace desktop
