#include <fmt/format.h>

#include <random>
#include <set>
#include <stdexcept>

#include "cli/Identifier.h"
#include "cli/MailFile.h"
#include "cli/MailWalker.h"
#include "cli/MessageParser.h"
#include "cli/QueryInput.h"
#include "cli/SearchRun.h"
#include "cli/TextMatch.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/support/Seed.h"
#include "tests/support/ShellTest.h"
#include "tokenizer/TLLexemonAssetManager.h"
#include "tokenizer/Tokenizer.h"

// Random searches find the same mails as a scan of all sample mails.
namespace {

using Key = TLAttributeKey;
using usersyntax::Field;
using usersyntax::Flag;
using usersyntax::Kind;
using usersyntax::Node;
using Words = std::vector<std::string>;

constexpr double kNow = 1707955200;  // 2024-02-15

// A mail in the model: the words of each text of each attribute, and facts from its bytes.
struct Mail {
  std::multimap<Key, Words> texts;
  std::string identifier;
  std::string folder;
  std::string flags;  // letters of a Maildir
  std::string messageID;
  std::string list;
  double date = 0;
  size_t size = 0;
};

Words wordsOf(TLStringView text) {
  static const auto tokenizer = tokenizer::NewFastLexemonTokenizer(bestLexemonLocale());
  std::vector<TLString> list;
  tokenizer->TokenizeToList(text, list);
  Words words;
  for (const TLString& word : list) words.push_back(platform::toUTF8(word));
  return words;
}

std::string lineAfter(std::string_view bytes, const std::string& name) {
  const size_t at = bytes.find('\n' + name + ": ");
  if (at == std::string_view::npos) return {};
  const size_t begin = at + name.size() + 3;
  return std::string(bytes.substr(begin, bytes.find('\n', begin) - begin));
}

void addPersons(Mail& mail, const TLIndexableItem& item, Key names, Key addresses) {
  const auto* const persons = item.personValuesForKey(names);
  if (persons == nullptr) return;
  for (const auto& person : *persons) {
    mail.texts.emplace(names, wordsOf(platform::orEmpty(person->name())));
    mail.texts.emplace(addresses, wordsOf(platform::orEmpty(person->emailAddress())));
  }
}

Mail mailOf(std::string_view bytes, const cli::MessageOrigin& origin, const TLIndexableItem& item) {
  Mail mail;
  mail.identifier = origin.identifier;
  mail.folder = origin.folderName;
  mail.size = bytes.size();
  mail.date = cli::dateOf(item).value_or(-1);
  mail.messageID = lineAfter(bytes, "Message-ID");
  mail.list = lineAfter(bytes, "List-Id");
  for (const Key key : {Key::SUBJECT, Key::X_FROM}) {
    mail.texts.emplace(key, wordsOf(platform::orEmpty(item.stringValueForKey(key))));
  }
  mail.texts.emplace(Key::TEXT_CONTENT, wordsOf(cli::bodyText(item)));
  for (const Key key : {Key::ATTACHMENT_NAMES, Key::ATTACHMENT_TYPES}) {
    const auto* const list = item.stringValuesForKey(key);
    if (list == nullptr) continue;
    for (const TLString& text : *list) mail.texts.emplace(key, wordsOf(text));
  }
  addPersons(mail, item, Key::AUTHORS, Key::AUTHOR_EMAIL_ADDRESSES);
  addPersons(mail, item, Key::RECIPIENTS, Key::RECIPIENT_EMAIL_ADDRESSES);
  addPersons(mail, item, Key::ADDITIONAL_RECIPIENTS, Key::ADDITIONAL_RECIPIENT_EMAIL_ADDRESSES);
  addPersons(mail, item, Key::HIDDEN_ADDITIONAL_RECIPIENTS, Key::HIDDEN_RECIPIENT_EMAIL_ADDRESSES);
  return mail;
}

class SearchModel : public testsupport::ShellTest {
 protected:
  SearchModel() {
    tallow = TALLOW_PROGRAM " --runtime-dir " + daemon.runtimeDirectory();
    EXPECT_EQ(run("index " TALLOW_SAMPLE_MAIL), 0) << errors;
    readMails();
    for (const Mail& mail : mails) {
      for (const auto& [key, words] : mail.texts) texts.emplace_back(key, words);
    }
    std::erase_if(texts, [](const auto& text) { return text.second.empty(); });
  }

