// The limits in force: sizes of reports and of the output directory, expiry ages. The built-in
// defaults are replaced by the command line, the state file and, in time, the configuration.
#pragma once

#include <cstdint>

namespace kivd {

inline constexpr uint32_t default_max_report_size = 409600;       // bytes
inline constexpr uint32_t default_max_output_dir_size = 5242880;  // bytes
inline constexpr uint32_t default_expire_age = 2592000;           // seconds; 30 days

struct limits {
    uint32_t max_report_size;      // bytes; the event file that reaches it becomes a report
    uint32_t max_output_dir_size;  // bytes
    uint32_t expire_counters_age;  // seconds since the last update; 0 = no expiry
    uint32_t expire_sdata_age;     // seconds since the value was last set; 0 = no expiry
    // What the command line gave, and what a configuration without ages returns to.
    uint32_t base_expire_counters_age;
    uint32_t base_expire_sdata_age;
};

// The built-in defaults.
void init_settings();

[[nodiscard]] limits& get_limits();

// The time at or before which something of that age (in seconds) has expired, in milliseconds; 0
// when nothing expires.
[[nodiscard]] int64_t expiry_cutoff_ms(uint32_t age_seconds);

}  // namespace kivd
