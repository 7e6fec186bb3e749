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

TLParameters& add(TLParameters& params, std::shared_ptr<TLParamKeyValue> keyValue) {
  params.addKeyvalue(std::move(keyValue));
  return params;
}

}  // namespace

TEST(Parameters, TableOfDefaults) {
  EXPECT_EQ(Manager::getDefaultParamDict().size(), 30U);
  EXPECT_EQ(Manager::defaultParamsSet().size(), 30U);
  const auto params = Manager::paramsFromFallback();
  EXPECT_EQ(params->keyvaluesCount(), 30U);
  EXPECT_EQ(params->intValueForKey("salt.maxTermResults"), 1232348160);
  EXPECT_EQ(params->intValueForKey("salt.maxTopK"), 1000);
  EXPECT_EQ(params->intValueForKey("queryModification.sufficentRetrievalThreshold"), 0);
  EXPECT_EQ(params->floatValueForKey("salt.scoreThreshold"), 0.02F);
  EXPECT_EQ(params->floatValueForKey("zoneScore.XFrom"), 0.2F);
  EXPECT_TRUE(params->boolValueForKey("queryModification.enableStemModification"));
  EXPECT_FALSE(params->boolValueForKey("queryModification.enableStemModificationFirstPass"));
  EXPECT_TRUE(Manager::isValidParamKey("zoneScore.Subject"));
  EXPECT_FALSE(Manager::isValidParamKey("zoneScore.subject"));
  EXPECT_TRUE(Manager::isValidParamTypeWithKey("salt.maxTopK", TLParamType::integer));
  EXPECT_FALSE(Manager::isValidParamTypeWithKey("salt.maxTopK", TLParamType::floating));
}

TEST(Parameters, TypedReadsLogWhatFails) {
  TLParameters empty;
  TLParameters wrong;
  add(wrong, Manager::tlParamKeyValueWithKeyIntValue(u"ranking.textScoreWeight", 1));
  add(wrong, Manager::tlParamKeyValueWithKeyFloatValue(u"salt.maxTopK", 1));
  add(wrong,
      Manager::tlParamKeyValueWithKeyIntValue(u"queryModification.enableStemModification", 1));
  const auto ignored = Manager::paramFromKeyValues(
      {Manager::tlParamKeyValueWithKeyFloatValue(u"zoneScore.Subject", 7)});
  using Lines = std::vector<std::string>;
  LogCapture capture;
  const auto logged = [&] {
    const Lines lines = capture.lines();
    capture.clear();
    return lines;
  };

  const Lines fallback{
      "error TLParameters: Param: <zoneScore.Subject> not found in param. Using Fallback",
      "error TLParameters: Using shared Fallback params to get value for Param: "
      "<zoneScore.Subject>"};
  EXPECT_EQ(empty.floatValueForKey("zoneScore.Subject"), 0.9F);
  EXPECT_EQ(logged(), fallback);
  EXPECT_EQ(empty.floatValueForKey("zoneScore.Subject", ignored), 0.9F);
  EXPECT_EQ(logged(), fallback);

  EXPECT_EQ(empty.intValueForKey("zoneScore.Subject"), 0);
  EXPECT_EQ(logged(), Lines{"error TLParameters: Param: <zoneScore.Subject> is not expected to be "
                            "of Integer type. Bad Access!"});
  EXPECT_FALSE(empty.boolValueForKey("nosuch"));
  EXPECT_EQ(logged(), Lines{"error TLParameters: Param: <nosuch> is not expected to be of Bool "
                            "type. Bad Access!"});
  EXPECT_EQ(empty.floatValueForKey("salt.maxTopK"), std::nullopt);
  EXPECT_EQ(logged(), Lines{"error TLParameters: Param: <salt.maxTopK> is not expected to be of "
                            "Float type. Bad Access!"});
  EXPECT_EQ(empty.stringValueForKey("salt.maxTopK"), std::nullopt);
  EXPECT_EQ(logged(), Lines{"error TLParameters: Param: <salt.maxTopK> is not expected to be of "
                            "String type. Bad Access!"});

  EXPECT_EQ(wrong.floatValueForKey("ranking.textScoreWeight"), std::nullopt);
  EXPECT_EQ(wrong.intValueForKey("salt.maxTopK"), 0);
  EXPECT_FALSE(wrong.boolValueForKey("queryModification.enableStemModification"));
  EXPECT_EQ(logged(),
            (Lines{"error TLParameters: FloatValue for param: ranking.textScoreWeight is Nil!",
                   "error TLParameters: IntValue for param: salt.maxTopK is Nil!!",
                   "error TLParameters: BoolValue for param: "
                   "queryModification.enableStemModification is Nil!"}));

  EXPECT_EQ(empty.kvForKey("nosuch", nullptr), nullptr);
  EXPECT_EQ(logged().back(), "error TLParameters: Param: <nosuch> not found in Fallback. Error!");
  EXPECT_EQ(Manager::tlParamKeyValueWithKeyBoolValue(std::nullopt, true), nullptr);
  EXPECT_EQ(logged(), Lines{"error TLParamsManager: TLParamKeyValue can't be initialized with a "
                            "nil key"});
}

