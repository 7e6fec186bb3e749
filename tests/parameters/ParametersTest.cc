#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <fstream>
#include <map>
#include <thread>

#include "parameters/TLParamsManager.h"
#include "platform/DefaultsStore.h"
#include "platform/Files.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

using testsupport::LogCapture;
using testsupport::TemporaryDirectory;
using Manager = TLParamsManager;

namespace {

// "KEY TYPE VALUE, KEY TYPE VALUE"; empty without a set.
std::string valuesOf(const TLParameters* params) {
  std::vector<std::string> texts;
  for (size_t i = 0; params != nullptr && i < params->keyvaluesCount(); ++i) {
    auto record = params->keyvalueAtIndex(i)->dictionaryRepresentation();
    const std::string key = record["key"];
    record.erase("key");
    texts.push_back(fmt::format("{} {} {}", key, record.begin().key(), record.begin()->dump()));
  }
  return fmt::format("{}", fmt::join(texts, ", "));
}

}  // namespace

TEST(Parameters, TableOfDefaults) {
  const auto params = Manager::paramsFromFallback();
  EXPECT_EQ(params->intValueForKey("salt.maxTermResults"), 1232348160);
  EXPECT_EQ(params->intValueForKey("queryModification.sufficentRetrievalThreshold"), 0);
  EXPECT_EQ(params->floatValueForKey("salt.scoreThreshold"), 0.02F);
  EXPECT_TRUE(params->boolValueForKey("queryModification.enableStemModification"));
  EXPECT_FALSE(params->boolValueForKey("queryModification.enableStemModificationFirstPass"));
  EXPECT_TRUE(Manager::isValidParamKey("zoneScore.Subject"));
  EXPECT_FALSE(Manager::isValidParamKey("zoneScore.subject"));
  EXPECT_TRUE(Manager::isValidParamTypeWithKey("salt.maxTopK", TLParamType::integer));
  EXPECT_FALSE(Manager::isValidParamTypeWithKey("salt.maxTopK", TLParamType::floating));
}

TEST(Parameters, TypedReadsLogWhatFails) {
  const TLParameters empty;
  const auto wrong = Manager::paramFromKeyValues(
      {Manager::tlParamKeyValueWithKeyIntValue(u"ranking.textScoreWeight", 1),
       Manager::tlParamKeyValueWithKeyFloatValue(u"salt.maxTopK", 1),
       Manager::tlParamKeyValueWithKeyIntValue(u"queryModification.enableStemModification", 1)});
  const auto ignored = Manager::paramFromKeyValues(
      {Manager::tlParamKeyValueWithKeyFloatValue(u"zoneScore.Subject", 7)});
  LogCapture capture;
  // The lines without their category, one below the other.
  const auto logged = [&] {
    std::string text;
    for (const std::string& line : capture.lines()) {
      EXPECT_TRUE(line.starts_with("error TLParam"));
      text += line.substr(line.find(": ") + 2) + "\n";
    }
    capture.clear();
    return text;
  };

  const std::string fallback =
      "Param: <zoneScore.Subject> not found in param. Using Fallback\n"
      "Using shared Fallback params to get value for Param: <zoneScore.Subject>\n";
  EXPECT_EQ(empty.floatValueForKey("zoneScore.Subject"), 0.9F);
  EXPECT_EQ(logged(), fallback);
  EXPECT_EQ(empty.floatValueForKey("zoneScore.Subject", ignored), 0.9F);
  EXPECT_EQ(logged(), fallback);

  EXPECT_EQ(empty.intValueForKey("zoneScore.Subject"), 0);
  EXPECT_FALSE(empty.boolValueForKey("nosuch"));
  EXPECT_EQ(empty.floatValueForKey("salt.maxTopK"), std::nullopt);
  EXPECT_EQ(empty.stringValueForKey("salt.maxTopK"), std::nullopt);
  EXPECT_EQ(logged(),
            "Param: <zoneScore.Subject> is not expected to be of Integer type. Bad Access!\n"
            "Param: <nosuch> is not expected to be of Bool type. Bad Access!\n"
            "Param: <salt.maxTopK> is not expected to be of Float type. Bad Access!\n"
            "Param: <salt.maxTopK> is not expected to be of String type. Bad Access!\n");

  EXPECT_EQ(wrong->floatValueForKey("ranking.textScoreWeight"), std::nullopt);
  EXPECT_EQ(wrong->intValueForKey("salt.maxTopK"), 0);
  EXPECT_FALSE(wrong->boolValueForKey("queryModification.enableStemModification"));
  EXPECT_EQ(logged(),
            "FloatValue for param: ranking.textScoreWeight is Nil!\n"
            "IntValue for param: salt.maxTopK is Nil!!\n"
            "BoolValue for param: queryModification.enableStemModification is Nil!\n");

  EXPECT_EQ(empty.kvForKey("nosuch", nullptr), nullptr);
  EXPECT_THAT(logged(), testing::EndsWith("Param: <nosuch> not found in Fallback. Error!\n"));
  EXPECT_EQ(Manager::tlParamKeyValueWithKeyBoolValue(std::nullopt, true), nullptr);
  EXPECT_EQ(logged(), "TLParamKeyValue can't be initialized with a nil key\n");
}

