#include "mcp/Tool.h"

#include <fmt/format.h>

#include <algorithm>

namespace mcp {

namespace {

using nlohmann::json;
using nlohmann::ordered_json;

ordered_json schemaOf(const Property& property) {
  ordered_json schema{{"type", property.isText ? "string" : "integer"},
                      {"description", property.description},
                      {property.isText ? "minLength" : "minimum", property.least},
                      {property.isText ? "maxLength" : "maximum", property.most}};
  if (property.byDefault) schema["default"] = *property.byDefault;
  return schema;
}

bool isWithin(const Property& property, const json& value) {
  if (property.isText) {
    if (!value.is_string()) return false;
    const auto size = static_cast<int64_t>(value.get_ref<const std::string&>().size());
    return size >= property.least && size <= property.most;
  }
  // Larger numbers are read as unsigned.
  if (!value.is_number_integer() ||
      (value.is_number_unsigned() && value.get<uint64_t>() > INT64_MAX)) {
    return false;
  }
  return value.get<int64_t>() >= property.least && value.get<int64_t>() <= property.most;
}

std::string expected(const Property& property) {
  return fmt::format("{} must be {} {} to {}{}", property.name,
                     property.isText ? "a text of" : "a whole number from", property.least,
                     property.most, property.isText ? " bytes" : "");
}

}  // namespace

ordered_json describe(const Tool& tool) {
  ordered_json properties = ordered_json::object();
  ordered_json required = ordered_json::array();
  for (const Property& property : tool.properties) {
    properties[property.name] = schemaOf(property);
    if (!property.byDefault) required.push_back(property.name);
  }
  return {{"name", tool.name},
          {"title", tool.title},
          {"description", tool.description},
          {"inputSchema",
           {{"type", "object"},
            {"properties", std::move(properties)},
            {"required", std::move(required)},
            {"additionalProperties", false}}},
          {"annotations",
           {{"title", tool.title},
            {"readOnlyHint", true},
            {"destructiveHint", false},
            {"idempotentHint", true},
            {"openWorldHint", false}}}};
}

std::string misuse(const Tool& tool, const json& arguments) {
  for (const auto& [name, value] : arguments.items()) {
    const auto property =
        std::find_if(tool.properties.begin(), tool.properties.end(),
                     [&word = name](const Property& one) { return word == one.name; });
    if (property == tool.properties.end()) return fmt::format("{} has no such argument", tool.name);
    if (!isWithin(*property, value)) return expected(*property);
  }
  for (const Property& property : tool.properties) {
    if (!property.byDefault && !arguments.contains(property.name)) {
      return fmt::format("{} is missing", property.name);
    }
  }
  return {};
}

}  // namespace mcp
