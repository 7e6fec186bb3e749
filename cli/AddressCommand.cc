#include <fmt/format.h>

#include <algorithm>
#include <cmath>
#include <map>
#include <nlohmann/json.hpp>

#include "cli/Commands.h"
#include "cli/Highlight.h"
#include "cli/Results.h"
#include "cli/SearchPlan.h"
#include "cli/SearchRun.h"
#include "cli/StateDirectory.h"
#include "client/SearchServiceProxy.h"
#include "platform/Clock.h"
#include "usersyntax/Names.h"

namespace cli {

namespace {

using usersyntax::Field;
using usersyntax::Kind;
using usersyntax::Node;
using Key = TLAttributeKey;

// The number of mails searched for senders, and again for recipients.
constexpr size_t kMails = 1000;

// A mail of this age counts half as much as one of today, which counts 1.
constexpr double kHalfLifeSeconds = 180 * 86400.0;
constexpr double kUndatedWeight = 0.01;

// A sender or a recipient.
struct Contact {
  std::string address;                       // as spelled in the newest mail
  std::map<std::string, double> names = {};  // with their weight
  double weight = 0;
  size_t mails = 0;
  std::optional<double> last = {};  // seconds since 1970

  [[nodiscard]] std::string name() const {
    const auto best =
        std::max_element(names.begin(), names.end(),
                         [](const auto& a, const auto& b) { return a.second < b.second; });
    return best == names.end() ? "" : best->first;
  }
};

// All words as prefixes in one field.
Node wordsIn(Field field, const std::vector<std::string>& words) {
  Node all;
  all.kind = Kind::conjunction;
  for (const std::string& word : words) {
    Node text;
    text.kind = Kind::text;
    text.field = field;
    text.text = word;
    text.prefix = true;
    all.children.push_back(std::move(text));
  }
  return all;
}

std::string cleanText(const std::optional<TLString>& text) {
  return cleanForTerminal(platform::toUTF8(platform::orEmpty(text)));
}

class AddressBook {
 public:
  AddressBook(std::vector<std::string> words, double now) : _words(std::move(words)), _now(now) {}

  void add(const TLIndexableItem& item) {
    const auto date = dateOf(item);
    const double age = date ? std::max(_now - *date, 0.0) : 0;
    const double weight = date ? std::exp2(-age / kHalfLifeSeconds) : kUndatedWeight;
    for (const Key key : {Key::AUTHORS, Key::RECIPIENTS}) {
      const auto* const persons = item.personValuesForKey(key);
      if (persons == nullptr) continue;
      for (const auto& person : *persons) {
        add(cleanText(person->name()), cleanText(person->emailAddress()), date, weight);
      }
    }
  }

  // Most likely first, by how often and how recently.
  [[nodiscard]] std::vector<Contact> ranked() const {
    std::vector<Contact> list;
    for (const auto& [key, contact] : _contacts) list.push_back(contact);
    std::stable_sort(list.begin(), list.end(),
                     [](const Contact& a, const Contact& b) { return a.weight > b.weight; });
    return list;
  }

 private:
  void add(const std::string& name, const std::string& address, std::optional<double> date,
           double weight) {
    if (address.find('@') == std::string::npos || address.find(' ') != std::string::npos) return;
    if (!isMeant(name, address)) return;
    Contact& contact = _contacts[usersyntax::folded(address)];
    const bool newer = date.value_or(-HUGE_VAL) > contact.last.value_or(-HUGE_VAL);
    if (newer || contact.address.empty()) contact.address = address;
    if (newer) contact.last = date;
    if (!name.empty() && name != address) contact.names[name] += weight;
    contact.weight += weight;
    ++contact.mails;
  }

  // Cached by text, because the same people appear again and again.
  bool isMeant(const std::string& name, const std::string& address) {
    const std::string text = name + ' ' + address;
    const auto [at, added] = _meant.try_emplace(text, false);
    if (added) {
      at->second = std::all_of(_words.begin(), _words.end(), [&text](const std::string& word) {
        return holdsWord(text, {word});
      });
    }
    return at->second;
  }

  const std::vector<std::string> _words;
  const double _now;
  std::map<std::string, Contact> _contacts;  // by address in lower case
  std::map<std::string, bool> _meant;
};

// ADDRESS <tab> NAME <tab> more information, the format that mutt and aerc read.
std::string linesOf(const std::vector<Contact>& contacts) {
  std::string out;
  for (const Contact& contact : contacts) {
    out += fmt::format("{}\t{}\t{} {}\n", contact.address, contact.name(), contact.mails,
                       contact.mails == 1 ? "mail" : "mails");
  }
  return out;
}

std::string jsonOf(const std::vector<Contact>& contacts) {
  nlohmann::json list = nlohmann::json::array();
  for (const Contact& contact : contacts) {
    list.push_back({{"address", contact.address},
                    {"name", contact.name()},
                    {"mails", contact.mails},
                    {"last", contact.last ? nlohmann::json(*contact.last) : nlohmann::json()}});
  }
  return jsonText(list);
}

// Adds the senders and recipients of the mails that the daemon finds for the words.
bool findContacts(const Options& options, const std::vector<std::string>& words, AddressBook& book,
                  TLErrorOut error) {
  Node tree;
  tree.kind = Kind::disjunction;
  tree.children = {wordsIn(Field::from, words), wordsIn(Field::to, words)};
  const auto plan = planSearch(tree, TLString(), nullptr, nullptr, error);
  if (!plan) return false;
  client::SearchServiceProxy service(options.runtimeDirectory, options.patience());
  MailFacts facts;
  const auto found = runPlan(*plan, {options.protectionClass, SortOrder::relevance, kMails, false},
                             service, facts, error);
  if (!found) return false;
  for (const auto& item : found->items) book.add(*item);
  return true;
}

}  // namespace

ExitStatus runAddress(const Options& options) {
  const auto words = queryWords(fmt::format("{}", fmt::join(options.arguments, " ")));
  if (words.empty()) {
    complain(std::string("there is no word to look for"));
    return ExitStatus::failure;
  }
  if (isUnknownClass(options)) return complainOfUnknownClass(options);
  AddressBook book(words, platform::secondsSince1970());
  std::optional<TLError> error;
  if (!findContacts(options, words, book, &error)) return complain(error);
  std::vector<Contact> contacts = book.ranked();
  const auto limit = static_cast<size_t>(options.limit);
  if (limit != 0) contacts.resize(std::min(contacts.size(), limit));
  const ExitStatus status = contacts.empty() ? ExitStatus::nothingFound : ExitStatus::done;
  if (options.format == OutputFormat::json) return print(jsonOf(contacts), status);
  std::string text = linesOf(contacts);
  if (options.mutt) text = fmt::format("{} addresses\n", contacts.size()) + text;
  if (contacts.empty()) complain(std::string("no match"));
  return print(text, status);
}

}  // namespace cli
