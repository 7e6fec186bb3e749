#pragma once

#include <optional>
#include <string>
#include <vector>

#include "records/TLIndexableItem.h"
#include "usersyntax/Syntax.h"

// Matches typed text in the same way as the index.
namespace cli {

// The attributes in which a field is searched; empty for fields that are not in the index.
[[nodiscard]] const std::vector<TLAttributeKey>& zonesOf(usersyntax::Field field);

// The words of a text node, each followed by a space, and their number.
[[nodiscard]] std::string indexedWords(const usersyntax::Node& node);
[[nodiscard]] size_t wordCount(const usersyntax::Node& node);

// Whether the last word may be incomplete and so matches as a prefix.
[[nodiscard]] bool mayGoOn(const usersyntax::Node& node);

// Whether the text is too long for the index, which keeps 32 bytes and the rest of a word from each
// place on, to check all words in their order.
[[nodiscard]] bool isCutInIndex(const usersyntax::Node& node);

// The searched text nodes of a tree that contain no word, and the tree without them; nullopt if
// nothing is left. Recursion depth at most 3 * kMaxDepth.
[[nodiscard]] std::vector<usersyntax::Node> wordlessNodes(const usersyntax::Node& tree);
[[nodiscard]] std::optional<usersyntax::Node> withoutWordless(const usersyntax::Node& tree);

// Whether an item with all its attributes contains the text.
[[nodiscard]] bool holdsText(const TLIndexableItem& item, const usersyntax::Node& node);

// The body of an item as plain text.
[[nodiscard]] TLString bodyText(const TLIndexableItem& item);

// The name of a folder as typed, in lower case, in upper case and capitalised.
[[nodiscard]] std::vector<std::string> folderSpellings(const std::string& name);

// Whether folder:TEXT selects a folder: by a spelling of its name, as a subfolder ("Work" selects
// "Work.Bills"), or by its path or the path of a parent.
[[nodiscard]] bool isFolderMeant(const std::string& name, const std::string& path,
                                 const std::string& text);

}  // namespace cli
