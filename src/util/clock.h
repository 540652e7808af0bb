// The daemon's clock, and the stepping clock that makes test runs reproducible.
#pragma once

#include <cstdint>

namespace kivd {

// Milliseconds since the Unix epoch. In test mode the test clock instead: whole seconds from
// 2010-01-01 06:00:00 UTC, and every call first goes one second forward.
[[nodiscard]] int64_t now_ms();

// Test mode (`--test-mode`): stepping clock, fixed identity, short flood interval.
void enable_test_mode();
void leave_test_mode();  // the clock then starts over
[[nodiscard]] bool is_test_mode();

// Sets the test clock, in seconds since the epoch; without effect on now_ms outside test mode.
void set_test_clock(int64_t seconds);

// Milliseconds of a clock that is never set, for deadlines and intervals.
[[nodiscard]] int64_t monotonic_ms();

}  // namespace kivd
