// The probe filters: which probes of each kind are kept. They come with a configuration and stay in
// force over restarts, in list files of their own. A filter that no configuration has given, or
// that cannot be built, accepts everything.
#pragma once

#include <cstdint>

namespace kivd {

enum class filter_kind : uint8_t { counters, static_data, events };

// Loads the filter files; a missing one is fine. True when there was one for events.
bool load_filters();
void release_filters();

// Builds the filters anew from the configuration in force. Why one could not be built has been
// logged and raised.
void apply_filter_config();

// Whether to keep such a probe.
[[nodiscard]] bool filter_match(filter_kind kind, const char* package, const char* name);

}  // namespace kivd
