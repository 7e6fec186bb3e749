#include <gtest/gtest.h>

#include <unordered_set>

#include "modification/TALSynonyms.h"
#include "platform/Files.h"
#include "platform/Text.h"
#include "tests/modification/ModificationSupport.h"

namespace {

using testsupport::word;
using Terms = std::vector<saltsearch::Term>;

class SynonymFile : public testing::Test {
 protected:
  bool load(const std::string& bytes) {
    EXPECT_TRUE(platform::writeFileAtomically(path, bytes, nullptr));
    error.reset();
    return model.loadSynonymsFromFile(path, &error);
  }
  // The synonyms of a word, joined by commas; "-" for none.
  std::string of(const std::string& headword) const {
    const auto* found = model.synonyms(headword);
    return found == nullptr ? "-" : fmt::format("{}", fmt::join(*found, ","));
  }

  testsupport::LogCapture log;
  testsupport::TemporaryDirectory directory;
  const std::string path = directory / "synonyms.txt";
  TALSynonyms model;
  std::optional<TLError> error;
};

}  // namespace

TEST_F(SynonymFile, IsReadLineByLine) {
  const struct {
    const char* file;
    const char* headword;
    const char* synonyms;
  } cases[] = {
      {"car,auto,automobile", "car", "auto,automobile"},
      {"car,auto,automobile", "auto", "-"},
      {"Car, \tAuto ", "car", "auto"},
      {"car,auto\ncar,vehicle", "car", "auto"},
      {"car,car", "car", "-"},
      {"car,car\ncar,4x4\ncar,auto", "car", "auto"},
      {"car,4x4,auto,,car, AUTO,van", "car", "auto,van"},
      {"driver's,auto", "driver's", "-"},
      {"driver's,auto", "drivers", "-"},
      {"#car,auto\ncar", "car", "-"},
      {" ,auto", "", "-"},
      {"car,auto mobile,to  go", "car", "auto mobile,to  go"},
      {"\xC3\x89TUDE,\xC3\x9C"
       "BUNG",
       "\xC3\xA9tude",
       "\xC3\xBC"
       "bung"},
      {"a,b\r\nc,d", "c", "d"},
      {"a,b\rc,d", "c", "d"},
      {"a,b\vx\f\xC2\x85y\xE2\x80\xA8\xE2\x80\xA9"
       "c,d",
       "c", "d"},
  };
  for (const auto& c : cases) {
    EXPECT_TRUE(load(c.file));
    EXPECT_EQ(of(c.headword), c.synonyms) << c.file;
  }
  for (const char bad : std::string("!~`@#$%^&*-+();:=_{}[].<>?\\/|\"'0123456789")) {
    ASSERT_TRUE(load(std::string("good,all,b") + bad + "d," + bad + ',' + bad + "x"));
    EXPECT_EQ(of("good"), "all") << bad;
  }
}

TEST_F(SynonymFile, MayHaveAnyEncoding) {
  ASSERT_TRUE(load("caf\xE9,bistro\nna\xEFve,green\nHome,house\n"));  // Latin-1
  EXPECT_EQ(of("caf\xC3\xA9") + of("na\xC3\xAFve") + of("home"), "bistrogreenhouse");
}

TEST_F(SynonymFile, UnreadableKeepsTheSynonymsAndReportsWhy) {
  ASSERT_TRUE(load("car,auto\nbad line\nhome,house"));
  EXPECT_EQ(log.lines(), (std::vector<std::string>{
                             "default TALSynonyms: Loading synonym from file: " + path,
                             "default TALSynonyms: Loaded 2 synonyms from file: " + path}));
  for (const char* empty : {"", "\xEF\xBB\xBF"}) {
    EXPECT_FALSE(load(empty));
    EXPECT_FALSE(error);
    EXPECT_TRUE(log.has("error TALSynonyms: Empty synonym file: " + path));
    log.clear();
  }
  EXPECT_FALSE(load(std::string(TALSynonyms::kMaxFileBytes + 1, 'x')));
  EXPECT_EQ(error->code, EFBIG);
  EXPECT_TRUE(log.contains("error TALSynonyms: Failed to read synonym file: " + path +
                           " with error: POSIX "));
  EXPECT_FALSE(model.loadSynonymsFromFile(directory.path(), &error));
  EXPECT_EQ(error->code, EISDIR);
  EXPECT_FALSE(model.loadSynonymsFromFile(directory / "none", &error));
  EXPECT_EQ(*error, (TLError{"TALSynonyms", 1001,
                             "Synonym file: " + (directory / "none") + " does not exist"}));
  EXPECT_TRUE(log.has("error TALSynonyms: Failed to load synonym file: " + (directory / "none")));
  EXPECT_EQ(of("car"), "auto");
}

