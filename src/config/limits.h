// The limits in force: sizes of reports and of the output directory, expiry ages. The built-in
// defaults are replaced by the command line, the state file and, in time, the configuration.
#pragma once

#include <cstdint>

namespace kivd {

// The built-in defaults.
struct limits {
    uint32_t max_report_size = 409600;       // bytes; the event file that reaches it is reported
    uint32_t max_output_dir_size = 5242880;  // bytes
    uint32_t expire_counters_age = 2592000;  // seconds since the last update; 0: no expiry
    uint32_t expire_sdata_age = 2592000;     // seconds since the value was last set; 0: no expiry
};

inline constexpr limits default_limits;

[[nodiscard]] limits& get_limits();

// What the command line gave: a configuration without a limit returns to these.
[[nodiscard]] limits& get_base_limits();

// Both back to the built-in defaults.
void limits_release();

// The time at or before which something of that age (in seconds) has expired, in milliseconds; 0
// when nothing expires.
[[nodiscard]] int64_t expiry_cutoff_ms(uint32_t age_seconds);

}  // namespace kivd
