// tallow-extract in its sandbox, as the client runs it.

#include <gtest/gtest.h>
#include <linux/landlock.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <random>

#include "extract/ExtractProcess.h"
#include "extract/TextExtraction.h"
#include "tests/extract/Samples.h"
#include "tests/support/Seed.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

using extract::ExtractProcess;
using extract::Kind;
using extract::Outcome;

constexpr size_t kRoom = 100000;

// "outcome:text".
std::string shown(ExtractProcess& process, Kind kind, const std::string& file,
                  size_t limit = kRoom) {
  const auto text = process.text(kind, file, limit);
  return nameOf(text.outcome) + (":" + text.text);
}

const std::string kFine = samples::docx({"still here"});
constexpr const char* kFineResult = "extracted:still here\n";

// Whether the sandbox can leave the tables of character sets readable.
bool hasLandlock() {
  return syscall(SYS_landlock_create_ruleset, nullptr, 0, LANDLOCK_CREATE_RULESET_VERSION) > 0;
}

TEST(ExtractProcess, GivesWhatTheParsersGive) {
  ExtractProcess process(TALLOW_EXTRACT_PROGRAM);
  const std::pair<Kind, std::string> files[] = {{Kind::pdf, samples::pdf({"A page", "Another"})},
                                                {Kind::pdf, samples::japanesePDF()},
                                                {Kind::pdf, samples::encryptedPDF()},
                                                {Kind::openDocument, samples::odt({"One", "two"})},
                                                {Kind::officeXML, kFine},
                                                {Kind::zip, samples::zip({{"bär.txt", ""}})},
                                                {Kind::html, "<p>caf&eacute;</p>"}};
  for (const auto& [kind, file] : files) {
    if (file.find("UniJIS") != std::string::npos && !hasLandlock()) continue;
    const auto here = extract::extractText(kind, file, kRoom);
    EXPECT_EQ(shown(process, kind, file), nameOf(here.outcome) + (":" + here.text));
  }
  EXPECT_EQ(shown(process, Kind::officeXML, kFine, 5), "cut:still");
}

// Each hostile file costs its own text, and the next file is read.
TEST(ExtractProcess, AHostileFileCostsItsOwnText) {
  ExtractProcess process(TALLOW_EXTRACT_PROGRAM);
  std::mt19937 random(testsupport::firstSeed());
  std::string noise(100000, '\0');
  for (char& c : noise) c = static_cast<char>(random());
  std::string bomb = samples::zip({{"word/document.xml", std::string(size_t{100} << 20, ' ')}});
  std::string nested = bomb;
  for (int i = 0; i < 20; ++i) nested = samples::zip({{"word/document.xml", nested}}, false);
  const std::string many = samples::pdfOfManyPages(20000);
  const std::pair<Kind, std::string> files[] = {{Kind::officeXML, bomb},
                                                {Kind::officeXML, nested},
                                                {Kind::pdf, many.substr(0, many.size() / 2)},
                                                {Kind::pdf, noise},
                                                {Kind::pdf, "%PDF-1.4\n" + noise},
                                                {Kind::zip, "PK\x03\x04" + noise},
                                                {Kind::officeXML, kFine.substr(0, 50)}};
  for (const auto& [kind, file] : files) {
    const auto text = process.text(kind, file, kRoom);
    EXPECT_NE(text.outcome, Outcome::extracted);
    EXPECT_LE(text.text.size(), kRoom);
    EXPECT_EQ(shown(process, Kind::officeXML, kFine), kFineResult);
  }
  const auto pages = process.text(Kind::pdf, many, kRoom);
  EXPECT_LE(pages.text.size(), kRoom);
  EXPECT_EQ(shown(process, Kind::officeXML, kFine), kFineResult);
}

TEST(ExtractProcess, LimitsFilesAndTime) {
  ExtractProcess process(TALLOW_EXTRACT_PROGRAM);
  EXPECT_EQ(shown(process, Kind::zip, std::string(ExtractProcess::kMaxFileBytes + 1, 'x')),
            "too-large:");
  EXPECT_EQ(shown(process, Kind::zip, ""), "empty:");
  const auto late = process.text(Kind::officeXML, kFine, kRoom, std::chrono::milliseconds(0));
  EXPECT_EQ(late.outcome, Outcome::timedOut);
  EXPECT_EQ(shown(process, Kind::officeXML, kFine), kFineResult);
}

// A program in place of the real one.
class ReplacedProgram : public ::testing::Test {
 protected:
  std::string script(const std::string& text) {
    const std::string path = _directory.write("program", "#!/bin/sh\n" + text);
    chmod(path.c_str(), 0700);
    return path;
  }

  testsupport::TemporaryDirectory _directory;
};

TEST_F(ReplacedProgram, ThatTakesTooLongIsEnded) {
  const std::string ready = _directory.write("ready", encode(extract::ReplyHeader{}));
  ExtractProcess slow(script("cat " + ready + " >&0\nexec sleep 600\n"));
  const auto text = slow.text(Kind::officeXML, kFine, kRoom, std::chrono::milliseconds(100));
  EXPECT_EQ(text.outcome, Outcome::timedOut);
}

TEST_F(ReplacedProgram, ThatCannotBeRunGivesNothing) {
  ExtractProcess missing(_directory / "missing");
  EXPECT_EQ(shown(missing, Kind::officeXML, kFine), "not-run:");
  for (const char* const text : {"exit 1\n", "echo it is not one of our headers >&0\n"}) {
    ExtractProcess process(script(text));
    EXPECT_EQ(shown(process, Kind::officeXML, kFine), "not-run:");
  }
}

// It answers each request with more than was asked for, or ends in the middle.
TEST_F(ReplacedProgram, ThatLiesCountsAsCrashed) {
  const std::string ready = _directory.write("ready", encode(extract::ReplyHeader{}));
  const std::string large =
      _directory.write("large", encode(extract::ReplyHeader{Outcome::extracted, false, 2000}) +
                                    std::string(2000, 'x'));
  const std::string half =
      _directory.write("half", encode(extract::ReplyHeader{Outcome::cut, false, 100}) + "x");
  for (const std::string& answer : {large, half}) {
    ExtractProcess lying(
        script("cat " + ready + " >&0\nhead -c 12 >/dev/null\ncat " + answer + " >&0\n"));
    EXPECT_EQ(shown(lying, Kind::officeXML, kFine, 1000), "crashed:");
    EXPECT_EQ(shown(lying, Kind::officeXML, kFine, 1000), "crashed:");
  }
}

}  // namespace
