// private/kivd.state: the values that are remembered across restarts and kept nowhere else. Three
// of them live here; the others belong to the header record, the limits and the error facility.
#pragma once

#include <cstdint>

#include "format/config_file.h"

namespace kivd {

// Reads the file into the values that it has lines for; a line without a value changes nothing. A
// missing file is fine; another failure to open it has been logged and raised.
void state_load();

// Replaces the file. Failures have been logged and raised; the old file is then still there.
void state_save();

// Returns the three values to those of a first start.
void state_release();

// The time of the last report flush, in ms: what changed then or later belongs to the next report.
[[nodiscard]] int64_t get_last_flush();
void set_last_flush(int64_t time_ms);

// While data collection is off, probe data is ignored and no report is made on request.
[[nodiscard]] bool is_data_collection_enabled();
void set_data_collection(bool enabled);

// Of the configuration in force; all zero before the first one.
[[nodiscard]] config_checksum get_config_checksum();
void set_config_checksum(const config_checksum& checksum);

}  // namespace kivd
