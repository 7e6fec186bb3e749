#pragma once

#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <string_view>

#include "mcp/MailTools.h"

namespace mcp {

// One session of the Model Context Protocol: JSON-RPC 2.0 messages in, one a line, and replies out.
// Nothing that a client sends ends the session. One thread.
class Session {
 public:
  // `version` is that of the program. The tools must outlive the session.
  Session(MailTools& tools, std::string version) : _tools(tools), _version(std::move(version)) {}

  // The reply to one line, without a line feed; empty if there is none, as for notifications.
  [[nodiscard]] std::string answer(std::string_view line);
  // The reply to a line that was too long to be read.
  [[nodiscard]] static std::string refuseLongLine();

 private:
  using Json = nlohmann::json;
  using Reply = nlohmann::ordered_json;

  [[nodiscard]] Reply answerBatch(const Json& messages);
  [[nodiscard]] Reply answerMessage(const Json& message, bool inBatch);
  [[nodiscard]] Reply answerRequest(const Json& id, const std::string& method, const Json& params);
  [[nodiscard]] Reply initialize(const Json& id, const Json& params);
  [[nodiscard]] Reply listTools(const Json& id, const Json& params) const;
  [[nodiscard]] Reply callTool(const Json& id, const Json& params);

  MailTools& _tools;
  const std::string _version;
  std::string _protocol;  // the version agreed on; empty before `initialize`
};

}  // namespace mcp
