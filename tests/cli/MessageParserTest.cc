#include <fmt/format.h>
#include <gtest/gtest.h>

#include <nlohmann/json.hpp>
#include <random>

#include "cli/MessageParser.h"
#include "cli/TextBudget.h"
#include "tests/support/Damage.h"

using Key = TLAttributeKey;
using Lines = std::vector<std::string>;

namespace {

const cli::MessageOrigin kOrigin{"file/m/1.eml", "/m/in box", "in box"};

// The item of a message, or null with the reason in `reason`.
std::shared_ptr<TLIndexableItem> parse(const std::string& bytes, std::string* reason = nullptr,
                                       bool* cut = nullptr) {
  static cli::MessageParser parser;
  auto result = parser.parse(bytes, kOrigin);
  if (const auto* bad = std::get_if<cli::UnparsableMessage>(&result)) {
    if (reason != nullptr) *reason = bad->reason;
    return nullptr;
  }
  const auto& message = std::get<cli::ParsedMessage>(result);
  if (cut != nullptr) *cut = message.cut;
  // Compare the item as it is after encoding and decoding.
  auto item = std::make_shared<TLIndexableItem>();
  EXPECT_TRUE(item->initWithData(message.item->data()));
  return item;
}

// One attribute as short text.
std::string show(const TLAttribute& attribute) {
  std::string out = TLAttributeKeyAsString(attribute.key()) + "=";
  const auto text = [](const std::optional<TLString>& s) {
    return platform::toUTF8(platform::orEmpty(s));
  };
  if (attribute.hasStringValue()) out += text(attribute.stringValue());
  if (attribute.hasDoubleValue()) out += fmt::format("{}", attribute.doubleValue());
  if (attribute.hasBytesValue()) out += "<" + *attribute.bytesValue() + ">";
  for (const auto& s : attribute.stringValues()) out += "[" + text(s) + "]";
  for (const auto& p : attribute.personValues()) {
    out += "{" + text(p->name()) + "|" + text(p->emailAddress()) + "}";
  }
  return out;
}

// All attributes except the three that every item has.
Lines attributesOf(const std::string& message) {
  Lines lines;
  const auto item = parse(message);
  if (item == nullptr) return {"unparsable"};
  for (const auto& attribute : item->attributes()) {
    const Key key = attribute->key();
    if (key == Key::MAILBOXES || key == Key::MAILBOX_IDENTIFIERS || key == Key::CONTENT_TYPE) {
      continue;
    }
    lines.push_back(show(*attribute));
  }
  return lines;
}

}  // namespace

TEST(MessageParser, StoresEveryField) {
  const auto item = parse(
      "Received: by b; Tue, 9 Jan 2024 10:00:00 +0000\n"
      "Received: by a; Mon, 8 Jan 2024 10:00:00 +0000\n"
      "From: \"Mara L\" <mara@example.org>, ida@example.org\n"
      "To: Team: Tom <tom@example.com>, elena@example.com;\n"
      "Cc: =?utf-8?q?Ren=C3=A9?= <rene@example.com>\nBcc: oleg@example.org\n"
      "X-From: Priya <priya@example.org>\nSender: owner@example.org\n"
      "Subject: =?iso-8859-1?q?Caf=E9?=\n =?utf-8?b?IPCfmIA=?=\n"
      "Date: Mon, 8 Jan 2024 09:00:00 +0100\nMessage-ID: <1@example.org>\n\nHello\n");
  const nlohmann::json expected = nlohmann::json::parse(R"({
    "identifier": "file/m/1.eml", "domainIdentifier": "/m/in%20box",
    "attributes": [
      {"key": "SUBJECT", "stringValue": "Café 😀"},
      {"key": "X_FROM", "stringValue": "Priya <priya@example.org>"},
      {"key": "AUTHORS", "personValues": [{"name": "Mara L", "emailAddress": "mara@example.org"},
                                          {"emailAddress": "ida@example.org"}]},
      {"key": "RECIPIENTS", "personValues": [{"name": "Tom", "emailAddress": "tom@example.com"},
                                             {"emailAddress": "elena@example.com"}]},
      {"key": "ADDITIONAL_RECIPIENTS",
       "personValues": [{"name": "René", "emailAddress": "rene@example.com"}]},
      {"key": "HIDDEN_ADDITIONAL_RECIPIENTS", "personValues": [{"emailAddress": "oleg@example.org"}]},
      {"key": "MAIL_DATE_RECEIVED", "doubleValue": 1704794400.0},
      {"key": "CONTENT_CREATION_DATE", "doubleValue": 1704700800.0},
      {"key": "TEXT_CONTENT", "stringValue": "Hello\n"},
      {"key": "MAIL_MESSAGE_ID", "stringValue": "1@example.org"},
      {"key": "MAILBOXES", "stringValues": ["in box"]},
      {"key": "MAILBOX_IDENTIFIERS", "stringValues": ["/m/in box"]},
      {"key": "CONTENT_TYPE", "stringValue": "message/rfc822"}]})");
  ASSERT_NE(item, nullptr);
  EXPECT_EQ(item->dictionaryRepresentation(), expected)
      << nlohmann::json::diff(expected, item->dictionaryRepresentation()).dump(1);
}

