#include "cli/AttachmentCounts.h"

#include <fmt/format.h>

#include <optional>

namespace cli {

std::string attachmentText(const extract::Counts& counts, const std::string& first,
                           const std::string& next) {
  std::string text;
  std::optional<extract::Kind> last;
  counts.forEach([&](extract::Kind kind, extract::Outcome outcome, uint64_t count) {
    if (kind == last) {
      text.back() = ',';
      text += ' ';
    } else {
      text += fmt::format("{}{}: ", last ? next : first, nameOf(kind));
    }
    text += fmt::format("{} {}\n", count, nameOf(outcome));
    last = kind;
  });
  return text;
}

nlohmann::json attachmentJSON(const extract::Counts& counts) {
  nlohmann::json list = nlohmann::json::array();
  counts.forEach([&](extract::Kind kind, extract::Outcome outcome, uint64_t count) {
    list.push_back({{"type", nameOf(kind)}, {"outcome", nameOf(outcome)}, {"count", count}});
  });
  return list;
}

}  // namespace cli
