// Counters: named 64-bit values that clients set or increment. A value is cumulative; no report
// resets it. What has not been updated for longer than the expiry age is left out of the file and
// so gone after a restart.
#pragma once

#include <sys/types.h>

#include <cstdint>

#include "record/record_file.h"

namespace kivd {

enum class counter_mode : uint8_t { set, increment };

// Loads private/counters.txt; a missing file is fine.
void counters_init();

// Sets the counter to `value` or adds it (the sum wraps); an unknown counter is created with it, if
// there is room for one of that user's (store/probe_store.h). A counter that the filter refuses is
// left as it is.
void counters_update(const char* package, const char* name, int32_t value, counter_mode mode,
                     uid_t user);

// Writes private/counters.txt when something changed since the last good save. Failures have been
// logged and raised; the next save tries again.
void counters_save();

// Appends a report record for each counter updated at `since_ms` or later.
void counters_write_report(record_appender& report, int64_t since_ms);

// Whether there is any such counter.
[[nodiscard]] bool counters_pending(int64_t since_ms);

void counters_release();

}  // namespace kivd
