#pragma once

#include <cstdint>
#include <string_view>

// The UTF-16 unit that a name of the HTML 4 character entity set stands for, without quot, amp, lt
// and gt; 0 for an unknown name. Case counts. Any thread.
[[nodiscard]] uint16_t TALHTMLEntityCode(std::string_view name);
