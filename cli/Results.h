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

// A result: the best of the copies of one message, and where the others are.
struct Hit {
  std::shared_ptr<TLIndexableItem> item;
  std::vector<std::shared_ptr<TLIndexableItem>> copies;
};
using Hits = std::vector<Hit>;

// Joins the copies of a message in several folders, which have one Message-ID, in the order of the
// best. Only mails with the same subject and date are looked at.
[[nodiscard]] Hits joinCopies(const ResultItems& items, MailFacts& facts);

// What is shown: a part of the hits, of which the first has the rank `firstRank`.
struct Page {
  std::span<const Hit> hits;
  size_t firstRank = 1;
  size_t total = 0;      // of all hits
  bool complete = true;  // false: there may be more than `total`
  std::vector<client::ReplacedWord> replaced;
};

// The output of a search as one text, clean of control characters. Lines fit into so many columns,
// 0 for no limit. Where the snippet holds no word, the mail is read for the place that does.
[[nodiscard]] std::string resultsText(const Page& page, const std::string& words, MailFacts& facts,
                                      const Palette& palette, size_t columns);
// An object: "schema" is 1, "total" and "complete" as in the page, "changed" a list of the replaced
// words, "results" a list of objects.
[[nodiscard]] std::string resultsJSON(const Page& page, MailFacts& facts);
// A path an entry, of copies too, with ":OFFSET" for a message of an mbox file. An identifier of
// another client stands as it is. With `raw`, each ends with NUL and is as it is on the disk.
[[nodiscard]] std::string resultsFiles(const Page& page, MailFacts& facts, bool raw);
// A Message-ID an entry; messages without one are left out.
[[nodiscard]] std::string resultsMessageIDs(const Page& page, MailFacts& facts, bool raw);

// What the daemon looked for in place of what was typed, as a line for people: "showing results
// for invoices". Empty where it replaced nothing.
[[nodiscard]] std::string replacedText(const std::vector<client::ReplacedWord>& words);
// Parts of these for other lists: one result as an object of resultsJSON, the date of a result in
// the time zone of the user, the names of its senders as they are in the mail, and its subject.
[[nodiscard]] nlohmann::json resultJSON(const Hit& hit, size_t rank, MailFacts& facts);
[[nodiscard]] std::string dateText(const TLIndexableItem& item);
[[nodiscard]] std::string authorsText(const TLIndexableItem& item);
[[nodiscard]] std::string subjectText(const TLIndexableItem& item);

// A line, or a row, a result: rank, scores, date, identifier.
[[nodiscard]] std::string scoresText(const ResultItems& items, const Palette& palette);
[[nodiscard]] nlohmann::json scoresJSON(const ResultItems& items);

// JSON as it goes out: indented, valid UTF-8, harmless to terminals, with a line feed.
[[nodiscard]] std::string jsonText(const nlohmann::json& json);

}  // namespace cli
