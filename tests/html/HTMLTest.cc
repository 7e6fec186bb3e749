#include <gtest/gtest.h>

#include <cstring>
#include <random>

#include "html/TALHTMLParsing.h"
#include "html/TALHTMLScanBuffer.h"

using nlohmann::json;

namespace {

constexpr uint64_t kNoLimit = 2147483647;
constexpr uint64_t kLatin1 = 5;
constexpr uint64_t kUTF16BE = 0x90000100;

// The text in UTF-8, "(null)" for none. The bytes are in memory of exactly their size, so that a
// sanitizer detects a read past the end.
std::string plain(std::string_view html, uint64_t limit = kNoLimit,
                  uint64_t encoding = platform::kEncodingUTF8) {
  const std::unique_ptr<char[]> bytes(new char[html.size()]);
  std::memcpy(bytes.get(), html.data(), html.size());
  return platform::printable(TALPlainTextFromHTMLData(std::string_view(bytes.get(), html.size()),
                                                      limit, nullptr, encoding));
}

std::optional<json> attributesOf(std::string_view html) {
  std::optional<json> attributes = json("stale");
  static_cast<void>(TALPlainTextFromHTMLData(html, kNoLimit, &attributes, platform::kEncodingUTF8));
  return attributes;
}

struct Case {
  std::string_view html;
  std::string text;
};

void expectTexts(std::initializer_list<Case> cases) {
  for (const Case& each : cases) EXPECT_EQ(plain(each.html), each.text) << each.html;
}

// If repeating any of them caused a scan of the remaining bytes each time, this would not end.
void expectOnePass(std::initializer_list<const char*> units) {
  for (const std::string unit : units) {
    for (std::string html : {"", "<head><title>x"}) {
      while (html.size() < 5000000) html += unit;
      std::optional<json> attributes;
      const auto text = TALPlainTextFromHTMLData(html, kNoLimit, &attributes, 4);
      EXPECT_LE(platform::orEmpty(text).size(), html.size()) << unit;
    }
  }
}

// Fragments whose text does not depend on what surrounds them, if there is text before them.
const Case kFragments[] = {
    {"word ", "word "},
    {"gr\xC3\xBC\xC3\x9F", "gr\xC3\xBC\xC3\x9F"},
    {"<b>", ""},
    {"</b>", ""},
    {"<a href=\"http://x/?a=1&b=2\" title='it'>", ""},
    {"<p>", "\n"},
    {"</P>", "\n"},
    {"<br/>", "\n"},
    {"<DIV CLASS=x>", "\n"},
    {"</div>", ""},
    {"&amp;", "&"},
    {"&lt;", "<"},
    {"&#228;", "\xC3\xA4"},
    {"&nosuch;", ""},
    {"<!-- > <p> & -->", ""},
    {"<!DOCTYPE html>", ""},
    {"<![CDATA[ <p>x&amp; ]]>", ">"},
    {"<?php echo 1 ?>", ""},
    {"<script>var a = '&amp;' + \"x\";</script>", ""},
    {"<style>p { x: y }</style>", ""},
    {"<head><title>T</title><meta name=a content=b></head>", ""},
    {"</h2>", "\n"},
    {"<tr><td>x</td>", "x\n"},
};

}  // namespace

TEST(HTML, TagsAndBlocks) {
  expectTexts({
      {"", "(null)"},
      {"<b></b>", "(null)"},
      {"\n", "(null)"},
      {"\na", "\na"},
      {"<p>x</p>", "x\n"},
      {"x<dt>a</dt><dd>b</dd><li>c</li><td>d</td>", "x\na\n\nb\nc\nd\n"},
      {"x<h1>a</h1><h6>b</h6><h7>c</h7><h>d</h>", "xa\nb\ncd"},
      // Names are compared by their beginning.
      {"x<pre>a</pre><param><link><button><picture>", "x\na\n\n\n\n"},
      {"x<brx><lix><ddx><dtx><divx>", "x\n\n\n\n\n"},
      {"x<d><l><di></d></t>", "x"},
      {"x< p>y", "xy"},
      {"x<>y</>z", "xyz"},
      {"a\x01<p\tq>b", "a\x01\nb"},
      {"x<header>y</header>z", "xz"},
      {"x<styles>y</stylez>z", "xz"},
  });
  EXPECT_EQ(TALPlainTextFromHTMLData(std::nullopt, kNoLimit, nullptr, 4), std::nullopt);
}