TEST(Parameters, OverrideText) {
  LogCapture capture;
  struct Case {
    TLString text;
    std::optional<std::string> records;  // dictionary of the result
    std::string log;
  };
  const Case cases[] = {
      {u"salt.maxTopK=500,ranking.freshnessWeight=0.5",
       R"([{"intValue":500,"key":"salt.maxTopK"},)"
       R"({"floatValue":0.5,"key":"ranking.freshnessWeight"}])",
       ""},
      {u"salt.maxTopK=-12abc", R"([{"intValue":-12,"key":"salt.maxTopK"}])", ""},
      {u"salt.maxTopK=+7", R"([{"intValue":7,"key":"salt.maxTopK"}])", ""},
      {u"salt.maxTopK=99999999999", R"([{"intValue":2147483647,"key":"salt.maxTopK"}])", ""},
      {u"ranking.freshnessWeight=-.5e1x",
       R"([{"floatValue":-5.0,"key":"ranking.freshnessWeight"}])", ""},
      {u"queryModification.enableStemModification=NO",
       R"([{"boolValue":false,"key":"queryModification.enableStemModification"}])", ""},
      {u"salt.maxTopK=500,bad", std::nullopt,
       "error TLParamsManager: Key Value format for override param bad cannot be parsed"},
      {u"salt.maxTopK=1=2", std::nullopt,
       "error TLParamsManager: Key Value format for override param salt.maxTopK=1=2 cannot be "
       "parsed"},
      {u"", std::nullopt,
       "error TLParamsManager: Key Value format for override param  cannot be parsed"},
      {u"nosuch=1,salt.maxTopK=500", R"([{"intValue":500,"key":"salt.maxTopK"}])",
       "error TLParamsManager: Override Param key: nosuch is not valid"},
      {u"salt.maxTopK=x", R"([{"intValue":1000,"key":"salt.maxTopK"}])",
       "error TLParamsManager: invalid type for override Param = salt.maxTopK=x (Integer expected) "
       "[Using Default Value]"},
      {u"salt.maxTopK=+-7", R"([{"intValue":1000,"key":"salt.maxTopK"}])",
       "error TLParamsManager: invalid type for override Param = salt.maxTopK=+-7 (Integer "
       "expected) [Using Default Value]"},
      {u"ranking.textScoreWeight=inf", R"([{"floatValue":1.0,"key":"ranking.textScoreWeight"}])",
       "error TLParamsManager: invalid type for override Param = ranking.textScoreWeight=inf "
       "(Float expected) [Using Default Value]"},
      {u"ranking.textScoreWeight=1e-50,ranking.freshnessWeight=-1e-400",
       R"([{"floatValue":0.0,"key":"ranking.textScoreWeight"},)"
       R"({"floatValue":0.0,"key":"ranking.freshnessWeight"}])",
       ""},
      {u"ranking.textScoreWeight=1e50", R"([{"floatValue":1.0,"key":"ranking.textScoreWeight"}])",
       "error TLParamsManager: invalid type for override Param = ranking.textScoreWeight=1e50 "
       "(Float expected) [Using Default Value]"},
      {u"queryModification.enableStemModification=yes",
       R"([{"boolValue":true,"key":"queryModification.enableStemModification"}])",
       "error TLParamsManager: invalid type for override Param = "
       "queryModification.enableStemModification=yes (BOOL expected) [Using Default Value]"},
  };
  for (const Case& one : cases) {
    capture.clear();
    const auto params = Manager::paramsFromString(one.text);
    const std::string name = platform::toUTF8(one.text);
    ASSERT_EQ(params != nullptr, one.records.has_value()) << name;
    if (params) {
      EXPECT_EQ(params->dictionaryRepresentation()["keyvalue"].dump(), *one.records) << name;
    }
    EXPECT_EQ(capture.lines(),
              one.log.empty() ? std::vector<std::string>() : std::vector<std::string>{one.log})
        << name;
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
