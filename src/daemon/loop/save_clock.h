// When counters and static data are saved: once an interval, and whenever a client asks.
#pragma once

#include <cstdint>

namespace kivd {

// Seconds, at least 1; cut to what the loop's wait can express.
void set_save_interval(int32_t seconds);

// Seconds until the next timed save: 0 when it is due, never more than the interval.
[[nodiscard]] int32_t seconds_until_save();

// Starts a new interval now.
void mark_saved();

// Saves counters and static data and starts a new interval.
void save_data();

// Back to the usual interval, with no save yet.
void save_clock_release();

}  // namespace kivd
