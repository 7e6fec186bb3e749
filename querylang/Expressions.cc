#include "querylang/Expressions.h"

#include <fmt/format.h>

#include <array>
#include <vector>

#include "records/TLAttributeKey.h"

namespace sq {

namespace {

// The attributes that free text is searched in. More than four, so that the optimiser recognises
// free text.
constexpr std::array<const char*, 6> kTextAttributes{
    "kTLItemSubject",    "kTLItemTextContent",
    "kTLItemAuthors",    "kTLItemAuthorEmailAddresses",
    "kTLItemRecipients", "kTLItemRecipientEmailAddresses"};

}  // namespace

// The optimiser removes one asterisk at each end, so the user's own asterisks are kept.
std::string expressionForWords(std::string_view words) {
  std::string out = "(";
  for (const char* const attribute : kTextAttributes) {
    if (out.size() > 1) out += " || ";
    out += fmt::format("{} == \"*{}*\"", attribute, escaped(words));
  }
  return out + ')';
}

std::set<std::string> unknownAttributes(const node& tree) {
  std::set<std::string> unknown;
  std::vector<const node*> open{&tree};
  while (!open.empty()) {
    const node& next = *open.back();
    open.pop_back();
    if (next.left == nullptr) continue;
    if (next.type == kTokenAnd || next.type == kTokenOr) {
      open.push_back(next.right.get());
      open.push_back(next.left.get());
    } else if (!TLAttributeKeyForQueryName(next.left->text)) {
      unknown.insert(next.left->text);
    }
  }
  return unknown;
}

}  // namespace sq