TEST_F(SynonymFile, LoadsWithAnyContents) {
  std::string longLine = "head,";
  for (int i = 0; i < 200000; ++i) {
    for (int n = 0, rest = i; n < 4; ++n, rest /= 26)
      longLine += static_cast<char>('a' + rest % 26);
    longLine += ',';
  }
  ASSERT_TRUE(load(longLine + "\nhome,house"));
  EXPECT_GT(model.synonyms("head")->size(), 100000u);
  EXPECT_EQ(of("home"), "house");
  std::string noise;
  for (uint32_t i = 0, x = 1; i < 100000; ++i, x = x * 1664525 + 1013904223) {
    noise += static_cast<char>(x >> 24);
  }
  EXPECT_TRUE(load(noise));
  EXPECT_TRUE(load(std::string(5, '\0')));
}

TEST(ShippedSynonyms, AreAllUsableAndPlain) {
  const auto bytes = platform::readFile(TALLOW_SYNONYMS, TALSynonyms::kMaxFileBytes, nullptr);
  ASSERT_TRUE(bytes);
  EXPECT_EQ(bytes->find_first_not_of("abcdefghijklmnopqrstuvwxyz ,\n"), std::string::npos);
  const TLString text = platform::fromUTF8(*bytes);
  const auto lines = platform::split(text, u"\n");
  ASSERT_TRUE(lines.back().empty());
  TALSynonyms model;
  ASSERT_TRUE(model.loadSynonymsFromFile(TALLOW_SYNONYMS, nullptr));
  std::unordered_set<TLStringView> headwords;
  for (size_t i = 0; i + 1 < lines.size(); ++i) {
    const std::string line = platform::toUTF8(lines[i]);
    const auto fields = platform::split(lines[i], u",");
    EXPECT_TRUE(headwords.insert(fields[0]).second) << line;
    const auto* synonyms = model.synonyms(platform::toUTF8(fields[0]));
    ASSERT_NE(synonyms, nullptr) << line;
    EXPECT_EQ(platform::toUTF8(fields[0]) + ',' + fmt::format("{}", fmt::join(*synonyms, ",")),
              line);
  }
  EXPECT_GE(headwords.size(), 600u);
}

namespace {

class Expansion : public testing::Test {
 protected:
  Expansion()
      : corpus({"red automobile for sale ", "big van ", "an auto auto ", "the open road ",
                "red auto parts "}) {
    model.setSynonymVocab({{"car", {"sedan", "van", "auto", "automobile"}},
                           {"boat", {"ship", "yacht"}},
                           {"lorry", {"van", "open road"}}});
  }
  // The score and the expanded tokens, or "no".
  std::string expand(Terms terms) {
    Terms out;
    const Terms searched = corpus.searched(std::move(terms));
    score = model.synonymExpansion(searched, out, *corpus.index);
    return score == -1.0F ? "no" : testsupport::tokensOf(out);
  }

  testsupport::Corpus corpus;
  TALSynonyms model;
  float score = 0;
};

}  // namespace

TEST_F(Expansion, TakesTheSynonymThatServesTheWholeQueryBest) {
  EXPECT_EQ(expand({word("car ")}),
            "[van ]");  // all have the same score, so the first in the file wins
  EXPECT_FLOAT_EQ(score, 0.9F);
  EXPECT_EQ(expand({word("red "), word("car ")}), "[red ][auto ]");
  EXPECT_FLOAT_EQ(score, 0.81F);
  EXPECT_EQ(expand({word("car "), word("sale")}), "[automobile ][sale]");
  EXPECT_EQ(expand({word("lorry "), word("the")}), "[open road ][the]");
  EXPECT_TRUE(corpus.log.has(
      "default TALSynonyms: No match token <car> is considered for synonym expansion."));
  EXPECT_TRUE(corpus.log.has("default TALSynonyms: Found 3 out of 4 synonyms in index"));
  EXPECT_TRUE(
      corpus.log.has("default TALSynonyms: Synonym expansion returns score 0.810000. Term "
                     "<\"ca...\"<3 chars>> modified with best synonym <\"au...\"<5 chars>>."));
}

TEST_F(Expansion, KeepsAQueryThatItCannotImprove) {
  saltsearch::Term pair = word("car boat ");
  pair.isUnigram = false;
  const struct {
    Terms terms;
    std::string line;
  } cases[] = {
      {{word("car "), word("red "), word("boat ")}, "as more than 1 term has no-matched document"},
      {{word("red "), word("van"), pair, word("")}, "as all terms matched a document"},
      {{word("car")}, "for <\"ca...\"<3 chars>> as it doesn't have a trailing space"},
      {{word("train ")}, "for <\"tr...\"<5 chars>> as it has no synonym in the vocab."},
      {{word("boat ")}, "for <\"bo...\"<4 chars>> as none of its 2 synonyms are present in index."},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(expand(c.terms), "no");
    EXPECT_TRUE(corpus.log.has("default TALSynonyms: Skipping synonym expansion " + c.line))
        << c.line;
  }
  // A synonym that occurs only in documents without the rest of the query.
  EXPECT_EQ(expand({word("open "), word("car ")}), "no");
  EXPECT_TRUE(
      corpus.log.has("default TALSynonyms: Synonym expansion returns score -1, as best candidate "
                     "synonym <> has sub-zero textScore."));
}