  // Anything that cannot be read is a failure of the test.
  void readMails() {
    const auto fail = [](const std::string& where, const std::string& reason) {
      ADD_FAILURE() << where << ": " << reason;
      return true;
    };
    cli::MessageParser parser;
    std::string flags;
    const cli::MailSink sink{[&](std::string_view bytes, const cli::MessageOrigin& origin) {
                               const auto parsed = parser.parse(bytes, origin);
                               const auto& message = std::get<cli::ParsedMessage>(parsed);
                               EXPECT_FALSE(message.cut);
                               mails.push_back(mailOf(bytes, origin, *message.item));
                               mails.back().flags = flags;
                               return true;
                             },
                             fail, [](const std::string& ignored) { ADD_FAILURE() << ignored; },
                             [](uint64_t) {}};
    const auto readFile = [&](const std::string& file, bool named, uint64_t) {
      flags = cli::maildirFlags(file);
      return cli::readMailFile(file, named, sink);
    };
    cli::walkMail(TALLOW_SAMPLE_MAIL, {readFile, fail});
  }

  size_t below(size_t limit) { return std::uniform_int_distribution<size_t>(0, limit - 1)(random); }
  template <typename T>
  const T& oneOf(const std::vector<T>& list) {
    return list[below(list.size())];
  }

  // A sequence of words, mostly from a sample mail.
  std::string words(size_t count) {
    const Words& text = oneOf(texts).second;
    const size_t begin = below(text.size());
    const size_t end = std::min(text.size(), begin + count);
    return fmt::format("{}", fmt::join(text.begin() + static_cast<ptrdiff_t>(begin),
                                       text.begin() + static_cast<ptrdiff_t>(end), " "));
  }

  std::string leaf() {
    static const std::vector<std::string> kFields{"from",    "to",   "cc",         "bcc", "with",
                                                  "subject", "body", "attachment", "type"};
    static const std::vector<std::string> kOthers{
        "is:unread",       "is:read",          "is:flagged",
        "is:replied",      "is:junk",          "has:attachment",
        "date:2024-01",    "date:3w..",        "date:..2024-01-20",
        "before:2024",     "after:2024-01-31", "larger:700",
        "smaller:1k",      "folder:Family",    "folder:archive",
        "folder:/nowhere", "list:allotment",   "date:2024-01-15..2024-02-03"};
    switch (below(8)) {
      case 0:
      case 1:
        return words(1);
      case 2:
        return fmt::format("\"{}\"", words(2 + below(12)));
      case 3:
        return fmt::format("{}:\"{}\"", oneOf(kFields), words(1 + below(2)));
      case 4:
      case 5:
        return fmt::format("{}:{}", oneOf(kFields), words(1));
      case 6:
        return oneOf(mails).messageID.empty() ? words(1) : "id:" + oneOf(mails).messageID;
      default:
        return oneOf(kOthers);
    }
  }

  std::string expression(size_t depth) {
    if (depth == 0) return leaf();
    std::string text;
    const size_t count = 1 + below(3);
    for (size_t i = 0; i < count; ++i) {
      if (i > 0) text += below(2) == 0 ? " OR " : " ";
      if (below(4) == 0) text += '-';
      text += below(2) == 0 ? leaf() : '(' + expression(depth - 1) + ')';
    }
    return text;
  }

  static bool holdsWords(const Mail& mail, const Node& node) {
    Words wanted = wordsOf(platform::fromUTF8(node.text));
    for (Key key : cli::zonesOf(node.field)) {
      if (key == Key::HTML_CONTENT_DATA) continue;  // included in the text
      const auto [begin, end] = mail.texts.equal_range(key);
      for (auto text = begin; text != end; ++text) {
        const Words& words = text->second;
        for (size_t at = 0; at + wanted.size() <= words.size(); ++at) {
          size_t same = 0;
          for (; same < wanted.size(); ++same) {
            const bool open = node.prefix && same + 1 == wanted.size();
            const std::string& word = words[at + same];
            if (open ? !word.starts_with(wanted[same]) : word != wanted[same]) break;
          }
          if (same == wanted.size()) return true;
        }
      }
    }
    return false;
  }

