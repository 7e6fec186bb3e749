#pragma once

#include <set>
#include <string>
#include <string_view>

#include "querylang/Parser.h"

// Expressions of the query language for the programs that make queries.
namespace sq {

// One disjunction over the attributes that hold text, as mail clients send it for typed words. The
// optimiser turns it into free text, so the last word is a prefix unless a space follows. The words
// must not contain NUL.
[[nodiscard]] std::string expressionForWords(std::string_view words);

// The attribute names in a tree that do not exist.
[[nodiscard]] std::set<std::string> unknownAttributes(const node& tree);

}  // namespace sq
