// Attachments in the text of a mail, with the real program.

#include <fmt/format.h>
#include <gtest/gtest.h>

#include "cli/AttachmentCounts.h"
#include "cli/AttachmentText.h"
#include "cli/MessageParser.h"
#include "tests/extract/Samples.h"

namespace {

using Key = TLAttributeKey;
using extract::Kind;

struct Part {
  std::string type;
  std::string name;
  std::string content;
  std::string disposition = "attachment";
};

std::string base64(const std::string& bytes) {
  const cli::CString text(
      g_base64_encode(reinterpret_cast<const guchar*>(bytes.data()), bytes.size()));
  return text.get();
}

// A mail with a body of this type and text, and attachments.
std::string mailOf(const std::string& type, const std::string& body,
                   const std::vector<Part>& parts) {
  std::string mail = "From: a@example.org\nSubject: s\n";
  mail += fmt::format("Content-Type: multipart/mixed; boundary=outer{}\n\n", parts.size());
  const std::string boundary = fmt::format("--outer{}", parts.size());
  mail += fmt::format("{}\nContent-Type: {}\n\n{}\n", boundary, type, body);
  for (const Part& part : parts) {
    mail += fmt::format("{}\nContent-Type: {}\nContent-Disposition: {}; filename=\"{}\"\n",
                        boundary, part.type, part.disposition, part.name);
    mail += part.type == "message/rfc822"
                ? '\n' + part.content + '\n'
                : "Content-Transfer-Encoding: base64\n\n" + base64(part.content) + '\n';
  }
  return mail + boundary + "--\n";
}

// The text of the mail as it is indexed, and what was counted: "text|counts".
std::string indexed(const std::string& mail, const std::string& program = TALLOW_EXTRACT_PROGRAM) {
  cli::MessageParser parser(program);
  const auto parsed = std::get<cli::ParsedMessage>(parser.parse(mail, {"file/m", "/m", "m"}));
  EXPECT_FALSE(parsed.cut);
  std::string text =
      platform::toUTF8(platform::orEmpty(parsed.item->stringValueForKey(Key::TEXT_CONTENT))) + '|' +
      cli::attachmentText(parsed.attachments, "", "");
  std::replace(text.begin(), text.end(), '\n', '/');
  return text;
}

TEST(AttachmentText, ComesAfterTheMailsOwnText) {
  const Part letter{"application/octet-stream", "Letter.DOCX", samples::docx({"Dear Ida"})};
  const Part note{"text/plain", "note.txt", "A note\n"};
  EXPECT_EQ(indexed(mailOf("text/plain", "Body", {letter, note})),
            "Body/Dear Ida/A note/|office-xml: 1 extracted/text: 1 extracted/");
  EXPECT_EQ(indexed(mailOf("text/plain", "", {note})), "A note/|text: 1 extracted/");
  // The body in HTML has a zone of its own.
  EXPECT_EQ(indexed(mailOf("text/html", "<p>Body", {letter})),
            "Dear Ida/|office-xml: 1 extracted/");
  EXPECT_EQ(indexed(mailOf("text/plain", "Body", {letter, note}), ""), "Body|");
}

TEST(AttachmentText, EachKind) {
  const std::vector<Part> parts{
      {"application/vnd.oasis.opendocument.text", "a", samples::odt({"An ODT"})},
      {"application/pdf", "b", samples::pdf({""})},
      {"text/html; charset=iso-8859-1", "c", "<p>caf\xE9"},
      {"application/zip", "d", samples::zip({{"inside.jpg", ""}})},
      {"text/x-diff", "inline.diff", "-old", "inline"},
      {"text/plain", "body.txt", "own", "inline"},
      {"image/png", "f.pdf", "no text"},
      {"application/pdf", "g", "damaged"}};
  EXPECT_EQ(indexed(mailOf("text/plain", "Body", parts)),
            "Body/own/An ODT/café/inside.jpg/-old|pdf: 1 empty, 1 damaged/"
            "opendocument: 1 extracted/zip: 1 extracted/html: 1 extracted/text: 1 extracted/");
}

TEST(AttachmentText, AttachedMessagesInAttachedMessages) {
  std::string mail = mailOf("text/html", "<p>innermost", {});
  for (int i = 0; i < 3; ++i) {
    mail = mailOf("text/plain", fmt::format("level {}", i),
                  std::vector<Part>(1, {"message/rfc822", "m", mail}));
    // Boundaries must differ from those inside.
    for (size_t at = 0; (at = mail.find("outer1", at)) != std::string::npos;) {
      mail.replace(at, 6, fmt::format("level{}", i));
    }
  }
  EXPECT_EQ(indexed(mail), "level 2/s/level 1/s/level 0/s/innermost|message: 3 extracted/");
}

TEST(AttachmentText, FillsTheZoneAndNoMore) {
  const std::string word = "word ";
  std::string text;
  while (text.size() < cli::TextBudget::kZoneBytes) text += word;
  const Part book{"application/vnd.openxmlformats-officedocument.wordprocessingml.document", "b",
                  samples::docx({text})};
  const std::string all = indexed(mailOf("text/plain", "Body", {book, book}));
  EXPECT_TRUE(all.ends_with("|office-xml: 1 cut, 1 no-room/")) << all.substr(all.size() - 60);
  EXPECT_GT(all.size(), cli::TextBudget::kZoneBytes - 1000);
  EXPECT_LT(all.size(), cli::TextBudget::kZoneBytes + 100);
  // Nor more attachments than are read of a mail.
  const std::vector<Part> notes(cli::AttachmentText::kMaxAttachments + 3,
                                {"text/plain", "n", "note"});
  EXPECT_TRUE(
      indexed(mailOf("text/plain", "", notes)).ends_with("|text: 100 extracted, 3 no-room/"));
}

TEST(AttachmentText, AProgramThatCannotBeRunCostsItsTexts) {
  const std::vector<Part> parts{{"application/pdf", "a", samples::pdf({"A page"})},
                                {"text/plain", "b", "note"}};
  EXPECT_EQ(indexed(mailOf("text/plain", "Body", parts), "/bin/false"),
            "Body/note|pdf: 1 not-run/text: 1 extracted/");
}

}  // namespace