  static bool holds(const Mail& mail, const Node& node) {
    const auto has = [&](char flag) { return mail.flags.find(flag) != std::string::npos; };
    switch (node.kind) {
      case Kind::conjunction:
        return std::all_of(node.children.begin(), node.children.end(),
                           [&](const Node& child) { return holds(mail, child); });
      case Kind::disjunction:
        return std::any_of(node.children.begin(), node.children.end(),
                           [&](const Node& child) { return holds(mail, child); });
      case Kind::negation:
        return !holds(mail, node.children[0]);
      case Kind::date:
        return node.dates.holds(mail.date);
      case Kind::size:
        return node.larger ? mail.size > node.bytes : mail.size < node.bytes;
      case Kind::flag:
        return node.flag == Flag::unread          ? !has('S')
               : node.flag == Flag::read          ? has('S')
               : node.flag == Flag::flagged       ? has('F')
               : node.flag == Flag::replied       ? has('R')
               : node.flag == Flag::hasAttachment ? mail.texts.count(Key::ATTACHMENT_TYPES) > 0
                                                  : false;
      case Kind::text:
        break;
    }
    if (node.field == Field::folder) return usersyntax::folded(node.text) == mail.folder;
    if (node.field == Field::id) return node.text == mail.messageID;
    if (node.field == Field::list) return mail.list.find(node.text) != std::string::npos;
    return holdsWords(mail, node);
  }

  std::set<std::string> found(const std::string& text, std::vector<std::string> filters = {}) {
    cli::Options options;
    options.arguments = {text};
    options.filters = std::move(filters);
    options.parameters =
        "queryModification.enableSpellModification=NO,"
        "queryModification.enableSynonymModification=NO,"
        "queryModification.enableStemModification=NO,salt.scoreThreshold=1e-37";
    std::optional<TLError> error;
    const auto input = cli::queryInput(options, kNow, &error);
    if (!input) {
      tooMany = error->message.find("more than 64") != std::string::npos;
      return {};
    }
    client::SearchServiceProxy service(daemon.runtimeDirectory());
    cli::MailFacts facts;
    const auto results =
        cli::runPlan(input->plan, {"default", cli::SortOrder::relevance, SIZE_MAX, false}, service,
                     facts, &error);
    if (!results) throw std::runtime_error(text + ": " + error->message);
    EXPECT_TRUE(results->complete);
    std::set<std::string> identifiers;
    for (const auto& item : results->items) {
      identifiers.insert(platform::toUTF8(platform::orEmpty(item->identifier())));
    }
    EXPECT_EQ(identifiers.size(), results->items.size()) << text;
    return identifiers;
  }

  std::set<std::string> expected(const std::string& text) const {
    std::set<std::string> identifiers;
    const Node root = usersyntax::parse(text, kNow).root;
    for (const Mail& mail : mails) {
      if (holds(mail, root)) identifiers.insert(mail.identifier);
    }
    return identifiers;
  }

  const testsupport::DaemonProcess daemon{directory.path()};
  std::mt19937 random{testsupport::firstSeed()};
  std::vector<Mail> mails;
  std::vector<std::pair<Key, Words>> texts;
  bool tooMany = false;
};

}  // namespace

TEST_F(SearchModel, RandomSearchesMatchAScanOfAllMails) {
  ASSERT_EQ(mails.size(), 41u);
  size_t some = 0;
  size_t refused = 0;
  for (int i = 0; i < 1500; ++i) {
    std::string text = expression(below(4));
    if (below(2) == 0) text += ' ';
    tooMany = false;
    const auto sets = std::pair(found(text), expected(text));
    if (tooMany) {
      ++refused;
      continue;
    }
    some += sets.second.empty() ? 0 : 1;
    ASSERT_EQ(sets.first, sets.second) << text << "\n"
                                       << usersyntax::printed(usersyntax::parse(text, kNow).root);
  }
  EXPECT_GT(some, 500u);
  EXPECT_LT(refused, 100u);
}

// Conditions of the query language on times, numbers and flags apply as well.
TEST_F(SearchModel, FiltersMatchAScanOfAllMails) {
  const std::string date = "com_quill_mail_dateReceived";
  const std::pair<std::vector<std::string>, const char*> cases[] = {
      {{date + " >= $time.iso(2024-02-01)"}, "a date:2024-02-01.. "},
      {{date + " < $time.iso(2024-02-01)"}, "a before:2024-02 "},
      {{date + " < $time.iso(2024-02-01) || kTLItemAuthors = \"mara lindqvist\""},
       "a (before:2024-02 OR from:\"mara lindqvist\") "},
      {{"com_quill_mail_read == 1"}, "a is:read "},
      {{"com_quill_mail_read == 0"}, "a is:unread "},
      {{"com_quill_mail_flagged == 1"}, "a is:flagged "},
      {{"com_quill_mail_read == 1", "kTLItemSubject != \"re\""}, "a is:read -subject:re"},
  };
  for (const auto& [filters, same] : cases) {
    EXPECT_EQ(found("a ", filters), expected(same)) << same;
    EXPECT_FALSE(expected(same).empty()) << same;
  }
}
