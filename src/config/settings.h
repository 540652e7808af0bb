// The part "Settings" of the configuration: the limits, and the switch that disables the daemon for
// good.
#pragma once

namespace kivd {

// Returns the limits to their defaults and takes what the configuration in force says of them.
void apply_settings();

}  // namespace kivd
