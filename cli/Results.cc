#include "cli/Results.h"

#include <fmt/format.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <ctime>
#include <nlohmann/json.hpp>
#include <optional>
#include <unordered_map>

#include "cli/Highlight.h"
#include "cli/Identifier.h"
#include "cli/SearchRun.h"
#include "cli/TextMatch.h"

namespace cli {

namespace {

using Key = TLAttributeKey;

// Longer mails are not read to find a passage.
constexpr uint64_t kMaxContextBytes = uint64_t{1} << 20;

constexpr double kYear9999 = 253402300799;

std::string textOf(const std::optional<TLString>& text) {
  return platform::toUTF8(platform::orEmpty(text));
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

// RFC 3339, in the time zone of the user.
nlohmann::json timeJSON(const TLIndexableItem& item) {
  const auto date = dateOf(item);
  if (!date || !(std::fabs(*date) <= kYear9999)) return {};
  const auto seconds = static_cast<time_t>(*date);
  tm parts{};
  if (localtime_r(&seconds, &parts) == nullptr) return {};
  const long minutes = std::abs(parts.tm_gmtoff) / 60;
  return fmt::format("{:04}-{:02}-{:02}T{:02}:{:02}:{:02}{}{:02}:{:02}", parts.tm_year + 1900,
                     parts.tm_mon + 1, parts.tm_mday, parts.tm_hour, parts.tm_min, parts.tm_sec,
                     parts.tm_gmtoff < 0 ? '-' : '+', minutes / 60, minutes % 60);
}

nlohmann::json flagsJSON(const std::string& identifier, MailFacts& facts) {
  using usersyntax::Flag;
  nlohmann::json list = nlohmann::json::array();
  for (const Flag flag : {Flag::read, Flag::flagged, Flag::replied}) {
    if (facts.flag(identifier, flag).value_or(false)) list.push_back(usersyntax::nameOf(flag));
  }
  return list;
}

// The path and offset of a message, unescaped for programs.
std::string placeText(const TLIndexableItem& item, MailFacts& facts) {
  const std::string identifier = textOf(item.identifier());
  auto location = facts.reader().locate(identifier);
  if (!location) location = parseIdentifier(identifier);
  if (!location) return identifier;
  return location->offset ? fmt::format("{}:{}", location->path, *location->offset)
                          : location->path;
}

std::string entry(const std::string& text, bool raw) {
  return raw ? text + '\0' : cleanForTerminal(text) + '\n';
}

nlohmann::json replacedJSON(const std::vector<client::ReplacedWord>& words) {
  nlohmann::json list = nlohmann::json::array();
  for (const client::ReplacedWord& word : words) {
    list.push_back(
        {{"typed", word.typed}, {"replacement", word.replacement}, {"reason", word.reason}});
  }
  return list;
}

std::string score(bool present, double value) {
  return present ? fmt::format("{:.4f}", value) : "-";
}

}  // namespace

std::string dateText(const TLIndexableItem& item) {
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

std::string subjectText(const TLIndexableItem& item) {
  return textOf(item.stringValueForKey(Key::SUBJECT));
}

nlohmann::json resultJSON(const Hit& hit, size_t rank, MailFacts& facts) {
  const TLIndexableItem& item = *hit.item;
  const std::string identifier = textOf(item.identifier());
  nlohmann::json json = cardJSON(item);
  json["rank"] = rank;
  json["identifier"] = identifier;
  json["domainIdentifier"] = textOf(item.domainIdentifier());
  json["subject"] = subjectText(item);
  json["snippet"] = textOf(item.stringValueForKey(Key::CONTENT_SNIPPET));
  json["from"] = personsJSON(item, Key::AUTHORS);
  json["to"] = personsJSON(item, Key::RECIPIENTS);
  const auto date = dateOf(item);
  json["date"] = date ? nlohmann::json(*date) : nlohmann::json();
  json["time"] = timeJSON(item);
  json["folder"] = folderName(item);
  json["flags"] = flagsJSON(identifier, facts);
  const auto location = facts.reader().locate(identifier);
  json["path"] = location ? nlohmann::json(location->path) : nlohmann::json();
  const auto head = location ? facts.head(identifier) : std::nullopt;
  json["messageID"] = head ? nlohmann::json(head->messageID) : nlohmann::json();
  json["copies"] = nlohmann::json::array();
  for (const auto& copy : hit.copies) json["copies"].push_back(textOf(copy->identifier()));
  return json;
}

std::string jsonText(const nlohmann::json& json) {
  return escapeJSONForTerminal(json.dump(2, ' ', false, nlohmann::json::error_handler_t::replace)) +
         '\n';
}

Hits joinCopies(const ResultItems& items, MailFacts& facts) {
  const auto keyOf = [](const TLIndexableItem& item) {
    return fmt::format("{} {}", item.doubleValueForKey(Key::CONTENT_CREATION_DATE),
                       textOf(item.stringValueForKey(Key::SUBJECT)));
  };
  std::unordered_map<std::string, size_t> alike;
  for (const auto& item : items) ++alike[keyOf(*item)];
  Hits hits;
  std::unordered_map<std::string, size_t> known;  // by Message-ID
  for (const auto& item : items) {
    const std::string identifier = textOf(item->identifier());
    if (alike[keyOf(*item)] > 1 && facts.reader().locate(identifier)) {
      const auto head = facts.head(identifier);
      if (head && !head->messageID.empty()) {
        const auto [at, added] = known.try_emplace(head->messageID, hits.size());
        if (!added) {
          hits[at->second].copies.push_back(item);
          continue;
        }
      }
    }
    hits.push_back({item, {}});
  }
  return hits;
}

// The snippet if it contains a word, otherwise the passage of the mail with the most words. Only
// what fits into the columns counts; 0 for no limit.
std::string contextOf(const TLIndexableItem& item, const std::vector<std::string>& words,
                      size_t columns, MailFacts& facts) {
  constexpr size_t kMaxCharacters = 200;
  constexpr size_t kMarks = 4;  // for an ellipsis at each end
  std::string snippet = textOf(item.stringValueForKey(Key::CONTENT_SNIPPET));
  if (words.empty() || holdsWord(fitted(snippet, columns), words)) return snippet;
  const std::string identifier = textOf(item.identifier());
  const auto size = facts.reader().locate(identifier) ? facts.size(identifier) : std::nullopt;
  if (!size || *size > kMaxContextBytes) return snippet;
  const auto whole = facts.item(identifier);
  if (whole == nullptr) return snippet;
  const size_t characters =
      columns == 0 ? kMaxCharacters : std::min(kMaxCharacters, columns - kMarks);
  const std::string passage = passageOf(platform::toUTF8(bodyText(*whole)), words, characters);
  return passage.empty() ? snippet : passage;
}

std::string resultsText(const Page& page, const std::string& query, MailFacts& facts,
                        const Palette& palette, size_t columns) {
  constexpr size_t kIndent = 5;
  const auto words = queryWords(query);
  const size_t width = columns > 2 * kIndent ? columns - kIndent : 0;
  const auto marked = [&](const std::string& text, const char* base) {
    // After a match the surrounding colour continues.
    return highlight(fitted(cleanForTerminal(text), width), words, palette.match,
                     std::string(palette.end) + base);
  };
  std::string out;
  size_t rank = page.firstRank;
  for (const Hit& hit : page.hits) {
    const TLIndexableItem& item = *hit.item;
    const std::string subject = subjectText(item);
    const std::string snippet = contextOf(item, words, width, facts);
    constexpr size_t kBeforeAuthors = 18;
    const size_t authors = width > 2 * kBeforeAuthors ? width - kBeforeAuthors : 0;
    out += fmt::format("{}{:3}{}  {}{}{}  {}{}{}\n", palette.rank, rank++, palette.end,
                       palette.date, dateText(item), palette.end, palette.from,
                       fitted(cleanForTerminal(authorsText(item)), authors), palette.end);
    out += fmt::format("     {}{}{}\n", palette.subject,
                       subject.empty() ? "(no subject)" : marked(subject, palette.subject),
                       palette.end);
    if (!snippet.empty()) out += fmt::format("     {}\n", marked(snippet, ""));
    // Identifiers are not cut, because users copy them.
    out += fmt::format("     {}{}{}\n", palette.faint, cleanForTerminal(textOf(item.identifier())),
                       palette.end);
    for (const auto& copy : hit.copies) {
      out += fmt::format("     {}also {}{}\n", palette.faint,
                         cleanForTerminal(textOf(copy->identifier())), palette.end);
    }
  }
  return out;
}

std::string replacedText(const std::vector<client::ReplacedWord>& words) {
  std::string text;
  for (const client::ReplacedWord& word : words) {
    text += text.empty() ? "showing results for " : ", ";
    text += word.replacement + (word.reason == "stem" ? "..." : "");
  }
  return cleanForTerminal(text);
}

std::string resultsJSON(const Page& page, MailFacts& facts) {
  nlohmann::json list = nlohmann::json::array();
  for (const Hit& hit : page.hits) {
    list.push_back(resultJSON(hit, page.firstRank + list.size(), facts));
  }
  return jsonText({{"schema", 1},
                   {"total", page.total},
                   {"complete", page.complete},
                   {"changed", replacedJSON(page.replaced)},
                   {"results", std::move(list)}});
}

std::string resultsFiles(const Page& page, MailFacts& facts, bool raw) {
  std::string out;
  for (const Hit& hit : page.hits) {
    out += entry(placeText(*hit.item, facts), raw);
    for (const auto& copy : hit.copies) out += entry(placeText(*copy, facts), raw);
  }
  return out;
}

std::string resultsMessageIDs(const Page& page, MailFacts& facts, bool raw) {
  std::string out;
  for (const Hit& hit : page.hits) {
    const auto head = facts.head(textOf(hit.item->identifier()));
    if (head && !head->messageID.empty()) out += entry(head->messageID, raw);
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
