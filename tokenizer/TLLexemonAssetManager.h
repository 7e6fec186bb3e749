#pragma once

#include <cstdint>
#include <optional>
#include <set>
#include <string>

#include "platform/Locale.h"
#include "tokenizer/LexemonAssets.h"

// Decides whether a language is supported and caches the answers: a language changes once from
// unknown to supported or unsupported, for the lifetime of the manager. Timeouts are in
// nanoseconds.
//
// Threads: no lock; one thread at a time.
class TLLexemonAssetManager {
 public:
  // `assets` must outlive the manager.
  explicit TLLexemonAssetManager(LexemonAssets& assets);

  // The shared manager, over the system's service.
  [[nodiscard]] static TLLexemonAssetManager& getObject();

  // Registers data of a language that is not embedded with the library. With a timeout of 0,
  // missing data is downloaded in the background for the next process.
  [[nodiscard]] bool isLanguageSupported(const std::string& language, uint64_t downloadTimeout);

  [[nodiscard]] std::optional<std::string> assetPathForLanguage(const std::string& language);
  [[nodiscard]] std::optional<std::string> downloadAssetForLanguage(const std::string& language,
                                                                    uint64_t downloadTimeout);

 private:
  LexemonAssets& _assets;
  std::set<std::string> _supportedLang;
  std::set<std::string> _unsupportedLang;
};

// Identifier and language code of the platform's locale; "en_US" and "en" without one. Read once;
// any thread.
[[nodiscard]] const std::string& userLocale();
[[nodiscard]] const std::string& userLanguage();

// The locale for tokenizers: userLocale if its language is supported, otherwise "en_US". Decided
// once; any thread.
[[nodiscard]] const std::string& bestLexemonLocale();

namespace tokenizer {

// The functions above for a given locale and manager.
[[nodiscard]] std::string userLocaleFrom(const std::optional<platform::Locale>& locale);
[[nodiscard]] std::string userLanguageFrom(const std::optional<platform::Locale>& locale);
[[nodiscard]] std::string bestLexemonLocaleFrom(const std::string& userLocale,
                                                TLLexemonAssetManager& manager);

}  // namespace tokenizer
