#pragma once

#include <memory>
#include <nlohmann/json_fwd.hpp>
#include <string>
#include <vector>

#include "cli/Options.h"
#include "cli/Terminal.h"
#include "records/TLIndexableItem.h"

namespace cli {

using ResultItems = std::vector<std::shared_ptr<TLIndexableItem>>;

// The output of a search as one text, clean of control characters.
[[nodiscard]] std::string resultsText(const ResultItems& items, const std::string& query,
                                      const Palette& palette);
[[nodiscard]] std::string resultsJSON(const ResultItems& items);
// A path a line, with ":OFFSET" for a message of an mbox file. An identifier of another client
// stands as it is.
[[nodiscard]] std::string resultsFiles(const ResultItems& items);

// A line, or a row, a result: rank, scores, date, identifier.
[[nodiscard]] std::string scoresText(const ResultItems& items, const Palette& palette);
[[nodiscard]] nlohmann::json scoresJSON(const ResultItems& items);

// JSON as it goes out: indented, valid UTF-8, harmless to terminals, with a line feed.
[[nodiscard]] std::string jsonText(const nlohmann::json& json);

}  // namespace cli
