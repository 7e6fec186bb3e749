#include <gtest/gtest.h>

#include "querylang/Parser.h"

namespace {

// The tree as an expression with every comparison in brackets; "(fails)".
std::string parsed(const std::string& input) {
  sq::Tree tree;
  if (!sq::parse(input.c_str(), tree)) return "(fails)";
  return sq::expressionText(*tree);
}

std::string repeated(const std::string& unit, size_t times) {
  std::string out;
  for (size_t i = 0; i < times; ++i) out += unit;
  return out;
}

// A megabyte of it.
std::string megabyteOf(const std::string& unit) {
  return repeated(unit, (size_t{1} << 20) / unit.size());
}

struct Case {
  const char* input;
  const char* expected;
};

void expectAll(std::initializer_list<Case> cases) {
  for (const Case& one : cases) EXPECT_EQ(parsed(one.input), one.expected) << one.input;
}

constexpr const char* kFails = "(fails)";

void expectFailures(std::initializer_list<const char*> inputs) {
  for (const char* const input : inputs) EXPECT_EQ(parsed(input), kFails) << input;
}

}  // namespace

TEST(Parser, OperandsAndValues) {
  expectAll({
      {" FALSE ", "false"},
      {"'TrUe'", "true"},
      {"a = b", "a = b"},
      {"a==\"x y\"", "a == \"x y\""},
      {"a!='x'", "a != x"},
      {"a = 'it\\'s'", "a = \"it's\""},
      {"a = \"\\\\ \\\" \\*\"", "a = \"\\\\ \\\" *\""},
      {"a = ''", "a = \"\""},
      {"a == b*", "a == b*"},
      {"** == *", "** == *"},
      {"com_quill-x.y_z = 1", "com_quill-x.y_z = 1"},
      {"a == caf\xC3\xA9", "a == caf"},
      {"a == 'caf\xC3\xA9'", "a == \"caf\xC3\xA9\""},
      {"a == b c d", "a == b"},
  });
}

TEST(Parser, RefusesWhatIsNoExpression) {
  expectFailures({"", " \t\n\v\f\r", "tru\\e", "'tru", "\xC3\xA9 == a", "a == 'x' && \xFF", "a",
                  "a ==", "a == (b)", "a > 5", "a < 'x'", "a == \"b", "a == 'b\\", "a == 'b\\'",
                  "a & b", "! a == b", "_a == b"});
  expectFailures({"a > $time.now(abc)", "a > $time.now(1", "a > $time", "a > $", "a > time.now",
                  "()", "(())", "a=1 &&", "a=1 && && b=2"});
}

TEST(Parser, TimeFunctions) {
  expectAll({
      {"a > $time.now", "a > $time.now(0)"},
      {"a > $time.now()", "a > $time.now()"},
      {"a = $time.now (\t-3600 )", "a = $time.now(-3600 )"},
      {"a != $time.this_week", "a != $time.this_week(0)"},
      {"a == $time.this_month", "a == $time.this_month(0)"},
      {"a > $time.this_year", "a > $time.this_year(0)"},
      {"a > $time.yesterday", "a > $time.yesterday(0)"},
      {"a > $time.last_week", "a > $time.last_week(0)"},
      // A word after a time is not a modifier: it ends the expression.
      {"a > $time.nowhere && b = c", "a > $time.now(0)"},
  });
  for (int32_t token = -1; token <= 24; ++token) {
    EXPECT_EQ(sq::isTimeOperator(token), token >= 5 && token <= 13) << token;
  }
}

TEST(Parser, ConnectivesAndParentheses) {
  expectAll({
      {"a=1 && b=2 || c=3", "a = 1 && (b = 2 || c = 3)"},
      {"a=1 || b=2 && c=3", "a = 1 || (b = 2 && c = 3)"},
      {"(a=1 || b=2) && c=3", "(a = 1 || b = 2) && c = 3"},
      {"(a=1 && b=2) && c=3", "(a = 1 && b = 2) && c = 3"},
      {"((a=1))", "a = 1"},
      {"true && a == b", "true && a == b"},
      {"(a=1", "a = 1"},
      {"(a=1 && (b=2", "a = 1 && b = 2"},
      {"a=1)", "a = 1"},
      {"a=1) || b=2", "a = 1"},
      {"true == 'x'", "true"},
      {"a=1 b=2", "a = 1"},
      {"a=1 | b=2", "a = 1"},
      {"(a > $time.now(1) c) && b == x", "a > $time.now(1)"},
  });
}

TEST(Parser, AStringAfterAStringValueIsAModifier) {
  expectAll({
      {"a = 'x*'cdw && b = c", "a = x* && b = c"},
      {"a = x 'y' && b = c", "a = x && b = c"},
      {"a = x y z && b = c", "a = x"},
      {"a = x 'y", "a = x"},
  });
}

// The start of an expression is not read: its attribute is the last text read.
TEST(Parser, ATextRemainsUntilTheNextOne) {
  expectAll({
      {"== = b", "\"\" = b"},
      {"&& == b", "\"\" == b"},
      {"a == b && ) == c", "a == b && b == c"},
      {"true && ) rest", "true && true"},
      {"'true", "true"},
      {"$time.now(12 == c", "\"12 \" == c"},
      {"$time.now == c", "0 == c"},
  });
}

TEST(Parser, EscapedTextIsReadBackInQuotesOfBothKinds) {
  const std::string text = "it's \"a\\b\" *\\* \xE6\x97\xA5\n";
  for (const char quote : {'"', '\''}) {
    sq::Tree tree;
    ASSERT_TRUE(sq::parse(("a = " + (quote + sq::escaped(text) + quote)).c_str(), tree));
    EXPECT_EQ(tree->right->text, text);
  }
}

TEST(Parser, ReportsWhereItStopped) {
  const auto stopOf = [](const char* input) {
    sq::Tree tree;
    size_t stop = 0;
    static_cast<void>(sq::parse(input, tree, &stop));
    return stop;
  };
  EXPECT_EQ(stopOf("a = b"), 5u);
  EXPECT_EQ(stopOf("a = b) || c"), 5u);
  EXPECT_EQ(stopOf("a = b && c"), 10u);
  EXPECT_EQ(stopOf("a > 5"), 4u);
  EXPECT_EQ(stopOf("a = 'b"), 4u);
}

// Each of these nests, or seems to nest, as deeply as it is long; parsing, printing and freeing it
// must not recurse.
TEST(Parser, NoInputIsTooDeep) {
  const std::string open = megabyteOf("(");
  EXPECT_EQ(parsed(open), kFails);
  EXPECT_EQ(parsed(open + "a=b"), "a = b");
  EXPECT_EQ(parsed(open + "a=b" + megabyteOf(")") + "&& c=d"), "a = b && c = d");
  for (const char* unit : {"a=b && (", "'", "'a\\", "'a' ", "a=b || ", "a='b", "$time.now("}) {
    const std::string result = parsed(megabyteOf(unit));
    EXPECT_TRUE(result == kFails || result == "a = \"ba=\"") << unit;
  }
  for (const auto& [unit, end] :
       {std::pair("a = b || ", "true"), std::pair("(a = b || c = d) && ", "true"),
        std::pair("a = b && (c = d || (", "a = b && true")}) {
    const std::string input = repeated(unit, 100000) + end;
    const std::string output = parsed(input);
    EXPECT_TRUE(output.starts_with(input)) << unit;
    EXPECT_TRUE(parsed(output) == output) << unit;
  }
}
