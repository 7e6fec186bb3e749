#include <gmock/gmock.h>

#include "cli/MailView.h"

using cli::MailView;
using testing::ElementsAre;
using testing::Pair;

namespace {

std::string textOf(const std::string& mail) {
  const auto view = MailView::parse(mail);
  return view == nullptr ? "(none)" : view->text();
}

// A multipart; each part begins with its type.
std::string multipart(const std::string& subtype, const std::vector<std::string>& parts) {
  const std::string boundary = "b-" + subtype;
  std::string text = "Content-Type: multipart/" + subtype + "; boundary=" + boundary + "\n\n";
  for (const std::string& part : parts) text += "--" + boundary + "\nContent-Type: " + part + '\n';
  return text + "--" + boundary + "--\n";
}

const std::string kHead = "From: a@b\nMIME-Version: 1.0\n";

}  // namespace

TEST(MailView, DecodesFieldsThatCannotImitateOthers) {
  const auto view = MailView::parse(
      "Subject: =?utf-8?q?caf=C3=A9?=\n"
      "From: =?utf-8?q?boss=40corp=2Eorg?= <evil@example.org>\n"
      "To: " +
      std::string(100000, 'x') + "\nX-Other: y\n\n");
  ASSERT_NE(view, nullptr);
  const auto fields = view->fields();
  EXPECT_THAT(fields, ElementsAre(Pair("From", "\"boss@corp.org\" <evil@example.org>"),
                                  Pair("To", testing::EndsWith("x…")), Pair("Subject", "café")));
  EXPECT_EQ(fields[1].second.size(), MailView::kMaxFieldUnits + std::string("…").size());
}

TEST(MailView, PrefersTheReadableAlternative) {
  const std::string plain = "text/plain\n\nplain\n";
  const std::string blank = "text/plain\n\n \n";
  const std::string html =
      "text/html\n\n<style>p{}</style><p>ht<b>ml</b></p><br><br><br><div> end </div>\n";
  const std::string calendar = "text/calendar\n\nBEGIN\n";
  const std::string footer = "text/plain\n\n--\nlist\n";
  const std::string related = multipart("related", {html, "image/png\n\nx\n"}).substr(14);
  const std::vector<std::pair<std::string, std::string>> cases{
      {multipart("alternative", {plain, html, calendar}), "plain\n"},
      {multipart("alternative", {html, plain}), "plain\n"},
      {multipart("alternative", {blank, html, calendar}), "html\n\nend\n"},
      {multipart("alternative", {blank, related}), "html\n\nend\n"},
      {multipart("mixed", {html, footer}), "html\n\nend\n--\nlist\n"},
      {multipart("mixed", {multipart("alternative", {plain, related}).substr(14), footer}),
       "plain\n--\nlist\n"},
      {multipart("mixed", {"message/rfc822\n\nSubject: in\n\ninner\n", footer}),
       "inner\n--\nlist\n"},
      {"\nbody", "body"}};
  for (const auto& [body, text] : cases) EXPECT_EQ(textOf(kHead + body), text) << body;
}

TEST(MailView, AttachmentsAreAllPartsThatAreNotText) {
  const auto view = MailView::parse(
      kHead + multipart("mixed", {"text/plain\n\nread\n", "text/calendar\n\nBEGIN\n",
                                  "text/plain; name=notes.txt\n\nnotes\n",
                                  "image/png; name=\"../a.png\"\n"
                                  "Content-Transfer-Encoding: base64\n\nAAEC\n",
                                  "message/rfc822\nContent-Disposition: attachment\n\n"
                                  "Subject: in\n\ninner\n"}));
  ASSERT_NE(view, nullptr);
  std::vector<std::string> list;
  for (const auto& one : view->attachments()) {
    list.push_back(one.name + ' ' + one.type + ' ' + std::to_string(one.bytes));
  }
  EXPECT_THAT(list, ElementsAre(" text/calendar 6", "notes.txt text/plain 6",
                                "../a.png image/png 3", testing::StartsWith(" message/rfc822 ")));
  EXPECT_EQ(view->attachment(2), std::string("\0\1\2", 3));
  EXPECT_THAT(view->attachment(3), testing::HasSubstr("Subject: in\n\ninner"));
  EXPECT_EQ(view->text(), "read\nnotes\n");
}

// Many parts or deep nesting must not exhaust the stack or take long.
TEST(MailView, LimitsHostileMail) {
  std::string deep = kHead;
  std::string messages = kHead;
  for (int i = 0; i < 5000; ++i) {
    const std::string boundary = "b" + std::to_string(i);
    deep += "Content-Type: multipart/mixed; boundary=" + boundary + "\n\n--" + boundary + '\n';
    messages += "Content-Type: message/rfc822\nContent-Disposition: attachment\n\nSubject: x\n";
  }
  const auto nested = MailView::parse(messages + "\nend\n");
  ASSERT_NE(nested, nullptr);
  EXPECT_FALSE(nested->attachment(0).empty());
  EXPECT_EQ(textOf(deep + "Content-Type: text/plain\n\nend\n"), "");
  const auto many = MailView::parse(
      kHead + multipart("mixed", std::vector<std::string>(20000, "image/png\n\nx\n")));
  EXPECT_LT(many->attachments().size(), 10000U);
  const auto longText = MailView::parse("Subject: s\n\n" + std::string(3000000, 'x'));
  EXPECT_EQ(longText->text().size(), size_t{1} << 20);
  EXPECT_FALSE(longText->complete());
  EXPECT_EQ(MailView::parse(""), nullptr);
}
