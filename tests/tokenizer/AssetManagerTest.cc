#include <gtest/gtest.h>

#include "tests/support/LogCapture.h"
#include "tokenizer/TLLexemonAssetManager.h"
#include "tokenizer/Tokenizer.h"
#include "tokenizer/lexemon/Lexemon.h"

using platform::Locale;

namespace {

// Records each call. After a download a language has data if it is in `fetchable`.
class FakeAssets : public LexemonAssets {
 public:
  std::vector<std::string> EmbeddedLanguages() override { return {"en", "fr"}; }
  Asset getAssetPathForLanguageCode(const std::string& code) override {
    calls.push_back("path " + code);
    if (present.count(code) == 0) return {};
    return {"/assets/" + code};
  }
  std::optional<TLError> blockingOnDemandDownloadForLanguageCode(
      const std::string& code, std::chrono::steady_clock::time_point deadline) override {
    calls.push_back("wait " + code);
    EXPECT_GT(deadline, std::chrono::steady_clock::now() + std::chrono::hours(1));
    if (fetchable.count(code) == 0) return TLError{"assets", 3, "late"};
    present.insert(code);
    return std::nullopt;
  }
  void onDemandDownloadForLanguageCode(const std::string& code) override {
    calls.push_back("start " + code);
  }

  std::set<std::string> present;
  std::set<std::string> fetchable;
  std::vector<std::string> calls;
};

using Calls = std::vector<std::string>;

}  // namespace

TEST(AssetManager, AsksOncePerLanguage) {
  FakeAssets assets;
  assets.present = {"tl"};
  TLLexemonAssetManager manager(assets);
  EXPECT_TRUE(manager.isLanguageSupported("en", 0));
  EXPECT_EQ(assets.calls, Calls{});
  EXPECT_FALSE(manager.isLanguageSupported("xx", 0));
  EXPECT_EQ(assets.calls, (Calls{"path xx", "start xx"}));
  assets.present.insert("xx");
  EXPECT_FALSE(manager.isLanguageSupported("xx", 0));
  EXPECT_TRUE(manager.isLanguageSupported("tl", 0));
  EXPECT_TRUE(manager.isLanguageSupported("tl", 0));
  EXPECT_EQ(assets.calls, (Calls{"path xx", "start xx", "path tl"}));
  EXPECT_EQ(lexemon::resources::DataRegistrationService::dataPathForLanguage("tl"), "/assets/tl");
  EXPECT_EQ(lexemon::resources::DataRegistrationService::dataPathForLanguage("xx"), std::nullopt);
}

TEST(AssetManager, WaitsForADownloadUntilTheTimeout) {
  FakeAssets assets;
  assets.fetchable = {"aa"};
  TLLexemonAssetManager manager(assets);
  testsupport::LogCapture log;
  EXPECT_TRUE(manager.isLanguageSupported("aa", UINT64_MAX));
  EXPECT_EQ(assets.calls, (Calls{"path aa", "wait aa", "path aa"}));
  const std::string category = " TLLexemonAssetManager: ";
  EXPECT_EQ(log.lines(),
            (Calls{"info" + category + "Fetching asset path for language: aa",
                   "info" + category + "Assets for language: aa found at path: (null)",
                   "info" + category +
                       "Downloading asset for language: aa with timeout: "
                       "18446744073709551615",
                   "info" + category + "Fetching asset path for language: aa",
                   "info" + category + "Assets for language: aa found at path: /assets/aa",
                   "info" + category + "Registering assets for language: aa at path: /assets/aa",
                   "info" + category + "Language: aa is supported"}));
  log.clear();
  EXPECT_FALSE(manager.isLanguageSupported("bb", uint64_t{7200} * 1000000000));
  EXPECT_TRUE(log.contains("error" + category + "Asset download timed out with error: "));
}

TEST(AssetManager, PicksASupportedLocale) {
  FakeAssets assets;
  TLLexemonAssetManager manager(assets);
  EXPECT_EQ(tokenizer::bestLexemonLocaleFrom("fr_CA", manager), "fr_CA");
  EXPECT_EQ(tokenizer::bestLexemonLocaleFrom("de_DE", manager), "en_US");
  EXPECT_EQ(tokenizer::bestLexemonLocaleFrom("fra", manager), "fra");
  EXPECT_EQ(tokenizer::userLocaleFrom(std::nullopt), "en_US");
  EXPECT_EQ(tokenizer::userLocaleFrom(Locale{"x", "x"}), "en_US");
  EXPECT_EQ(tokenizer::userLocaleFrom(Locale{"de_AT", "de"}), "de_AT");
  EXPECT_EQ(tokenizer::userLanguageFrom(std::nullopt), "en");
  EXPECT_EQ(tokenizer::userLanguageFrom(Locale{"de_AT", "de"}), "de");
  EXPECT_NE(tokenizer::NewFastLexemonTokenizer(bestLexemonLocale()), nullptr);
}

TEST(AssetManager, SystemServiceDownloadsNothing) {
  TLLexemonAssetManager manager(LexemonAssets::systemService());
  for (const char* language : {"en", "de", "ja", "th"}) {
    EXPECT_TRUE(manager.isLanguageSupported(language, 0)) << language;
  }
  EXPECT_FALSE(manager.isLanguageSupported("bo", 1));
}

TEST(PlatformLocale, ReadsPOSIXNames) {
  const struct {
    std::string name;
    std::optional<Locale> locale;
  } cases[] = {
      {"de_DE.UTF-8", Locale{"de_DE", "de"}},
      {"de_AT@euro", Locale{"de_AT", "de"}},
      {"en", Locale{"en", "en"}},
      {"pt_br", Locale{"pt_BR", "pt"}},
      {"C", std::nullopt},
      {"C.UTF-8", std::nullopt},
      {"POSIX", std::nullopt},
      {"", std::nullopt},
      {"_US", std::nullopt},
      {std::string("e\0n", 3), std::nullopt},
  };
  for (const auto& each : cases) {
    EXPECT_EQ(platform::localeFromPOSIXName(each.name), each.locale) << each.name;
  }
}

TEST(PlatformLocale, TheFirstVariableThatIsNotEmptyDecides) {
  setenv("LC_ALL", "", 1);
  setenv("LC_CTYPE", "fr_CA.UTF-8", 1);
  setenv("LANG", "de_DE", 1);
  EXPECT_EQ(platform::currentLocale(), (Locale{"fr_CA", "fr"}));
  setenv("LC_ALL", "C", 1);
  EXPECT_EQ(platform::currentLocale(), std::nullopt);
  for (const char* name : {"LC_ALL", "LC_CTYPE", "LANG"}) unsetenv(name);
  EXPECT_EQ(platform::currentLocale(), std::nullopt);
}
