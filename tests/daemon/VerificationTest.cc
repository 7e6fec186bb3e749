#include <gtest/gtest.h>

#include <functional>
#include <set>

#include "daemon/TALSearchService.h"
#include "daemon/VerificationQuery.h"
#include "parameters/TLParamsManager.h"
#include "querylang/TLQueryAdditions.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Outcome.h"
#include "tests/support/TemporaryDirectory.h"

// Verification queries from their text to the mails found.
namespace {

using Identifiers = std::multiset<TLString>;

// Distinct subjects that are hard to quote.
TLString subjectNumber(size_t i) {
  static const std::vector<std::string> kForms{"It's the {} o'clock news",
                                               "\"{}\", she said",
                                               "C:\\mail\\{}\\",
                                               "* {} stars **",
                                               "one, two, {}",
                                               "京都旅行の予定 {}",
                                               "\\' and \\\" and \\* {} \\\\'",
                                               "({}) || kTLItemSubject = x",
                                               "{}",
                                               "Re: Fwd: Größe {} – ça va ?"};
  return platform::fromUTF8(fmt::format(fmt::runtime(kForms[i % kForms.size()]), i));
}

// A query as a mail client sends it to check whether it has messages with these subjects.
std::shared_ptr<TLQuery> queryFor(const std::vector<TLString>& subjects) {
  std::string text;
  for (const TLString& subject : subjects) {
    text += text.empty() ? "(" : " || ";
    text += "kTLItemSubject = '" + sq::escaped(platform::toUTF8(subject)) + "'";
  }
  return TLQueryAdditions::initWithBeaconQueryString(platform::fromUTF8(text + ")"), true);
}

class Verification : public testing::Test {
 protected:
  Verification()
      : service(std::make_shared<TALIndexerManager>(directory.path(), [] {
          return TALIndexerManager::LockState{true, true};
        })) {}
  ~Verification() override { service.shutdown(); }

  void add(const TLString& subject) {
    auto item = std::make_shared<TLIndexableItem>();
    item->setIdentifier(platform::fromUTF8(std::to_string(items.size())));
    item->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, subject);
    items.push_back(std::move(item));
  }
  void index() {
    ASSERT_EQ(testsupport::outcomeOf(
                  [this](auto done) { service.indexItems(items, "test", "default", done); }),
              std::nullopt);
  }

  Identifiers found(const TLQuery& query, const char16_t* parameters) {
    const auto copy = query.copyWithZone();
    copy->setSearchParams(TLParamsManager::paramsFromString(parameters));
    Identifiers identifiers;
    service.searchItemsForQuery(*copy, 0, "default", 1,
                                [&](const auto& results, const std::optional<TLError>& error) {
                                  ASSERT_EQ(error, std::nullopt);
                                  for (const auto& item : *results) {
                                    identifiers.insert(*item->identifier());
                                  }
                                });
    return identifiers;
  }
  // The mails with one of the subjects.
  [[nodiscard]] Identifiers expected(const std::vector<TLString>& subjects) const {
    const std::set<TLString> wanted(subjects.begin(), subjects.end());
    Identifiers identifiers;
    for (const auto& item : items) {
      if (wanted.contains(*item->stringValueForKey(TLAttributeKey::SUBJECT))) {
        identifiers.insert(*item->identifier());
      }
    }
    return identifiers;
  }

  testsupport::LogCapture log;
  testsupport::TemporaryDirectory directory;
  TALSearchService service;
  TALSearchService::Items items;
};

constexpr const char* kLinear = "will use a slow linear search";

}  // namespace

