#include "platform/PowerSupply.h"

#include <vector>

#include "platform/Files.h"
#include "platform/Paths.h"

namespace platform {

namespace {

constexpr size_t kAttributeBytes = 4096;  // the most that the kernel writes

std::string attributeOf(const std::string& supply, const char* name) {
  std::string text = readFile(joinPath(supply, name), kAttributeBytes, nullptr).value_or("");
  while (!text.empty() && text.back() == '\n') text.pop_back();
  return text;
}

}  // namespace

bool runsOnBattery(const std::string& directory) {
  bool battery = false;
  bool offline = false;
  bool discharging = false;
  const auto supplies = listDirectory(directory, nullptr);
  for (const std::string& name : supplies.value_or(std::vector<std::string>())) {
    const std::string supply = joinPath(directory, name);
    if (attributeOf(supply, "scope") == "Device") continue;
    if (attributeOf(supply, "type") == "Battery") {
      battery = true;
      discharging = discharging || attributeOf(supply, "status") == "Discharging";
    } else {
      const std::string online = attributeOf(supply, "online");
      if (!online.empty() && online != "0") return false;
      offline = offline || online == "0";
    }
  }
  return discharging || (battery && offline);
}

}  // namespace platform
