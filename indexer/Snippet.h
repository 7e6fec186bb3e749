#pragma once

#include <optional>

#include "platform/Text.h"

// The first lines of a body for a list of results: its first 300 or so UTF-16 units, runs of blanks
// and tabs as one blank, line breaks as one U+2008 or, for two and more, two. At most 302 units,
// never cut inside a character that a reader sees as one. None for an empty body; a body of nothing
// but white space is its own snippet.
[[nodiscard]] std::optional<TLString> snippetOfBody(const std::optional<TLString>& body);
