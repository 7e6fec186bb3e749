#pragma once

#include <cstdint>
#include <string_view>

// The UTF-16 unit of a named HTML 4 character entity other than quot, amp, lt and gt; 0 for an
// unknown name. Case-sensitive. Any thread.
[[nodiscard]] uint16_t TALHTMLEntityCode(std::string_view name);
