#include <fmt/format.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <random>

#include "querylang/TLQueryAdditions.h"
#include "tests/support/Seed.h"

namespace {

using Additions = TLQueryAdditions;
using Node = Additions::Node;
using Merge = TLQueryNodeMergeOp;
using Op = TLQueryNodeOp;

// Generates parse trees from few names and values, so that equal conditions are frequent.
class Generator {
 public:
  explicit Generator(uint32_t seed) : _random(seed) {}

  size_t below(size_t limit) { return _random() % limit; }
  bool chance(size_t percent) { return below(100) < percent; }

  // Attributes and values of any kind, connectives anywhere.
  sq::Tree any(size_t leaves) {
    if (leaves <= 1) return chance(10) ? constant() : comparison(anyText(), anyText());
    const size_t left = 1 + below(leaves - 1);
    return connective(any(left), any(leaves - left));
  }

  // Words in many attributes, times, constants and conditions.
  sq::Tree mixed(size_t leaves) {
    if (leaves >= 5 && chance(30)) return disjunction(4 + below(4));
    if (leaves <= 1) return chance(15) ? constant() : comparison(oneOf(kAll), smallText());
    const size_t left = 1 + below(leaves - 1);
    return connective(mixed(left), mixed(leaves - left));
  }

  // Bytes that may look like a query.
  std::string noise() {
    static constexpr const char* kPieces[] = {
        "(",  ")",   "||",         "&&",   "|", "&",  "!",   "!=",   "=",    "==",
        ">",  "<=",  "\"",         "'",    "a", "\\", " ",   "true", "\xC3", "$time.now",
        "$t", "-1)", "$time.iso(", "b = ", "*", "\n", ".._", "FALSE"};
    std::string text;
    for (size_t i = below(20); i > 0; --i) text += kPieces[below(std::size(kPieces))];
    return text;
  }

 private:
  static constexpr const char* kAll[] = {
      "kTLItemSubject", "kTLItemAuthors", "com_quill_mail_read", "*", "**", "kTLItemMailboxes"};
  template <size_t n>
  std::string oneOf(const char* const (&list)[n]) {
    return list[below(n)];
  }
  sq::Tree connective(sq::Tree left, sq::Tree right) {
    return join(chance(50) ? sq::kTokenAnd : sq::kTokenOr, std::move(left), std::move(right));
  }
  static sq::Tree join(int32_t type, sq::Tree left, sq::Tree right) {
    auto node = std::make_unique<sq::node>(type);
    node->left = std::move(left);
    node->right = std::move(right);
    return node;
  }
  sq::Tree constant() {
    return std::make_unique<sq::node>(sq::kTokenString, chance(50) ? "true" : "false");
  }
  std::string smallText() {
    static constexpr const char* kTexts[] = {"0", "1", "x", "*x", "x*", "*", "**", "", "***"};
    return oneOf(kTexts);
  }
  std::string anyText() {
    std::string text;
    for (size_t i = below(6); i > 0; --i) {
      text.push_back(chance(30) ? "'\"\\*"[below(4)] : static_cast<char>(1 + below(255)));
    }
    return text;
  }
  sq::Tree value(std::string text) {
    if (!chance(20)) return std::make_unique<sq::node>(sq::kTokenString, std::move(text));
    const auto function = static_cast<int32_t>(sq::kTokenTimeAbsolute + below(9));
    return std::make_unique<sq::node>(function, chance(30) ? "" : "-1.5 T:Z+");
  }
  sq::Tree comparison(std::string attribute, std::string text) {
    sq::Tree right = value(std::move(text));
    const bool string = right->type == sq::kTokenString;
    const auto op =
        static_cast<int32_t>(string ? sq::kTokenAssign + below(3) : sq::kTokenGreater + below(4));
    return join(op, std::make_unique<sq::node>(sq::kTokenString, std::move(attribute)),
                std::move(right));
  }
  // Usually one word in many attributes.
  sq::Tree disjunction(size_t leaves) {
    const std::string text = smallText();
    sq::Tree tree;
    for (size_t i = 0; i < leaves; ++i) {
      auto leaf = join(sq::kTokenEqual, std::make_unique<sq::node>(sq::kTokenString, oneOf(kAll)),
                       std::make_unique<sq::node>(sq::kTokenString, chance(2) ? "x" : text));
      tree =
          tree == nullptr ? std::move(leaf) : join(sq::kTokenOr, std::move(leaf), std::move(tree));
    }
    return tree;
  }