TEST(HTML, AttributesOfTags) {
  expectTexts({
      {"a<x b=\"c d\" e='f g' h=i j>k", "ak"},
      {"a<x b=\"c>d\" e>f", "ad\" e>f"},
      {"a<x b='c>d'>f", "ad'>f"},
      {"a<x b=\"c\"\"d>e", "ae"},
      {"a<x b=\"c\" / >d", "ad"},
      {"a<x b = \"c\" d>e", "ae"},
      {"a<x =b =>c", "ac"},
      {"a<x \"y\"/>c", "ac"},
      {"a<x b=\"c\"/d>e", "a<x b=\"c\"/d>e"},
      {"a<x b=\"c\"/d & e", "a<x b=\"c\"/d  e"},
      {"a<x b=\"c\"/?>p<p b=\"c\"/?>q", "apq"},
      {"a<x b=c/>d", "ad"},
      {"a<p /p>d", "a\nd"},
  });
}

TEST(HTML, InvalidTagsAreText) {
  expectTexts({
      {"1 < 2 and 3 > 2 x", "1  2 x"},
      {"<script>x<y</script", "(null)"},
      {"a<<p>>b", "a>b"},
  });
  for (const char* text :
       {"a<", "a<b", "a</", "a</p", "a<p b", "a<p b=\"c", "a < b", "a<!DOCTYPE html", "a<?pi"}) {
    EXPECT_EQ(plain(text), text);
  }
}

TEST(HTML, DeclarationsCommentsAndInstructions) {
  expectTexts({
      {"<!---->a", "a"},
      {"<!-->a", "a"},
      {"<!-- -- > --->a", "a"},
      {"b<!--x--", "b"},
      {"b<!-x>a", "ba"},
      {"<!>a", "a"},
      {"<![CDATA[]]>a", ">a"},
      {"<![CDATA[a]]b]]]>c", ">c"},
      {"b<![CDATA[x]]", "b"},
      {"b<![CDATA[]>a", "b"},
      {"b<![CDATA[]>", "b"},
      {"b<![CDATA[>a", "ba"},
      {"b<![cdata[x]]>a", "ba"},
  });
}

TEST(HTML, Entities) {
  expectTexts({
      {"&quot;&QUOT;&amp;&AMP;&lt;&LT;&gt;&GT;", "\"\"&&<<>>"},
      {"a&Amp;&Lt;&nbsp&Nbsp;b", "ab"},
      {"&nbsp;&yuml;", "\u00A0\u00FF"},
      {"&OElig;&euro;&diams;&there4;&thetasym;", "\u0152\u20AC\u2666\u2234\u03D1"},
      {"&Auml;&auml;&AUML;", "\u00C4\u00E4"},
      {"&#65;&#x41;&#X41;&#65", "AAAA"},
      {"&#65x;&#x41g;&#0065;", "AAA"},
      {"&#128512;&#x1F600;&#65535;", "\uFFFF\uFFFF\uFFFF"},
      {"a&#0;&#;&#x;&#-5;&#xyz;b", "ab"},
      {"&#999999999999999999999999;", "\uFFFF"},
      {"&#000000000000065;&#0000000000000065;", "A\x06"},
      {"a &T b", "a  b"},
      {"a&", "a"},
      {"a&;b", "ab"},
      {"AT&T<p>x; y", "AT y"},
      {"a&amp\tb&lt\nc", "a&\tb<\nc"},
      {"&eacute\v&eacute\f", "\u00E9\v\u00E9\f"},
      {"&#10;a&#10;", "a\n"},
      {"&apos;&hearts", "\u2665"},
  });
  TALHTMLParsing parsing(platform::kEncodingUTF8);
  EXPECT_DEATH(TALHTMLDecodeEntity({}, parsing), "Assertion failed");
}

