// Static data: named texts of which only the latest value matters. A value is reported once, after
// it changed; setting it again to the same text only keeps it from expiring.
#pragma once

#include <sys/types.h>

#include <cstdint>

#include "record/record_file.h"

namespace kivd {

// Loads private/sdata.txt; a missing file is fine.
void static_data_init();

// Stores what can be reported and saved of `value`, and what tells it from others. There has to be
// room for a new name of that user's (store/probe_store.h).
void static_data_set(const char* package, const char* name, const char* value, uid_t user);

// Writes private/sdata.txt when an item was created or changed since the last good save, each value
// cut to 256 bytes. Failures have been logged and raised; the next save tries again.
void static_data_save();

// Appends a report record for each item whose value changed at `since_ms` or later; one that needs
// more than 512 bytes is left out.
void static_data_write_report(record_appender& report, int64_t since_ms);

// Whether there is any such item.
[[nodiscard]] bool static_data_pending(int64_t since_ms);

void static_data_release();

}  // namespace kivd
