#include "cli/TextMatch.h"

#include <unicode/locid.h>
#include <unicode/unistr.h>

#include <algorithm>

#include "html/TALHTMLParsing.h"
#include "tokenizer/TLLexemonAssetManager.h"
#include "tokenizer/Tokenizer.h"

namespace cli {

namespace {

using usersyntax::Field;
using usersyntax::Kind;
using usersyntax::Node;
using Key = TLAttributeKey;

// How much of a text the index keeps from a word on: up to the first space after this many bytes,
// and never more than kMaxKeptBytes.
constexpr size_t kKeptBytes = 32;
constexpr size_t kMaxKeptBytes = 100;

const tokenizer::Tokenizer& words() {
  static const auto tokenizer = tokenizer::NewFastLexemonTokenizer(bestLexemonLocale());
  return *tokenizer;
}

std::string wordsOf(TLStringView text) {
  std::string out;
  std::vector<uint32_t> offsets;
  words().TokenizeToText(text, out, offsets);
  return out;
}

bool isWordless(const Node& node) {
  return node.kind == Kind::text && !zonesOf(node.field).empty() && wordCount(node) == 0;
}

// Calls body(key, text) for each text of an item, with the key that the index uses.
template <typename Body>
void forEachText(const TLIndexableItem& item, const Body& body) {
  static constexpr std::pair<Key, Key> kPersons[] = {
      {Key::AUTHORS, Key::AUTHOR_EMAIL_ADDRESSES},
      {Key::RECIPIENTS, Key::RECIPIENT_EMAIL_ADDRESSES},
      {Key::ADDITIONAL_RECIPIENTS, Key::ADDITIONAL_RECIPIENT_EMAIL_ADDRESSES},
      {Key::HIDDEN_ADDITIONAL_RECIPIENTS, Key::HIDDEN_RECIPIENT_EMAIL_ADDRESSES}};
  for (const Key key : {Key::SUBJECT, Key::X_FROM, Key::TEXT_CONTENT}) {
    body(key, platform::orEmpty(item.stringValueForKey(key)));
  }
  if (item.bytesValueForKey(Key::HTML_CONTENT_DATA)) body(Key::HTML_CONTENT_DATA, bodyText(item));
  for (const Key key : {Key::ATTACHMENT_NAMES, Key::ATTACHMENT_TYPES}) {
    const auto* const texts = item.stringValuesForKey(key);
    if (texts == nullptr) continue;
    for (const TLString& text : *texts) body(key, text);
  }
  for (const auto& [key, addresses] : kPersons) {
    const auto* const persons = item.personValuesForKey(key);
    if (persons == nullptr) continue;
    for (const auto& person : *persons) {
      body(key, platform::orEmpty(person->name()));
      body(addresses, platform::orEmpty(person->emailAddress()));
    }
  }
}

}  // namespace

const std::vector<Key>& zonesOf(Field field) {
  using enum TLAttributeKey;
  static const std::vector<Key> kNone;
  static const std::vector<Key> kFrom{AUTHORS, AUTHOR_EMAIL_ADDRESSES, X_FROM};
  static const std::vector<Key> kTo{RECIPIENTS, RECIPIENT_EMAIL_ADDRESSES};
  static const std::vector<Key> kCc{ADDITIONAL_RECIPIENTS, ADDITIONAL_RECIPIENT_EMAIL_ADDRESSES};
  static const std::vector<Key> kBcc{HIDDEN_ADDITIONAL_RECIPIENTS,
                                     HIDDEN_RECIPIENT_EMAIL_ADDRESSES};
  static const std::vector<Key> kSubject{SUBJECT};
  static const std::vector<Key> kBody{TEXT_CONTENT, HTML_CONTENT_DATA};
  static const std::vector<Key> kAttachment{ATTACHMENT_NAMES};
  static const std::vector<Key> kType{ATTACHMENT_TYPES};
  static const std::vector<Key> kWith{AUTHORS,
                                      AUTHOR_EMAIL_ADDRESSES,
                                      X_FROM,
                                      RECIPIENTS,
                                      RECIPIENT_EMAIL_ADDRESSES,
                                      ADDITIONAL_RECIPIENTS,
                                      ADDITIONAL_RECIPIENT_EMAIL_ADDRESSES,
                                      HIDDEN_ADDITIONAL_RECIPIENTS,
                                      HIDDEN_RECIPIENT_EMAIL_ADDRESSES};
  // Like a search for words, which ignores hidden recipients.
  static const std::vector<Key> kAny{SUBJECT,
                                     TEXT_CONTENT,
                                     HTML_CONTENT_DATA,
                                     AUTHORS,
                                     RECIPIENTS,
                                     ADDITIONAL_RECIPIENTS,
                                     AUTHOR_EMAIL_ADDRESSES,
                                     RECIPIENT_EMAIL_ADDRESSES,
                                     ADDITIONAL_RECIPIENT_EMAIL_ADDRESSES,
                                     X_FROM,
                                     ATTACHMENT_NAMES,
                                     ATTACHMENT_TYPES};
  switch (field) {
    case Field::any:
      return kAny;
    case Field::from:
      return kFrom;
    case Field::to:
      return kTo;
    case Field::cc:
      return kCc;
    case Field::bcc:
      return kBcc;
    case Field::with:
      return kWith;
    case Field::subject:
      return kSubject;
    case Field::body:
      return kBody;
    case Field::attachment:
      return kAttachment;
    case Field::type:
      return kType;
    default:
      return kNone;
  }
}

std::string indexedWords(const Node& node) {
  return wordsOf(platform::fromUTF8(node.text));
}

size_t wordCount(const Node& node) {
  const std::string text = indexedWords(node);
  return static_cast<size_t>(std::count(text.begin(), text.end(), ' '));
}

bool mayGoOn(const Node& node) {
  return node.prefix && !node.phrase && !hasTrailingSpecialChar(platform::fromUTF8(node.text));
}

bool isCutInIndex(const Node& node) {
  const std::string text = indexedWords(node);
  const size_t space = text.find(' ', std::min(kKeptBytes, text.size()));
  return text.size() > kMaxKeptBytes || (space != std::string::npos && space + 1 < text.size());
}

std::vector<Node> wordlessNodes(const Node& tree) {
  if (isWordless(tree)) return {tree};
  std::vector<Node> found;
  for (const Node& child : tree.children) {
    const auto below = wordlessNodes(child);
    found.insert(found.end(), below.begin(), below.end());
  }
  return found;
}

std::optional<Node> withoutWordless(const Node& tree) {
  if (isWordless(tree)) return std::nullopt;
  if (tree.children.empty()) return tree;
  Node kept = tree;
  kept.children.clear();
  for (const Node& child : tree.children) {
    if (auto below = withoutWordless(child)) kept.children.push_back(std::move(*below));
  }
  if (kept.children.empty()) return std::nullopt;
  return kept;
}

TLString bodyText(const TLIndexableItem& item) {
  const auto& html = item.bytesValueForKey(Key::HTML_CONTENT_DATA);
  if (!html) return TLString(platform::orEmpty(item.stringValueForKey(Key::TEXT_CONTENT)));
  constexpr uint64_t kNoLimit = 2147483647;
  return TALPlainTextFromHTMLData(*html, kNoLimit, nullptr, platform::kEncodingUTF8)
      .value_or(TLString());
}

bool holdsText(const TLIndexableItem& item, const Node& node) {
  const std::vector<Key>& keys = zonesOf(node.field);
  std::string wanted = ' ' + indexedWords(node);
  if (mayGoOn(node) && wanted.ends_with(' ')) wanted.pop_back();
  bool found = false;
  forEachText(item, [&](Key key, TLStringView text) {
    if (found || std::find(keys.begin(), keys.end(), key) == keys.end()) return;
    found = (' ' + wordsOf(text)).find(wanted) != std::string::npos;
  });
  return found;
}

std::vector<std::string> folderSpellings(const std::string& name) {
  const TLString units = platform::fromUTF8(name);
  icu::UnicodeString small(units.data(), static_cast<int32_t>(units.size()));
  small.toLower(icu::Locale::getRoot());
  icu::UnicodeString capitals = small;
  capitals.toUpper(icu::Locale::getRoot());
  icu::UnicodeString title = small;
  title.toTitle(nullptr, icu::Locale::getRoot());
  std::vector<std::string> spellings{name};
  for (const icu::UnicodeString& one : {small, capitals, title}) {
    std::string text =
        platform::toUTF8(TLStringView(one.getBuffer(), static_cast<size_t>(one.length())));
    if (std::find(spellings.begin(), spellings.end(), text) == spellings.end()) {
      spellings.push_back(std::move(text));
    }
  }
  return spellings;
}

bool isFolderMeant(const std::string& name, const std::string& path, const std::string& text) {
  const auto within = [](const std::string& whole, const std::string& part, char separator) {
    return whole == part || (whole.size() > part.size() && whole.starts_with(part) &&
                             whole[part.size()] == separator);
  };
  if (text.starts_with('/')) {
    const size_t end = text.find_last_not_of('/');
    return end == std::string::npos || within(path, text.substr(0, end + 1), '/');
  }
  const auto spellings = folderSpellings(text);
  return std::any_of(spellings.begin(), spellings.end(),
                     [&](const std::string& spelling) { return within(name, spelling, '.'); });
}

}  // namespace cli