TEST(MessageParser, Bodies) {
  const std::string part = "--b\nContent-Type: ";
  const std::string alternative = "Content-Type: multipart/alternative; boundary=b\nA: a\n\n";
  const std::string mixed = "Content-Type: multipart/mixed; boundary=b\nA: a\n\n";
  const std::pair<std::string, Lines> cases[] = {
      {"A: a\n\n", {}},
      {"A: a\n\nplain caf\xC3\xA9\n", {"TEXT_CONTENT=plain café\n"}},
      {"A: a\nContent-Type: text/html; charset=iso-8859-1\n\n<p>caf\xE9\n",
       {"HTML_CONTENT_DATA=<<p>café\n>"}},
      {"A: a\nContent-Transfer-Encoding: base64\n\nSGkhCg==\n", {"TEXT_CONTENT=Hi!\n"}},
      {"A: a\nContent-Transfer-Encoding: quoted-printable\nContent-Type: text/plain; "
       "charset=utf-8\n\nna=C3=AFve so=\nft\n",
       {"TEXT_CONTENT=naïve soft\n"}},
      {"A: a\nContent-Type: text/plain; format=flowed\n\none \ntwo\n", {"TEXT_CONTENT=one two\n"}},
      {alternative + part + "text/plain\n\nplain\n" + part + "text/html\n\n<p>html\n--b--\n",
       {"TEXT_CONTENT=plain"}},
      // A text part without text is ignored.
      {alternative + part + "text/plain\n\n \n" + part + "text/html\n\n<p>html\n--b--\n",
       {"HTML_CONTENT_DATA=<<p>html>"}},
      {mixed + part + "text/plain\n\none\n" + part + "text/plain\n\ntwo\n--b--\n",
       {"TEXT_CONTENT=one\ntwo"}},
      {mixed + part + "text/plain\n\none\n" + part +
           "text/plain; name=a.txt\nContent-Disposition: attachment\n\nno\n--b--\n",
       {"TEXT_CONTENT=one", "ATTACHMENT_NAMES=[a.txt]", "ATTACHMENT_TYPES=[text/plain]"}},
      // An inline patch is both text and a named part.
      {mixed + part + "text/x-diff\nContent-Disposition: inline; filename=x.diff\n\n-a\n" + part +
           "text/plain\nContent-Disposition: inline; filename*=utf-8''%C3%BC.txt\n\nyes\n--b--\n",
       {"TEXT_CONTENT=yes", "ATTACHMENT_NAMES=[x.diff][ü.txt]",
        "ATTACHMENT_TYPES=[text/x-diff][text/plain]"}},
      {mixed + part + "application/pdf\n\nx\n" + part +
           "image/png; name=\"=?utf-8?q?=C3=A4?=\"\n\ny\n--b--\n",
       {"ATTACHMENT_NAMES=[ä]", "ATTACHMENT_TYPES=[application/pdf][image/png]"}},
      // An embedded message is included unless it is an attachment.
      {mixed + part + "message/rfc822\n\nSubject: in\n\ninner\n--b--\n", {"TEXT_CONTENT=inner"}},
      {mixed + part +
           "message/rfc822\nContent-Disposition: attachment\n\nSubject: in\n\ninner\n--b--\n",
       {"ATTACHMENT_TYPES=[message/rfc822]"}},
      // Without its boundary, and without the closing boundary.
      {"A: a\nContent-Type: multipart/mixed; boundary=b\n\nlost\n", {}},
      {mixed + part + "text/plain\n\nopen end\n", {"TEXT_CONTENT=open end\n"}},
      {"A: a\nContent-Type: nonsense\n\nx\n", {"ATTACHMENT_TYPES=[application/octet-stream]"}},
  };
  for (const auto& [message, lines] : cases) EXPECT_EQ(attributesOf(message), lines) << message;
}

TEST(MessageParser, DatesSendersAndInvalidAddresses) {
  const std::string good = "Date: Mon, 8 Jan 2024 08:00:00 +0000\n";
  const Lines both{"MAIL_DATE_RECEIVED=1704700800", "CONTENT_CREATION_DATE=1704700800"};
  const std::pair<std::string, Lines> cases[] = {
      {good, both},
      {"Date: yesterday\n", {}},
      {"Date:\n", {}},
      {"Received: by a; nonsense\n" + good, both},
      {"Received: by a\n" + good, both},
      {"Received: by a; (x;y) 8 Jan 2024 08:00:01 GMT\nDate: no\n",
       {"MAIL_DATE_RECEIVED=1704700801"}},
      {"Date: Thu, 1 Jan 1970 00:00:00 GMT\n", {"MAIL_DATE_RECEIVED=0", "CONTENT_CREATION_DATE=0"}},
      {"Sender: list@example.org\n", {"X_FROM=list@example.org"}},
      {"From: @ar@ @ending from example@org (Mara)\n",
       {"AUTHORS={@ar@ @ending from example@org (Mara)|}"}},
      {"To: undisclosed-recipients:;\nCc: a@example.org\nBcc:\n",
       {"ADDITIONAL_RECIPIENTS={|a@example.org}"}},
  };
  for (const auto& [header, lines] : cases) EXPECT_EQ(attributesOf(header + "\n"), lines) << header;
}

