#pragma once

#include <cstdint>
#include <optional>
#include <set>
#include <string>

#include "platform/Locale.h"
#include "tokenizer/LexemonAssets.h"

// Decides whether a language can be served, and remembers the answers: a language moves once from
// unknown to supported or unsupported, and stays there for the life of the manager. Timeouts are in
// nanoseconds.
//
// Threads: no lock; one thread at a time.
class TLLexemonAssetManager {
 public:
  // `assets` must outlive the manager.
  explicit TLLexemonAssetManager(LexemonAssets& assets);

  // The shared manager, over the service of the system.
  [[nodiscard]] static TLLexemonAssetManager& getObject();

  // Registers the data of a language that is not embedded with the library. A timeout of 0 leaves
  // missing data to a fetch in the background, which serves the next process.
  [[nodiscard]] bool isLanguageSupported(const std::string& language, uint64_t downloadTimeout);

  [[nodiscard]] std::optional<std::string> assetPathForLanguage(const std::string& language);
  [[nodiscard]] std::optional<std::string> downloadAssetForLanguage(const std::string& language,
                                                                    uint64_t downloadTimeout);

 private:
  LexemonAssets& _assets;
  std::set<std::string> _supportedLang;
  std::set<std::string> _unsupportedLang;
};

// Identifier and language code of the platform's locale, "en_US" and "en" without one. Read once;
// any thread.
[[nodiscard]] const std::string& userLocale();
[[nodiscard]] const std::string& userLanguage();

// The locale to make tokenizers for: userLocale where its language is supported, else "en_US".
// Decided once; any thread.
[[nodiscard]] const std::string& bestLexemonLocale();

namespace tokenizer {

// The rules behind the three functions above.
[[nodiscard]] std::string userLocaleFrom(const std::optional<platform::Locale>& locale);
[[nodiscard]] std::string userLanguageFrom(const std::optional<platform::Locale>& locale);
[[nodiscard]] std::string bestLexemonLocaleFrom(const std::string& userLocale,
                                                TLLexemonAssetManager& manager);

}  // namespace tokenizer