  std::mt19937 _random;
};

bool equal(const sq::node* a, const sq::node* b) {
  if (a == nullptr || b == nullptr) return a == b;
  return a->type == b->type && a->text == b->text && equal(a->left.get(), b->left.get()) &&
         equal(a->right.get(), b->right.get());
}

TLString textOf(const sq::Tree& tree) {
  return platform::fromUTF8(sq::expressionText(*tree));
}

bool isOneWordInManyAttributes(const TLQueryNode& node) {
  const auto leaves = [](const auto& child) { return child->mergeOp() == Merge::LEAF; };
  if (node.mergeOp() != Merge::OR || node.childsCount() < 5 || !leaves(node.childAtIndex(0)) ||
      !node.childAtIndex(0)->hasStringValue()) {
    return false;
  }
  std::vector<std::optional<TLString>> texts;
  for (const Node& child : node.childs()) {
    if (leaves(child)) texts.push_back(child->stringValue());
  }
  std::sort(texts.begin(), texts.end());
  return texts.front() == texts.back();
}

std::string leafOnPaper(const TLQueryNode& leaf, const std::string& text) {
  return fmt::format("[{} {} '{}' {} {}]", TLQueryNode::keysAsString(leaf.keyAtIndex(0)),
                     TLQueryNode::opAsString(leaf.op()), text, leaf.intValue(), leaf.doubleValue());
}

// Reference optimiser on texts: a tree is its text, nothing is the empty text, and constants are
// "true" and "false".
std::string onPaper(const TLQueryNode& node, std::vector<std::string>& parts) {
  const auto bare = [](const TLQueryNode& leaf) {
    return platform::toUTF8(Additions::removeWildCard(*leaf.stringValue()));
  };
  if (isOneWordInManyAttributes(node)) {
    parts.push_back(bare(*node.childAtIndex(0)));
    return "";
  }
  if (node.mergeOp() == Merge::LEAF) {
    if (node.op() == Op::BOOL_CONSTANT) return node.boolValue() ? "true" : "false";
    const std::string text = node.hasStringValue() ? bare(node) : "";
    const int32_t key = node.keyAtIndex(0);
    if (key == static_cast<int32_t>(TLAttributeKey::ANY) ||
        key == static_cast<int32_t>(TLAttributeKey::ANY_METADATA)) {
      parts.push_back(text);
      return "";
    }
    return leafOnPaper(node, text);
  }
  const bool isAnd = node.mergeOp() == Merge::AND;
  std::vector<std::string> rest;
  for (const Node& child : node.childs()) {
    const std::string text = onPaper(*child, parts);
    if (text == (isAnd ? "false" : "true")) return text;
    if (text.empty() || text == "true" || text == "false") continue;
    if (std::find(rest.begin(), rest.end(), text) == rest.end()) rest.push_back(text);
  }
  if (rest.size() < 2) return rest.empty() ? "" : rest[0];
  return fmt::format("({} {})", isAnd ? "AND" : "OR", fmt::join(rest, " "));
}

// A tree in the notation of `onPaper`.
std::string paperOf(const TLQueryNode& node) {
  if (node.mergeOp() == Merge::LEAF) {
    if (node.op() == Op::BOOL_CONSTANT) return node.boolValue() ? "true" : "false";
    return leafOnPaper(node, platform::toUTF8(platform::orEmpty(node.stringValue())));
  }
  std::vector<std::string> childs;
  for (const Node& child : node.childs()) childs.push_back(paperOf(*child));
  return fmt::format("({} {})", node.mergeOp() == Merge::AND ? "AND" : "OR",
                     fmt::join(childs, " "));
}

constexpr int kRounds = 3000;

}  // namespace

TEST(QueryProperties, ATreeWrittenAndReadIsTheSame) {
  Generator generator(testsupport::firstSeed());
  for (int i = 0; i < kRounds; ++i) {
    const sq::Tree tree = generator.any(1 + generator.below(20));
    const std::string text = sq::expressionText(*tree);
    sq::Tree again;
    ASSERT_TRUE(sq::parse(text.c_str(), again)) << text;
    ASSERT_TRUE(equal(tree.get(), again.get())) << text;
  }
}

TEST(QueryProperties, OptimisingMatchesTheReferenceRules) {
  Generator generator(testsupport::firstSeed());
  int withText = 0;
  for (int i = 0; i < kRounds; ++i) {
    const TLString text = textOf(generator.mixed(1 + generator.below(16)));
    const Node before = Additions::_parse(text);
    ASSERT_NE(before, nullptr);
    std::vector<std::string> expectedParts;
    const std::string expected = onPaper(*before, expectedParts);
    std::erase(expectedParts, "");
    Additions::Parts parts;
    const Node after = Additions::optimizeQuery(before, parts);
    ASSERT_EQ(after == nullptr ? "" : paperOf(*after), expected) << platform::toUTF8(text);
    std::vector<std::string> shown;
    for (const TLString& part : parts) shown.push_back(platform::toUTF8(part));
    ASSERT_EQ(shown, expectedParts) << platform::toUTF8(text);
    withText += shown.empty() ? 0 : 1;
  }
  EXPECT_GT(withText, kRounds / 4);
}

// The text ends where its memory ends, or is followed by something that would change the result.
TEST(QueryProperties, NothingAfterTheEndIsRead) {
  Generator generator(testsupport::firstSeed());
  const auto outcome = [](const char* input) {
    sq::Tree tree;
    return sq::parse(input, tree) ? sq::expressionText(*tree) : "(fails)";
  };
  for (int i = 0; i < 10 * kRounds; ++i) {
    const std::string text = generator.noise();
    const auto exact = std::make_unique<char[]>(text.size() + 1);
    std::memcpy(exact.get(), text.c_str(), text.size() + 1);
    for (const char* behind : {"' && c = d", "\" = x", ") && e = f", "g == 'h'"}) {
      const std::string longer = text + '\0' + behind;
      ASSERT_EQ(outcome(exact.get()), outcome(longer.c_str())) << text;
    }
  }
}
