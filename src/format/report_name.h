// Names of report files: "kiv_" and a number.
#pragma once

#include <cstdint>
#include <optional>

namespace kivd {

inline constexpr char report_prefix[] = "kiv_";

// The name of the report with that number, NUL-terminated.
struct report_name {
    explicit report_name(int64_t number);
    char text[32];
};

// Reads a name, NUL-terminated, as scanf does with "kiv_%d": what follows the number does not
// matter.
[[nodiscard]] std::optional<int32_t> scan_report_number(const char* name);

// The number of a name that report_name gives for a number above 0; nothing for any other.
[[nodiscard]] std::optional<int32_t> parse_report_name(const char* name);

}  // namespace kivd
