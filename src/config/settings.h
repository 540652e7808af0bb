// The part "Settings" of the configuration: the limits, and the switch that disables the daemon for
// good.
#pragma once

#include <cstdint>
#include <iterator>
#include <string_view>

#include "config/limits.h"
#include "settings.pb-c.h"

namespace kivd {

// What there is to know about a limit beside its default: where its values come from.
struct setting {
    uint32_t limits::*limit;
    protobuf_c_boolean Kivd__Settings::*is_given;
    uint32_t Kivd__Settings::*given;
    std::string_view state_key;  // of its line in the state file
};

// The state file has their lines in this order, those of sizes before those of ages.
// clang-format off
inline constexpr setting settings[] = {
    {&limits::max_report_size,     &Kivd__Settings::has_max_report_size,     &Kivd__Settings::max_report_size,     "report-max-size:"},
    {&limits::max_output_dir_size, &Kivd__Settings::has_max_output_dir_size, &Kivd__Settings::max_output_dir_size, "output-dir-max-size:"},
    {&limits::expire_counters_age, &Kivd__Settings::has_expire_counters_age, &Kivd__Settings::expire_counters_age, "expire-counters:"},
    {&limits::expire_sdata_age,    &Kivd__Settings::has_expire_sdata_age,    &Kivd__Settings::expire_sdata_age,    "expire-sdata:"},
};
// clang-format on
static_assert(sizeof(limits) == std::size(settings) * sizeof(uint32_t), "each limit has a row");

// Returns the limits to what they are without a configuration and takes what the one in force says
// of them.
void apply_settings();

}  // namespace kivd