TEST(MessageParser, ExplainsWhyBytesAreNotAMessage) {
  const std::pair<std::string, const char*> cases[] = {
      {"", "the message is empty"},
      {" \r\n\n", "the message is empty"},
      {"\n\nbody only\n", "the message has no header"},
      {std::string(1000, '\0'), "not a mail message"},
      {"just a line without a colon", "not a mail message"},
  };
  for (const auto& [bytes, expected] : cases) {
    std::string reason;
    EXPECT_EQ(parse(bytes, &reason), nullptr) << bytes;
    EXPECT_EQ(reason, expected) << bytes;
  }
}

TEST(MessageParser, CutsLongTexts) {
  bool cut = false;
  std::string words;
  while (words.size() < 400000) words += "word ";
  auto item = parse("Subject: " + words + "\n\n" + words, nullptr, &cut);
  EXPECT_TRUE(cut);
  EXPECT_EQ(item->stringValueForKey(Key::TEXT_CONTENT)->size(), cli::TextBudget::kZoneBytes - 2);
  EXPECT_LE(item->stringValueForKey(Key::SUBJECT)->size(), cli::TextBudget::kZoneBytes);

  item = parse("Content-Type: text/html\nA: a\n\n" + words + "<b>" + words, nullptr, &cut);
  EXPECT_TRUE(cut);
  std::string to = "To: ";
  for (int i = 0; i < 12000; ++i) to += fmt::format("Name {} <n{}@example.org>,\n ", i, i);
  item = parse(to + "last@example.org\n\nshort\n", nullptr, &cut);
  EXPECT_TRUE(cut);
  size_t names = 0;
  size_t addresses = 0;
  for (const auto& person : *item->personValuesForKey(Key::RECIPIENTS)) {
    names += platform::orEmpty(person->name()).size() + 2;
    addresses += platform::orEmpty(person->emailAddress()).size() + 2;
  }
  EXPECT_LE(names, cli::TextBudget::kZoneBytes);
  EXPECT_LE(addresses, cli::TextBudget::kZoneBytes);
  EXPECT_GT(addresses, cli::TextBudget::kZoneBytes - 100);

  parse("Subject: short\n\nshort\n", nullptr, &cut);
  EXPECT_FALSE(cut);
}

// None of these may crash, hang or exhaust the stack.
TEST(MessageParser, SurvivesExtremeMail) {
  std::string nested = "A: a\n";
  std::string messages = "A: a\n";
  std::string siblings = "A: a\nContent-Type: multipart/mixed; boundary=b\n\n";
  std::string headers;
  for (int i = 0; i < 100000; ++i) {
    nested += fmt::format("Content-Type: multipart/mixed; boundary=\"b{}\"\n\n--b{}\n", i, i);
    messages += "Content-Type: message/rfc822\n\nA: a\n";
    siblings += "--b\n\nx\n";
    headers += "X-Header: value\n";
  }
  for (const std::string& mail :
       {nested + "\nend\n", messages + "\nend\n", siblings + "--b--\n", headers + "\n",
        "Subject: " + std::string(8 << 20, 'x') + "\n\n",
        "To: " + std::string(100000, '(') + "\n\n", "To: " + std::string(100000, ':') + "\n\n",
        "Content-Type: text/plain" + std::string(100000, ';') + "\nA: a\n\n"}) {
    EXPECT_NE(parse(mail), nullptr) << mail.substr(0, 100);
  }
}

TEST(MessageParser, SurvivesRandomDamage) {
  const std::string message =
      "Received: by a; Mon, 8 Jan 2024 10:00:00 +0000\nFrom: M <m@example.org>\n"
      "To: a: b@example.org;\nSubject: =?iso-2022-jp?b?GyRCNX5FVBsoQg==?=\n"
      "Content-Type: multipart/mixed; boundary=\"b\"\n\n--b\n"
      "Content-Type: text/plain; charset=koi8-r; format=flowed\n"
      "Content-Transfer-Encoding: quoted-printable\n\n=C1=C2 \n--b\n"
      "Content-Type: text/html\nContent-Transfer-Encoding: base64\n\nPGI+\n--b\n"
      "Content-Type: message/rfc822\n\nSubject: x\n\ny\n--b--\n";
  std::mt19937 random(3);
  for (int round = 0; round < 5000; ++round) {
    const std::string bytes = testsupport::damaged(message, 8, random);
    std::string reason;
    EXPECT_TRUE(parse(bytes, &reason) != nullptr || !reason.empty()) << bytes;
  }
}
