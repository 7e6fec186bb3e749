#include "tokenizer/TLLexemonAssetManager.h"

#include <algorithm>

#include "platform/Log.h"
#include "tokenizer/lexemon/Lexemon.h"

namespace {

constexpr platform::Log kLog(platform::kSubsystem, "TLLexemonAssetManager");
constexpr const char* kDefaultLocale = "en_US";
constexpr const char* kDefaultLanguage = "en";

// The current time plus the timeout, clamped to the end of the clock.
std::chrono::steady_clock::time_point deadlineAfter(uint64_t nanoseconds) {
  using Clock = std::chrono::steady_clock;
  const auto now = Clock::now();
  const auto left = static_cast<uint64_t>((Clock::time_point::max() - now).count());
  return now + Clock::duration(static_cast<Clock::rep>(std::min(nanoseconds, left)));
}

}  // namespace

TLLexemonAssetManager::TLLexemonAssetManager(LexemonAssets& assets) : _assets(assets) {
  kLog.info("Caching the list of embedded languages");
  for (const std::string& language : assets.EmbeddedLanguages()) _supportedLang.insert(language);
}

TLLexemonAssetManager& TLLexemonAssetManager::getObject() {
  static TLLexemonAssetManager manager(LexemonAssets::systemService());
  return manager;
}

bool TLLexemonAssetManager::isLanguageSupported(const std::string& language,
                                                uint64_t downloadTimeout) {
  if (_supportedLang.count(language) != 0) {
    kLog.info("Language: {} is supported", language);
    return true;
  }
  if (_unsupportedLang.count(language) != 0) {
    kLog.info("Language: {} is not supported", language);
    return false;
  }
  std::optional<std::string> path = assetPathForLanguage(language);
  if (!path) path = downloadAssetForLanguage(language, downloadTimeout);
  if (!path) {
    _unsupportedLang.insert(language);
    kLog.info("Language: {} is not supported", language);
    return false;
  }
  kLog.info("Registering assets for language: {} at path: {}", language, *path);
  lexemon::resources::DataRegistrationService::registerDataPathForLanguage(language, *path);
  _supportedLang.insert(language);
  kLog.info("Language: {} is supported", language);
  return true;
}

std::optional<std::string> TLLexemonAssetManager::assetPathForLanguage(
    const std::string& language) {
  kLog.info("Fetching asset path for language: {}", language);
  std::optional<std::string> path = _assets.getAssetPathForLanguageCode(language).path;
  kLog.info("Assets for language: {} found at path: {}", language, path.value_or("(null)"));
  return path;
}

std::optional<std::string> TLLexemonAssetManager::downloadAssetForLanguage(
    const std::string& language, uint64_t downloadTimeout) {
  kLog.info("Downloading asset for language: {} with timeout: {}", language, downloadTimeout);
  if (downloadTimeout == 0) {
    _assets.onDemandDownloadForLanguageCode(language);
    return std::nullopt;
  }
  const auto error =
      _assets.blockingOnDemandDownloadForLanguageCode(language, deadlineAfter(downloadTimeout));
  if (error) {
    kLog.error("Asset download timed out with error: {}", platform::printable(error));
    return std::nullopt;
  }
  return assetPathForLanguage(language);
}

namespace tokenizer {

std::string userLocaleFrom(const std::optional<platform::Locale>& locale) {
  return locale && locale->identifier.size() >= 2 ? locale->identifier : kDefaultLocale;
}

std::string userLanguageFrom(const std::optional<platform::Locale>& locale) {
  return locale && !locale->language.empty() ? locale->language : kDefaultLanguage;
}

std::string bestLexemonLocaleFrom(const std::string& userLocale, TLLexemonAssetManager& manager) {
  return manager.isLanguageSupported(userLocale.substr(0, 2), 0) ? userLocale : kDefaultLocale;
}

}  // namespace tokenizer

const std::string& userLocale() {
  static const std::string locale = tokenizer::userLocaleFrom(platform::currentLocale());
  return locale;
}

const std::string& userLanguage() {
  static const std::string language = tokenizer::userLanguageFrom(platform::currentLocale());
  return language;
}

const std::string& bestLexemonLocale() {
  static const std::string locale =
      tokenizer::bestLexemonLocaleFrom(userLocale(), TLLexemonAssetManager::getObject());
  return locale;
}
