#include "desktop/Replies.h"

#include <systemd/sd-bus.h>

#include <cstdlib>

namespace desktop {

namespace {

constexpr const char* kIcon = "mail-read";

// KDE's number for results that may be meant, which come after exact ones such as programs.
constexpr int kPossibleMatch = 30;
constexpr double kBestRelevance = 0.7;  // from 0 to 1; the results of other runners have theirs
constexpr double kRelevanceStep = 0.01;
constexpr int kMinLetters = 2;

int appendText(sd_bus_message* reply, const char* key, const std::string& text) {
  return sd_bus_message_append(reply, "{sv}", key, "s", text.c_str());
}

int appendMatch(sd_bus_message* reply, const FoundMail& mail, double relevance) {
  return sd_bus_message_append(reply, "(sssida{sv})", mail.identifier.c_str(), mail.subject.c_str(),
                               kIcon, kPossibleMatch, relevance, 1, "subtext", "s",
                               mail.details.c_str());
}

}  // namespace

int readTexts(sd_bus_message* call, std::vector<std::string>& texts) {
  int result = sd_bus_message_enter_container(call, 'a', "s");
  const char* text = nullptr;
  while (result >= 0 && (result = sd_bus_message_read(call, "s", &text)) > 0) {
    texts.emplace_back(text);
  }
  return result < 0 ? result : sd_bus_message_exit_container(call);
}

int appendIdentifiers(sd_bus_message* reply, const FoundMails& mails) {
  int result = sd_bus_message_open_container(reply, 'a', "s");
  for (const FoundMail& mail : mails) {
    if (result >= 0) result = sd_bus_message_append(reply, "s", mail.identifier.c_str());
  }
  return result < 0 ? result : sd_bus_message_close_container(reply);
}

int appendMeta(sd_bus_message* reply, const FoundMail& mail) {
  int result = sd_bus_message_open_container(reply, 'a', "{sv}");
  if (result >= 0) result = appendText(reply, "id", mail.identifier);
  if (result >= 0) result = appendText(reply, "name", mail.subject);
  if (result >= 0) result = appendText(reply, "description", mail.details);
  if (result >= 0) result = appendText(reply, "gicon", kIcon);
  return result < 0 ? result : sd_bus_message_close_container(reply);
}

int appendMatches(sd_bus_message* reply, const FoundMails& mails) {
  int result = sd_bus_message_open_container(reply, 'a', "(sssida{sv})");
  double relevance = kBestRelevance;
  for (const FoundMail& mail : mails) {
    if (result >= 0) result = appendMatch(reply, mail, relevance);
    relevance -= kRelevanceStep;
  }
  return result < 0 ? result : sd_bus_message_close_container(reply);
}

int appendActions(sd_bus_message* reply) {
  return sd_bus_message_append(reply, "a(sss)", 1, kShowAction, "Show in a terminal",
                               "utilities-terminal");
}

int appendConfig(sd_bus_message* reply) {
  return sd_bus_message_append(reply, "a{sv}", 1, "MinLetterCount", "i", kMinLetters);
}

}  // namespace desktop
