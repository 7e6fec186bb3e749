// The parsers of attachments, in this process.

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <random>

#include "extract/OfficeXML.h"
#include "extract/Protocol.h"
#include "extract/TextExtraction.h"
#include "extract/ZipReader.h"
#include "platform/Text.h"
#include "tests/extract/Samples.h"
#include "tests/support/Damage.h"
#include "tests/support/Seed.h"

namespace {

using extract::Extraction;
using extract::Kind;
using extract::Outcome;

constexpr size_t kRoom = 100000;

// The outcome and the text, with a slash for the end of lines and pages.
std::string shown(Kind kind, const std::string& bytes, size_t limit = kRoom) {
  Extraction result = extract::extractText(kind, bytes, limit);
  for (char& c : result.text) c = c == '\n' || c == '\f' ? '/' : c;
  const auto repeats = [](char a, char b) { return a == '/' && b == '/'; };
  result.text.erase(std::unique(result.text.begin(), result.text.end(), repeats),
                    result.text.end());
  return fmt::format("{}:{}", nameOf(result.outcome), result.text);
}

std::string shownXML(Kind kind, const std::string& xml) {
  const char* const name = kind == Kind::openDocument ? "content.xml" : "word/document.xml";
  return shown(kind, samples::zip({{name, xml}}));
}

std::string repeated(std::string_view text, size_t count) {
  return fmt::format("{}", fmt::join(std::vector(count, text), ""));
}

TEST(TextExtraction, FindsTheTextOfEachKind) {
  EXPECT_EQ(shown(Kind::pdf, samples::pdf({"The harbour is open", "Second page"})),
            "extracted:The harbour is open/Second page/");
  EXPECT_EQ(shown(Kind::pdf, samples::japanesePDF()), "extracted:京都/");
  EXPECT_EQ(shown(Kind::officeXML, samples::docx({"Lease &amp; more", "café"})),
            "extracted:Lease & more/café/");
  EXPECT_EQ(shown(Kind::openDocument, samples::odt({"One <text:span>two</text:span>", "three"})),
            "extracted:One two/three/");
  EXPECT_EQ(shown(Kind::officeXML,
                  samples::zip({{"xl/sharedStrings.xml",
                                 "<sst><si><t>Quarter</t></si>"
                                 "<si><r><t>Reve</t></r><r><t>nue</t></r></si></sst>"},
                                {"xl/worksheets/sheet1.xml",
                                 "<s><c t='s'><v>17</v></c><c><is><t>inline</t></is></c></s>"},
                                {"xl/styles.xml", "<t>unseen</t>"}})),
            "extracted:Quarter/Revenue/inline/");
  EXPECT_EQ(
      shown(Kind::officeXML,
            samples::zip({{"ppt/slides/slide2.xml", "<a:p><a:t>Slide</a:t></a:p>"},
                          {"ppt/notesSlides/notesSlide2.xml", "<a:p><a:t>Note</a:t></a:p>"}})),
      "extracted:Slide/Note/");
  EXPECT_EQ(shown(Kind::zip, samples::zip({{"photos/pier.jpg", "x"}, {"bär.txt", "y"}})),
            "extracted:photos/pier.jpg/bär.txt/");
  EXPECT_EQ(shown(Kind::html, "<body><p>Dear &eacute;</p><script>no</script></body>"),
            "extracted:Dear é/");
}

TEST(TextExtraction, OfficeXML) {
  const Kind odf = Kind::openDocument;
  const Kind ooxml = Kind::officeXML;
  const std::tuple<Kind, std::string, std::string> rows[] = {
      {ooxml, "<w:p><w:t>a</w:t><w:tab/><w:t>b</w:t><w:br/><w:t>c</w:t></w:p>",
       "extracted:a\tb/c/"},
      {ooxml, "<w:p><w:delText>old</w:delText><w:instrText>PAGE</w:instrText><w:t>new</w:t></w:p>",
       "extracted:new/"},
      {ooxml, "<w:p><w:t/></w:p>", "empty:"},
      {odf, "<b><text:h>T</text:h><text:p>a<text:s/>b<text:tab/>c<text:line-break/>d</text:p></b>",
       "extracted:T/a b\tc/d/"},
      {odf,
       "<b>no<text:tracked-changes><text:p>gone</text:p></text:tracked-changes>"
       "<text:p>here</text:p></b>",
       "extracted:here/"},
      {odf, "<b><text:p>begun</text:p><text:p>cut", "cut:begun/cut/"},
      {odf, "<b><text:p>wrong</b>", "cut:wrong/"},
      {odf, "not XML", "damaged:"},
      {odf, "<!DOCTYPE b [<!ENTITY a \"aaaa\">]><b><text:p>&a;</text:p></b>", "damaged:"},
      {odf, "<!DOCTYPE b [<!ENTITY a SYSTEM \"file:///etc/passwd\">]><b><text:p>&a;</text:p></b>",
       "damaged:"},
      {odf, "<?xml version='1.0' encoding='ISO-8859-1'?><text:p>caf\xE9</text:p>",
       "extracted:café/"},
      {odf, repeated("<d>", 400) + "<text:p>deep</text:p>" + repeated("</d>", 400),
       "extracted:deep/"},
      {odf, repeated("<d>", 200000), "damaged:"}};
  for (const auto& [kind, xml, result] : rows) {
    EXPECT_EQ(shownXML(kind, xml), result) << xml.substr(0, 200);
  }
}

TEST(TextExtraction, CutsAtTheLimitInWholeCharacters) {
  EXPECT_EQ(shown(Kind::officeXML, samples::docx({"caféé"}), 6), "cut:café");
  EXPECT_EQ(shown(Kind::officeXML, samples::docx({"caféé"}), 4), "cut:caf");
  EXPECT_EQ(shown(Kind::html, "<p>one two</p>", 3), "cut:one");
  const Extraction pages = extract::extractText(Kind::pdf, samples::pdfOfManyPages(2000), 1000);
  EXPECT_EQ(pages.outcome, Outcome::cut);
  EXPECT_EQ(pages.text.size(), 1000);
}

TEST(TextExtraction, TellsWhyThereIsNoText) {
  EXPECT_EQ(shown(Kind::pdf, samples::pdf({""})), "empty:");
  EXPECT_EQ(shown(Kind::pdf, samples::encryptedPDF()), "encrypted:");
  EXPECT_EQ(shown(Kind::pdf, "no PDF"), "damaged:");
  EXPECT_EQ(shown(Kind::officeXML, "\xD0\xCF\x11\xE0 an older file"), "encrypted:");
  EXPECT_EQ(shown(Kind::officeXML, samples::zip({{"mimetype", "other"}})), "damaged:");
  EXPECT_EQ(shown(Kind::zip, "no zip file"), "damaged:");
}

TEST(TextExtraction, LooksIntoNoArchiveInAnArchive) {
  std::string nested = samples::zip({{"word/document.xml", "<w:p><w:t>inner</w:t></w:p>"}});
  for (int i = 0; i < 50; ++i) nested = samples::zip({{"word/document.xml", nested}}, false);
  EXPECT_EQ(shown(Kind::officeXML, nested), "damaged:");
  EXPECT_EQ(shown(Kind::zip, nested), "extracted:word/document.xml/");
}

// Small files that unpack to more than is read.
TEST(TextExtraction, ReadsABombUpToItsLimits) {
  const size_t size = extract::ZipReader::kMaxUnpackedBytes / 4;
  const std::string spaces(size, ' ');
  std::vector<samples::ZipEntry> entries;
  for (int i = 0; i < 6; ++i) {
    entries.push_back({fmt::format("word/header{}.xml", i), "<w:p>" + spaces + "</w:p>"});
  }
  const std::string bomb = samples::zip(entries);
  EXPECT_LT(bomb.size(), size / 100);
  EXPECT_EQ(shown(Kind::officeXML, bomb), "damaged:");

  const std::vector<samples::ZipEntry> names(extract::ZipReader::kMaxEntries + 10, {"n", ""});
  EXPECT_TRUE(shown(Kind::zip, samples::zip(names)).starts_with("cut:n/n/n"));
}

// Whatever is cut off or changed, there is valid text within the limit, or none.
TEST(TextExtraction, SurvivesDamage) {
  const std::pair<Kind, std::string> files[] = {
      {Kind::pdf, samples::pdf({"A page", "Another"})},
      {Kind::officeXML, samples::docx({"One", "two"})},
      {Kind::openDocument, samples::odt({"One", "two"})},
      {Kind::zip, samples::zip({{"a", "b"}, {"c", "d"}})}};
  const auto check = [](Kind kind, const std::string& bytes) {
    const Extraction result = extract::extractText(kind, bytes, 50);
    const bool some = result.outcome == Outcome::extracted || result.outcome == Outcome::cut;
    EXPECT_EQ(some, !result.text.empty());
    EXPECT_LE(result.text.size(), 50);
    EXPECT_TRUE(platform::isValidUTF8(result.text));
  };
  std::mt19937 random(testsupport::firstSeed());
  for (const auto& [kind, whole] : files) {
    for (size_t size = 0; size < whole.size(); size += 1 + size / 40) {
      check(kind, whole.substr(0, size));
    }
    for (int i = 0; i < 150; ++i) check(kind, testsupport::damaged(whole, 4, random));
    std::string noise(3000, '\0');
    for (char& c : noise) c = static_cast<char>(random());
    check(kind, noise);
  }
}

TEST(ExtractProtocol, TakesOnlyWhatIsEncoded) {
  const extract::Request request{Kind::html, 17};
  const extract::ReplyHeader reply{Outcome::cut, true, 17};
  EXPECT_EQ(extract::parseRequest(encode(request)), request);
  EXPECT_EQ(extract::parseReply(encode(reply), 17), reply);
  for (const extract::Request& wrong : {extract::Request{Kind::text, 17},
                                        {Kind::pdf, 0},
                                        {Kind::pdf, extract::kMaxTextBytes + 1}}) {
    EXPECT_FALSE(extract::parseRequest(encode(wrong)));
  }
  for (const extract::ReplyHeader& wrong : {extract::ReplyHeader{Outcome::cut, false, 18},
                                            {Outcome::cut, false, 0},
                                            {Outcome::empty, false, 1},
                                            {Outcome::crashed, false, 0}}) {
    EXPECT_FALSE(extract::parseReply(encode(wrong), 17));
  }
  for (size_t size = 0; size < extract::kReplyBytes; ++size) {
    EXPECT_FALSE(extract::parseReply(encode(reply).substr(0, size), 17)) << size;
    EXPECT_FALSE(size < extract::kRequestBytes &&
                 extract::parseRequest(encode(request).substr(0, size)).has_value());
  }
  EXPECT_FALSE(extract::parseReply(std::string(extract::kReplyBytes, '\xFF'), 17));
}

}  // namespace
