#pragma once

#include <memory>
#include <optional>
#include <span>
#include <string>

#include "cli/HitSearch.h"
#include "cli/Options.h"
#include "mcp/FolderLimit.h"
#include "mcp/Tool.h"

namespace mcp {

// The tools for clients: search, show, threads and status. All of them only read, and show only
// mail within the limit. What comes from mail stands under the key "untrusted", cleaned and cut.
// One thread; each call waits for the daemon as `tallow search` does.
class MailTools {
 public:
  // Limits of one answer. Lengths are in code points.
  static constexpr int64_t kMaxResults = 50;
  static constexpr size_t kMaxThreadedResults = 1000;
  static constexpr size_t kMaxThreadMessages = 20;
  static constexpr size_t kMaxFieldLength = 300;
  static constexpr size_t kMaxSnippetLength = 500;
  static constexpr size_t kMaxTextLength = 20000;
  static constexpr size_t kMaxPersons = 10;
  static constexpr size_t kMaxAttachments = 50;
  static constexpr size_t kMaxFolderCounts = 200;

  // `options` say how to reach the daemon, and which class to search.
  MailTools(cli::Options options, FolderLimit limit);

  [[nodiscard]] static std::span<const Tool> all();
  // Calls a tool with arguments that fit it.
  [[nodiscard]] ToolAnswer call(const Tool& tool, const nlohmann::json& arguments) {
    return (this->*tool.call)(arguments);
  }

 private:
  ToolAnswer search(const nlohmann::json& arguments);
  ToolAnswer show(const nlohmann::json& arguments);
  ToolAnswer threads(const nlohmann::json& arguments);
  ToolAnswer status(const nlohmann::json& arguments);

  struct Found;
  [[nodiscard]] std::optional<Found> find(const nlohmann::json& arguments, bool threaded,
                                          cli::MailFacts& facts, ToolAnswer& failed) const;
  void keepAllowed(cli::Hits& hits, cli::MailFacts& facts) const;
  nlohmann::ordered_json listed(const cli::Hit& hit);

  const cli::Options _options;
  const FolderLimit _limit;
  ListedMail _listed;
};

}  // namespace mcp