TEST_F(Verification, AnySubjectsAreFoundExactlyByBothPaths) {
  constexpr size_t kSubjects = 1000;
  for (size_t i = 0; i < kSubjects; ++i) {
    add(subjectNumber(i));
    if (i % 7 == 0) add(subjectNumber(i));                 // twice
    if (i % 3 == 0) add(subjectNumber(i) + u" tomorrow");  // matches the words only
  }
  index();
  for (const size_t count : {size_t{5}, size_t{50}, kSubjects}) {
    std::vector<TLString> subjects;
    for (size_t i = 0; i < count; ++i) subjects.push_back(subjectNumber(i));
    subjects.push_back(subjects.front());
    const auto query = queryFor(subjects);
    ASSERT_TRUE(isMailVerificationQuery(query.get()));
    EXPECT_EQ(subjectsFromRawQuery(*query->rawQuery()), subjects);
    log.clear();
    EXPECT_EQ(found(*query, u"salt.maxTopK=100000"), expected(subjects)) << count;
    EXPECT_EQ(log.count(kLinear), 0u) << count;
    EXPECT_EQ(found(*query, u"salt.maxTopK=1"), expected(subjects)) << count;
    EXPECT_EQ(log.count(kLinear), 1u) << count;
    EXPECT_EQ(log.count("Verification Query Successful"), 2u) << count;
    EXPECT_EQ(log.contains("Doc with No Subject Match: <\"on...\"<21 chars>>"), count > 24)
        << count;
  }
}

// A subject without words is in no index; one that no mail has is not found.
TEST_F(Verification, TheLinearPathFindsWhatTheIndexCannot) {
  for (const char16_t* const subject :
       {u"one", u"two", u"three", u"four", u"five", u"!!!", u"!!!"}) {
    add(subject);
  }
  index();
  std::vector<TLString> subjects{u"one", u"two", u"three", u"four", u"!!!"};
  EXPECT_EQ(found(*queryFor(subjects), u"salt.maxTopK=100"), expected(subjects));
  EXPECT_EQ(log.count(kLinear), 1u);
  // A number of results that reaches the limit cannot be trusted.
  subjects.back() = u"five";
  EXPECT_EQ(found(*queryFor(subjects), u"salt.maxTopK=5"), expected(subjects));
  EXPECT_TRUE(log.contains("(max_limit = 5)"));
  subjects.back() = u"six";
  EXPECT_EQ(found(*queryFor(subjects), u"salt.maxTopK=100"), expected(subjects));
  EXPECT_TRUE(log.has("fault TALIndexer: Verification Query Failed"));
}

TEST(VerificationQuery, IsRecognisedByItsShape) {
  EXPECT_FALSE(isMailVerificationQuery(nullptr));
  const std::vector<TLString> five{u"a", u"b", u"c", u"d", u"e"};
  const TLQuery query;
  EXPECT_FALSE(isMailVerificationQuery(&query));
  const auto good = queryFor(five);
  EXPECT_TRUE(isMailVerificationQuery(good.get()));
  const auto four = queryFor({u"a", u"b", u"c", u"d"});
  EXPECT_FALSE(isMailVerificationQuery(four.get()));
  using Change = std::function<void(TLQueryNode&)>;
  const std::vector<Change> changes{
      [](TLQueryNode& root) { root.setMergeOp(TLQueryNodeMergeOp::AND); },
      [](TLQueryNode& root) { root.childAtIndex(4)->addKey(TLAttributeKey::SUBJECT); },
      [](TLQueryNode& root) { root.childAtIndex(3)->clearKeys(); },
      [](TLQueryNode& root) { root.childAtIndex(2)->setOp(TLQueryNodeOp::STRING_NOT_EQUAL); },
      [](TLQueryNode& root) { root.childAtIndex(0)->setMergeOp(TLQueryNodeMergeOp::OR); }};
  for (const Change& change : changes) {
    const auto changed = queryFor(five);
    change(*changed->root());
    EXPECT_FALSE(isMailVerificationQuery(changed.get()));
  }
}

TEST(VerificationQuery, SubjectsComeFromTheText) {
  using Strings = std::vector<TLString>;
  const std::vector<std::pair<TLString, Strings>> cases{
      {u"", {}},
      {u"kTLItemSubject = 'a\\'b' || kTLItemSubject = '\\\"q\\\" \\*'", {u"a'b", u"\"q\" *"}},
      {u"kTLItemSubject = '\\\\\\'x'", {u"\\'x"}},
      // An escaped backslash before an apostrophe is unescaped twice.
      {u"kTLItemSubject = 'a\\\\'b'", {u"a'b"}},
      {u"kTLItemSubject = 'x' || other = 'y' || kTLItemSubject = ''", {u"x"}},
  };
  for (const auto& [raw, subjects] : cases) {
    EXPECT_EQ(subjectsFromRawQuery(raw), subjects) << platform::toUTF8(raw);
  }
}
