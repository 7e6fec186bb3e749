#pragma once

#include <optional>

#include "platform/Text.h"

// The first lines of a body for a result list: about 300 UTF-16 units, at most 302, never cut
// inside a character that readers see as one. Runs of spaces and tabs become one space; a line
// break becomes one U+2008, two or more become two. Nullopt for an empty body; a body of white
// space only is its own snippet.
[[nodiscard]] std::optional<TLString> snippetOfBody(const std::optional<TLString>& body);
