#pragma once

#include <string>

namespace platform {

inline constexpr const char* kPowerSupplyDirectory = "/sys/class/power_supply";

// Whether this device runs on its battery, by the kernel's list of power supplies in `directory`: a
// supply of another kind that is online says no; else a battery that discharges says yes, and so
// does any battery beside a supply that is not online. Batteries of mice and the like do not count.
// No without a list.
[[nodiscard]] bool runsOnBattery(const std::string& directory = kPowerSupplyDirectory);

}  // namespace platform
