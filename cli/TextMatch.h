#pragma once

#include <optional>
#include <string>
#include <vector>

#include "records/TLIndexableItem.h"
#include "usersyntax/Syntax.h"

// The words of a typed text as the index knows them.
namespace cli {

// The attributes that a field is looked for in; empty for fields that the index does not hold.
[[nodiscard]] const std::vector<TLAttributeKey>& zonesOf(usersyntax::Field field);

// The words of a text node, each followed by a space, and how many there are.
[[nodiscard]] std::string indexedWords(const usersyntax::Node& node);
[[nodiscard]] size_t wordCount(const usersyntax::Node& node);

// Whether the last word is still being typed, and so matches as a prefix.
[[nodiscard]] bool mayGoOn(const usersyntax::Node& node);

// Whether the index, which keeps 32 bytes and the rest of a word of the text from each place on,
// cannot tell all of the words in their order.
[[nodiscard]] bool isCutInIndex(const usersyntax::Node& node);

// Text nodes of a tree that are looked up and hold no word, and the tree without them; none where
// nothing is left. At most 3 * kMaxDepth calls deep.
[[nodiscard]] std::vector<usersyntax::Node> wordlessNodes(const usersyntax::Node& tree);
[[nodiscard]] std::optional<usersyntax::Node> withoutWordless(const usersyntax::Node& tree);

// Whether an item with all its attributes holds the text.
[[nodiscard]] bool holdsText(const TLIndexableItem& item, const usersyntax::Node& node);

// The body of an item as plain text.
[[nodiscard]] TLString bodyText(const TLIndexableItem& item);

// A folder's name as it was typed, and in small letters, capitals and with a capital.
[[nodiscard]] std::vector<std::string> folderSpellings(const std::string& name);

// Whether a folder is meant by folder:TEXT: by one of the spellings of its name, or as a folder
// below it ("Work" of "Work.Bills"), or by its path or one above.
[[nodiscard]] bool isFolderMeant(const std::string& name, const std::string& path,
                                 const std::string& text);

}  // namespace cli
