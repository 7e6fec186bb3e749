#include "tokenizer/LexemonAssets.h"

#include <array>

namespace {

// Languages written with spaces between words, or split by an ICU dictionary (ja, km, lo, my, th,
// zh).
constexpr std::array kLanguages = {
    "af", "ar", "az", "be", "bg", "bn", "bs", "ca", "cs", "cy", "da", "de", "el", "en",
    "eo", "es", "et", "eu", "fa", "fi", "fr", "ga", "gl", "gu", "he", "hi", "hr", "hu",
    "hy", "id", "is", "it", "ja", "ka", "kk", "km", "kn", "ko", "lo", "lt", "lv", "mk",
    "ml", "mr", "ms", "my", "nb", "nl", "nn", "no", "pa", "pl", "pt", "ro", "ru", "sk",
    "sl", "sq", "sr", "sv", "sw", "ta", "te", "th", "tr", "uk", "ur", "uz", "vi", "zh"};

class SystemAssets : public LexemonAssets {
 public:
  std::vector<std::string> EmbeddedLanguages() override {
    return {kLanguages.begin(), kLanguages.end()};
  }
  Asset getAssetPathForLanguageCode(const std::string&) override { return {}; }
  std::optional<TLError> blockingOnDemandDownloadForLanguageCode(
      const std::string& code, std::chrono::steady_clock::time_point) override {
    return TLError{"LexemonAssets", 1, "no source of data for language " + code};
  }
  void onDemandDownloadForLanguageCode(const std::string&) override {}
};

}  // namespace

LexemonAssets& LexemonAssets::systemService() {
  static SystemAssets service;
  return service;
}
