#pragma once

#include <memory>
#include <nlohmann/json_fwd.hpp>
#include <span>
#include <string>
#include <vector>

#include "cli/MailFacts.h"
#include "cli/Options.h"
#include "cli/Terminal.h"
#include "client/SearchServiceProxy.h"
#include "records/TLIndexableItem.h"

namespace cli {

using ResultItems = std::vector<std::shared_ptr<TLIndexableItem>>;

// A result: the best copy of a message, and the other copies.
struct Hit {
  std::shared_ptr<TLIndexableItem> item;
  std::vector<std::shared_ptr<TLIndexableItem>> copies;
};
using Hits = std::vector<Hit>;

// Merges copies of a message in several folders, which have the same Message-ID. Ordered by the
// best copy. Only mails with the same subject and date are compared.
[[nodiscard]] Hits joinCopies(const ResultItems& items, MailFacts& facts);

// The part of the hits to show; the first one has the rank `firstRank`.
struct Page {
  std::span<const Hit> hits;
  size_t firstRank = 1;
  size_t total = 0;      // of all hits
  bool complete = true;  // false: there may be more than `total`
  std::vector<client::ReplacedWord> replaced;
};

// The output of a search as one text without control characters. Lines fit into `columns`; 0 for no
// limit. If the snippet contains no word, the mail is read to find a passage that does.
[[nodiscard]] std::string resultsText(const Page& page, const std::string& words, MailFacts& facts,
                                      const Palette& palette, size_t columns);
// An object: "schema" is 1, "total" and "complete" as in the page, "changed" a list of the replaced
// words, "results" a list of objects.
[[nodiscard]] std::string resultsJSON(const Page& page, MailFacts& facts);
// One path per entry, also for copies, with ":OFFSET" for a message of an mbox file. An item of
// another client is shown by its identifier. With `raw`, each entry is unescaped and ends with NUL.
[[nodiscard]] std::string resultsFiles(const Page& page, MailFacts& facts, bool raw);
// One Message-ID per entry; messages without one are left out.
[[nodiscard]] std::string resultsMessageIDs(const Page& page, MailFacts& facts, bool raw);

// A line for the user about the words that the daemon replaced: "showing results for invoices".
// Empty if it replaced nothing.
[[nodiscard]] std::string replacedText(const std::vector<client::ReplacedWord>& words);
// Parts for other lists: one result as an object of resultsJSON, the date of a result in the user's
// time zone, the names of its senders as in the mail, and its subject.
[[nodiscard]] nlohmann::json resultJSON(const Hit& hit, size_t rank, MailFacts& facts);
[[nodiscard]] std::string dateText(const TLIndexableItem& item);
[[nodiscard]] std::string authorsText(const TLIndexableItem& item);
[[nodiscard]] std::string subjectText(const TLIndexableItem& item);

// One line or row per result: rank, scores, date, identifier.
[[nodiscard]] std::string scoresText(const ResultItems& items, const Palette& palette);
[[nodiscard]] nlohmann::json scoresJSON(const ResultItems& items);

// JSON for output: indented, valid UTF-8, safe for terminals, ending with a line feed.
[[nodiscard]] std::string jsonText(const nlohmann::json& json);

}  // namespace cli
