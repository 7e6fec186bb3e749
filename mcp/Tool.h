#pragma once

#include <cstddef>
#include <cstdint>
#include <nlohmann/json.hpp>
#include <optional>
#include <span>
#include <string>

namespace mcp {

// One argument of a tool: a text, or a whole number. Without a default it is required.
struct Property {
  const char* name;
  const char* description;
  bool isText;
  int64_t least;  // the smallest number; of a text, the shortest length in bytes
  int64_t most;
  std::optional<int64_t> byDefault = {};
};

// What a call of a tool gives: a JSON object for the client, or why it failed, in words.
struct ToolAnswer {
  nlohmann::ordered_json object;
  std::string failure = {};  // not empty: the call failed
};

class MailTools;

struct Tool {
  const char* name;
  const char* title;
  const char* description;
  std::span<const Property> properties;
  ToolAnswer (MailTools::*call)(const nlohmann::json& arguments);
};

// The entry of the tool in the reply to tools/list.
[[nodiscard]] nlohmann::ordered_json describe(const Tool& tool);

// Why the arguments do not fit the tool; empty if they do. Then each is present with its type, or
// absent with a default.
[[nodiscard]] std::string misuse(const Tool& tool, const nlohmann::json& arguments);

}  // namespace mcp
