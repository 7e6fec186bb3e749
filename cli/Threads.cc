#include "cli/Threads.h"

#include <fmt/format.h>

#include <algorithm>
#include <cmath>
#include <nlohmann/json.hpp>
#include <numeric>
#include <unordered_map>

#include "cli/Highlight.h"
#include "cli/SearchRun.h"

namespace cli {

namespace {

constexpr size_t kSendersColumns = 20;
constexpr size_t kMaxShownRanks = 8;
// No mail program creates longer ones.
constexpr size_t kMaxMessageID = 250;

// Union-find: each set is represented by one of its members.
class DisjointSets {
 public:
  explicit DisjointSets(size_t members) : _parents(members) {
    std::iota(_parents.begin(), _parents.end(), size_t{0});
  }
  size_t find(size_t member) {
    while (_parents[member] != member) {
      _parents[member] = _parents[_parents[member]];
      member = _parents[member];
    }
    return member;
  }
  void join(size_t a, size_t b) { _parents[find(a)] = find(b); }

 private:
  std::vector<size_t> _parents;
};

// Adds the IDs in < > from a header field and ignores other text, such as "Your message of Monday".
void addMessageIDs(const std::string& field, std::vector<std::string>& ids) {
  for (size_t begin = field.find('<'); begin != std::string::npos; begin = field.find('<', begin)) {
    const size_t end = field.find('>', begin);
    if (end == std::string::npos) return;
    const size_t size = end - begin - 1;
    if (size > 0 && size <= kMaxMessageID) ids.push_back(field.substr(begin + 1, size));
    begin = end;
  }
}

// The IDs of the mail itself and of the messages that it refers to.
std::vector<std::string> messagesOf(const MailHead& head) {
  std::vector<std::string> ids;
  addMessageIDs(head.references, ids);
  if (ids.size() > kMaxReferences) {
    ids.erase(ids.begin() + 1, ids.end() - static_cast<ptrdiff_t>(kMaxReferences - 1));
  }
  addMessageIDs(head.inReplyTo, ids);
  if (!head.messageID.empty()) ids.push_back(head.messageID);
  return ids;
}

const TLIndexableItem& newestOf(const Hits& hits, const Thread& thread) {
  const auto date = [&hits](size_t hit) { return dateOf(*hits[hit].item).value_or(-HUGE_VAL); };
  const auto newest = std::max_element(thread.begin(), thread.end(),
                                       [&](size_t a, size_t b) { return date(a) < date(b); });
  return *hits[*newest].item;
}

// Each sender once, in the order of the hits.
std::string sendersOf(const Hits& hits, const Thread& thread) {
  std::vector<std::string> senders;
  for (const size_t hit : thread) {
    std::string sender = cleanForTerminal(authorsText(*hits[hit].item));
    if (std::find(senders.begin(), senders.end(), sender) == senders.end()) {
      senders.push_back(std::move(sender));
    }
  }
  return fmt::format("{}", fmt::join(senders, ", "));
}

std::string ranksOf(const Thread& thread) {
  if (thread.size() == 1) return "";
  std::string text = fmt::format("  ({} results:", thread.size());
  for (size_t i = 0; i < std::min(thread.size(), kMaxShownRanks); ++i) {
    text += fmt::format(" {}", thread[i] + 1);
  }
  return text + (thread.size() > kMaxShownRanks ? " …)" : ")");
}

}  // namespace

std::vector<Thread> threadsOf(const Hits& hits, MailFacts& facts) {
  DisjointSets sets(hits.size());
  std::unordered_map<std::string, size_t> known;  // by Message-ID: a hit that mentions it
  for (size_t hit = 0; hit < hits.size(); ++hit) {
    const auto head = facts.head(platform::toUTF8(platform::orEmpty(hits[hit].item->identifier())));
    if (!head) continue;
    for (std::string& id : messagesOf(*head)) {
      const auto [at, added] = known.try_emplace(std::move(id), hit);
      if (!added) sets.join(hit, at->second);
    }
  }
  std::vector<Thread> threads;
  std::unordered_map<size_t, size_t> places;  // by set: the index of the thread
  for (size_t hit = 0; hit < hits.size(); ++hit) {
    const auto [at, added] = places.try_emplace(sets.find(hit), threads.size());
    if (added) threads.emplace_back();
    threads[at->second].push_back(hit);
  }
  return threads;
}

std::string threadsText(const ThreadPage& page, const std::string& query, const Palette& palette,
                        size_t columns) {
  constexpr size_t kBeforeSubject = 3 + 2 + 16 + 2 + kSendersColumns + 2;
  const auto words = queryWords(query);
  std::string out;
  for (const Thread& thread : page.threads) {
    const TLIndexableItem& best = *page.hits[thread.front()].item;
    const std::string ranks = ranksOf(thread);
    const size_t taken = kBeforeSubject + columnsTaken(ranks);
    const std::string senders = fitted(sendersOf(page.hits, thread), kSendersColumns);
    std::string subject = cleanForTerminal(subjectText(best));
    if (subject.empty()) subject = "(no subject)";
    if (columns > 0) subject = fitted(subject, columns > taken ? columns - taken : 1);
    out += fmt::format("{}{:3}{}  {}{}{}  {}{}{}", palette.rank, thread.front() + 1, palette.end,
                       palette.date, dateText(newestOf(page.hits, thread)), palette.end,
                       palette.from, senders, palette.end);
    out.append(kSendersColumns - columnsTaken(senders) + 2, ' ');
    out += highlight(subject, words, palette.match, palette.end);
    out += fmt::format("{}{}{}\n", palette.faint, ranks, palette.end);
  }
  return out;
}

std::string threadsJSON(const ThreadPage& page, MailFacts& facts) {
  nlohmann::json list = nlohmann::json::array();
  for (const Thread& thread : page.threads) {
    nlohmann::json results = nlohmann::json::array();
    for (const size_t hit : thread) results.push_back(resultJSON(page.hits[hit], hit + 1, facts));
    list.push_back({{"subject", subjectText(*page.hits[thread.front()].item)},
                    {"results", std::move(results)}});
  }
  return jsonText({{"schema", 1},
                   {"total", page.total},
                   {"complete", page.complete},
                   {"threads", std::move(list)}});
}

}  // namespace cli
