// Static data: named texts of which only the latest value matters. A value is reported once, after
// it changed; setting it again to the same text only keeps it from expiring.
#pragma once

#include <cstdint>

#include "report/record_file.h"

namespace kivd {

// Loads private/sdata.txt; a missing file is fine. Ends the process when out of memory.
void sdata_init();

// Stores a copy of `value`, of any length.
void sdata_set(const char* package, const char* name, const char* value);

// Writes private/sdata.txt when an item was created or changed since the last good save, each value
// cut to 256 bytes. Failures have been logged and raised; the next save tries again.
void sdata_save();

// Appends a report record for each item whose value changed at `since_ms` or later; one that needs
// more than 512 bytes is left out.
void sdata_write_report(record_appender& report, int64_t since_ms);

// Whether there is any such item.
[[nodiscard]] bool sdata_pending(int64_t since_ms);

void sdata_free();

}  // namespace kivd
