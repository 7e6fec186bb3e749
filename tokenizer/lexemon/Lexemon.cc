#include "tokenizer/lexemon/Lexemon.h"

#include <stdexcept>
#include <utility>

#include "platform/Locale.h"

namespace lexemon {

void TokenChain::append(bool significant, TLString cleanValue) {
  Token* last = _tokens.empty() ? nullptr : &_tokens.back();
  _tokens.emplace_back(significant, std::move(cleanValue));
  if (last != nullptr) last->_next = &_tokens.back();
}

namespace util {

ULocale::ULocale(const std::string& name, const std::string& country, const std::string& variant,
                 const std::string& keywords) {
  std::string full = name;
  if (!country.empty()) full += '_' + country;
  if (!variant.empty()) full += '_' + variant;
  if (!keywords.empty()) full += '@' + keywords;
  const auto locale = platform::localeFromName(full);
  if (!locale) throw std::invalid_argument("no language in the locale name");
  _name = locale->identifier;
}

}  // namespace util

namespace analysis {

namespace {

// The whole text, if ICU holds it as one chunk of UTF-16, as it does for utext_openUChars.
TLStringView chunkOf(UText* text) {
  const int64_t length = utext_nativeLength(text);
  utext_setNativeIndex(text, 0);
  if (utext_current32(text) == U_SENTINEL || text->chunkLength != length) return {};
  return {text->chunkContents, static_cast<size_t>(text->chunkLength)};
}

TLString copyOf(UText* text) {
  UErrorCode status = U_ZERO_ERROR;
  const int32_t length = utext_extract(text, 0, INT64_MAX, nullptr, 0, &status);
  TLString copy(static_cast<size_t>(length), u'\0');
  status = U_ZERO_ERROR;
  utext_extract(text, 0, INT64_MAX, copy.data(), length, &status);
  return copy;
}

}  // namespace

TokenStream::TokenStream(UText* text, const std::string& locale)
    : _copy(chunkOf(text).empty() ? copyOf(text) : TLString()),
      _text(_copy.empty() ? chunkOf(text) : TLStringView(_copy)),
      _locale(locale) {}

void TokenStream::reset() {
  _scanner.emplace(_text, _locale, WordScanner::Mode::asciiByTable);
}

bool TokenStream::increment() {
  return _scanner && _term && _scanner->next(_term->_term);
}

Analyzer::Analyzer(std::string locale) : _locale(std::move(locale)) {
  WorkspaceLease probe(_locale);
}

std::unique_ptr<TokenChain> Analyzer::tokenize(TLStringView text) const {
  auto chain = std::make_unique<TokenChain>();
  WordScanner scanner(text, _locale, WordScanner::Mode::unicodeOnly);
  TLString word;
  for (bool more = true; more;) {
    more = scanner.next(word);
    if (scanner.takeSkipped()) chain->append(false, {});
    if (more) chain->append(true, word);
  }
  return chain;
}

std::unique_ptr<TokenStream> Analyzer::tokenStream(UText* text) const {
  return std::make_unique<TokenStream>(text, _locale);
}

DefaultAnalyzerFactory::DefaultAnalyzerFactory(Options options) {
  if (options.to_ulong() != kOptions) throw std::invalid_argument("unknown set of options");
}

const Analyzer& DefaultAnalyzerFactory::analyzer(const lexemon::util::ULocale& locale) {
  platform::MutexLock lock(_mutex);
  std::unique_ptr<Analyzer>& analyzer = _analyzers[locale.name()];
  if (!analyzer) analyzer = std::make_unique<Analyzer>(locale.name());
  return *analyzer;
}

}  // namespace analysis

namespace resources {

namespace {

struct Registry {
  platform::Mutex mutex;
  std::map<std::string, std::string> paths TL_GUARDED_BY(mutex);
};

Registry& registry() {
  static Registry instance;
  return instance;
}

}  // namespace

void DataRegistrationService::registerDataPathForLanguage(const std::string& language,
                                                          const std::string& path) {
  platform::MutexLock lock(registry().mutex);
  registry().paths.insert_or_assign(language, path);
}

std::optional<std::string> DataRegistrationService::dataPathForLanguage(
    const std::string& language) {
  platform::MutexLock lock(registry().mutex);
  const auto found = registry().paths.find(language);
  if (found == registry().paths.end()) return std::nullopt;
  return found->second;
}

}  // namespace resources

}  // namespace lexemon
