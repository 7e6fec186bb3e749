#include <gtest/gtest.h>

#include <fstream>

#include "platform/DefaultsStore.h"
#include "platform/Files.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

using platform::DefaultsStore;
using platform::DefaultsValue;
using testsupport::LogCapture;
using testsupport::TemporaryDirectory;

TEST(DefaultsStore, ValuesConvertToWhatTheReaderNeeds) {
  struct Case {
    const char* json;
    int64_t integer;
    float floating;
    bool boolean;
  };
  const Case cases[] = {
      {"true", 1, 1, true},
      {"false", 0, 0, false},
      {"-3", -3, -3, true},
      {"2.9", 2, 2.9F, true},
      {"-2.9", -2, -2.9F, true},
      {"1e300", INT64_MAX, std::numeric_limits<float>::infinity(), true},
      {"-1e300", INT64_MIN, -std::numeric_limits<float>::infinity(), true},
      {"18446744073709551615", INT64_MAX, 18446744073709551615.0F, true},
      {"\" 12.5kg\"", 12, 12.5F, true},
      {"\"-99999999999999999999\"", INT64_MIN, -1e20F, true},
      {"\"YES\"", 0, 0, true},
      {"\"no\"", 0, 0, false},
      {"\"007\"", 7, 7, true},
      {"\"inf\"", 0, 0, false},
      {"\"\"", 0, 0, false},
      {"null", 0, 0, false},
      {"[1]", 0, 0, false},
  };
  for (const Case& one : cases) {
    const DefaultsValue value(nlohmann::json::parse(one.json));
    EXPECT_EQ(value.integerValue(), one.integer) << one.json;
    EXPECT_EQ(value.floatValue(), one.floating) << one.json;
    EXPECT_EQ(value.boolValue(), one.boolean) << one.json;
  }
}

TEST(DefaultsStore, WritesSurviveInTheFile) {
  TemporaryDirectory directory;
  const std::string path = directory / "defaults.json";
  DefaultsStore store(path);
  EXPECT_TRUE(store.keys().empty());
  EXPECT_FALSE(store.valueForKey("a"));
  EXPECT_TRUE(store.setString("a", "text"));
  EXPECT_TRUE(store.setInteger("b", INT64_MIN));
  EXPECT_TRUE(store.setFloat("c", 0.25F));
  EXPECT_TRUE(store.setBool("d", true));
  EXPECT_TRUE(store.setBool("d", false));
  DefaultsStore again(path);
  EXPECT_EQ(again.keys(), (std::vector<std::string>{"a", "b", "c", "d"}));
  EXPECT_EQ(again.valueForKey("a")->stringValue(), "text");
  EXPECT_EQ(again.valueForKey("b")->integerValue(), INT64_MIN);
  EXPECT_EQ(again.valueForKey("c")->floatValue(), 0.25F);
  EXPECT_FALSE(again.valueForKey("d")->boolValue());
}

TEST(DefaultsStore, AnUnreadableFileStaysAsItIs) {
  for (const char* content : {"{\"a\": 1", "[1, 2]", ""}) {
    TemporaryDirectory directory;
    const std::string path = directory / "defaults.json";
    std::ofstream(path) << content;
    LogCapture capture;
    DefaultsStore store(path);
    EXPECT_TRUE(store.keys().empty());
    EXPECT_TRUE(capture.contains("is not a JSON object"));
    EXPECT_FALSE(store.setBool("b", true));
    EXPECT_FALSE(store.valueForKey("b"));
    EXPECT_EQ(platform::readFile(path, 100, nullptr), content);
  }
}

TEST(DefaultsStore, AFailedWriteIsReportedAndNotKept) {
  TemporaryDirectory directory;
  DefaultsStore store(directory / "missing/defaults.json");
  LogCapture capture;
  EXPECT_FALSE(store.setBool("a", true));
  EXPECT_TRUE(capture.contains("error DefaultsStore: Cannot write the defaults file"));
  EXPECT_TRUE(store.keys().empty());
}