TEST(Parameters, OverrideText) {
  LogCapture capture;
  const std::string format = "Key Value format for override param ";
  const std::string type = "invalid type for override Param = ";
  const struct {
    std::string text;
    std::string values;  // of the result, each with its key and type; empty if there is none
    std::string error;   // logged
  } cases[] = {
      {"salt.maxTopK=500,ranking.freshnessWeight=0.5",
       "salt.maxTopK intValue 500, ranking.freshnessWeight floatValue 0.5", ""},
      {"salt.maxTopK=-12abc", "salt.maxTopK intValue -12", ""},
      {"salt.maxTopK=+7", "salt.maxTopK intValue 7", ""},
      {"salt.maxTopK=99999999999", "salt.maxTopK intValue 2147483647", ""},
      {"ranking.freshnessWeight=-.5e1x", "ranking.freshnessWeight floatValue -5.0", ""},
      {"ranking.textScoreWeight=1e-50,ranking.freshnessWeight=-1e-400",
       "ranking.textScoreWeight floatValue 0.0, ranking.freshnessWeight floatValue 0.0", ""},
      {"queryModification.enableStemModification=NO",
       "queryModification.enableStemModification boolValue false", ""},
      {"salt.maxTopK=500,bad", "", format + "bad cannot be parsed"},
      {"salt.maxTopK=1=2", "", format + "salt.maxTopK=1=2 cannot be parsed"},
      {"", "", format + " cannot be parsed"},
      {"nosuch=1,salt.maxTopK=500", "salt.maxTopK intValue 500",
       "Override Param key: nosuch is not valid"},
      // An invalid value gives the default one.
      {"salt.maxTopK=x", "salt.maxTopK intValue 1000",
       type + "salt.maxTopK=x (Integer expected) [Using Default Value]"},
      {"salt.maxTopK=+-7", "salt.maxTopK intValue 1000",
       type + "salt.maxTopK=+-7 (Integer expected) [Using Default Value]"},
      {"ranking.textScoreWeight=inf", "ranking.textScoreWeight floatValue 1.0",
       type + "ranking.textScoreWeight=inf (Float expected) [Using Default Value]"},
      {"ranking.textScoreWeight=1e50", "ranking.textScoreWeight floatValue 1.0",
       type + "ranking.textScoreWeight=1e50 (Float expected) [Using Default Value]"},
      {"queryModification.enableStemModification=yes",
       "queryModification.enableStemModification boolValue true",
       type + "queryModification.enableStemModification=yes (BOOL expected) [Using Default Value]"},
  };
  for (const auto& one : cases) {
    capture.clear();
    const auto params = Manager::paramsFromString(platform::fromUTF8(one.text));
    EXPECT_EQ(params == nullptr, one.values.empty()) << one.text;
    EXPECT_EQ(valuesOf(params.get()), one.values) << one.text;
    std::vector<std::string> lines;
    if (!one.error.empty()) lines.push_back("error TLParamsManager: " + one.error);
    EXPECT_EQ(capture.lines(), lines) << one.text;
  }
}

