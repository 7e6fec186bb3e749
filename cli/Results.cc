#include "cli/Results.h"

#include <fmt/format.h>

#include <cmath>
#include <ctime>
#include <nlohmann/json.hpp>
#include <optional>

#include "cli/Highlight.h"
#include "cli/Identifier.h"
#include "cli/SearchRun.h"

namespace cli {

namespace {

using Key = TLAttributeKey;

std::string textOf(const std::optional<TLString>& text) {
  return platform::toUTF8(platform::orEmpty(text));
}

// In the time zone of the user.
std::string dateText(const TLIndexableItem& item) {
  constexpr double kYear9999 = 253402300799;
  const auto date = dateOf(item);
  if (!date || !(std::fabs(*date) <= kYear9999)) return "----------------";
  const auto seconds = static_cast<time_t>(*date);
  tm parts{};
  if (localtime_r(&seconds, &parts) == nullptr) return "----------------";
  return fmt::format("{:04}-{:02}-{:02} {:02}:{:02}", parts.tm_year + 1900, parts.tm_mon + 1,
                     parts.tm_mday, parts.tm_hour, parts.tm_min);
}

std::string authorsText(const TLIndexableItem& item) {
  std::string text;
  const auto* persons = item.personValuesForKey(Key::AUTHORS);
  if (persons == nullptr) return text;
  for (const auto& person : *persons) {
    if (!text.empty()) text += ", ";
    text += textOf(person->hasName() ? person->name() : person->emailAddress());
  }
  return text;
}

nlohmann::json personsJSON(const TLIndexableItem& item, Key key) {
  nlohmann::json list = nlohmann::json::array();
  const auto* persons = item.personValuesForKey(key);
  if (persons == nullptr) return list;
  for (const auto& person : *persons) list.push_back(person->dictionaryRepresentation());
  return list;
}

nlohmann::json cardJSON(const TLIndexableItem& item) {
  nlohmann::json json = nlohmann::json::object();
  if (!item.hasCard()) return json;
  const TLCard& card = *item.card();
  if (card.hasTextScore()) json["textScore"] = card.textScore();
  if (card.hasLightScore()) json["lightScore"] = card.lightScore();
  if (card.hasFreshness()) json["freshness"] = card.freshness();
  return json;
}

nlohmann::json resultJSON(const TLIndexableItem& item, size_t rank) {
  nlohmann::json json = cardJSON(item);
  json["rank"] = rank;
  json["identifier"] = textOf(item.identifier());
  json["domainIdentifier"] = textOf(item.domainIdentifier());
  json["subject"] = textOf(item.stringValueForKey(Key::SUBJECT));
  json["snippet"] = textOf(item.stringValueForKey(Key::CONTENT_SNIPPET));
  json["from"] = personsJSON(item, Key::AUTHORS);
  json["to"] = personsJSON(item, Key::RECIPIENTS);
  const auto date = dateOf(item);
  json["date"] = date ? nlohmann::json(*date) : nlohmann::json();
  return json;
}

std::string score(bool present, double value) {
  return present ? fmt::format("{:.4f}", value) : "-";
}

}  // namespace

std::string jsonText(const nlohmann::json& json) {
  return escapeJSONForTerminal(json.dump(2, ' ', false, nlohmann::json::error_handler_t::replace)) +
         '\n';
}

std::string resultsText(const ResultItems& items, const std::string& query,
                        const Palette& palette) {
  const auto words = queryWords(query);
  const auto marked = [&](const std::string& text, const char* base) {
    // Behind a match the colour around it goes on.
    return highlight(cleanForTerminal(text), words, palette.match, std::string(palette.end) + base);
  };
  std::string out;
  size_t rank = 0;
  for (const auto& item : items) {
    const std::string subject = textOf(item->stringValueForKey(Key::SUBJECT));
    const std::string snippet = textOf(item->stringValueForKey(Key::CONTENT_SNIPPET));
    out += fmt::format("{}{:3}{}  {}{}{}  {}{}{}\n", palette.rank, ++rank, palette.end,
                       palette.date, dateText(*item), palette.end, palette.from,
                       cleanForTerminal(authorsText(*item)), palette.end);
    out += fmt::format("     {}{}{}\n", palette.subject,
                       subject.empty() ? "(no subject)" : marked(subject, palette.subject),
                       palette.end);
    if (!snippet.empty()) out += fmt::format("     {}\n", marked(snippet, ""));
    out += fmt::format("     {}{}{}\n", palette.faint, cleanForTerminal(textOf(item->identifier())),
                       palette.end);
  }
  return out;
}

std::string resultsJSON(const ResultItems& items) {
  nlohmann::json list = nlohmann::json::array();
  for (const auto& item : items) list.push_back(resultJSON(*item, list.size() + 1));
  return jsonText(list);
}

std::string resultsFiles(const ResultItems& items) {
  std::string out;
  for (const auto& item : items) {
    const std::string identifier = textOf(item->identifier());
    const auto location = parseIdentifier(identifier);
    std::string line = identifier;
    if (location && location->offset) {
      line = fmt::format("{}:{}", location->path, *location->offset);
    } else if (location) {
      line = findMaildirFile(location->path);
    }
    out += cleanForTerminal(line) + '\n';
  }
  return out;
}

std::string scoresText(const ResultItems& items, const Palette& palette) {
  std::string out =
      fmt::format("{}{:>4}  {:>10}  {:>10}  {:>9}  {:16}  {}{}\n", palette.faint, "rank",
                  "textScore", "lightScore", "freshness", "date", "identifier", palette.end);
  size_t rank = 0;
  for (const auto& item : items) {
    const TLCard none;
    const TLCard& card = item->hasCard() ? *item->card() : none;
    out += fmt::format("{:4}  {:>10}  {:>10}  {:>9}  {:16}  {}\n", ++rank,
                       score(card.hasTextScore(), card.textScore()),
                       score(card.hasLightScore(), card.lightScore()),
                       score(card.hasFreshness(), card.freshness()), dateText(*item),
                       cleanForTerminal(textOf(item->identifier())));
  }
  return out;
}

nlohmann::json scoresJSON(const ResultItems& items) {
  nlohmann::json list = nlohmann::json::array();
  for (const auto& item : items) {
    nlohmann::json row = cardJSON(*item);
    const auto date = dateOf(*item);
    row["rank"] = list.size() + 1;
    row["date"] = date ? nlohmann::json(*date) : nlohmann::json();
    row["identifier"] = textOf(item->identifier());
    list.push_back(std::move(row));
  }
  return list;
}

}  // namespace cli