TEST(HTML, HeadScriptAndStyle) {
  expectTexts({
      {"<head><title>t&amp;</title>x&lt;</head>a", "a"},
      {"<head>a", "(null)"},
      {"<HEAD>a</HeAd>b", "b"},
      {"<html><head><p>a</p><br></head>b", "b"},
      {"<script>x&amp;<b>y</script>a", "a"},
      {"<script>x<script>y</script>a", "a"},
      {"<style>x</script>y</style>a", "a"},
      {"b<script>x<p>y</script>a", "b\na"},
      {"<script>x</scrip>y", "(null)"},
      {"<head><script></head>a</script>b", "b"},
  });
}

TEST(HTML, LenientUTF8) {
  const Case cases[] = {
      {"a\x80\xBF z", "a z"},     {"\xC3\xA4", "\u00E4"},
      {"\xE2\x82\xAC", "\u20AC"}, {"\xF0\x9F\x98\x80", "\U0001F600"},
      {"ab\xC3", "ab"},           {"ab\xE2\x82<b>c", "abc"},
      {"\xC3(x", "\u00E8x"},      {"a\xF0\x9F\x98<i>b", "ab"},
  };
  for (const Case& each : cases) EXPECT_EQ(plain(each.html), each.text);
  const auto pair = TALPlainTextFromHTMLData("\xFF\xBF\xBF\xBF", kNoLimit, nullptr, 4);
  EXPECT_EQ(pair, (TLString{0xDFBF, 0xDFFF}));
}

TEST(HTML, OtherEncodings) {
  EXPECT_EQ(plain("gr\xFC\xDF&uuml;<br>x", kNoLimit, kLatin1), "gr\u00FC\u00DF\u00FC\nx");
  EXPECT_EQ(plain("\n<b>a", kNoLimit, kLatin1), "a");
  EXPECT_EQ(plain("a<b>\x80", kNoLimit, 1), "a");
  EXPECT_EQ(plain("a&lt;b", kNoLimit, 12345), "<");
  TALHTMLParsing utf16(kUTF16BE);
  EXPECT_EQ(std::string(utf16.newLineBuffer.data(), utf16.newLineLength), std::string("\0\n", 2));
  TALHTMLParsing utf8(platform::kEncodingUTF8);
  EXPECT_EQ(utf8.sourceSysEncoding, 0x8000100u);
}

TEST(HTML, LimitIsCheckedBeforeEachRun) {
  EXPECT_EQ(plain("long run<b>more&amp;<p>", 1), "long run");
  EXPECT_EQ(plain("a<b>b<b>c", 2), "ab");
  EXPECT_EQ(plain("a&amp;<br>b", 2), "a&");
  EXPECT_EQ(plain("a", 0), "(null)");
}

TEST(HTML, HeadGivesAttributesWhenThereIsATitle) {
  const std::string head =
      "<head><title>The &amp; title</title>"
      "<meta name=Generator content='a &lt;b&gt; c'><META NAME=\"keywords\" CONTENT=\"x, y,z\">"
      "<meta content=NOINDEX,follow name=robots><meta name=MochaVersion content=' 2.5x'>"
      "<meta name=creationtime content='2024-3-5T10:20:30+02:00'>"
      "<meta name=ModificationTime content=yesterday><meta name=author>"
      "<meta name=company content=''><meta name=description content=d>"
      "<meta name=comment content=e><meta name=indexTitle content=f></head>";
  EXPECT_EQ(attributesOf(head + " \n body\t\ttext   of it\xC2\xA0"),
            (json{{"SysGeneratorDocumentAttribute", "a <b> c"},
                  {"SysKeywordsDocumentAttribute", {"x", "y,z"}},
                  {"SysNoIndexDocumentAttribute", 1},
                  {"MochaRTFVersion", 2.5},
                  {"SysCreationTimeDocumentAttribute", 1709626830.0},
                  {"SysCommentDocumentAttribute", "e"},
                  {"SysDisplayNameDocumentAttribute", "f"},
                  {"SysTitleDocumentAttribute", "body text of it"}}));
  EXPECT_EQ(attributesOf("<head><meta name=author content=x></head>a"), std::nullopt);
  EXPECT_EQ(attributesOf("<head><title></title></head>a"), std::nullopt);
  EXPECT_EQ(attributesOf("<head><title><b></title></head>a"), std::nullopt);
  EXPECT_EQ(attributesOf(""), std::nullopt);
  EXPECT_EQ(attributesOf("<head><title>t</head>"), (json{{"SysTitleDocumentAttribute", ""}}));
}

