// The probe filters: which probes of each kind are kept. They come with a configuration and stay in
// force over restarts, in list files of their own. A filter that no configuration has given, or
// that cannot be built, accepts everything.
#pragma once

#include <cstdint>
#include <span>

namespace kivd {

inline constexpr char filter_part_name[] = "FilterConfig";

enum class filter_kind : uint8_t { counters, static_data, events };

// Loads the filter files; a missing one is fine. True when there was one for events.
bool load_filters();
void release_filters();

// Whether the filters of a FilterConfig, as it comes with a configuration, can be read back at a
// start: that they have not too many items, and none that is too long. If not, that has been logged
// and raised. One that cannot be decoded is no filter.
[[nodiscard]] bool can_hold_filters(std::span<const uint8_t> filter_config);

// Builds the filters anew from the configuration in force. Why one could not be built has been
// logged and raised.
void apply_filter_config();

// Whether to keep such a probe.
[[nodiscard]] bool filter_match(filter_kind kind, const char* package, const char* name);

}  // namespace kivd
