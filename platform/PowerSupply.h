#pragma once

#include <string>

namespace platform {

inline constexpr const char* kPowerSupplyDirectory = "/sys/class/power_supply";

// Whether this device runs on battery, according to the kernel's list of power supplies in
// `directory`. False if another kind of supply is online; otherwise true if a battery discharges,
// or if there is a battery and a supply that is not online. Batteries of peripherals such as mice
// are ignored. False without a list.
[[nodiscard]] bool runsOnBattery(const std::string& directory = kPowerSupplyDirectory);

}  // namespace platform