TEST(Parameters, OverridesReplaceTheDefaults) {
  TemporaryDirectory directory;
  setenv("STATE_DIRECTORY", directory.path().c_str(), 1);
  const auto keyless = std::make_shared<TLParamKeyValue>();
  const auto overrides = Manager::paramFromKeyValues(
      {keyless, Manager::tlParamKeyValueWithKeyIntValue(u"salt.maxTopK", 5),
       Manager::tlParamKeyValueWithKeyIntValue(u"salt.maxTopK", 6),
       Manager::tlParamKeyValueWithKeyIntValue(u"nosuch", 1)});
  const auto resolved = Manager::resolveOverrides(*overrides, true);
  EXPECT_EQ(resolved->keyvaluesCount(), 30U);
  EXPECT_EQ(resolved->intValueForKey("salt.maxTopK"), 5);
  EXPECT_EQ(resolved->floatValueForKey("zoneScore.Subject"), 0.9F);
  EXPECT_NE(resolved->parameterKeyValueForKey("salt.maxTopK"), overrides->keyvalueAtIndex(1));
  const auto cached = Manager::getDefaultSearchParamsWithCaching(true);
  EXPECT_EQ(Manager::getDefaultSearchParamsWithCaching(true), cached);
  EXPECT_EQ(cached->intValueForKey("salt.maxTopK"), 1000);
  EXPECT_NE(Manager::getDefaultSearchParamsWithCaching(false), cached);
}

TEST(Parameters, FirstReadersOfTheCacheGetOneSet) {
  std::vector<std::shared_ptr<TLParameters>> seen(4);
  std::vector<std::thread> threads;
  for (auto& one : seen) {
    threads.emplace_back([&one] { one = Manager::getDefaultSearchParamsWithCaching(true); });
  }
  for (auto& thread : threads) thread.join();
  for (const auto& one : seen) EXPECT_EQ(one, seen[0]);
}

TEST(Parameters, UserDefaultsOverrideTheTable) {
  TemporaryDirectory directory;
  const std::string path = directory / "defaults.json";
  std::ofstream(path) << R"({"salt.maxTopK": "250 of them", "zoneScore.Subject": 1,
      "queryModification.enableStemModification": 0, "salt.maxTermResults": 1e18, "other": [1]})";
  platform::DefaultsStore store(path);
  LogCapture capture;
  const auto params = Manager::loadSearchParamsFromUserDefaults(store);
  EXPECT_EQ(params->keyvaluesCount(), 30U);
  EXPECT_EQ(params->intValueForKey("salt.maxTopK"), 250);
  EXPECT_EQ(params->floatValueForKey("zoneScore.Subject"), 1.0F);
  EXPECT_FALSE(params->boolValueForKey("queryModification.enableStemModification"));
  EXPECT_EQ(params->intValueForKey("salt.maxTermResults"), 2147483647);
  EXPECT_EQ(params->floatValueForKey("zoneScore.Authors"), 1.0F);
  EXPECT_EQ(capture.count("in UserDefaults. [Using Fallback]"), 26U);
  EXPECT_TRUE(
      capture.has("info TLParamsManager: No override for param <zoneScore.Authors> in "
                  "UserDefaults. [Using Fallback]"));

  Manager::saveSearchParamsToUserDefaults(store);
  platform::DefaultsStore saved(path);
  EXPECT_EQ(saved.keys().size(), 31U);
  EXPECT_EQ(saved.valueForKey("salt.maxTopK")->stringValue(), "250 of them");
  EXPECT_EQ(saved.valueForKey("ranking.rankingLogsItemCap")->integerValue(), 10);
  EXPECT_EQ(saved.valueForKey("zoneScore.XFrom")->floatValue(), 0.2F);
  EXPECT_TRUE(saved.valueForKey("queryModification.enableSynonymModification")->boolValue());
}

TEST(Parameters, WritingWithoutAKeyEndsTheProcess) {
  TLParameters params;
  params.addKeyvalue(std::make_shared<TLParamKeyValue>());
  EXPECT_DEATH((void)params.data(), "nil != self->_key.*TLParamKeyValue writeTo:");
  TLParameters read;
  EXPECT_TRUE(read.initWithData(std::string("\x0a\x02\x18\x05", 4)));
  EXPECT_EQ(read.keyvalueAtIndex(0)->intValue(), 5);
  EXPECT_EQ(read.parameterKeyValueForKey(""), nullptr);
}