TEST(HTML, KeywordsAreCutAtTheFirstSeparatorThatOccurs) {
  const struct {
    std::string content;
    json keywords;
  } cases[] = {
      {"one", {"one"}}, {"a b", {"a", "b"}}, {"a,b c", {"a", "b c"}}, {"a, b,c d", {"a", "b,c d"}},
      {",", {"", ""}},
  };
  for (const auto& each : cases) {
    const auto attributes = attributesOf("<head><title>t</title><meta name=keywords content='" +
                                         each.content + "'></head>");
    EXPECT_EQ(attributes->at("SysKeywordsDocumentAttribute"), each.keywords) << each.content;
  }
}

TEST(HTML, ACharsetInTheHeadChangesNamesOnly) {
  for (const char* charset : {"iso-8859-1", "'latin1'", "LATIN1 \"x"}) {
    const auto attributes = attributesOf(
        "<head><title>t</title><meta http-equiv=Content-Type content=\"text/html; CHARSET = " +
        std::string(charset) +
        "\"><meta name=author content=\"\xC3\xA4\"><meta name=\"auth\xF6r\" content=z></head>"
        "\xC3\xA4");
    EXPECT_EQ(*attributes, (json{{"SysAuthorDocumentAttribute", "\u00E4"},
                                 {"SysTitleDocumentAttribute", "\u00E4"}}));
  }
  TALHTMLParsing parsing(platform::kEncodingUTF8);
  const auto scan = [&](std::string_view html) {
    TALHTMLScanBuffer(html, TALHTMLStartTag, TALHTMLEndTag, TALHTMLAttribute, parsing);
  };
  scan("<head><meta http-equiv=content-type content='text/html; charset=no-such-set'>");
  EXPECT_EQ(parsing.sourceEncoding, platform::kEncodingUTF8);
  scan("<meta http-equiv=content-type content='text/html; charset=iso-8859-1'><x name=\"\xE4\"/y");
  EXPECT_EQ(parsing.sourceEncoding, kLatin1);
  EXPECT_EQ(parsing.sourceSysEncoding, 0x8000100u);
  EXPECT_EQ(parsing.metaName, u"\u00E4");
}

TEST(HTML, AnySequenceOfFragmentsIsTheirTextsInOrder) {
  std::mt19937 random(17);
  for (int round = 0; round < 2000; ++round) {
    std::string html = "x";
    std::string text = "x";
    for (size_t i = random() % 40; i > 0; --i) {
      const Case& fragment = kFragments[random() % std::size(kFragments)];
      html += fragment.html;
      text += fragment.text;
    }
    ASSERT_EQ(plain(html), text) << html;
  }
}

// However a document is truncated, the text before the last complete fragment remains.
TEST(HTML, EveryTruncationKeepsWhatWasCompleteBefore) {
  std::string html;
  for (const Case& fragment : kFragments) html += fragment.html;
  html += "<head><title>x</title><meta http-equiv='content-type' content='a;charset=utf-8'></head>";
  size_t complete = 0;
  std::string text;
  size_t next = 0;
  for (size_t length = 0; length <= html.size(); ++length) {
    while (next < std::size(kFragments) && complete + kFragments[next].html.size() <= length) {
      complete += kFragments[next].html.size();
      text += kFragments[next++].text;
    }
    const std::string cut = plain(html.substr(0, length));
    EXPECT_EQ(cut.substr(0, text.size()), text.empty() ? "" : text) << length;
    static_cast<void>(attributesOf(html.substr(0, length)));
  }
  EXPECT_EQ(next, std::size(kFragments));
}

TEST(HTML, RepetitionsOfAnyKindTakeOnePass) {
  expectOnePass({"<", "</", "<a ", "<a b=\"", "<a b='>", "<a b=\"c\"/", "<p>", "<script>", "<head>",
                 "<title>", "<head></head>", "<meta content=\"&amp;\">"});
  expectOnePass({"<?", "<!", "<!--", "-->", "<![CDATA[", "<![CDATA[]]", "]]>", "&", "&#", "&amp",
                 "&lt;", "a=", "\"", "\x80", "\xF0", " ", "\n"});
}
